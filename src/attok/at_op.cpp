// The operation-form classifier: which form of a command the host used (basic,
// action, read, test or set), as one bit so that command tables can hold a mask.
#include <ctype.h>
#include <stdlib.h>
#include <string.h>

#include "attok/at_tok.h"

AtOpType getAtOp(char **cursor) {
    if (cursor == NULL || *cursor == NULL) return AT_NONE_OP;
    const size_t len = strlen(*cursor);
    char *line = (char *)calloc(len + 1, 1);
    if (line == NULL) return AT_NONE_OP;
    memcpy(line, *cursor, len);

    AtOpType op;
    if (len < 2) {
        op = AT_NONE_OP;
    } else if (len == 2 || isalpha((unsigned char)line[2])) {
        // "AT", or a basic command letter right after it (ATE0, ATQ0V1E).
        op = AT_BASIC_OP;
    } else if (strstr(line, "=?") != NULL) {
        op = AT_TEST_OP;
    } else if (strchr(line, '?') != NULL) {
        // A "?" anywhere, even inside a parameter, outranks the "=".
        op = AT_READ_OP;
    } else if (strchr(line, '=') != NULL) {
        op = AT_SET_OP;
        // The caller goes on with the parameter text.
        (void)at_tok_start_flag(cursor, '=');
    } else {
        op = AT_ACTION_OP;
    }
    free(line);
    return op;
}
