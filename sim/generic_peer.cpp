// The simulated generic framework service on "tolk-service": it cuts what it
// reads into the daemon's messages (GenericSplitter), records every message and
// answers command texts from its script (a framed OK by default). Answers may be held back or delayed per command; the service
// keeps reading and answering other messages meanwhile, so a test can tell a
// daemon that waits for one answer from one that does not.
#include "hostile.h"
#include "modem_script.h"
#include "peers.h"

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include <errno.h>
#include <poll.h>
#include <signal.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <map>

using namespace tolksim;

namespace {

const char kServiceName[] = "tolk-service";
const char kMmiMark[] = "+ORVTOLKJ";
// Hostile timing: how late an answer may be, so that answers due close together
// leave in one write.
const int kHostileLateMs = 8;

struct Pending {
    int fd;
    AnswerStep step;
};

class GenericService {
public:
    explicit GenericService(const std::string &root)
        : root_(root),
          script_(root + "/sim/generic/script"),
          journal_(root + "/journal/generic.log"),
          hostile_(root, "generic") {}
    int run();

private:
    void receive(int fd);
    void serve(int fd, const std::string &msg);
    void dropClient(int fd);
    void deliverDue();

    std::string root_;
    ScriptFile script_;
    std::string journal_;
    int listenFd_ = -1;
    std::string socketPath_;
    std::vector<int> clients_;
    std::vector<Pending> pending_;
    std::map<int, GenericSplitter> splitters_;  // per connection: what was read of its messages
    sim::Hostile hostile_;
    sim::Outbox outbox_;  // answer bytes on their way, split in hostile mode
};

void GenericService::dropClient(int fd) {
    // An MMI answer cut short by the end of the link is recorded as far as it came.
    std::string rest = splitters_[fd].flush();
    if (!rest.empty()) journalLine(journal_, visibleBytes(rest));
    splitters_.erase(fd);
    outbox_.drop(fd);
    close(fd);
    clients_.erase(std::remove(clients_.begin(), clients_.end(), fd), clients_.end());
    pending_.erase(std::remove_if(pending_.begin(), pending_.end(), [fd](const Pending &p) { return p.fd == fd; }),
                   pending_.end());
}

void GenericService::receive(int fd) {
    char buf[8192];
    ssize_t n = read(fd, buf, sizeof buf);
    if (n < 0 && errno == EINTR) return;
    if (n <= 0) {
        dropClient(fd);
        return;
    }
    for (const std::string &msg : splitters_[fd].feed(std::string(buf, static_cast<size_t>(n)))) serve(fd, msg);
}

void GenericService::serve(int fd, const std::string &msg) {
    journalLine(journal_, visibleBytes(msg));
    ScriptAnswer sa;
    if (!script_.lookup(msg, &sa)) {
        // MMI feedback ("command+ORVTOLKJ" + modem answer + ";") only informs the
        // framework; everything else is a command that wants a final result.
        if (msg.find(kMmiMark) != std::string::npos) return;
        sa.frames.push_back("\r\nOK\r\n");
    }
    int late = hostile_.on() ? hostile_.below(kHostileLateMs + 1) : 0;
    for (AnswerStep &step : answerSteps(sa, nowMs())) {
        step.due += late;
        pending_.push_back(Pending{fd, std::move(step)});
    }
}

void GenericService::deliverDue() {
    long long now = nowMs();
    bool released = takeReleaseFile(root_ + "/sim/generic/release");
    std::vector<Pending> due, keep;
    for (Pending &p : pending_) (p.step.ready(now, released) ? due : keep).push_back(p);
    pending_.swap(keep);
    // What is due together for one connection goes into the outbox as one
    // write (in hostile mode cut into pieces there); a close waits for what
    // was due before it.
    std::map<int, std::string> together;
    auto post = [&](int fd) {
        outbox_.push(fd, together[fd], now, hostile_);
        together.erase(fd);
    };
    for (Pending &p : due) {
        if (std::find(clients_.begin(), clients_.end(), p.fd) == clients_.end()) continue;
        if (!p.step.close) {
            together[p.fd] += p.step.frame;
            continue;
        }
        post(p.fd);
        sendAll(p.fd, outbox_.take(p.fd));
        dropClient(p.fd);
    }
    while (!together.empty()) post(together.begin()->first);
    std::vector<int> gone;
    outbox_.flush(now, [&](int fd, const std::string &b) { return sendAll(fd, b) || (gone.push_back(fd), false); });
    for (int fd : gone) dropClient(fd);
}

int GenericService::run() {
    // Served where the daemon's socket_local_client looks for it: the reserved
    // namespace under the device root.
    struct sockaddr_un addr;
    if (tolk_local_address(kServiceName, ANDROID_SOCKET_NAMESPACE_RESERVED, &addr) < 0) return 1;
    socketPath_ = addr.sun_path;
    listenFd_ = tolk_local_server(kServiceName, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 4);
    if (listenFd_ < 0) {
        fprintf(stderr, "generic: cannot serve %s: %s\n", socketPath_.c_str(), strerror(errno));
        return 1;
    }
    while (!sim::stopRequested()) {
        std::vector<struct pollfd> fds;
        fds.push_back({listenFd_, POLLIN, 0});
        for (int c : clients_) fds.push_back({c, POLLIN, 0});
        int r = poll(fds.data(), fds.size(), outbox_.timeoutMs(nowMs(), stepPollTimeout(pending_, nowMs())));
        if (r < 0 && errno != EINTR) break;
        if (r > 0) {
            if (fds[0].revents & POLLIN) {
                int c = accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
                if (c >= 0) clients_.push_back(c);
            }
            for (size_t k = 1; k < fds.size(); k++) {
                if (fds[k].revents & (POLLIN | POLLHUP | POLLERR)) {
                    if (std::find(clients_.begin(), clients_.end(), fds[k].fd) != clients_.end()) receive(fds[k].fd);
                }
            }
        }
        deliverDue();
    }
    for (int c : std::vector<int>(clients_)) dropClient(c);
    close(listenFd_);
    unlink(socketPath_.c_str());
    return 0;
}

}  // namespace

int run_generic_peer(const std::string &root, const std::vector<std::string> &args) {
    for (size_t i = 0; i < args.size(); i++) {
        if (args[i] == "--root" && i + 1 < args.size()) {
            ++i;
        } else {
            fprintf(stderr, "generic: unknown argument %s\n", args[i].c_str());
            return 2;
        }
    }
    sim::watchStopSignals();
    // The socket helpers resolve device paths under TOLKD_ROOT; tolk-sim sets it,
    // a peer started by hand may not.
    setenv("TOLKD_ROOT", root.c_str(), 1);
    GenericService service(root);
    return service.run();
}
