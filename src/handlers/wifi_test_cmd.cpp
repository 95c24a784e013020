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

// Reads the first integer of a set form; false when it does not parse.
static bool firstInt(const char *param, char *buf, size_t size, char **cursor, int *value) {
    *cursor = copyParam(param, buf, size);
    *value = 0;
    return at_tok_nextint(cursor, value) == 0;
}

// Asks the generic service to switch Wi-Fi and waits for its answer, which is
// relayed to the host; true when the answer holds OK.
static bool askFramework(const char *cmd) {
    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    sendDataToGenericService(cmd);
    return serviceReaderLoopWithResult(cmd) != -1;
}

int pas_wienable_handler(const char *param, int opType, char *response) {
    if (opType == AT_READ_OP) {
        snprintf(response, RESPONSE_BUF_SIZE, "%d", wifiEnableState);
        return RESPONSE_OK;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;

    char buf[PARAM_BUF_SIZE];
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;
    switch (value) {
    case 2:
        if (!WIFI_TEST_OpenDUT()) return RESPONSE_ERROR;
        wifiEnableState = WIFI_STATE_TEST;
        return RESPONSE_OK;
    case 1:
        if (!askFramework("AT+WITOF=2")) return RESPONSE_ERROR;
        wifiEnableState = WIFI_STATE_FRAMEWORK;
        return RESPONSE_OK;
    case 0:
        // Wi-Fi that the framework switched on is switched off by it too; from
        // any other state the device under test is closed.
        if (wifiEnableState == WIFI_STATE_FRAMEWORK) {
            if (!askFramework("AT+WITOF=1")) return RESPONSE_ERROR;
        } else if (!WIFI_TEST_CloseDUT()) {
            return RESPONSE_ERROR;
        }
        wifiEnableState = WIFI_STATE_OFF;
        return RESPONSE_OK;
    default:
        return RESPONSE_ERROR;
    }
}

int pas_wimode_handler(const char *param, int opType, char *response) {
    if (opType == AT_TEST_OP) {
        int32_t mode = 0;
        bool ok = WIFI_TEST_GetSupportedMode(&mode);
        snprintf(response, RESPONSE_BUF_SIZE, "%d", (int)mode);
        return ok ? RESPONSE_OK : RESPONSE_ERROR;
    }
    if (opType != AT_SET_OP) return RESPONSE_ERROR;

    char buf[PARAM_BUF_SIZE];
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;
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

    char buf[PARAM_BUF_SIZE];
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;
    if (value != 0 && value != 1) return RESPONSE_ERROR;
    if (!WIFI_TEST_SetBandwidth(value)) return RESPONSE_ERROR;
    snprintf(response, RESPONSE_BUF_SIZE, "%s", bandName(value));
    wifiBand = value;
    return RESPONSE_OK;
}

// Frequency, data rate and TX power: read back the last accepted value; a
// refused set reads back as -1.
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

    char buf[PARAM_BUF_SIZE];
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;
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
    char buf[PARAM_BUF_SIZE];
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;
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
    char *cursor;
    int value;
    if (!firstInt(param, buf, sizeof(buf), &cursor, &value)) return RESPONSE_INVALID;

    unsigned char first[WIFI_ADDR_LEN];
    unsigned char second[WIFI_ADDR_LEN];
    memset(first, 0, sizeof(first));
    memset(second, 0, sizeof(second));
    if (value == 0) return WIFI_TEST_SetRX(false, first, second) ? RESPONSE_OK : RESPONSE_ERROR;
    if (value != 1) return RESPONSE_ERROR;

    int64_t a = 0;
    int64_t b = 0;
    if (at_tok_nextint64(&cursor, &a) < 0 || at_tok_nextint64(&cursor, &b) < 0) return RESPONSE_INVALID;
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
