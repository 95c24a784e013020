// The links to the targets of forwarded commands. The modem link is a socket pair
// inside the daemon (the radio HAL bridge writes the modem's output into its far
// end); the others are client connections to services in the reserved namespace.
#include "targets/target_conn.h"

#include <errno.h>
#include <stdlib.h>
#include <sys/socket.h>

#include <cutils/properties.h>
#include <cutils/sockets.h>

#include "core/prop_number.h"
#include "core/tolkd_log.h"
#include "dispatch/command_type.h"
#include "hal/tolkd_adaptation.h"
#include "targets/modem_link.h"

int s_fdRild_command = -1;
int s_fdService_command = -1;
int s_fdAudio_command = -1;
int s_fdAudioExt_command = -1;

void connectTarget(int target) {
    LOGD("Enter");
    switch (target) {
    case RIL_TYPE: {
        if (s_fdRild_command != -1) break;
        int fds[2];
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds) < 0) {
            LOG_RAW(LOG_LVL_ERROR, TOLKD_LOG_TAG, "socketpair failed. errno:%d", errno);
            s_fdRild_command = -1;
            break;
        }
        s_fdRild_command = fds[0];
        // A record half read from the old pair is lost with it.
        modemLinkReset();
        // The bridge closes the end of the previous pair it held, if any.
        setSocketFdForAdaptation(fds[1]);
        break;
    }
    case AUDIO_TYPE:
    case BELVO_AUDIO_TYPE:
        s_fdAudio_command = socket_local_client(TOLK_AUDIO_SOCKET, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM);
        if (s_fdAudio_command < 0) {
            LOG_RAW(LOG_LVL_ERROR, TOLKD_LOG_TAG, "fail to open tolk audio socket. errno:%d", errno);
        }
        break;
    case GENERIC_TYPE:
        s_fdService_command =
            socket_local_client(TOLK_SERVICE_SOCKET, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM);
        if (s_fdService_command < 0) {
            LOG_RAW(LOG_LVL_ERROR, TOLKD_LOG_TAG, "fail to open tolk generic socket. errno:%d", errno);
        }
        break;
    case AUDIO_EXT_TYPE:
        s_fdAudioExt_command =
            socket_local_client(TOLK_AUDIO_EXT_SOCKET, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM);
        if (s_fdAudioExt_command < 0) {
            LOG_RAW(LOG_LVL_ERROR, TOLKD_LOG_TAG, "fail to open tolk audio external socket. errno:%d", errno);
        }
        break;
    default:
        break;
    }
}

bool isCdmaLteDcSupport(void) {
    char value[PROPERTY_VALUE_MAX] = {0};
    property_get("ro.boot.opt_c2k_lte_mode", value, "0");
    int mode = propertyNumber(value);
    LOGD("isC2kLteSupport: %d", mode);
    return mode != 0;
}
