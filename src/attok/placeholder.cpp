// Placeholder bodies so the daemon links while the subsystem is being written.
#include "attok/at_tok.h"
AtOpType getAtOp(char **) { return AT_NONE_OP; }
int at_tok_start_flag(char **, char) { return -1; }
int at_tok_nextint(char **, int *) { return -1; }
int at_tok_nextint64(char **, int64_t *) { return -1; }
int at_tok_nextstr(char **, char **) { return -1; }
int at_tok_hasmore(char **) { return 0; }
void convertToUpperCase(char *, char) {}
int trim_string(char **) { return 0; }
