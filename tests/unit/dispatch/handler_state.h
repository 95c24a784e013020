// Test helper: puts the in-memory state of the local commands and the MMI
// command sequence queue back to what a freshly started daemon has.
#ifndef TOLK_TESTS_DISPATCH_HANDLER_STATE_H
#define TOLK_TESTS_DISPATCH_HANDLER_STATE_H

#include <cstring>

#include "handlers/handlers.h"
#include "targets/mmi_queue.h"

inline void resetHandlerState() {
    for (int &v : gCmecConfig) v = 2;
    gVzwTolkCfg = 0;
    gCsdfMode = 1;
    gCsdfAuxmode = 1;
    gCclkTz = 65535;
    wifiEnableState = -1;
    wifiBand = -1;
    wifiFrequency = 0;
    wifiDataRate = 0;
    wifiTxPower = 0;
}

inline void resetMmiQueue() {
    std::memset(&gMmiCmdSeq, 0, sizeof(gMmiCmdSeq));
    for (int &s : gMmiCmdSeq.seq) s = -1;
}

#endif
