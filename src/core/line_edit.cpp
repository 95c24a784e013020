// Backspace editing of host lines. A station may type and correct a command by hand;
// the device maker's binary test frames pass through the same filter and must not be
// shifted by a 0x08 byte inside them.
#include "core/line_edit.h"

#include <string.h>

#define BACKSPACE 0x08

int applyBackspaces(char *line, int n) {
    if (line == NULL || n <= 0) return n < 0 ? 0 : n;
    const int textLen = (int)strnlen(line, (size_t)n);
    int kept = 0;
    for (int i = 0; i < textLen; i++) {
        if (line[i] == BACKSPACE) {
            if (kept > 0) kept--;
        } else {
            line[kept++] = line[i];
        }
    }
    if (kept == textLen) return n;
    line[kept] = '\0';
    // A raw frame keeps its length and every byte after its first NUL.
    if (textLen < n) return n;
    memset(line + kept, 0, (size_t)(n - kept + 1));
    return kept;
}
