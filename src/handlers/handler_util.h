// Small helpers shared by the local handlers.
#ifndef TOLKD_HANDLERS_HANDLER_UTIL_H
#define TOLKD_HANDLERS_HANDLER_UTIL_H

#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "attok/at_tok.h"
#include "core/prop_number.h"
#include "dispatch/dispatcher.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"

// Room for a whole command line and its NUL: the tokenizer writes into the text
// it reads, so handlers work on a private copy of their const parameter text.
#define PARAM_BUF_SIZE DATA_BUF_SIZE

static inline char *copyParam(const char *param, char *buf, size_t size) {
    snprintf(buf, size, "%s", param != NULL ? param : "");
    return buf;
}

// The next number of a set form. A station records every OK, so text that is not
// a whole number never stands for one: without any number it gets the command's
// answer for an unreadable parameter (RESPONSE_INVALID, "UNKNOWN"); a number with
// other text after it, or beyond int, gets `refusal`, the command's answer for a
// value it does not take.
static inline int nextParamNumber(char **cursor, int *value, int refusal) {
    int rc = at_tok_nextint_strict(cursor, value);
    if (rc == 0) return RESPONSE_OK;
    return rc == AT_TOK_NOT_WHOLE ? refusal : RESPONSE_INVALID;
}

// A set form's only number: as nextParamNumber, and a further parameter is refused
// too.
static inline int onlyParamNumber(const char *param, int *value, int refusal) {
    char buf[PARAM_BUF_SIZE];
    char *cursor = copyParam(param, buf, sizeof(buf));
    int rc = nextParamNumber(&cursor, value, refusal);
    if (rc == RESPONSE_OK && at_tok_hasmore(&cursor)) return refusal;
    return rc;
}

#endif
