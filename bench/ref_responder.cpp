// The reference responder: the least a program can do to answer an AT line on the
// links tolkd serves. tolk-sim runs it in tolkd's place (`up --tolkd THIS`), so it
// gets the same adb control socket (inherited, as from init) and the same serial
// port behind the same relay. It answers "\r\nOK\r\n" to every line: on the serial
// port a canonical line (the port set up exactly as tolkd leaves it), on adb every
// CR-ended line. The main loop has tolkd's shape (select without a timeout over the
// three host slots) but does nothing else: no pause, no logging, no parsing.
//
// With --pause-ms N it sleeps N ms after every serial read, as tolkd must.
//
// Two adb lines show what parts of tolkd's answer pattern cost by themselves:
// "AT+SPLIT" is answered by two writes, a body and then the final result, as
// tolkd answers a local command; "AT+SPLITLOG" also appends two log lines to a
// file first, as tolkd logs two info lines before it answers.
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <initializer_list>

namespace {

const char kOk[] = "\r\nOK\r\n";
const char kBody[] = "\r\n+SPLIT: 1,1\n\r\n";
const char kLogLine[] =
    "12-06 08:27:19.807  5119  5119 I TOLKD: 140:routeCommandLine(): Command:[AT+SPLITLOG]\n";

bool writeAll(int fd, const char *p, size_t n) {
    while (n > 0) {
        ssize_t w = write(fd, p, n);
        if (w < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        p += w;
        n -= static_cast<size_t>(w);
    }
    return true;
}

// The settings tolkd gives its port (see `tolk-sim tty-settings`): canonical input
// with echo, CR read as LF, Ctrl-Z and ESC also ending a line, Ctrl-D plain data,
// no output processing.
int openSerial(const char *root) {
    char path[PATH_MAX];
    snprintf(path, sizeof path, "%s/dev/ttyGS0", root);
    int fd = open(path, O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (fd < 0) return -1;
    struct termios t;
    if (tcgetattr(fd, &t) == 0) {
        t.c_iflag = ICRNL | IXON;
        t.c_oflag = ONLCR;
        t.c_lflag = ICANON | ECHO | IEXTEN;
        t.c_cc[VERASE] = 0x7f;
        t.c_cc[VEOL] = 0x1a;
        t.c_cc[VEOL2] = 0x1b;
        t.c_cc[VEOF] = _POSIX_VDISABLE;  // Ctrl-D is data on tolkd's port too
        tcsetattr(fd, TCSANOW, &t);
    }
    return fd;
}

}  // namespace

int main(int argc, char **argv) {
    int pauseMs = 0;
    for (int i = 1; i < argc; i++) {
        if (strcmp(argv[i], "--pause-ms") == 0 && i + 1 < argc) pauseMs = atoi(argv[++i]);
    }
    const char *env = getenv("TOLK_BENCH_REF_PAUSE_MS");
    if (env != nullptr) pauseMs = atoi(env);
    const char *root = getenv("TOLKD_ROOT");
    if (root == nullptr) root = "";

    int serial = openSerial(root);
    int listenFd = -1;
    if (const char *s = getenv("ANDROID_SOCKET_adb_tolk_socket")) {
        listenFd = atoi(s);
        if (listen(listenFd, 2) != 0) listenFd = -1;
    }
    int conn = -1;
    char buf[4096];
    char line[4096];
    size_t lineLen = 0;
    char logPath[PATH_MAX];
    snprintf(logPath, sizeof logPath, "%s/log/ref.log", root);
    int logFd = open(logPath, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);

    for (;;) {
        fd_set rs;
        FD_ZERO(&rs);
        int maxFd = -1;
        for (int fd : {serial, listenFd, conn}) {
            if (fd < 0) continue;
            FD_SET(fd, &rs);
            if (fd > maxFd) maxFd = fd;
        }
        if (maxFd < 0) return 1;
        if (select(maxFd + 1, &rs, nullptr, nullptr, nullptr) < 0) {
            if (errno == EINTR) continue;
            return 1;
        }
        if (serial >= 0 && FD_ISSET(serial, &rs)) {
            ssize_t n = read(serial, buf, sizeof buf);
            if (n > 0) {
                if (pauseMs > 0) {
                    struct timespec ts = {pauseMs / 1000, (pauseMs % 1000) * 1000000L};
                    nanosleep(&ts, nullptr);
                }
                writeAll(serial, kOk, sizeof kOk - 1);
            } else if (n == 0 || errno != EINTR) {
                close(serial);
                serial = openSerial(root);
            }
        }
        if (listenFd >= 0 && FD_ISSET(listenFd, &rs)) {
            int fd = accept4(listenFd, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd >= 0) {
                if (conn >= 0) close(conn);
                conn = fd;
                lineLen = 0;
            }
        }
        if (conn >= 0 && FD_ISSET(conn, &rs)) {
            ssize_t n = read(conn, buf, sizeof buf);
            if (n <= 0) {
                if (n < 0 && errno == EINTR) continue;
                close(conn);
                conn = -1;
                continue;
            }
            for (ssize_t i = 0; i < n; i++) {
                if (buf[i] != '\r') {
                    if (lineLen < sizeof line) line[lineLen++] = buf[i];
                    continue;
                }
                bool split = lineLen >= 8 && memcmp(line, "AT+SPLIT", 8) == 0;
                if (split && lineLen >= 11 && memcmp(line + 8, "LOG", 3) == 0 && logFd >= 0) {
                    writeAll(logFd, kLogLine, sizeof kLogLine - 1);
                    writeAll(logFd, kLogLine, sizeof kLogLine - 1);
                }
                if (split) writeAll(conn, kBody, sizeof kBody - 1);
                writeAll(conn, kOk, sizeof kOk - 1);
                lineLen = 0;
            }
        }
    }
}
