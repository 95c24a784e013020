// Shared pieces of the tolk-sim subcommands: the device-root layout, small file
// helpers and the supervisor's control socket protocol. The escape syntax of
// command-line texts is in sim_text.h.
#ifndef TOLK_SIM_UTIL_H
#define TOLK_SIM_UTIL_H

#include <sys/types.h>

#include <string>
#include <vector>

namespace sim {

// Where things live under the device root DIR.
struct RootLayout {
    std::string root;  // absolute

    std::string path(const std::string &rel) const { return root + "/" + rel; }
    std::string deviceTty() const { return path("dev/ttyGS0"); }
    std::string hostTty() const { return path("host/ttyACM0"); }
    std::string adbSocket() const { return path("dev/socket/adb_tolk_socket"); }
    std::string ctlSocket() const { return path("run/sim.ctl"); }
    std::string envFile() const { return path("sim.env"); }
    std::string tolkdLog() const { return path("log/tolkd.log"); }
    std::string tolkdOut() const { return path("log/tolkd.out"); }
    std::string supervisorLog() const { return path("log/sim.log"); }
    std::string tolkdStatus() const { return path("run/tolkd.status"); }
    std::string pidFile(const std::string &name) const { return path("run/" + name + ".pid"); }
    std::string peerLog(const std::string &name) const { return path("log/" + name + ".log"); }
};

// The peers the supervisor runs, in start order.
const std::vector<std::string> &peerNames();
bool isPeerName(const std::string &name);

// Absolute form of path (made relative to the current folder; need not exist).
std::string absolutePath(const std::string &path);
// mkdir -p; true when the folder exists afterwards.
bool makeDirs(const std::string &path, mode_t mode = 0755);
// Whole-file helpers; readFile gives "" for a missing file.
bool writeFile(const std::string &path, const std::string &content);
bool readFile(const std::string &path, std::string *content);
std::string readFileOr(const std::string &path, const std::string &fallback = "");
bool fileExists(const std::string &path);
// The last n lines of a file (for failure reports).
std::string tailLines(const std::string &path, int n);

// True when a process with this pid exists and its environment names this
// device root (TOLKD_ROOT=root): the guard against signalling a recycled pid.
bool processBelongsToRoot(pid_t pid, const std::string &root);
pid_t readPidFile(const std::string &path);

// Sends one command line to the supervisor of root and returns its answer.
// The first answer line is "ok" or "error: <why>"; further lines are data.
// Returns false when the supervisor cannot be reached.
bool controlRequest(const std::string &root, const std::string &command, std::string *answer,
                    int timeoutMs = 15000);

// Monotonic milliseconds.
long long nowMs();
void sleepMs(int ms);

}  // namespace sim

#endif
