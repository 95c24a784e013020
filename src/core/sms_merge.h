// SMS commands that take a text body after a "> " prompt: recognition, the message
// format of AT+CMGF, and merging the body into one command for operator OP12.
#ifndef TOLKD_CORE_SMS_MERGE_H
#define TOLKD_CORE_SMS_MERGE_H

#include <stdbool.h>
#include "serial/serial_device.h"

extern bool isNeedMergeMsgCmdInput;
extern int msgCmdMode;

int isMsgCmd(const char *line);
int getMsgCmdParameterCount(const char *line);
int startMergeMsgCmdInputIfNeed(SerialDevice *dev, const char *line);
// Reader side: puts a text line (n bytes in lineBuf) or the merged command into cmdBuf.
char *handleMsgTextLine(SerialDevice *dev, char *lineBuf, int n);
// Routing side: prompt for more text, or send the text line / merged command;
// its answer goes to origin.
void routeMsgTextLine(SerialDevice *dev, const HostLink *origin);

#endif
