// AT%REBOOT: restart the device a few seconds after the answer has gone out.
#include <stdlib.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

int pas_reboot_handler(const char *param, int opType, char *response) {
    (void)response;
    LOGD("handle cmdline:%s", param != NULL ? param : "");
    if (opType != AT_ACTION_OP) return RESPONSE_ERROR;
    // The delay lets the OK reach the host before the shutdown starts; the exit
    // status of the shell says nothing the host could act on.
    int status = system("shutdown -r -t 3");
    (void)status;
    return RESPONSE_OK;
}
