// AT text utilities: case and blank normalisation, the operation-form classifier
// and the parameter tokenizer. All work on a caller-owned, mutable, NUL-terminated line.
#ifndef TOLKD_ATTOK_AT_TOK_H
#define TOLKD_ATTOK_AT_TOK_H

#include <stdint.h>

#define AT_NONE_OP 1
#define AT_BASIC_OP 2
#define AT_ACTION_OP 4
#define AT_READ_OP 8
#define AT_TEST_OP 16
#define AT_SET_OP 32
typedef int AtOpType;

AtOpType getAtOp(char **cursor);
int at_tok_start_flag(char **cursor, char c);
int at_tok_nextint(char **cursor, int *out);
int at_tok_nextint64(char **cursor, int64_t *out);
int at_tok_nextstr(char **cursor, char **out);
int at_tok_hasmore(char **cursor);
void convertToUpperCase(char *line, char stop);
int trim_string(char **cursor);

#endif
