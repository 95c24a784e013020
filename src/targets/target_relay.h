// Moving bytes between the daemon and its targets: sends to the generic service and
// the audio links, and the readers that relay target answers to the host.
#ifndef TOLKD_TARGETS_TARGET_RELAY_H
#define TOLKD_TARGETS_TARGET_RELAY_H

#include <stdbool.h>

extern bool isATCmdInject;

// Serves one readable target link: the modem pair and the generic service link
// relay every complete answer (modem_link.h, generic_link.h), an audio link its
// answer (audioReaderLoop).
int readDataFromTarget(int target, int *fd);
// Waits for the generic service's answer to the command just sent and relays it.
void serviceReaderLoop(void);
// Waits for an audio link's answer and relays all of it.
void audioReaderLoop(int target);
// Sends a command text to the generic service; 0, or -1 when it could not go out
// (the broken link is then closed).
int sendDataToGenericService(const char *data);
int sendDataToAudio(const char *data, int len, int target);
// A target link ended: while a modem command is outstanding the host is told
// "ERROR:UE is not ready", once. Returns true when it was.
bool reportUeNotReady(void);
// Sends cmd to the generic service and relays its answer to the host, all but
// its final result line, which is stored in finalLine ("OK", "ERROR",
// "+CME ERROR: 3"; empty when the answer had none or the link ended first).
// Returns 0, or -1 when there is no link to the service.
int exchangeWithGenericService(const char *cmd, char *finalLine, int size);

#endif
