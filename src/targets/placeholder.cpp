// Placeholder bodies so the daemon links while the subsystem is being written.
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"
int s_fdRild_command = -1;
int s_fdService_command = -1;
int s_fdAudio_command = -1;
int s_fdAudioExt_command = -1;
bool isATCmdInject = false;
MmiCmdSeq gMmiCmdSeq;
void connectTarget(int) {}
bool isCdmaLteDcSupport(void) { return false; }
int readDataFromTarget(int, int *) { return 0; }
int readDataFromTargetWithResult(int, int *, char *, int) { return 0; }
void serviceReaderLoop(void) {}
int serviceReaderLoopWithResult(const char *) { return -1; }
void audioReaderLoop(int) {}
int sendDataToGenericService(const char *) { return 0; }
int sendDataToAudio(const char *, int, int) { return 0; }
void mmiCmdSeqReset(void) {}
void mmiCmdSeqEnQueue(void) {}
bool mmiCmdSeqDeQueue(void) { return false; }
void sendCusMMICmdRspToMMI(const char *) {}
