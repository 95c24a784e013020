// Numbers read from system properties. Any text can sit in a property, so a
// value is read with its range checked rather than with atoi, whose overflow is
// undefined and in practice wraps ("4294967297" would read as 1).
#ifndef TOLKD_CORE_PROP_NUMBER_H
#define TOLKD_CORE_PROP_NUMBER_H

#include <limits.h>
#include <stdlib.h>

// A property value read as a decimal number; text that is not a number is 0.
// Out-of-range numbers saturate so they can never wrap onto a valid value.
static inline int propertyNumber(const char *value) {
    long v = strtol(value, NULL, 10);
    if (v > INT_MAX) return INT_MAX;
    if (v < INT_MIN) return INT_MIN;
    return (int)v;
}

#endif
