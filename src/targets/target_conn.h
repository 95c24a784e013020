// The links to the services that answer forwarded commands: one descriptor global
// per link (-1 when closed) and connectTarget, the one operation that opens a link.
#ifndef TOLKD_TARGETS_TARGET_CONN_H
#define TOLKD_TARGETS_TARGET_CONN_H

#include <stdbool.h>

#define TOLK_SERVICE_SOCKET "tolk-service"
#define TOLK_AUDIO_SOCKET "tolk-audio"
#define TOLK_AUDIO_EXT_SOCKET "rild-tolk-md2"

extern int s_fdRild_command;
extern int s_fdService_command;
extern int s_fdAudio_command;
extern int s_fdAudioExt_command;

// Opens the link of a target (a CommandType value): a new modem socket pair, or a
// client connection to the generic, audio or second-modem audio service.
void connectTarget(int target);
// True when the C2K/LTE dual-connection mode is on (ro.boot.opt_c2k_lte_mode).
bool isCdmaLteDcSupport(void);

#endif
