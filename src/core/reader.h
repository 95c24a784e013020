// The main loop of the daemon: the reading half (readline) and the routing half.
#ifndef TOLKD_CORE_READER_H
#define TOLKD_CORE_READER_H

#include <stdbool.h>
#include "serial/serial_device.h"

extern int tolk_conn_mode;
extern bool isMsgCmdInput;
// The SMS text phase now in progress (or the last one): each SMS command that
// takes text starts a new one, so that a late final result of an earlier message
// cannot end it.
extern unsigned msgTextPhase;
// Set when an SMS command line starts a text phase: a lone LF read next is the
// second half of that line's CR LF, not an empty line of the message.
extern bool msgCmdLfPending;
// The reader kept the current line as typed (a device-maker audio command):
// routing must not change its case or blanks.
extern bool lineKeptAsTyped;

// Never returns.
void readerLoop(SerialDevice *dev);
// One reading cycle: returns cmdBuf holding a complete line, or NULL.
char *readline(SerialDevice *dev);
int adb_socket_accept(int listenFd);
int adb_socket_listen(int fd);
int getBootMode(void);
// Routes one line that readline produced (the routing half of one loop pass).
void routeCommandLine(SerialDevice *dev, char *line);
// What readerLoop does once before its first wait: SIGPIPE handler, operator code,
// PCT mode property.
void readerLoopPreamble(void);
// Forgets an adb line that is still being assembled (its connection is gone).
void discardAdbLine(void);
// Ends the SMS text phase, and the merging of its text, whatever it was doing.
void endMsgTextPhase(void);
// Ends the text phase when phase is the current one (TEXT_PHASE_ANY: any).
void msgTextPhaseEndedBy(unsigned phase);

#endif
