// Terminal commands: echo control (ATE0, ATE1, ATQ0V1E) and the commands that the
// daemon refuses itself instead of forwarding them (AT#CLS, AT+GCI, AT%WLAN,
// AT%WLANT, AT%WLANR, AT%MAC, AT%MACCK).
#include <stddef.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"

int pas_echo_handler(const char *param, int opType, char *response) {
    (void)opType;
    (void)response;
    const char *line = param != NULL ? param : "";
    LOGD("cmdline %s", line);

    int dev = gSerialDevice.currDevice;
    int value = (dev >= 0 && dev < DEVICE_COUNT) ? gSerialDevice.echoOption[dev] : 0;
    // The digit after the first "E" selects the setting; ATQ0V1E ends in its
    // "E" and so re-applies the current one.
    for (const char *p = line; *p != '\0'; p++) {
        if (*p == 'E' || *p == 'e') {
            if (p[1] != '\0') value = p[1] - '0';
            break;
        }
    }
    if (value != 0 && value != 1) return RESPONSE_ERROR;
    setEchoOption(value);
    return RESPONSE_OK;
}

// Answers ERROR for every form its rows accept; the forms they do not accept
// get "Not Implement" from the dispatcher.
int pas_modem_handler(const char *param, int opType, char *response) {
    (void)param;
    (void)opType;
    (void)response;
    return RESPONSE_ERROR;
}
