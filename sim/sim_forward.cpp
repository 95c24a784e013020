// `tolk-sim forward`: what `adb forward tcp:PORT localreserved:adb_tolk_socket`
// does for a real phone. Each connection accepted on 127.0.0.1:PORT gets its own
// connection to the adb control socket and a relay of bytes both ways; an end
// of input on one side is passed on as a half-close of the other. Whether a new
// connection replaces an older one is the daemon's rule, not the forwarder's.
#include <arpa/inet.h>
#include <errno.h>
#include <fcntl.h>
#include <netinet/in.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <list>

#include "sim_host_tools.h"
#include "sim_util.h"

namespace sim {

namespace {

// Bytes held per direction before the relay stops reading that side.
const size_t kForwardCap = 64 * 1024;
const int kListenBacklog = 8;

// One side of a relay: its descriptor, the bytes waiting to be written to it,
// and whether its peer has ended its input (then, once out is flushed, this
// side's writing is shut down).
struct Side {
    int fd = -1;
    std::string out;
    bool inputEnded = false;  // read returned 0
    bool writeShut = false;
};

struct Relay {
    Side tcp, local;
    bool failed = false;
};

void closeSide(Side *s) {
    if (s->fd >= 0) close(s->fd);
    s->fd = -1;
}

// Non-blocking: a full backlog fails this connection instead of holding every
// other relay.
int connectLocal(const std::string &path) { return connectUnix(path, SOCK_NONBLOCK); }

// Reads what from has into to's queue; marks the end of input.
void pump(Side *from, Side *to, Relay *r) {
    char buf[8192];
    while (to->out.size() < kForwardCap) {
        ssize_t n = recv(from->fd, buf, std::min(sizeof buf, kForwardCap - to->out.size()), 0);
        if (n > 0) {
            to->out.append(buf, static_cast<size_t>(n));
            continue;
        }
        if (n == 0) {
            from->inputEnded = true;
        } else if (errno == EINTR) {
            continue;
        } else if (errno != EAGAIN) {
            r->failed = true;
        }
        break;
    }
}

// Writes to's queue; shuts its writing down once the other side's input has
// ended and everything is out.
void flush(Side *to, const Side *from, Relay *r) {
    while (!to->out.empty()) {
        ssize_t n = send(to->fd, to->out.data(), to->out.size(), MSG_NOSIGNAL);
        if (n > 0) {
            to->out.erase(0, static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && errno != EAGAIN) r->failed = true;
        break;
    }
    if (from->inputEnded && to->out.empty() && !to->writeShut) {
        shutdown(to->fd, SHUT_WR);
        to->writeShut = true;
    }
}

short events(const Side &self, const Side &other) {
    short ev = 0;
    if (!self.inputEnded && other.out.size() < kForwardCap) ev |= POLLIN;
    if (!self.out.empty()) ev |= POLLOUT;
    return ev;
}

bool parsePort(const std::string &address, int *port) {
    if (address.compare(0, 4, "tcp:") != 0 || address.size() == 4) return false;
    char *end = nullptr;
    long v = strtol(address.c_str() + 4, &end, 10);
    if (*end != '\0' || v < 0 || v > 65535) return false;
    *port = static_cast<int>(v);
    return true;
}

}  // namespace

bool checkForwardArgs(const std::vector<std::string> &args, std::string *err) {
    int port = -1;
    for (const auto &a : args) {
        if (a == "--background") continue;
        if (port < 0 && parsePort(a, &port)) continue;
        *err = "tcp:PORT expected, got '" + a + "'";
        return false;
    }
    if (port < 0) {
        *err = "tcp:PORT is required (tcp:0 picks a free port)";
        return false;
    }
    return true;
}

int cmdForward(const std::string &root, const std::vector<std::string> &args) {
    std::string err;
    if (!checkForwardArgs(args, &err)) {
        fprintf(stderr, "tolk-sim forward: %s\n", err.c_str());
        return kExitUsage;
    }
    int port = -1;
    bool background = false;
    for (const auto &a : args) {
        if (a == "--background")
            background = true;
        else
            parsePort(a, &port);
    }
    std::string adb = RootLayout{root}.adbSocket();

    int listener = socket(AF_INET, SOCK_STREAM | SOCK_NONBLOCK | SOCK_CLOEXEC, 0);
    int one = 1;
    struct sockaddr_in addr;
    memset(&addr, 0, sizeof addr);
    addr.sin_family = AF_INET;
    addr.sin_port = htons(static_cast<uint16_t>(port));
    addr.sin_addr.s_addr = htonl(INADDR_LOOPBACK);  // never beyond this machine
    socklen_t len = sizeof addr;
    if (listener < 0 || setsockopt(listener, SOL_SOCKET, SO_REUSEADDR, &one, sizeof one) != 0 ||
        bind(listener, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0 ||
        listen(listener, kListenBacklog) != 0 ||
        getsockname(listener, reinterpret_cast<struct sockaddr *>(&addr), &len) != 0) {
        fprintf(stderr, "tolk-sim forward: cannot listen on 127.0.0.1:%d: %s\n", port, strerror(errno));
        if (listener >= 0) close(listener);
        return 1;
    }
    int bound = ntohs(addr.sin_port);

    // SIGINT and SIGTERM are taken only inside ppoll, so that none is lost
    // between a check and the wait.
    static volatile sig_atomic_t stop = 0;
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = [](int) { stop = 1; };
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);
    sigset_t blocked, waitMask;
    sigemptyset(&blocked);
    sigaddset(&blocked, SIGINT);
    sigaddset(&blocked, SIGTERM);
    sigprocmask(SIG_BLOCK, &blocked, &waitMask);
    sigdelset(&waitMask, SIGINT);
    sigdelset(&waitMask, SIGTERM);
    signal(SIGPIPE, SIG_IGN);

    if (background) {
        fflush(stdout);
        pid_t pid = fork();
        if (pid < 0) {
            perror("tolk-sim forward: fork");
            return 1;
        }
        if (pid > 0) {
            // The pid on stdout, for a script's `kill $(tolk-sim forward ...)`.
            if (port == 0) printf("%d\n", bound);
            printf("%d\n", pid);
            fprintf(stderr, "forwarding 127.0.0.1:%d to %s (kill %d stops it)\n", bound, adb.c_str(), pid);
            return 0;
        }
        setsid();
        int nul = open("/dev/null", O_RDWR);
        if (nul >= 0) {
            dup2(nul, 0);
            dup2(nul, 1);
            dup2(nul, 2);
            if (nul > 2) close(nul);
        }
    } else {
        if (port == 0) printf("%d\n", bound);
        fprintf(stderr, "forwarding 127.0.0.1:%d to %s (Ctrl-C stops)\n", bound, adb.c_str());
        fflush(stdout);
    }

    std::list<Relay> relays;
    while (!stop) {
        std::vector<struct pollfd> fds;
        fds.push_back({listener, POLLIN, 0});
        for (Relay &r : relays) {
            // A side with nothing to do is left out: a closed peer would
            // otherwise wake every poll with POLLHUP.
            short t = events(r.tcp, r.local), l = events(r.local, r.tcp);
            fds.push_back({t ? r.tcp.fd : -1, t, 0});
            fds.push_back({l ? r.local.fd : -1, l, 0});
        }
        if (ppoll(fds.data(), fds.size(), nullptr, &waitMask) < 0) {
            if (errno == EINTR) continue;
            perror("tolk-sim forward: poll");
            break;
        }
        size_t k = 1;
        for (Relay &r : relays) {
            const struct pollfd &t = fds[k++], &l = fds[k++];
            if (t.revents & (POLLIN | POLLHUP | POLLERR)) pump(&r.tcp, &r.local, &r);
            if (l.revents & (POLLIN | POLLHUP | POLLERR)) pump(&r.local, &r.tcp, &r);
            flush(&r.local, &r.tcp, &r);
            flush(&r.tcp, &r.local, &r);
        }
        for (auto it = relays.begin(); it != relays.end();) {
            bool done = it->tcp.writeShut && it->local.writeShut;
            if (it->failed || done) {
                closeSide(&it->tcp);
                closeSide(&it->local);
                it = relays.erase(it);
            } else {
                ++it;
            }
        }
        if (fds[0].revents & POLLIN) {
            int c = accept4(listener, nullptr, nullptr, SOCK_NONBLOCK | SOCK_CLOEXEC);
            if (c < 0) continue;
            int local = connectLocal(adb);
            if (local < 0) {
                // As adb does: a device socket that cannot be reached closes
                // the connection.
                fprintf(stderr, "tolk-sim forward: %s: %s\n", adb.c_str(), strerror(errno));
                close(c);
                continue;
            }
            relays.emplace_back();
            relays.back().tcp.fd = c;
            relays.back().local.fd = local;
        }
    }
    for (Relay &r : relays) {
        closeSide(&r.tcp);
        closeSide(&r.local);
    }
    close(listener);
    return 0;
}

}  // namespace sim
