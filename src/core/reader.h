// The main loop of the daemon: the reading half (readline) and the routing half.
#ifndef TOLKD_CORE_READER_H
#define TOLKD_CORE_READER_H

#include <stdbool.h>
#include "serial/serial_device.h"

extern int tolk_conn_mode;
extern bool isMsgCmdInput;

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

#endif
