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

// A set value other than 0 or 1 is accepted and ignored: stations send it to
// probe the command and expect OK.
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
    case AT_SET_OP: {
        char buf[PARAM_BUF_SIZE];
        char *cursor = copyParam(param, buf, sizeof(buf));
        int value = 0;
        if (at_tok_nextint(&cursor, &value) < 0) return RESPONSE_INVALID;
        if (value == 0) property_set(sw->property, "0");
        else if (value == 1) property_set(sw->property, "1");
        return RESPONSE_OK;
    }
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
        char buf[PARAM_BUF_SIZE];
        char *cursor = copyParam(param, buf, sizeof(buf));
        int value = 0;
        if (at_tok_nextint(&cursor, &value) < 0 || (value != 0 && value != 1)) return RESPONSE_ERROR;
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
            if (at_tok_nextint(&cursor, &values[i]) < 0) return RESPONSE_ERROR;
            if (values[i] < 0 || values[i] > CMEC_MAX_VALUE) return RESPONSE_ERROR;
        }
        for (int i = 0; i < CMEC_PARAM_COUNT; i++) gCmecConfig[i] = values[i];
        return RESPONSE_OK;
    }
    default:
        return RESPONSE_ERROR;
    }
}
