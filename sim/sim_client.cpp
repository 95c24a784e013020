#include "sim_client.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cctype>
#include <cstdio>
#include <cstring>

#include "sim_text.h"
#include "sim_util.h"

namespace sim {

namespace {

// The console's piped mode: how long a line without a complete answer waits.
const int kPipedSilenceMs = 300;
// A raw answer (audio, device-maker test frames) has no end mark: the daemon
// passes its pieces on as they come and waits briefly for the next, so the
// quiet that ends it must be well above that wait.
const int kRawAnswerQuietMs = 300;

bool isFinalLine(const std::string &l, bool numeric) {
    static const char *const finals[] = {
        "OK",          "ERROR",         "NO CARRIER",         "BUSY",
        "NO ANSWER",   "NO DIALTONE",   "CONNECT",            "Not Implement",
        "UNKNOWN",     "ERROR:No Modem", "ERROR:UE is not ready", "Not access to modem in User Mode.",
        "> ",
    };
    for (const char *f : finals)
        if (l == f) return true;
    if (l.compare(0, 10, "+CME ERROR") == 0 || l.compare(0, 10, "+CMS ERROR") == 0) return true;
    if (numeric && l.size() == 1 && l[0] >= '0' && l[0] <= '8') return true;
    return false;
}

// Commands whose answer the daemon relays from the audio service as it comes,
// one answer per command and no final result added: the audio commands and the
// device maker's test commands (whose answers are raw byte frames).
const char *const kRelayedWhole[] = {
    "AUD+",          "MM+",         "AT+EAPS",       "AT+EADP",         "AT^MMITESTENABLE",
    "AT^MMITEST",    "AT^ALLVER?",  "AT^TMMI",       "AT^RUNTEST?",     "AT^BSN?",
    "AT^FACINFO",    "AT^TCHRENABLE", "AT^TBATLVL",  "AT^IINLIMIT=1",   "AT^POWERDOWN",
    "AT+AUDLOOP=",   "AT+FMTEST",
};

bool isRelayedWhole(const std::string &line) {
    std::string t = trimBlanks(line);
    for (const char *prefix : kRelayedWhole)
        if (startsWithNoCase(t, prefix)) return true;
    return false;
}

// What ATV0 / ATV1 (ATV alone is ATV0) make of the numeric mode.
bool numericAfter(const std::string &line, bool numeric) {
    std::string t = trimBlanks(line);
    if (equalsNoCase(t, "ATV") || equalsNoCase(t, "ATV0")) return true;
    if (equalsNoCase(t, "ATV1")) return false;
    return numeric;
}

int gInterruptFd = -1;

bool interrupted() {
    if (gInterruptFd < 0) return false;
    struct pollfd p = {gInterruptFd, POLLIN, 0};
    return poll(&p, 1, 0) > 0;
}

int openLink(const std::string &root, bool adb, std::string *err) {
    RootLayout L{root};
    if (adb) {
        std::string path = L.adbSocket();
        if (!fitsSocketPath(path)) {
            *err = "socket path too long: " + path;
            return -1;
        }
        int fd = connectUnix(path);
        if (fd < 0) {
            *err = "cannot connect to " + path + ": " + strerror(errno);
            return -1;
        }
        fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
        return fd;
    }
    std::string path = L.hostTty();
    // Stale output of earlier commands (or unsolicited lines) is not part of
    // this exchange: flushed at the open, and what the relay still had under way
    // is read away.
    int fd = openRawTty(path, O_NONBLOCK);
    if (fd < 0) {
        *err = "cannot open " + path + ": " + strerror(errno);
        return -1;
    }
    char junk[4096];
    while (read(fd, junk, sizeof junk) > 0) {
    }
    return fd;
}

bool writeAllTo(int fd, const std::string &data, long long deadline) {
    size_t done = 0;
    while (done < data.size()) {
        ssize_t n = write(fd, data.data() + done, data.size() - done);
        if (n > 0) {
            done += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && errno == EAGAIN) {
            long long left = deadline - nowMs();
            if (left <= 0) return false;
            struct pollfd p = {fd, POLLOUT, 0};
            poll(&p, 1, static_cast<int>(left));
            continue;
        }
        return false;
    }
    return true;
}

}  // namespace

bool hasFinalResult(const std::string &received, bool numeric) {
    size_t start = 0;
    for (;;) {
        size_t nl = received.find('\n', start);
        if (nl == std::string::npos) break;
        std::string line = received.substr(start, nl - start);
        while (!line.empty() && line.back() == '\r') line.pop_back();
        while (!line.empty() && line.front() == '\r') line.erase(0, 1);
        if (isFinalLine(line, numeric)) return true;
        start = nl + 1;
    }
    // The SMS prompt is not followed by a line end when it stands alone.
    const std::string prompt = "\r\n> ";
    return received.size() >= prompt.size() &&
           received.compare(received.size() - prompt.size(), prompt.size(), prompt) == 0;
}

bool isCompleteAnswer(const std::string &sent, const std::string &received, bool numeric) {
    // The daemon's echo of the line ("LINE\n"), or the terminal's own after a
    // replug, before the daemon has set the port up ("LINE\r\n").
    std::string line = sent;
    while (!line.empty() && (line.back() == '\r' || line.back() == '\n')) line.pop_back();
    std::string rest = received;
    for (const char *end : {"\r\n", "\n"}) {
        std::string echo = line + end;
        if (!line.empty() && rest.compare(0, echo.size(), echo) == 0) {
            rest.erase(0, echo.size());
            break;
        }
    }
    if (hasFinalResult(rest, numeric)) return true;
    return !rest.empty() && isRelayedWhole(line);
}

void setInterruptFd(int fd) { gInterruptFd = fd; }

int cmdAt(const AtOptions &opt) {
    std::vector<std::string> payloads;
    for (const auto &l : opt.lines) {
        std::string bytes = l, err;
        if (!opt.rawLines && !decodeEscapes(l, &bytes, &err)) {
            fprintf(stderr, "tolk-sim at: %s\n", err.c_str());
            return kExitUsage;
        }
        payloads.push_back(bytes);
    }
    std::string err;
    int fd = openLink(opt.root, opt.adb, &err);
    if (fd < 0) {
        fprintf(stderr, "tolk-sim at: %s\n", err.c_str());
        return kExitFailed;
    }
    bool numeric = opt.numeric;
    char buf[8192];
    for (const auto &line : payloads) {
        numeric = numericAfter(line, numeric);
        std::string p = opt.noCr ? line : line + "\r";
        long long deadline = nowMs() + opt.timeoutMs;
        if (!writeAllTo(fd, p, deadline)) {
            fprintf(stderr, "tolk-sim at: cannot send %s: %s\n", visibleBytes(p).c_str(), strerror(errno));
            close(fd);
            return kExitFailed;
        }
        std::string received;
        bool complete = false;
        int quietMs = opt.quietMs;
        long long lastByte = nowMs();
        for (;;) {
            if (interrupted()) {
                close(fd);
                return kExitFailed;
            }
            long long now = nowMs();
            if (complete && now - lastByte >= quietMs) break;  // the answer and its tail are in
            if (!complete && opt.silenceEnds && now - lastByte >= opt.quietMs) break;
            if (now >= deadline) {
                if (complete) break;  // a link that never goes quiet: the answer is in all the same
                fflush(stdout);
                fprintf(stderr, "tolk-sim at: no complete answer to %s within %d.%03d s%s\n",
                        visibleBytes(line).c_str(), opt.timeoutMs / 1000, opt.timeoutMs % 1000,
                        !numeric && hasFinalResult(received, true)
                            ? " (a numeric result code came: if an earlier ATV0 is in force, give --numeric)"
                            : "");
                close(fd);
                return kExitNoAnswer;
            }
            long long wait = deadline - now;
            if (complete || opt.silenceEnds) wait = std::min<long long>(wait, lastByte + quietMs - now);
            struct pollfd pf[2] = {{fd, POLLIN, 0}, {gInterruptFd, POLLIN, 0}};
            int r = poll(pf, gInterruptFd >= 0 ? 2 : 1, static_cast<int>(std::max<long long>(wait, 0)));
            if (r < 0 && errno == EINTR) continue;
            if (r <= 0 || !(pf[0].revents & (POLLIN | POLLHUP | POLLERR))) continue;
            ssize_t n = read(fd, buf, sizeof buf);
            if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
            if (n <= 0) {
                fflush(stdout);
                fprintf(stderr, "tolk-sim at: the link was closed\n");
                close(fd);
                return kExitFailed;
            }
            fwrite(buf, 1, static_cast<size_t>(n), stdout);
            fflush(stdout);
            received.append(buf, static_cast<size_t>(n));
            lastByte = nowMs();
            if (!complete) {
                complete = isCompleteAnswer(line, received, numeric);
                if (complete && !hasFinalResult(received, numeric)) quietMs = std::max(quietMs, kRawAnswerQuietMs);
            }
        }
    }
    close(fd);
    return kExitOk;
}

int cmdConsole(const std::string &root, bool adb) {
    if (!isatty(0)) {
        // Piped input: one exchange per line, as a host program would do it
        // (the adb link takes one line per packet). A line that gets no
        // complete answer ends after a short silence: the console waits for
        // nobody, a script wanting certainty uses `at`.
        AtOptions opt;
        opt.root = root;
        opt.adb = adb;
        opt.rawLines = true;
        opt.silenceEnds = true;
        opt.quietMs = kPipedSilenceMs;
        std::string line;
        char in[4096];
        for (;;) {
            struct pollfd p[2] = {{0, POLLIN, 0}, {gInterruptFd, POLLIN, 0}};
            int r = poll(p, gInterruptFd >= 0 ? 2 : 1, -1);
            if (r < 0 && errno == EINTR) continue;
            if (interrupted()) return kExitFailed;
            ssize_t n = read(0, in, sizeof in);
            if (n < 0 && errno == EINTR) continue;
            if (n <= 0) break;
            for (ssize_t i = 0; i < n; i++) {
                if (in[i] == '\n') {
                    opt.lines.push_back(line);
                    line.clear();
                } else {
                    line.push_back(in[i]);
                }
            }
        }
        if (!line.empty()) opt.lines.push_back(line);
        return opt.lines.empty() ? kExitOk : cmdAt(opt);
    }
    std::string err;
    int fd = openLink(root, adb, &err);
    if (fd < 0) {
        fprintf(stderr, "tolk-sim console: %s\n", err.c_str());
        return kExitFailed;
    }
    bool tty = isatty(0);
    struct termios saved;
    if (tty && tcgetattr(0, &saved) == 0) {
        struct termios raw = saved;
        cfmakeraw(&raw);
        raw.c_oflag |= OPOST | ONLCR;  // keep our own messages readable
        tcsetattr(0, TCSANOW, &raw);
    } else {
        tty = false;
    }
    fprintf(stderr, "Connected to the %s. Type AT commands; Enter sends CR. Quit with Ctrl-].\r\n",
            adb ? "adb link" : "host serial port");
    bool stdinOpen = true;
    long long eofAt = 0;
    char buf[4096];
    int rc = 0;
    for (;;) {
        struct pollfd p[3] = {{fd, POLLIN, 0}, {0, static_cast<short>(stdinOpen ? POLLIN : 0), 0},
                              {gInterruptFd, POLLIN, 0}};
        int r = poll(p, gInterruptFd >= 0 ? 3 : 2, stdinOpen ? -1 : 100);
        if (r < 0 && errno == EINTR) continue;
        if (interrupted()) {
            rc = kExitFailed;
            break;
        }
        if (!stdinOpen && nowMs() - eofAt > 500) break;  // piped input: let the answers arrive
        if (p[0].revents & (POLLIN | POLLHUP | POLLERR)) {
            ssize_t n = read(fd, buf, sizeof buf);
            if (n == 0 || (n < 0 && errno != EAGAIN && errno != EINTR)) {
                fprintf(stderr, "\r\n[the link was closed]\r\n");
                rc = kExitFailed;
                break;
            }
            if (n > 0) {
                ssize_t w = write(1, buf, static_cast<size_t>(n));
                (void)w;
                if (!stdinOpen) eofAt = nowMs();
            }
        }
        if (stdinOpen && (p[1].revents & (POLLIN | POLLHUP))) {
            ssize_t n = read(0, buf, sizeof buf);
            if (n <= 0) {
                stdinOpen = false;
                eofAt = nowMs();
                continue;
            }
            std::string out;
            bool quit = false;
            for (ssize_t i = 0; i < n; i++) {
                if (buf[i] == 0x1d) {
                    quit = true;
                    break;
                }
                out.push_back(!tty && buf[i] == '\n' ? '\r' : buf[i]);
            }
            if (!out.empty() && !writeAllTo(fd, out, nowMs() + 5000)) {
                fprintf(stderr, "\r\n[cannot write to the link]\r\n");
                rc = kExitFailed;
                break;
            }
            if (quit) break;
        }
    }
    if (tty) tcsetattr(0, TCSANOW, &saved);
    fprintf(stderr, "\n");
    close(fd);
    return rc;
}

}  // namespace sim
