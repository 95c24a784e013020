// Small helpers shared by the local handlers.
#ifndef TOLKD_HANDLERS_HANDLER_UTIL_H
#define TOLKD_HANDLERS_HANDLER_UTIL_H

#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include "core/prop_number.h"
#include "dispatch/dispatcher.h"
#include "serial/serial_device.h"

// Room for a whole command line and its NUL: the tokenizer writes into the text
// it reads, so handlers work on a private copy of their const parameter text.
#define PARAM_BUF_SIZE DATA_BUF_SIZE

static inline char *copyParam(const char *param, char *buf, size_t size) {
    snprintf(buf, size, "%s", param != NULL ? param : "");
    return buf;
}

#endif
