// Wi-Fi RF test commands (AT^WI...): drive the chip's test mode through the Wi-Fi
// test library for factory measurements. Switching Wi-Fi on or off for normal use
// is asked of the framework's generic service instead.
#include <libwifitest.h>
#include <stdint.h>
#include <stdio.h>
#include <string.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "dispatch/dispatcher.h"
#include "handlers/handler_util.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

// -1 until the first AT^WIENABLE set; 0 off, 1 on through the framework, 2 RF test
// mode (device under test open).
int wifiEnableState = -1;
// -1 until set; 0 20 MHz, 1 40 MHz.
int wifiBand = -1;
// The last values the library accepted, or -1 after it refused one.
int wifiFrequency = 0;
int wifiDataRate = 0;
int wifiTxPower = 0;

#define WIFI_STATE_OFF 0
#define WIFI_STATE_FRAMEWORK 1
#define WIFI_STATE_TEST 2
#define WIFI_MODE_MAX 4
#define WIFI_ADDR_LEN 6

// Hands Wi-Fi to the framework ("AT+WITOF=2") or takes it back ("AT+WITOF=1") and
// judges the service's answer. Its information text is shown to the host; its
// final result is not, so that the command ends with exactly one, its own.
static bool askFramework(const char *cmd) {
    char finalLine[DATA_BUF_SIZE];
    return exchangeWithGenericService(cmd, finalLine, (int)sizeof(finalLine)) == 0 && strcmp(finalLine, "OK") == 0;
}

// The state always names who holds the chip. Wi-Fi goes to the framework only with
// the device under test closed, and the test device opens only once the framework
// has let Wi-Fi go: the two never hold the chip at once.
static int wifiHandOver(int target) {
    switch (target) {
    case WIFI_STATE_TEST:
        if (wifiEnableState == WIFI_STATE_FRAMEWORK) {
            if (!askFramework("AT+WITOF=1")) return RESPONSE_ERROR;
            wifiEnableState = WIFI_STATE_OFF;
        }
        if (!WIFI_TEST_OpenDUT()) return RESPONSE_ERROR;
        break;
    case WIFI_STATE_FRAMEWORK:
        if (wifiEnableState == WIFI_STATE_TEST) {
            if (!WIFI_TEST_CloseDUT()) return RESPONSE_ERROR;
            wifiEnableState = WIFI_STATE_OFF;
        }
        if (!askFramework("AT+WITOF=2")) return RESPONSE_ERROR;
        break;
    case WIFI_STATE_OFF:
        // Wi-Fi that the framework switched on is switched off by it too; from
        // any other state the device under test is closed.
        if (wifiEnableState == WIFI_STATE_FRAMEWORK) {
            if (!askFramework("AT+WITOF=1")) return RESPONSE_ERROR;
        } else if (!WIFI_TEST_CloseDUT()) {
            return RESPONSE_ERROR;
        }
        break;
    default:
        return RESPONSE_ERROR;
    }
    wifiEnableState = target;
    return RESPONSE_OK;
}

int pas_wienable_handler(const char *param, int opType, char *response) {
    if (opType == AT_READ_OP) {
        snprintf(response, RESPONSE_BUF_SIZE, "%d", wifiEnableState);
        return RESPONSE_OK;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;
    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_ERROR);
    return rc != RESPONSE_OK ? rc : wifiHandOver(value);
}

int pas_wimode_handler(const char *param, int opType, char *response) {
    if (opType == AT_TEST_OP) {
        int32_t mode = 0;
        bool ok = WIFI_TEST_GetSupportedMode(&mode);
        snprintf(response, RESPONSE_BUF_SIZE, "%d", (int)mode);
        return ok ? RESPONSE_OK : RESPONSE_ERROR;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;

    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_ERROR);
    if (rc != RESPONSE_OK) return rc;
    if (value < 0 || value > WIFI_MODE_MAX) return RESPONSE_ERROR;
    return WIFI_TEST_SetMode(value) ? RESPONSE_OK : RESPONSE_ERROR;
}

static const char *bandName(int band) {
    return band == 1 ? "40MHZ" : "20MHZ";
}

int pas_wiband_handler(const char *param, int opType, char *response) {
    if (opType == AT_READ_OP) {
        if (wifiBand != 0 && wifiBand != 1) return RESPONSE_ERROR;
        snprintf(response, RESPONSE_BUF_SIZE, "%s", bandName(wifiBand));
        return RESPONSE_OK;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;

    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_ERROR);
    if (rc != RESPONSE_OK) return rc;
    if (value != 0 && value != 1) return RESPONSE_ERROR;
    if (!WIFI_TEST_SetBandwidth(value)) return RESPONSE_ERROR;
    snprintf(response, RESPONSE_BUF_SIZE, "%s", bandName(value));
    wifiBand = value;
    return RESPONSE_OK;
}

// Frequency, data rate and TX power: read back the last accepted value; a
// refused set reads back as -1. Every whole number goes to the library, so text
// that is none is refused like text without digits, before the library sees it.
typedef bool (*WifiSetter)(int value);

static bool setFrequency(int value) { return WIFI_TEST_SetFrequency(value, 0); }
static bool setRate(int value) { return WIFI_TEST_SetRate(value); }
static bool setTxPower(int value) { return WIFI_TEST_SetTXPower(value); }

static int storedValueHandler(int *stored, WifiSetter setter, const char *param, int opType, char *response) {
    if (opType == AT_READ_OP) {
        snprintf(response, RESPONSE_BUF_SIZE, "%d", *stored);
        return RESPONSE_OK;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;

    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_INVALID);
    if (rc != RESPONSE_OK) return rc;
    if (!setter(value)) {
        *stored = -1;
        return RESPONSE_ERROR;
    }
    *stored = value;
    return RESPONSE_OK;
}

int pas_wifreq_handler(const char *param, int opType, char *response) {
    return storedValueHandler(&wifiFrequency, setFrequency, param, opType, response);
}

int pas_widatarate_handler(const char *param, int opType, char *response) {
    int rc = storedValueHandler(&wifiDataRate, setRate, param, opType, response);
    if (opType == AT_SET_OP && rc == RESPONSE_OK) LOGD("pas_widatarate_handler [rate=%d] \n", wifiDataRate);
    return rc;
}

int pas_wipow_handler(const char *param, int opType, char *response) {
    return storedValueHandler(&wifiTxPower, setTxPower, param, opType, response);
}

int pas_witx_handler(const char *param, int opType, char *response) {
    (void)response;
    if (opType != AT_SET_OP) return RESPONSE_ERROR;
    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_INVALID);
    if (rc != RESPONSE_OK) return rc;
    return WIFI_TEST_SetTX(value != 0) ? RESPONSE_OK : RESPONSE_ERROR;
}

// The six least significant bytes of a number, least significant first.
static void toAddress(int64_t number, unsigned char addr[WIFI_ADDR_LEN]) {
    uint64_t bits = (uint64_t)number;
    for (int i = 0; i < WIFI_ADDR_LEN; i++) {
        addr[i] = (unsigned char)(bits & 0xFF);
        bits >>= 8;
    }
}

int pas_wirx_handler(const char *param, int opType, char *response) {
    (void)response;
    if (opType != AT_SET_OP) return RESPONSE_ERROR;
    char buf[PARAM_BUF_SIZE];
    char *cursor = copyParam(param, buf, sizeof(buf));
    int value = 0;
    int rc = nextParamNumber(&cursor, &value, RESPONSE_ERROR);
    if (rc != RESPONSE_OK) return rc;

    unsigned char first[WIFI_ADDR_LEN];
    unsigned char second[WIFI_ADDR_LEN];
    memset(first, 0, sizeof(first));
    memset(second, 0, sizeof(second));
    if (value == 0) {
        if (at_tok_hasmore(&cursor)) return RESPONSE_ERROR;
        return WIFI_TEST_SetRX(false, first, second) ? RESPONSE_OK : RESPONSE_ERROR;
    }
    if (value != 1) return RESPONSE_ERROR;

    // Each address must be a whole 64-bit number; the top two bytes are dropped.
    int64_t a = 0;
    int64_t b = 0;
    if (at_tok_nextint64_strict(&cursor, &a) != 0 || at_tok_nextint64_strict(&cursor, &b) != 0) return RESPONSE_INVALID;
    if (at_tok_hasmore(&cursor)) return RESPONSE_ERROR;
    toAddress(a, first);
    toAddress(b, second);
    return WIFI_TEST_SetRX(true, first, second) ? RESPONSE_OK : RESPONSE_ERROR;
}

int pas_wirpckg_handler(const char *param, int opType, char *response) {
    (void)param;
    if (opType == AT_READ_OP) {
        int32_t first = 0;
        int32_t second = 0;
        bool ok = WIFI_TEST_GetResult(&first, &second);
        // The counts carry their own OK; the final result line follows.
        snprintf(response, RESPONSE_BUF_SIZE, "%d,%d OK", (int)first, (int)second);
        return ok ? RESPONSE_OK : RESPONSE_ERROR;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;
    return WIFI_TEST_ClearResult() ? RESPONSE_OK : RESPONSE_ERROR;
}
