// `tolk-sim up` and `down`: the simulated device around one tolkd process. The
// supervisor that `up` leaves behind is in sim_supervisor.h.
#ifndef TOLK_SIM_DEVICE_H
#define TOLK_SIM_DEVICE_H

#include <string>
#include <utility>
#include <vector>

namespace sim {

struct UpOptions {
    std::string root;
    std::vector<std::pair<std::string, std::string>> props;
    bool writeBootMode = true;
    std::string bootMode = "0";
    bool controlSocket = true;
    std::string logTags = "*:i";  // checked by parseUpOptions: logcat filter syntax
    std::vector<std::string> adcLines;  // "CHANNEL VALUE STATUS"
    std::string modemTty;
    bool nvram = true;
    bool nvramShapeGiven = false;
    long nvramSize = 1024;
    long nvramCount = 1;
    std::string tolkdBinary;
    bool quiet = false;  // no success summary on stdout
    bool hostile = false;     // peers with hostile timing (hostile.h)
    std::string hostileSeed;  // decimal; empty: one is drawn
};

// Parses the options of `up` (and of `run`, which shares them) starting at args[i].
// Unknown options are errors unless extra is given, in which case they are
// appended to it. Returns false with a message in err.
bool parseUpOptions(const std::vector<std::string> &args, size_t i, UpOptions *opt, std::string *err,
                    std::vector<std::string> *extra = nullptr);

// Brings the device up; returns the process exit status of `up`. started (if
// given) tells whether a supervisor of this call is left running: always after
// success, and after a daemon that ended or did not serve, which stays for a
// look at its state until `down`.
int cmdUp(UpOptions opt, bool *started = nullptr);
// Stops everything started for root; idempotent. Returns 0 when nothing is left.
int cmdDown(const std::string &root);

}  // namespace sim

#endif
