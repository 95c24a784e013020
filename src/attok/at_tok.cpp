// Parameter tokenizer. The cursor walks a caller-owned line; each token is cut out in
// place by writing a NUL over the comma or quote that ends it, so a line can be
// tokenized once. A NULL cursor means the line is used up.
#include "attok/at_tok.h"

#include <ctype.h>
#include <stdlib.h>
#include <string.h>

int at_tok_start_flag(char **cursor, char c) {
    if (cursor == NULL || *cursor == NULL) return -1;
    // Searching for NUL would "find" the terminator and leave the cursor past the end.
    char *found = c != '\0' ? strchr(*cursor, c) : NULL;
    if (found == NULL) {
        *cursor = NULL;
        return -1;
    }
    *cursor = found + 1;
    return 0;
}

// Cuts the next token out of the line and returns it, or NULL for a used-up cursor.
static char *nextTok(char **cursor) {
    if (cursor == NULL || *cursor == NULL) return NULL;
    char *p = *cursor;
    while (*p != '\0' && isspace((unsigned char)*p)) p++;

    if (*p == '"') {
        char *token = p + 1;
        char *close = strchr(token, '"');
        if (close == NULL) {
            *cursor = NULL;
            return token;
        }
        *close = '\0';
        // Whatever stands between the closing quote and the next comma is skipped.
        char *rest = close + 1;
        char *comma = strchr(rest, ',');
        *cursor = comma != NULL ? comma + 1 : rest + strlen(rest);
        return token;
    }

    char *comma = strchr(p, ',');
    if (comma != NULL) {
        *comma = '\0';
        *cursor = comma + 1;
    } else {
        *cursor = NULL;
    }
    return p;
}

int at_tok_nextint(char **cursor, int *out) {
    char *token = nextTok(cursor);
    if (token == NULL) return -1;
    char *end = NULL;
    const long value = strtol(token, &end, 10);
    // Values wider than an int keep their low 32 bits.
    const int cut = (int)(unsigned int)(unsigned long)value;
    if (out != NULL) *out = cut;
    return end == token ? -1 : 0;
}

int at_tok_nextint64(char **cursor, int64_t *out) {
    char *token = nextTok(cursor);
    if (token == NULL) return -1;
    char *end = NULL;
    const long long value = strtoll(token, &end, 10);
    if (out != NULL) *out = (int64_t)value;
    return end == token ? -1 : 0;
}

int at_tok_nextstr(char **cursor, char **out) {
    char *token = nextTok(cursor);
    if (token == NULL) return -1;
    if (out != NULL) *out = token;
    return 0;
}

int at_tok_hasmore(char **cursor) {
    return cursor != NULL && *cursor != NULL && **cursor != '\0' ? 1 : 0;
}
