// Small helpers shared by the local handlers.
#ifndef TOLKD_HANDLERS_HANDLER_UTIL_H
#define TOLKD_HANDLERS_HANDLER_UTIL_H

#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "dispatch/dispatcher.h"
#include "serial/serial_device.h"

// Room for a whole command line and its NUL: the tokenizer writes into the text
// it reads, so handlers work on a private copy of their const parameter text.
#define PARAM_BUF_SIZE DATA_BUF_SIZE

static inline char *copyParam(const char *param, char *buf, size_t size) {
    snprintf(buf, size, "%s", param != NULL ? param : "");
    return buf;
}

// A property value read as a decimal number; text that is not a number is 0.
// Out-of-range numbers saturate so they can never wrap onto a valid value.
static inline int propertyNumber(const char *value) {
    long v = strtol(value, NULL, 10);
    if (v > INT_MAX) return INT_MAX;
    if (v < INT_MIN) return INT_MIN;
    return (int)v;
}

#endif
