// Shared pieces of tolk-sim and its peers: the device-root layout, small file,
// socket and clock helpers, and the supervisor's control socket protocol. The escape syntax of
// command-line texts is in sim_text.h.
#ifndef TOLK_SIM_UTIL_H
#define TOLK_SIM_UTIL_H

#include <sys/types.h>

#include <string>
#include <vector>

namespace sim {

// Exit statuses of every tolk-sim subcommand (a host program run by `host` keeps
// its own). Station scripts branch on them, so each means one thing only.
enum ExitStatus {
    kExitOk = 0,
    kExitFailed = 1,    // the device is not up, a link failed, the operation was refused
    kExitUsage = 2,     // wrong invocation: unknown command or option, bad value
    kExitNoAnswer = 3,  // `at`: a line got no complete answer within --timeout
};

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
    // Held with flock by `up` while it runs and by the supervisor while the
    // device is up: one device per root.
    std::string lockFile() const { return path("run/device.lock"); }
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
// rm -rf without following symbolic links; true when nothing is left.
bool removeTree(const std::string &path);
// The last n lines of a file (for failure reports).
std::string tailLines(const std::string &path, int n);

// Appends one line (text + "\n") to a journal file with one write, creating its
// folders, so lines of concurrent writers never mix.
void journalLine(const std::string &path, const std::string &line);

// Whether path fits into an AF_UNIX socket address.
bool fitsSocketPath(const std::string &path);
// A stream socket bound to path (an old socket file there is removed first) and,
// for backlog >= 0, listening. The descriptor, or -1 with errno (ENAMETOOLONG for
// a path that does not fit).
int bindUnix(const std::string &path, int backlog, bool cloexec = true);
// A stream connection to the AF_UNIX socket at path (socketFlags, such as
// SOCK_NONBLOCK, join the socket's type); the descriptor, or -1 with errno.
int connectUnix(const std::string &path, int socketFlags = 0);
// Writes all bytes, retrying EINTR and short writes, never raising SIGPIPE (a
// descriptor that is no socket, such as a tty, is written to plainly).
bool sendAll(int fd, const void *data, size_t len);
inline bool sendAll(int fd, const std::string &bytes) { return sendAll(fd, bytes.data(), bytes.size()); }

// Opens the host end of the serial link (or any tty) as a host program does: raw,
// with what arrived before the open flushed. flags are added to O_RDWR |
// O_NOCTTY | O_CLOEXEC. The descriptor, or -1 with errno.
int openRawTty(const std::string &path, int flags = 0);

// A peer runs until SIGTERM or SIGINT: after watchStopSignals(), stopRequested()
// turns true at either. SIGPIPE is ignored, so a client that went away shows as a
// failed write rather than ending the peer.
void watchStopSignals();
bool stopRequested();

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
