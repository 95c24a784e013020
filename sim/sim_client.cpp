#include "sim_client.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstring>

#include "sim_text.h"
#include "sim_util.h"

namespace sim {

namespace {

// After a final result the answer may still have a trailing line (a handler's
// own "OK" followed by the dispatcher's): wait this long for more.
const int kTrailingGapMs = 50;

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

bool startsWithNoCase(const std::string &s, const char *prefix) {
    size_t n = strlen(prefix);
    if (s.size() < n) return false;
    for (size_t i = 0; i < n; i++)
        if (toupper(static_cast<unsigned char>(s[i])) != prefix[i]) return false;
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

int cmdAt(const AtOptions &opt) {
    std::vector<std::string> payloads;
    for (const auto &l : opt.lines) {
        std::string bytes = l, err;
        if (!opt.rawLines && !decodeEscapes(l, &bytes, &err)) {
            fprintf(stderr, "tolk-sim at: %s\n", err.c_str());
            return 2;
        }
        if (!opt.noCr) bytes.push_back('\r');
        payloads.push_back(bytes);
    }
    std::string err;
    int fd = openLink(opt.root, opt.adb, &err);
    if (fd < 0) {
        fprintf(stderr, "tolk-sim at: %s\n", err.c_str());
        return 1;
    }
    long long deadline = nowMs() + static_cast<long long>(opt.timeoutSec) * 1000;
    bool numeric = false;
    char buf[8192];
    for (const auto &p : payloads) {
        if (startsWithNoCase(p, "ATV0")) numeric = true;
        if (startsWithNoCase(p, "ATV1")) numeric = false;
        if (!writeAllTo(fd, p, deadline)) {
            fprintf(stderr, "tolk-sim at: cannot send %s: %s\n", visibleBytes(p).c_str(), strerror(errno));
            close(fd);
            return 1;
        }
        std::string received;
        bool final = false;
        for (;;) {
            long long left = deadline - nowMs();
            if (left <= 0) {
                fprintf(stderr, "tolk-sim at: timed out after %d s\n", opt.timeoutSec);
                close(fd);
                return 1;
            }
            int wait = final ? kTrailingGapMs : opt.quietMs;
            if (wait > left) wait = static_cast<int>(left);
            struct pollfd pf = {fd, POLLIN, 0};
            int r = poll(&pf, 1, wait);
            if (r < 0 && errno == EINTR) continue;
            if (r == 0) {
                if (nowMs() >= deadline) continue;  // reported above
                break;                              // quiet: this line is done
            }
            ssize_t n = read(fd, buf, sizeof buf);
            if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
            if (n <= 0) {
                fflush(stdout);
                fprintf(stderr, "tolk-sim at: the link was closed\n");
                close(fd);
                return 1;
            }
            fwrite(buf, 1, static_cast<size_t>(n), stdout);
            fflush(stdout);
            received.append(buf, static_cast<size_t>(n));
            if (!final && hasFinalResult(received, numeric)) final = true;
        }
    }
    close(fd);
    return 0;
}

int cmdConsole(const std::string &root, bool adb) {
    if (!isatty(0)) {
        // Piped input: one exchange per line, as a host program would do it
        // (the adb link takes one line per packet).
        AtOptions opt;
        opt.root = root;
        opt.adb = adb;
        opt.rawLines = true;
        opt.timeoutSec = 3600;
        std::string line;
        int c;
        while ((c = getchar()) != EOF) {
            if (c == '\n') {
                opt.lines.push_back(line);
                line.clear();
            } else {
                line.push_back(static_cast<char>(c));
            }
        }
        if (!line.empty()) opt.lines.push_back(line);
        return opt.lines.empty() ? 0 : cmdAt(opt);
    }
    std::string err;
    int fd = openLink(root, adb, &err);
    if (fd < 0) {
        fprintf(stderr, "tolk-sim console: %s\n", err.c_str());
        return 1;
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
        struct pollfd p[2] = {{fd, POLLIN, 0}, {0, static_cast<short>(stdinOpen ? POLLIN : 0), 0}};
        int r = poll(p, 2, stdinOpen ? -1 : 100);
        if (r < 0 && errno == EINTR) continue;
        if (!stdinOpen && nowMs() - eofAt > 500) break;  // piped input: let the answers arrive
        if (p[0].revents & (POLLIN | POLLHUP | POLLERR)) {
            ssize_t n = read(fd, buf, sizeof buf);
            if (n == 0 || (n < 0 && errno != EAGAIN && errno != EINTR)) {
                fprintf(stderr, "\r\n[the link was closed]\r\n");
                rc = 1;
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
                rc = 1;
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
