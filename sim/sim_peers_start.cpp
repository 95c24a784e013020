// Starting and stopping the peers, and knowing when one serves.
#include <errno.h>
#include <fcntl.h>
#include <stddef.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <vector>

#include <cutils/sockets.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/local_socket.h>
#include <tolk_platform/radio_wire.h>

#include "sim_privilege.h"
#include "sim_supervisor.h"

namespace sim {

namespace {

// One address a peer serves: a device path (ns < 0) or a local socket name in
// an ANDROID_SOCKET_NAMESPACE_*.
struct PeerAddress {
    const char *name;
    int ns;
};

// Every address the daemon or a subcommand reaches a peer by.
std::vector<PeerAddress> peerAddresses(const std::string &name) {
    if (name == "radio") return {{RADIO_WIRE_PATH_PREFIX "slot1", -1}, {"/run/radio.ctl", -1}};
    if (name == "generic") return {{"tolk-service", ANDROID_SOCKET_NAMESPACE_RESERVED}};
    if (name == "audio")
        return {{"tolk-audio", ANDROID_SOCKET_NAMESPACE_RESERVED}, {"rild-tolk-md2", ANDROID_SOCKET_NAMESPACE_RESERVED}};
    if (name == "cit") return {{"auto_cit", ANDROID_SOCKET_NAMESPACE_ABSTRACT}};
    return {};
}

}  // namespace

pid_t Supervisor::spawnPeer(const std::string &name) {
    std::vector<std::string> args = {self_, "peer", name, "--root", L_.root};
    if (name == "radio" && !opt_.modemTty.empty()) {
        args.push_back("--modem-tty");
        args.push_back(opt_.modemTty);
    }
    std::string logPath = L_.peerLog(name);
    pid_t pid = fork();
    if (pid < 0) {
        log("fork for peer %s failed: %s", name.c_str(), strerror(errno));
        return -1;
    }
    if (pid == 0) {
        int in = open("/dev/null", O_RDONLY);
        int out = open(logPath.c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        if (in >= 0) dup2(in, 0);
        if (out >= 0) {
            dup2(out, 1);
            dup2(out, 2);
        }
        closeFrom(3, -1);
        std::string err;
        if (name == "cit" && !becomeTestApp(STDOUT_FILENO, &err)) {
            fprintf(stderr, "cit peer: %s\n", err.c_str());
            _exit(126);
        }
        // A peer that logs through the platform log writes its own file.
        setenv("TOLKD_LOG", logPath.c_str(), 1);
        unsetenv("ANDROID_SOCKET_adb_tolk_socket");
        std::vector<char *> argv;
        for (auto &a : args) argv.push_back(const_cast<char *>(a.c_str()));
        argv.push_back(nullptr);
        execv(self_.c_str(), argv.data());
        _exit(127);
    }
    peers_[name] = pid;
    writeFile(L_.pidFile(name), std::to_string(pid) + "\n");
    log("peer %s started, pid %d", name.c_str(), pid);
    return pid;
}

// A peer is ready once a connect to each address it serves succeeds: the
// presence of a socket file says nothing (a stopped peer leaves its file behind).
bool Supervisor::peerReady(const std::string &name) {
    for (const PeerAddress &a : peerAddresses(name)) {
        struct sockaddr_un addr;
        socklen_t len = 0;
        if (a.ns < 0) {
            char path[sizeof addr.sun_path];
            if (!tolk_device_path(a.name, path, sizeof path)) return false;
            memset(&addr, 0, sizeof addr);
            addr.sun_family = AF_UNIX;
            snprintf(addr.sun_path, sizeof addr.sun_path, "%s", path);
            len = static_cast<socklen_t>(offsetof(struct sockaddr_un, sun_path) + strlen(addr.sun_path) + 1);
        } else {
            int n = tolk_local_address(a.name, a.ns, &addr);
            if (n < 0) return false;
            len = static_cast<socklen_t>(n);
        }
        // Non-blocking: a full backlog answers EAGAIN instead of holding the
        // supervisor; the probe is closed at once, which the peer reads as a
        // client that went away.
        int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
        if (fd < 0) return false;
        bool ok = connect(fd, reinterpret_cast<struct sockaddr *>(&addr), len) == 0;
        close(fd);
        if (!ok) return false;
    }
    return true;
}

// Every peer must serve before tolkd starts: a device with a peer missing
// would answer differently from the one a test or a station asked for.
bool Supervisor::waitForPeers(std::string *err) {
    long long deadline = nowMs() + kPeerReadyTimeoutMs;
    for (;;) {
        reapChildren();
        for (const auto &p : peers_) {
            if (p.second <= 0) {
                *err = "peer " + p.first + " ended at start (see " + L_.peerLog(p.first) + ")";
                return false;
            }
        }
        bool all = true;
        for (const auto &p : peers_)
            if (!peerReady(p.first)) all = false;
        if (all) {
            ownDeviceRoot(L_);  // the peers' sockets, as their services create them on the phone
            return true;
        }
        if (nowMs() >= deadline) break;
        sleepMs(10);
    }
    for (const auto &p : peers_) {
        if (!peerReady(p.first)) {
            *err = "peer " + p.first + " is not serving after " + std::to_string(kPeerReadyTimeoutMs) + " ms (see " +
                   L_.peerLog(p.first) + ")";
            break;
        }
    }
    return false;
}


std::string Supervisor::stopPeer(const std::string &name) {
    auto it = peers_.find(name);
    if (it == peers_.end() || it->second <= 0) return "ok\nnot running\n";
    terminate(it->second, "peer " + name);
    it->second = -1;
    unlink(L_.pidFile(name).c_str());
    return "ok\n";
}

std::string Supervisor::startPeer(const std::string &name) {
    auto it = peers_.find(name);
    if (it != peers_.end() && it->second > 0) return "ok\nalready running\n";
    pid_t pid = spawnPeer(name);
    if (pid <= 0) return "error: cannot start peer " + name + "\n";
    long long deadline = nowMs() + kPeerReadyTimeoutMs;
    for (;;) {
        reapChildren();
        if (peers_[name] <= 0) return "error: peer " + name + " ended at start (see " + L_.peerLog(name) + ")\n";
        if (peerReady(name)) {
            ownDeviceRoot(L_);
            return "ok\n";
        }
        if (nowMs() >= deadline) break;
        sleepMs(5);
    }
    return "error: peer " + name + " does not serve after " + std::to_string(kPeerReadyTimeoutMs) + " ms\n";
}


}  // namespace sim
