// Parsing a command line once: its command name for the exact-match tables, its
// operation form for the rows' masks, and the parameter text for the handlers.
#include "dispatch/command_line.h"

#include <string.h>

void parseCommandLine(CommandLine *cmd, char *text, int len, const HostLink *origin) {
    static char empty[1] = "";
    cmd->text = text != NULL ? text : empty;
    cmd->len = len;
    // A name too long for the tables matches no row, never a truncated one.
    if (getCmdName(cmd->text, cmd->name, (int)sizeof(cmd->name)) != 0) cmd->name[0] = '\0';
    // getAtOp moves the cursor past "=" for a set form; it writes nothing.
    char *cursor = cmd->text;
    cmd->op = getAtOp(&cursor);
    cmd->param = cursor != NULL ? cursor : cmd->text;
    cmd->origin = origin != NULL ? *origin : currentHostLink();
}
