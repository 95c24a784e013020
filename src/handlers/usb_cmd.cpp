// USB commands: AT%USBTETHERING switches the persistent tethering flag, and
// AT@USBCONFIG reads or sets sys.usb.config, the list of USB functions.
#include <ctype.h>
#include <cutils/properties.h>
#include <stdio.h>
#include <string.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handler_util.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

#define USB_TETHERING_PROPERTY "persist.service.usbtethering"
#define USB_CONFIG_PROPERTY "sys.usb.config"
// A property value holds at most this many characters.
#define USB_CONFIG_MAX_LEN (PROPERTY_VALUE_MAX - 1)

int pas_usbTethering_handler(const char *param, int opType, char *response) {
    LOGD("handle cmdline:%s", param != NULL ? param : "");
    switch (opType) {
    case AT_READ_OP: {
        char value[PROPERTY_VALUE_MAX];
        property_get(USB_TETHERING_PROPERTY, value, "0");
        snprintf(response, RESPONSE_BUF_SIZE, "%s",
                 propertyNumber(value) == 1 ? "+USBTETHERING:1\r\n" : "+USBTETHERING:0\r\n");
        return RESPONSE_OK;
    }
    case AT_SET_OP: {
        int value = 0;
        int rc = onlyParamNumber(param, &value, RESPONSE_ERROR);
        if (rc != RESPONSE_OK) return rc;
        if (value != 0 && value != 1) return RESPONSE_ERROR;
        // A flag the property store did not take was not switched.
        if (property_set(USB_TETHERING_PROPERTY, value == 1 ? "1" : "0") != 0) {
            LOGE("set %s to %d failed", USB_TETHERING_PROPERTY, value);
            return RESPONSE_ERROR;
        }
        LOGD("set usbTethering to %d", value);
        return RESPONSE_OK;
    }
    default:
        return RESPONSE_ERROR;
    }
}

// The function list as the property wants it: lower case, without blanks, line
// feeds or quotes, from at most the first 91 characters of the parameter.
static size_t buildUsbConfig(const char *param, char *out, size_t size) {
    size_t n = 0;
    for (size_t i = 0; i < USB_CONFIG_MAX_LEN && param[i] != '\0' && n + 1 < size; i++) {
        char c = param[i];
        if (c == '\n' || c == ' ' || c == '"' || c == '\'') continue;
        out[n++] = (char)tolower((unsigned char)c);
    }
    out[n] = '\0';
    return n;
}

// Both answers carry their own final line; the dispatcher's result follows.
int pas_usbconfig_handler(const char *param, int opType, char *response) {
    const char *text = param != NULL ? param : "";
    LOGD("handle cmdline:%s", text);
    switch (opType) {
    case AT_READ_OP: {
        LOGD("opType = AT_READ_OP");
        char config[PROPERTY_VALUE_MAX];
        property_get(USB_CONFIG_PROPERTY, config, "");
        int length = (int)strlen(config);
        if (length >= 1) {
            LOGD("get %s property successful, config=%s, length=%d are decent", USB_CONFIG_PROPERTY, config, length);
            snprintf(response, RESPONSE_BUF_SIZE, "\r\n@USBCONFIG: \"%s\"\r\n\r\nOK\r\n", config);
            return RESPONSE_OK;
        }
        LOGD("get %s property fail, config=%s, length=%d is abnormal", USB_CONFIG_PROPERTY, config, length);
        snprintf(response, RESPONSE_BUF_SIZE, "\r\n@USBCONFIG: \"%s\"\r\n\r\nERROR\r\n", config);
        return RESPONSE_ERROR;
    }
    case AT_SET_OP: {
        LOGD("opType = AT_SET_OP");
        char config[PROPERTY_VALUE_MAX];
        size_t length = buildUsbConfig(text, config, sizeof(config));
        LOGD("reads cmdline as config: %s", config);
        if (length == 0) {
            LOGD("skip setting %s property due to length=%d is abnormal", USB_CONFIG_PROPERTY, (int)length);
            snprintf(response, RESPONSE_BUF_SIZE, "\r\n%d\r\nERROR\r\n\r\n", -1);
            return RESPONSE_ERROR;
        }
        int rc = property_set(USB_CONFIG_PROPERTY, config);
        if (rc != 0) {
            LOGD("set %s property failed, length=%d is abnormal", USB_CONFIG_PROPERTY, rc);
            snprintf(response, RESPONSE_BUF_SIZE, "\r\n@USBCONFIG=\"%s\"\r\n\r\nERROR\r\n", config);
            return RESPONSE_ERROR;
        }
        LOGD("set %s successful", USB_CONFIG_PROPERTY);
        snprintf(response, RESPONSE_BUF_SIZE, "\r\n@USBCONFIG=\"%s\"\r\n\r\nOK\r\n", config);
        return RESPONSE_OK;
    }
    default:
        return RESPONSE_ERROR;
    }
}
