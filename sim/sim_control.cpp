// The supervisor's control socket run/sim.ctl: one command line in, "ok" or
// "error: ..." and data lines out. The subcommands replug, unplug, stop, start,
// pause-host, tty-settings and down use it.
#include <poll.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include <sstream>

#include "sim_supervisor.h"

namespace sim {

std::string Supervisor::handleCommand(const std::string &line) {
    std::istringstream in(line);
    std::string cmd, arg;
    in >> cmd;
    in >> arg;
    if (cmd == "status") {
        std::string s = "ok\n";
        s += "tolkd " + std::to_string(tolkdEnded_ ? -1 : tolkd_) + "\n";
        for (const auto &p : peers_) s += p.first + " " + std::to_string(p.second) + "\n";
        return s;
    }
    if (cmd == "replug") return replug();
    if (cmd == "unplug") return unplug();
    if (cmd == "tty-settings") return ttySettings();
    if (cmd == "pause-host") {
        char *end = nullptr;
        long ms = strtol(arg.c_str(), &end, 10);
        if (arg.empty() || *end != '\0' || ms < 0) return "error: pause-host needs milliseconds\n";
        pauseUntil_ = nowMs() + ms;
        log("host output paused for %ld ms", ms);
        return "ok\n";
    }
    if (cmd == "stop" || cmd == "start") {
        if (!isPeerName(arg)) return "error: unknown peer '" + arg + "'\n";
        return cmd == "stop" ? stopPeer(arg) : startPeer(arg);
    }
    if (cmd == "down") {
        stopping_ = true;
        return "ok\n";
    }
    return "error: unknown command '" + cmd + "'\n";
}

void Supervisor::serveControl(int listenFd) {
    int c = accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC);
    if (c < 0) return;
    std::string line;
    long long deadline = nowMs() + 1000;
    char buf[512];
    while (line.find('\n') == std::string::npos && nowMs() < deadline) {
        struct pollfd p = {c, POLLIN, 0};
        if (poll(&p, 1, 100) <= 0) continue;
        ssize_t n = read(c, buf, sizeof buf);
        if (n <= 0) break;
        line.append(buf, static_cast<size_t>(n));
    }
    size_t nl = line.find('\n');
    if (nl != std::string::npos) line.resize(nl);
    log("control: %s", line.c_str());
    std::string answer = handleCommand(line);
    if (stopping_) {
        // Answer only once everything is down, so that `down` returns late enough.
        shutdownAll();
    }
    ssize_t r = write(c, answer.data(), answer.size());
    (void)r;
    close(c);
}


}  // namespace sim
