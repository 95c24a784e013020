// Parameter tokenizer. The cursor walks a caller-owned line; each token is cut out in
// place by writing a NUL over the comma or quote that ends it, so a line can be
// tokenized once. A NULL cursor means the line is used up.
#include "attok/at_tok.h"

#include <ctype.h>
#include <errno.h>
#include <limits.h>
#include <stdint.h>
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
// *whole, when given, becomes false for a quoted token whose closing quote is
// missing or followed by other text than blanks before the next comma.
static char *nextTok(char **cursor, bool *whole = NULL) {
    if (cursor == NULL || *cursor == NULL) return NULL;
    char *p = *cursor;
    while (*p != '\0' && isspace((unsigned char)*p)) p++;

    if (*p == '"') {
        char *token = p + 1;
        char *close = strchr(token, '"');
        if (close == NULL) {
            if (whole != NULL) *whole = false;
            *cursor = NULL;
            return token;
        }
        *close = '\0';
        // Whatever stands between the closing quote and the next comma is skipped.
        char *rest = close + 1;
        char *comma = strchr(rest, ',');
        for (char *q = rest; whole != NULL && *q != '\0' && q != comma; q++) {
            if (!isspace((unsigned char)*q)) *whole = false;
        }
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

// The token as one whole decimal number between min and max.
static int wholeNumber(char **cursor, long long min, long long max, long long *value) {
    bool whole = true;
    char *token = nextTok(cursor, &whole);
    if (token == NULL) return AT_TOK_EMPTY;
    while (isspace((unsigned char)*token)) token++;
    if (*token == '\0') return AT_TOK_EMPTY;
    char *end = NULL;
    errno = 0;
    const long long v = strtoll(token, &end, 10);
    if (end == token) return AT_TOK_NO_NUMBER;
    while (isspace((unsigned char)*end)) end++;
    if (!whole || *end != '\0' || errno == ERANGE || v < min || v > max) return AT_TOK_NOT_WHOLE;
    *value = v;
    return 0;
}

int at_tok_nextint_strict(char **cursor, int *out) {
    long long v = 0;
    int rc = wholeNumber(cursor, INT_MIN, INT_MAX, &v);
    if (rc == 0 && out != NULL) *out = (int)v;
    return rc;
}

int at_tok_nextint64_strict(char **cursor, int64_t *out) {
    long long v = 0;
    int rc = wholeNumber(cursor, INT64_MIN, INT64_MAX, &v);
    if (rc == 0 && out != NULL) *out = (int64_t)v;
    return rc;
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
