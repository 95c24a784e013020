// The command tables and the dispatcher that gives every command line its type,
// running the local handlers on the way.
#ifndef TOLKD_DISPATCH_DISPATCHER_H
#define TOLKD_DISPATCH_DISPATCHER_H

#include "dispatch/command_type.h"

#define CMD_NAME_SIZE 32
#define RESPONSE_BUF_SIZE 2048

// A local handler: parameter text, operation form, 2048-byte response buffer.
typedef int (*CmdHandler)(const char *param, int opType, char *response);

typedef struct CustomCmd {
    char cmdName[CMD_NAME_SIZE];
    unsigned int supportOp;
    CmdHandler handler;
} CustomCmd;

typedef struct NamedCmd {
    char cmdName[CMD_NAME_SIZE];
} NamedCmd;

typedef struct RilMmiCmd {
    char cmdName[CMD_NAME_SIZE];
    unsigned int supportOp;
} RilMmiCmd;

typedef struct DestCmd {
    char cmdName[CMD_NAME_SIZE];
    int dest;
} DestCmd;

struct CommandLine;

// The CommandType of a parsed command line; local commands are answered on the way.
int dispatchCommandLine(const struct CommandLine *cmd);
// The same for a line as it is (parsed here, origin the current line's link).
int process_cmd_line(const char *line);
int ril_command_hdlr(const struct CommandLine *cmd);
int custom_command_hdlr(const struct CommandLine *cmd);
int generic_command_hdlr(const struct CommandLine *cmd);
int audio_command_hdlr(const char *line);
int belvo_audio_command_hdlr(const char *line);

// Copies the command name (the line up to the first "=" or "?") into out;
// returns 0, or -1 when it does not fit (which counts as no match).
int getCmdName(const char *line, char *out, int size);

#endif
