// Placeholder bodies so the daemon links while the subsystem is being written.
#include "core/reader.h"
#include "core/sms_merge.h"
int tolk_conn_mode = 1;
bool isMsgCmdInput = false;
bool isNeedMergeMsgCmdInput = false;
int msgCmdMode = 0;
void readerLoop(SerialDevice *) { for (;;) {} }
char *readline(SerialDevice *) { return nullptr; }
int adb_socket_accept(int) { return -1; }
int adb_socket_listen(int) { return 3; }
int getBootMode(void) { return -1; }
void routeCommandLine(SerialDevice *, char *) {}
int isMsgCmd(const char *) { return 0; }
int getMsgCmdParameterCount(const char *) { return 0; }
int startMergeMsgCmdInputIfNeed(SerialDevice *, const char *) { return 0; }
char *handleMsgTextLine(SerialDevice *, char *, int) { return nullptr; }
void routeMsgTextLine(SerialDevice *) {}
void applyBackspaces(char *) {}
