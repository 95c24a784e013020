// A command line parsed once, after the reader accepted it and routing normalised
// it, into what dispatch, routing, the targets and the answer need; every stage
// works on this record instead of copying and classifying the line again.
#ifndef TOLKD_DISPATCH_COMMAND_LINE_H
#define TOLKD_DISPATCH_COMMAND_LINE_H

#include "attok/at_tok.h"
#include "dispatch/dispatcher.h"
#include "serial/serial_device.h"

typedef struct CommandLine {
    char *text;                // the line, NUL-terminated (in cmdBuf)
    int len;                   // its byte count as read (audio commands go out with it)
    char name[CMD_NAME_SIZE];  // up to the first "=" or "?"; "" when too long for a name
    AtOpType op;               // its operation form
    const char *param;         // for a set form the text after "=", else the whole line
    HostLink origin;           // the host link that sent it, where its answer goes
} CommandLine;

// Fills cmd from text (len bytes as read), which stays owned by the caller and
// must outlive cmd.
void parseCommandLine(CommandLine *cmd, char *text, int len, const HostLink *origin);

#endif
