// Moving bytes between the daemon and its targets: sends to the generic service and
// the audio links, and the readers that relay target answers to the host.
#ifndef TOLKD_TARGETS_TARGET_RELAY_H
#define TOLKD_TARGETS_TARGET_RELAY_H

#include <stdbool.h>

extern bool isATCmdInject;

int readDataFromTarget(int target, int *fd);
int readDataFromTargetWithResult(int target, int *fd, char *buf, int size);
void serviceReaderLoop(void);
int serviceReaderLoopWithResult(const char *cmd);
void audioReaderLoop(int target);
int sendDataToGenericService(const char *data);
int sendDataToAudio(const char *data, int len, int target);
// Sends cmd to the generic service and relays its answer to the host, all but
// its final result line, which is stored in finalLine ("OK", "ERROR",
// "+CME ERROR: 3"; empty when the answer had none or the link ended first).
// Returns 0, or -1 when there is no link to the service.
int exchangeWithGenericService(const char *cmd, char *finalLine, int size);

#endif
