// The supervisor process that `tolk-sim up` leaves behind: it owns the serial
// link (two pseudo-terminal pairs and a relay between them, sim_relay.cpp), the
// adb control socket, the peers (sim_peers_start.cpp) and tolkd, and serves the
// control socket run/sim.ctl (sim_control.cpp). Internal to tolk-sim.
#ifndef TOLK_SIM_SUPERVISOR_H
#define TOLK_SIM_SUPERVISOR_H

#include <sys/types.h>

#include <map>
#include <string>

#include "sim_device.h"
#include "sim_util.h"

namespace sim {

// How long tolkd may take to reach its main wait, and a peer to serve.
const int kServeTimeoutMs = 10000;
// Generous: only a peer that hangs at start waits it out (one that exits is seen
// at once), and a loaded machine (sanitizers, parallel builds) must not fail an up.
const int kPeerReadyTimeoutMs = 10000;
// How long a process gets between SIGTERM and SIGKILL.
const int kGraceMs = 2000;

// A pseudo-terminal pair: the master and an open descriptor on its slave.
struct PtyPair {
    int master = -1;
    int slave = -1;
    std::string slaveName;
};

bool openPty(PtyPair *p, std::string *err);
// Replaces link atomically, so that an open of it always finds either the old
// or the new terminal, never nothing.
bool replaceSymlink(const std::string &target, const std::string &link);

// Closes every descriptor from first on except keep (in a child before exec).
void closeFrom(int first, int keep);

// Creates the device root's folders and files for `up` (sim_root.cpp); err is
// left empty on success.
void prepareRoot(const UpOptions &opt, std::string *err);

class Supervisor {
public:
    // readyFd: where the outcome of the start goes to `up`; lockFd: the root's
    // lock, held until everything is down (the supervisor closes both).
    Supervisor(const UpOptions &opt, int readyFd, int lockFd)
        : opt_(opt), L_{opt.root}, readyFd_(readyFd), lockFd_(lockFd) {}
    int run();

private:
    // sim_supervisor.cpp: start-up, tolkd, children, shutdown.
    void log(const char *fmt, ...) __attribute__((format(printf, 2, 3)));
    void ready(const std::string &line);
    bool setUp(std::string *err);
    void writeEnvFile();
    pid_t spawnTolkd();
    void waitForServing();
    bool tolkdInMainWait();
    bool tolkdIdle();
    void reapChildren();
    void childEnded(pid_t pid, int status);
    bool terminate(pid_t pid, const std::string &what);
    void shutdownAll();
    // sim_peers_start.cpp
    pid_t spawnPeer(const std::string &name);
    bool waitForPeers(std::string *err);
    bool peerReady(const std::string &name);
    std::string stopPeer(const std::string &name);
    std::string startPeer(const std::string &name);
    // sim_relay.cpp: the serial link and the host port's line state.
    bool setUpLink(std::string *err);
    void relayLoop();
    void pumpRead(int fd, std::string *buf);
    void pumpWrite(int fd, std::string *buf);
    void setCable(bool in);
    std::string replug();
    std::string unplug();
    std::string ttySettings();
    // sim_control.cpp
    void serveControl(int listenFd);
    std::string handleCommand(const std::string &line);

    UpOptions opt_;
    RootLayout L_;
    int readyFd_;
    int lockFd_;
    std::string self_;
    FILE *log_ = nullptr;
    int signalFd_ = -1;  // read end of the signal pipe (owned by sim_supervisor.cpp)
    PtyPair dev_, host_;
    int linesFd_ = -1;  // the host port's line state file (acm_lines.h)
    int adbFd_ = -1;
    int ctlFd_ = -1;
    pid_t tolkd_ = -1;
    bool tolkdEnded_ = false;
    std::map<std::string, pid_t> peers_;
    std::string toHost_, toDevice_;
    long long pauseUntil_ = 0;
    bool stopping_ = false;
};

}  // namespace sim

#endif
