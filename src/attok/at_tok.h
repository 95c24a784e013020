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

// Whole-number readers for host parameters. The token is read as above (a quoted
// number is a number), but it must hold one decimal number and nothing else but
// blanks around it, within the range of the type. On success the value is stored
// and 0 returned; on failure nothing is stored and the result tells why:
#define AT_TOK_EMPTY (-1)      // no token left, or one of blanks only
#define AT_TOK_NO_NUMBER (-2)  // text that does not begin with a number ("abc", "+")
#define AT_TOK_NOT_WHOLE (-3)  // a number followed by other text, or beyond the type's range
int at_tok_nextint_strict(char **cursor, int *out);
int at_tok_nextint64_strict(char **cursor, int64_t *out);
int at_tok_hasmore(char **cursor);
void convertToUpperCase(char *line, char stop);
int trim_string(char **cursor);

#endif
