// AT%REBOOT, and the power requests it shares with the factory power-off.
#include <stddef.h>

#include <cutils/properties.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

// init carries out a reboot or power-off written here: a vendor daemon may not run
// the system's shell tools, and init is the one process that shuts the device
// down in order. init acknowledges the request before it begins to stop the
// services, so the answer written right after a successful request still reaches
// the host; a refused request is reported instead of a success that never happens.
int requestPowerAction(const char *action) {
    if (property_set(POWERCTL_PROPERTY, action) != 0) {
        LOGE("%s=%s refused", POWERCTL_PROPERTY, action);
        return -1;
    }
    LOGI("%s=%s", POWERCTL_PROPERTY, action);
    return 0;
}

int pas_reboot_handler(const char *param, int opType, char *response) {
    (void)response;
    LOGD("handle cmdline:%s", param != NULL ? param : "");
    if (opType != AT_ACTION_OP) return RESPONSE_ERROR;
    return requestPowerAction(POWER_ACTION_REBOOT) == 0 ? RESPONSE_OK : RESPONSE_ERROR;
}
