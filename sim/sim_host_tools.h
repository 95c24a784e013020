// Host-side tools around a running simulated device: the host runner, which runs
// a host program with the host port behaving as a USB ACM port, and the adb
// forwarder, which serves the adb control socket on a loopback TCP port.
#ifndef TOLK_SIM_HOST_TOOLS_H
#define TOLK_SIM_HOST_TOOLS_H

#include <string>
#include <vector>

namespace sim {

// `tolk-sim host --root DIR -- CMD ARGS...`: runs CMD with libtolk-acm.so
// preloaded (acm_shim.cpp). Returns only when CMD cannot be started.
int cmdHost(const std::string &root, const std::vector<std::string> &command);

// `tolk-sim forward --root DIR [--background] tcp:PORT`: relays every
// connection accepted on 127.0.0.1:PORT to the adb control socket until SIGINT
// or SIGTERM.
int cmdForward(const std::string &root, const std::vector<std::string> &args);
// Whether args are forward's ([--background] tcp:PORT); err says what is wrong.
bool checkForwardArgs(const std::vector<std::string> &args, std::string *err);

}  // namespace sim

#endif
