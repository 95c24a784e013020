// Test helpers: a fixture that calls handlers the way the dispatcher does, with
// the in-memory state these tests change back as in a freshly started daemon.
#ifndef TOLK_TESTS_DISPATCH_HANDLER_STATE_H
#define TOLK_TESTS_DISPATCH_HANDLER_STATE_H

#include <cutils/properties.h>

#include <cstring>

#include "dispatch/dispatcher.h"
#include "handlers/handlers.h"
#include "host_capture.h"

inline std::string prop(const char *name, const char *def = "(unset)") {
    char value[PROPERTY_VALUE_MAX];
    property_get(name, value, def);
    return value;
}

class HandlerTest : public LinkTest {
protected:
    void SetUp() override {
        LinkTest::SetUp();
        gVzwTolkCfg = 0;
        gCclkTz = 65535;
    }

    // A zeroed response buffer for every call, as the dispatcher gives.
    int call(CmdHandler h, const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return h(param, op, response);
    }

    char response[RESPONSE_BUF_SIZE];
};

#endif
