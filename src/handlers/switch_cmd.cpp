// Switch commands: AT%EURC and AT+TOLK (persistent switches in system properties),
// AT+VZWTOLKCFG (who handles the APN setting commands) and AT+CMEC (which side
// may operate keypad, display, indicators and touch screen; OP12 only).
#include <cutils/properties.h>
#include <stdio.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handler_util.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

// +CMEC: keypad, display, indicator, touch screen (3GPP TS 27.007 order).
int gCmecConfig[4] = {2, 2, 2, 2};
int gVzwTolkCfg = 0;

#define CMEC_PARAM_COUNT 4
#define CMEC_MAX_VALUE 2

typedef struct SwitchCmd {
    const char *property;
    const char *on;       // read answer for "1"
    const char *off;      // read answer for "0"
    const char *invalid;  // read answer for any other number
    const char *range;    // test answer
} SwitchCmd;

static const SwitchCmd kEurc = {"persist.service.tolk_urc.enable", "+EURC:1\r\n", "+EURC:0\r\n",
                                "+EURC:invalid value.\r\n", "+EURC:(0,1)"};
static const SwitchCmd kTolk = {"persist.service.tolk.usermode", "+TOLK:1\r\n", "+TOLK:0\r\n",
                                "+TOLK:invalid value.\r\n", "+TOLK:(0,1)"};

// A switch takes 0 and 1. Any other whole number is accepted and ignored: stations
// send one to probe the command and expect OK. Text that is no whole number is
// refused like one without digits, and a value the property store did not take is
// an error: the switch did not change.
static int switchSet(const SwitchCmd *sw, const char *param) {
    int value = 0;
    int rc = onlyParamNumber(param, &value, RESPONSE_INVALID);
    if (rc != RESPONSE_OK) return rc;
    if (value != 0 && value != 1) return RESPONSE_OK;
    if (property_set(sw->property, value == 1 ? "1" : "0") != 0) {
        LOGE("set %s to %d failed", sw->property, value);
        return RESPONSE_ERROR;
    }
    return RESPONSE_OK;
}

static int switchHandler(const SwitchCmd *sw, const char *param, int opType, char *response) {
    switch (opType) {
    case AT_READ_OP: {
        char value[PROPERTY_VALUE_MAX];
        property_get(sw->property, value, "0");
        int n = propertyNumber(value);
        snprintf(response, RESPONSE_BUF_SIZE, "%s", n == 1 ? sw->on : (n == 0 ? sw->off : sw->invalid));
        return RESPONSE_OK;
    }
    case AT_TEST_OP:
        writeDataToSerial(sw->range, (int)strlen(sw->range));
        return RESPONSE_OK;
    case AT_SET_OP:
        return switchSet(sw, param);
    default:
        return RESPONSE_ERROR;
    }
}

int pas_eurc_handler(const char *param, int opType, char *response) {
    LOGD("pas_eurc_handler enter with opType: %d", opType);
    return switchHandler(&kEurc, param, opType, response);
}

int pas_tolk_handler(const char *param, int opType, char *response) {
    LOGD("pas_tolk_handler enter with opType: %d", opType);
    return switchHandler(&kTolk, param, opType, response);
}

int pas_vzwtolkcfg_handler(const char *param, int opType, char *response) {
    LOGD("pas_vzwtolkcfg_handler enter with opType: %d", opType);
    switch (opType) {
    case AT_READ_OP:
        snprintf(response, RESPONSE_BUF_SIZE, "%s", gVzwTolkCfg == 1 ? "+VZWTOLKCFG:1\r\n" : "+VZWTOLKCFG:0\r\n");
        return RESPONSE_OK;
    case AT_TEST_OP: {
        static const char kRange[] = "+VZWTOLKCFG:(0,1)";
        writeDataToSerial(kRange, (int)strlen(kRange));
        return RESPONSE_OK;
    }
    case AT_SET_OP: {
        int value = 0;
        if (onlyParamNumber(param, &value, RESPONSE_ERROR) != RESPONSE_OK || (value != 0 && value != 1))
            return RESPONSE_ERROR;
        gVzwTolkCfg = value;
        return RESPONSE_OK;
    }
    default:
        return RESPONSE_ERROR;
    }
}

int pas_cmec_handler(const char *param, int opType, char *response) {
    LOGD("pas_cmec_handler enter with opType: %d", opType);
    switch (opType) {
    case AT_READ_OP:
        snprintf(response, RESPONSE_BUF_SIZE, "+CMEC:%1d,%1d,%1d,%1d\r\n", gCmecConfig[0], gCmecConfig[1],
                 gCmecConfig[2], gCmecConfig[3]);
        return RESPONSE_OK;
    case AT_TEST_OP: {
        static const char kRange[] = "+CMEC:(0-2),(0-2),(0-2),(0-2)";
        writeDataToSerial(kRange, (int)strlen(kRange));
        return RESPONSE_OK;
    }
    case AT_SET_OP: {
        char buf[PARAM_BUF_SIZE];
        char *cursor = copyParam(param, buf, sizeof(buf));
        // All four or nothing: a partial configuration is never applied.
        int values[CMEC_PARAM_COUNT];
        for (int i = 0; i < CMEC_PARAM_COUNT; i++) {
            if (nextParamNumber(&cursor, &values[i], RESPONSE_ERROR) != RESPONSE_OK) return RESPONSE_ERROR;
            if (values[i] < 0 || values[i] > CMEC_MAX_VALUE) return RESPONSE_ERROR;
        }
        if (at_tok_hasmore(&cursor)) return RESPONSE_ERROR;
        for (int i = 0; i < CMEC_PARAM_COUNT; i++) gCmecConfig[i] = values[i];
        return RESPONSE_OK;
    }
    default:
        return RESPONSE_ERROR;
    }
}
