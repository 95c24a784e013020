// Normalisation of a command line before dispatch: the command word is upper-cased
// (parameters keep their case) and blanks around the line are cut.
#include <ctype.h>
#include <string.h>

#include "attok/at_tok.h"

void convertToUpperCase(char *line, char stop) {
    if (line == NULL) return;
    for (char *p = line; *p != '\0' && *p != stop; p++) {
        *p = (char)toupper((unsigned char)*p);
    }
}

int trim_string(char **cursor) {
    if (cursor == NULL || *cursor == NULL) return 0;
    // Only the space character: tabs, CR and LF are left to the callers.
    char *start = *cursor;
    while (*start == ' ') start++;
    *cursor = start;
    size_t len = strlen(start);
    while (len > 0 && start[len - 1] == ' ') len--;
    start[len] = '\0';
    return (int)len;
}
