// AT+ESUO: which SIM slot, and so which modem protocol instance, receives the
// commands forwarded to the modem. The choice lives in persist.service.tolk.sim,
// which the radio bridge consults for every request.
#include <cutils/properties.h>
#include <stdio.h>
#include <string.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handler_util.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"
#include "targets/target_conn.h"

#define TOLK_SIM_PROPERTY "persist.service.tolk.sim"

static int esuoRead(char *response) {
    char value[PROPERTY_VALUE_MAX];
    property_get(TOLK_SIM_PROPERTY, value, "0");
    const char *answer;
    switch (propertyNumber(value)) {
    case 0: answer = "+ESUO:4\r\n"; break;
    case 1: answer = "+ESUO:5\r\n"; break;
    case 2: answer = "+ESUO:6\r\n"; break;
    case 3: answer = "+ESUO:7\r\n"; break;
    case 9: answer = "+ESUO:9\r\n"; break;
    default: answer = "+ESUO:Value unsupport\r\n"; break;
    }
    snprintf(response, RESPONSE_BUF_SIZE, "%s", answer);
    return RESPONSE_OK;
}

static int esuoTest(const char *multiSim) {
    const char *answer = "+ESUO: (4-5)";
    if (strcmp(multiSim, "ss") == 0) answer = "+ESUO: (4)";
    else if (strcmp(multiSim, "tsts") == 0) answer = "+ESUO: (4-6)";
    writeDataToSerial(answer, (int)strlen(answer));
    return RESPONSE_OK;
}

// Stores the slot choice; a choice the property store did not take is an error,
// since the modem commands would still go to the old slot.
static int setSimProperty(const char *slot) {
    if (property_set(TOLK_SIM_PROPERTY, slot) != 0) {
        LOGE("set %s to %s failed", TOLK_SIM_PROPERTY, slot);
        return RESPONSE_ERROR;
    }
    return RESPONSE_OK;
}

// In C2K mode the first modem serves SIM 1 and SIM 2 and the third modem (9)
// is the CDMA side; there is no SIM 3.
static int esuoSetC2k(int value) {
    LOGD("C2K mode");
    switch (value) {
    case 9:
        LOGD("C2K, setSocket to MD3");
        return setSimProperty("9");
    case 5:
        LOGD("Set default to SIM2, setSocket to MD1");
        return setSimProperty("1");
    case 4:
        LOGD("Set default to SIM1, setSocket to MD1");
        return setSimProperty("0");
    default:
        return RESPONSE_ERROR;
    }
}

static int esuoSet(const char *multiSim, int value) {
    switch (value) {
    case 4:
        LOGD("Set default to SIM1");
        return setSimProperty("0");
    case 5:
        if (strcmp(multiSim, "ss") == 0) {
            LOGD("Error single SIM.");
            return RESPONSE_ERROR;
        }
        LOGD("Set default to SIM2");
        return setSimProperty("1");
    case 6:
        if (strcmp(multiSim, "tsts") == 0) {
            LOGD("Set default to SIM3");
            return setSimProperty("2");
        }
        LOGD("Error: Not triple SIM.");
        return RESPONSE_ERROR;
    case 9:
        return RESPONSE_ERROR;
    default:
        LOGD("Error: not supported SIM Id.");
        return RESPONSE_ERROR;
    }
}

int pas_esuo_handler(const char *param, int opType, char *response) {
    char multiSim[PROPERTY_VALUE_MAX];
    property_get("persist.radio.multisim.config", multiSim, "dsds");
    LOGD("pas_esuo_handler enter with opType: %d, multiSIM: %s", opType, multiSim);

    switch (opType) {
    case AT_READ_OP:
        return esuoRead(response);
    case AT_TEST_OP:
        return esuoTest(multiSim);
    case AT_SET_OP: {
        int value = 0;
        int rc = onlyParamNumber(param, &value, RESPONSE_ERROR);
        if (rc != RESPONSE_OK) return rc;
        if (isCdmaLteDcSupport()) return esuoSetC2k(value);
        return esuoSet(multiSim, value);
    }
    default:
        return RESPONSE_ERROR;
    }
}
