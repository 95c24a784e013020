// Tokenizer and operation classifier on arbitrary lines: normalisation, the form
// classifier and every token reader, in the order the handlers use them. Beyond the
// sanitizers, the cursors must stay inside the line and every loop must progress.
#include <stdint.h>
#include <stdlib.h>
#include <string.h>

#include "attok/at_tok.h"
#include "fuzz_env.h"

namespace {

// A fresh heap copy of exactly len + 1 bytes, so any read past the NUL is caught.
char *copyLine(const uint8_t *data, size_t len) {
    char *line = static_cast<char *>(malloc(len + 1));
    memcpy(line, data, len);
    line[len] = '\0';
    return line;
}

void check(bool ok) {
    if (!ok) abort();
}

bool inside(const char *p, const char *line, size_t len) { return p == nullptr || (p >= line && p <= line + len); }

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    fuzzenv::init();
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    // The first byte picks the token readers; the rest is the line.
    uint8_t pick = size > 0 ? data[0] : 0;
    const uint8_t *text = size > 0 ? data + 1 : data;
    size_t len = size > 0 ? size - 1 : 0;

    // Normalisation as routing does it.
    char *line = copyLine(text, len);
    size_t textLen = strlen(line);
    convertToUpperCase(line, '=');
    check(strlen(line) == textLen);
    char *cursor = line;
    int trimmed = trim_string(&cursor);
    check(inside(cursor, line, textLen) && trimmed >= 0 && (size_t)trimmed == strlen(cursor));
    check(trimmed == 0 || (cursor[0] != ' ' && cursor[trimmed - 1] != ' '));

    // The form classifier, then the parameters of a set form.
    char *work = cursor;
    AtOpType op = getAtOp(&work);
    check(op == AT_NONE_OP || op == AT_BASIC_OP || op == AT_ACTION_OP || op == AT_READ_OP || op == AT_TEST_OP ||
          op == AT_SET_OP);
    check(inside(work, line, textLen));
    if (op != AT_SET_OP) {
        work = cursor;
        at_tok_start_flag(&work, (char)(pick & 0x80 ? ':' : '='));
    }
    for (int guard = 0; at_tok_hasmore(&work); guard++) {
        // Every token read consumes at least one byte, so a line of n bytes ends
        // within n + 1 reads.
        check(guard <= (int)textLen + 1);
        char *before = work;
        switch ((pick >> (2 * (guard % 3))) & 3) {
        case 0: {
            int v;
            at_tok_nextint(&work, &v);
            break;
        }
        case 1: {
            int64_t v;
            at_tok_nextint64(&work, &v);
            break;
        }
        default: {
            char *s = nullptr;
            if (at_tok_nextstr(&work, &s) == 0) check(inside(s, line, textLen) && strlen(s) <= textLen);
            break;
        }
        }
        check(work == nullptr || work > before);
        check(inside(work, line, textLen));
    }
    free(line);

    // The tokenizer on the raw line, without normalisation: count as the SMS merge
    // counter does.
    line = copyLine(text, len);
    cursor = line;
    int count = 0;
    while (at_tok_hasmore(&cursor)) {
        char *s;
        if (at_tok_nextstr(&cursor, &s) != 0) break;
        check(++count <= (int)textLen + 1);
    }
    free(line);
    return 0;
}
