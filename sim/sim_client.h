// The host side of the simulated device: a scripted AT client and an
// interactive console, on the host serial port or on the adb link.
#ifndef TOLK_SIM_CLIENT_H
#define TOLK_SIM_CLIENT_H

#include <string>
#include <vector>

namespace sim {

struct AtOptions {
    std::string root;
    bool adb = false;
    int timeoutSec = 60;
    int quietMs = 300;
    bool noCr = false;
    bool rawLines = false;           // lines are bytes already: no escapes
    std::vector<std::string> lines;  // with escapes still in them (unless rawLines)
};

// True when the bytes received so far hold a final result line of an AT
// answer (numeric: a lone digit 0-8 counts too).
bool hasFinalResult(const std::string &received, bool numeric);

int cmdAt(const AtOptions &opt);
int cmdConsole(const std::string &root, bool adb);

}  // namespace sim

#endif
