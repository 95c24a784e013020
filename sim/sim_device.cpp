// The simulated device: `tolk-sim up` prepares the device root and starts a
// supervisor process that owns the serial link (two pseudo-terminal pairs and a
// relay between them), the adb control socket, the peers and tolkd.
#include "sim_device.h"

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdarg.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <map>
#include <sstream>

#include <cutils/properties.h>
#include <tolk_platform/device_root.h>

#include "sim_util.h"

#ifndef TOLKD_DEFAULT_BINARY
#define TOLKD_DEFAULT_BINARY "tolkd"
#endif

namespace sim {

namespace {

const int kServeTimeoutMs = 10000;
const int kPeerReadyTimeoutMs = 3000;
const int kGraceMs = 2000;
// Bytes the relay holds per direction before it stops reading that side.
const size_t kRelayCap = 256 * 1024;

std::string shellQuote(const std::string &s) {
    std::string out = "'";
    for (char c : s) {
        if (c == '\'')
            out += "'\\''";
        else
            out.push_back(c);
    }
    return out + "'";
}

// A pseudo-terminal pair: the master and an open descriptor on its slave.
struct PtyPair {
    int master = -1;
    int slave = -1;
    std::string slaveName;
};

bool openPty(PtyPair *p, std::string *err) {
    int m = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (m < 0 || grantpt(m) != 0 || unlockpt(m) != 0) {
        *err = std::string("cannot create a pseudo-terminal: ") + strerror(errno);
        if (m >= 0) close(m);
        return false;
    }
    char name[128];
    if (ptsname_r(m, name, sizeof name) != 0) {
        *err = std::string("ptsname: ") + strerror(errno);
        close(m);
        return false;
    }
    int s = open(name, O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (s < 0) {
        *err = std::string("cannot open ") + name + ": " + strerror(errno);
        close(m);
        return false;
    }
    fcntl(m, F_SETFL, fcntl(m, F_GETFL) | O_NONBLOCK);
    p->master = m;
    p->slave = s;
    p->slaveName = name;
    return true;
}

// Replaces link atomically, so that an open of it always finds either the old
// or the new terminal, never nothing.
bool replaceSymlink(const std::string &target, const std::string &link) {
    std::string tmp = link + ".new";
    unlink(tmp.c_str());
    if (symlink(target.c_str(), tmp.c_str()) != 0) return false;
    if (rename(tmp.c_str(), link.c_str()) != 0) {
        unlink(tmp.c_str());
        return false;
    }
    return true;
}

std::string describeStatus(int status) {
    if (WIFEXITED(status)) return "tolkd exited with status " + std::to_string(WEXITSTATUS(status));
    if (WIFSIGNALED(status)) return "tolkd was killed by signal " + std::to_string(WTERMSIG(status));
    return "tolkd ended (wait status " + std::to_string(status) + ")";
}

// What run/tolkd.status holds: the exit status, or "signal N".
std::string statusFileText(int status) {
    if (WIFSIGNALED(status)) return "signal " + std::to_string(WTERMSIG(status)) + "\n";
    return std::to_string(WEXITSTATUS(status)) + "\n";
}

int gSignalPipe[2] = {-1, -1};

void onSignal(int sig) {
    int saved = errno;
    unsigned char b = static_cast<unsigned char>(sig);
    ssize_t r = write(gSignalPipe[1], &b, 1);
    (void)r;
    errno = saved;
}

void closeFrom(int first, int keep) {
    long max = sysconf(_SC_OPEN_MAX);
    if (max < 0 || max > 65536) max = 65536;
    for (int fd = first; fd < max; fd++)
        if (fd != keep) close(fd);
}

class Supervisor {
public:
    Supervisor(const UpOptions &opt, int readyFd) : opt_(opt), L_{opt.root}, readyFd_(readyFd) {}
    int run();

private:
    void log(const char *fmt, ...) __attribute__((format(printf, 2, 3)));
    void ready(const std::string &line);
    bool setUp(std::string *err);
    void writeEnvFile();
    pid_t spawnPeer(const std::string &name);
    void waitForPeers();
    bool peerReady(const std::string &name);
    pid_t spawnTolkd();
    void waitForServing();
    bool tolkdInMainWait();
    void reapChildren();
    void childEnded(pid_t pid, int status);
    void relayLoop();
    void serveControl(int listenFd);
    std::string handleCommand(const std::string &line);
    std::string replug();
    std::string unplug();
    std::string ttySettings();
    std::string stopPeer(const std::string &name);
    std::string startPeer(const std::string &name);
    bool terminate(pid_t pid, const std::string &what);
    void shutdownAll();
    void pumpRead(int fd, std::string *buf, bool toDevice);
    void pumpWrite(int fd, std::string *buf);

    UpOptions opt_;
    RootLayout L_;
    int readyFd_;
    std::string self_;
    FILE *log_ = nullptr;
    PtyPair dev_, host_;
    int adbFd_ = -1;
    int ctlFd_ = -1;
    pid_t tolkd_ = -1;
    bool tolkdEnded_ = false;
    std::map<std::string, pid_t> peers_;
    std::string toHost_, toDevice_;
    long long pauseUntil_ = 0;
    bool stopping_ = false;
};

void Supervisor::log(const char *fmt, ...) {
    if (!log_) return;
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    struct tm tm;
    localtime_r(&ts.tv_sec, &tm);
    char stamp[32];
    strftime(stamp, sizeof stamp, "%H:%M:%S", &tm);
    fprintf(log_, "%s.%03ld ", stamp, ts.tv_nsec / 1000000);
    va_list ap;
    va_start(ap, fmt);
    vfprintf(log_, fmt, ap);
    va_end(ap);
    fputc('\n', log_);
    fflush(log_);
}

void Supervisor::ready(const std::string &line) {
    if (readyFd_ < 0) return;
    std::string l = line + "\n";
    ssize_t r = write(readyFd_, l.data(), l.size());
    (void)r;
    close(readyFd_);
    readyFd_ = -1;
}

bool Supervisor::setUp(std::string *err) {
    char exe[4096];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    if (n <= 0) {
        *err = "cannot find the tolk-sim binary";
        return false;
    }
    exe[n] = '\0';
    self_ = exe;

    if (pipe2(gSignalPipe, O_CLOEXEC | O_NONBLOCK) != 0) {
        *err = "pipe failed";
        return false;
    }
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = onSignal;
    sa.sa_flags = SA_RESTART | SA_NOCLDSTOP;
    sigaction(SIGCHLD, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGHUP, &sa, nullptr);
    signal(SIGPIPE, SIG_IGN);

    // The gadget side. Its terminal settings stay at the pseudo-terminal
    // defaults (ICRNL: a CR typed by the host ends a canonical line); the
    // daemon applies its own when it opens the port.
    if (!openPty(&dev_, err)) return false;
    if (!replaceSymlink(dev_.slaveName, L_.deviceTty())) {
        *err = "cannot link " + L_.deviceTty() + ": " + strerror(errno);
        return false;
    }
    // The host side: a raw terminal, like the ACM port a host opens.
    if (!openPty(&host_, err)) return false;
    struct termios t;
    if (tcgetattr(host_.slave, &t) == 0) {
        cfmakeraw(&t);
        tcsetattr(host_.slave, TCSANOW, &t);
    }
    if (!replaceSymlink(host_.slaveName, L_.hostTty())) {
        *err = "cannot link " + L_.hostTty() + ": " + strerror(errno);
        return false;
    }

    if (opt_.controlSocket) {
        // Bound, not listening: like init, which leaves listen() to the service.
        // No CLOEXEC: tolkd inherits it.
        adbFd_ = bindUnix(L_.adbSocket(), -1, false);
        if (adbFd_ < 0) {
            *err = "cannot create the control socket " + L_.adbSocket() + ": " + strerror(errno);
            return false;
        }
    } else {
        unlink(L_.adbSocket().c_str());
    }
    ctlFd_ = bindUnix(L_.ctlSocket(), 8);
    if (ctlFd_ < 0) {
        *err = "cannot create " + L_.ctlSocket() + ": " + strerror(errno);
        return false;
    }
    fcntl(ctlFd_, F_SETFL, fcntl(ctlFd_, F_GETFL) | O_NONBLOCK);
    writeFile(L_.pidFile("supervisor"), std::to_string(getpid()) + "\n");
    return true;
}

void Supervisor::writeEnvFile() {
    std::ostringstream e;
    e << "TOLKD_ROOT=" << shellQuote(L_.root) << "\n";
    e << "TOLKD_PID=" << tolkd_ << "\n";
    e << "TOLK_SIM_PID=" << getpid() << "\n";
    e << "TOLK_HOST_TTY=" << shellQuote(L_.hostTty()) << "\n";
    e << "TOLK_DEVICE_TTY=" << shellQuote(L_.deviceTty()) << "\n";
    e << "TOLK_ADB_SOCKET=" << shellQuote(opt_.controlSocket ? L_.adbSocket() : "") << "\n";
    e << "TOLKD_LOG=" << shellQuote(L_.tolkdLog()) << "\n";
    e << "TOLK_SIM_CTL=" << shellQuote(L_.ctlSocket()) << "\n";
    writeFile(L_.envFile(), e.str());
}

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

// The address each peer serves, so that tolkd does not start before the peers
// can be reached.
bool Supervisor::peerReady(const std::string &name) {
    struct stat st;
    const char *dev = nullptr;
    if (name == "radio") dev = "/dev/hwbinder/radio.slot1";
    if (name == "generic") dev = "/dev/socket/tolk-service";
    if (name == "audio") dev = "/dev/socket/tolk-audio";
    if (dev) {
        char path[4096];
        return tolk_device_path(dev, path, sizeof path) && stat(path, &st) == 0 && S_ISSOCK(st.st_mode);
    }
    if (name == "cit") {
        char abs[256];
        int len = tolk_abstract_name("auto_cit", abs, sizeof abs);
        if (len <= 0) return true;
        std::string want = "@" + std::string(abs, static_cast<size_t>(len));
        std::string table = readFileOr("/proc/net/unix");
        std::istringstream in(table);
        std::string line;
        while (std::getline(in, line)) {
            if (line.size() >= want.size() && line.compare(line.size() - want.size(), want.size(), want) == 0)
                return true;
        }
        return false;
    }
    return true;
}

void Supervisor::waitForPeers() {
    long long deadline = nowMs() + kPeerReadyTimeoutMs;
    for (;;) {
        reapChildren();
        bool all = true;
        for (const auto &p : peers_)
            if (p.second > 0 && !peerReady(p.first)) all = false;
        if (all) return;
        if (nowMs() >= deadline) break;
        sleepMs(10);
    }
    for (const auto &p : peers_)
        if (p.second > 0 && !peerReady(p.first))
            log("peer %s is not serving after %d ms; starting tolkd anyway", p.first.c_str(),
                kPeerReadyTimeoutMs);
}

pid_t Supervisor::spawnTolkd() {
    unlink(L_.tolkdStatus().c_str());
    pid_t pid = fork();
    if (pid < 0) return -1;
    if (pid == 0) {
        int in = open("/dev/null", O_RDONLY);
        int out = open(L_.tolkdOut().c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        if (in >= 0) dup2(in, 0);
        if (out >= 0) {
            dup2(out, 1);
            dup2(out, 2);
        }
        int keep = adbFd_;
        if (keep >= 0 && keep < 3) {
            keep = fcntl(adbFd_, F_DUPFD, 3);
        }
        closeFrom(3, keep);
        setenv("TOLKD_ROOT", L_.root.c_str(), 1);
        setenv("TOLKD_LOG", L_.tolkdLog().c_str(), 1);
        setenv("ANDROID_LOG_TAGS", opt_.logTags.c_str(), 1);
        if (keep >= 0)
            setenv("ANDROID_SOCKET_adb_tolk_socket", std::to_string(keep).c_str(), 1);
        else
            unsetenv("ANDROID_SOCKET_adb_tolk_socket");
        struct sigaction sa;
        memset(&sa, 0, sizeof sa);
        sa.sa_handler = SIG_DFL;
        for (int s : {SIGCHLD, SIGTERM, SIGINT, SIGHUP, SIGPIPE}) sigaction(s, &sa, nullptr);
        const char *bin = opt_.tolkdBinary.c_str();
        char *argv[] = {const_cast<char *>("tolkd"), nullptr};
        execv(bin, argv);
        fprintf(stderr, "cannot run %s: %s\n", bin, strerror(errno));
        _exit(127);
    }
    writeFile(L_.pidFile("tolkd"), std::to_string(pid) + "\n");
    log("tolkd started, pid %d", pid);
    return pid;
}

// tolkd serves once its main thread blocks in the reader's select.
bool Supervisor::tolkdInMainWait() {
    std::string proc = "/proc/" + std::to_string(tolkd_);
    std::string s;
    if (!readFile(proc + "/syscall", &s) || s.empty()) {
        // Kernels without syscall tracing: the wait channel names the select wait.
        std::string wchan = readFileOr(proc + "/wchan");
        return wchan.find("select") != std::string::npos || wchan.find("poll_schedule") != std::string::npos;
    }
    if (!isdigit(static_cast<unsigned char>(s[0]))) return false;
    long nr = atol(s.c_str());
#ifdef SYS_select
    if (nr == SYS_select) return true;
#endif
#ifdef SYS_pselect6
    if (nr == SYS_pselect6) return true;
#endif
    return false;
}

void Supervisor::waitForServing() {
    long long deadline = nowMs() + kServeTimeoutMs;
    while (nowMs() < deadline) {
        reapChildren();
        if (tolkdEnded_) {
            ready("exited " + readFileOr(L_.tolkdStatus()));
            return;
        }
        if (tolkdInMainWait()) {
            log("tolkd is serving");
            ready("serving " + std::to_string(tolkd_));
            return;
        }
        sleepMs(10);
    }
    log("tolkd did not reach its main wait within %d s", kServeTimeoutMs / 1000);
    ready("timeout " + std::to_string(tolkd_));
}

void Supervisor::childEnded(pid_t pid, int status) {
    if (pid == tolkd_) {
        tolkdEnded_ = true;
        writeFile(L_.tolkdStatus(), statusFileText(status));
        log("%s", describeStatus(status).c_str());
        unlink(L_.pidFile("tolkd").c_str());
        return;
    }
    for (auto &p : peers_) {
        if (p.second == pid) {
            log("peer %s (pid %d) ended with wait status %d", p.first.c_str(), pid, status);
            p.second = -1;
            unlink(L_.pidFile(p.first).c_str());
            return;
        }
    }
}

void Supervisor::reapChildren() {
    int status;
    pid_t pid;
    while ((pid = waitpid(-1, &status, WNOHANG)) > 0) childEnded(pid, status);
}

bool Supervisor::terminate(pid_t pid, const std::string &what) {
    if (pid <= 0) return true;
    kill(pid, SIGTERM);
    long long deadline = nowMs() + kGraceMs;
    int status;
    while (nowMs() < deadline) {
        pid_t r = waitpid(pid, &status, WNOHANG);
        if (r == pid) {
            childEnded(pid, status);
            return true;
        }
        if (r < 0 && errno == ECHILD) return true;
        sleepMs(5);
    }
    log("%s (pid %d) ignored SIGTERM; killing it", what.c_str(), pid);
    kill(pid, SIGKILL);
    if (waitpid(pid, &status, 0) == pid) childEnded(pid, status);
    return true;
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
    while (nowMs() < deadline && peers_[name] > 0 && !peerReady(name)) {
        reapChildren();
        sleepMs(10);
    }
    return "ok\n";
}

std::string Supervisor::replug() {
    PtyPair fresh;
    std::string err;
    if (!openPty(&fresh, &err)) return "error: " + err + "\n";
    if (!replaceSymlink(fresh.slaveName, L_.deviceTty())) {
        close(fresh.master);
        close(fresh.slave);
        return "error: cannot relink " + L_.deviceTty() + "\n";
    }
    // Closing the old master hangs the old port up: tolkd's read fails and it
    // reopens /dev/ttyGS0, which now names the fresh terminal.
    if (dev_.master >= 0) close(dev_.master);
    if (dev_.slave >= 0) close(dev_.slave);
    dev_ = fresh;
    toDevice_.clear();  // bytes on the wire when the cable was pulled are lost
    log("replugged: %s", dev_.slaveName.c_str());
    return "ok\n" + dev_.slaveName + "\n";
}

std::string Supervisor::unplug() {
    unlink(L_.deviceTty().c_str());
    if (dev_.master >= 0) close(dev_.master);
    if (dev_.slave >= 0) close(dev_.slave);
    dev_ = PtyPair();
    toDevice_.clear();
    log("unplugged");
    return "ok\n";
}

std::string Supervisor::ttySettings() {
    if (dev_.slave < 0) return "error: the serial link is unplugged\n";
    struct termios t;
    if (tcgetattr(dev_.slave, &t) != 0) return std::string("error: tcgetattr: ") + strerror(errno) + "\n";
    char buf[256];
    snprintf(buf, sizeof buf,
             "ok\nc_iflag=0x%x\nc_oflag=0x%x\nc_lflag=0x%x\nVERASE=0x%02x\nVEOL=0x%02x\nVEOL2=0x%02x\n",
             static_cast<unsigned>(t.c_iflag), static_cast<unsigned>(t.c_oflag),
             static_cast<unsigned>(t.c_lflag), t.c_cc[VERASE], t.c_cc[VEOL], t.c_cc[VEOL2]);
    return buf;
}

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

void Supervisor::pumpRead(int fd, std::string *buf, bool toDevice) {
    char tmp[4096];
    while (buf->size() < kRelayCap) {
        ssize_t n = read(fd, tmp, std::min(sizeof tmp, kRelayCap - buf->size()));
        if (n > 0) {
            buf->append(tmp, static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        break;  // EAGAIN, or EIO while nobody holds the slave
    }
    (void)toDevice;
}

void Supervisor::pumpWrite(int fd, std::string *buf) {
    while (!buf->empty()) {
        ssize_t n = write(fd, buf->data(), buf->size());
        if (n > 0) {
            buf->erase(0, static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        break;
    }
}

void Supervisor::relayLoop() {
    while (!stopping_) {
        long long now = nowMs();
        bool paused = now < pauseUntil_;
        struct pollfd fds[4];
        int nfds = 0;
        int iDev = -1, iHost = -1;
        fds[nfds++] = {gSignalPipe[0], POLLIN, 0};
        fds[nfds++] = {ctlFd_, POLLIN, 0};
        if (dev_.master >= 0) {
            short ev = 0;
            if (!paused && toHost_.size() < kRelayCap) ev |= POLLIN;
            if (!toDevice_.empty()) ev |= POLLOUT;
            iDev = nfds;
            fds[nfds++] = {dev_.master, ev, 0};
        }
        {
            short ev = 0;
            if (toDevice_.size() < kRelayCap) ev |= POLLIN;
            if (!toHost_.empty()) ev |= POLLOUT;
            iHost = nfds;
            fds[nfds++] = {host_.master, ev, 0};
        }
        int timeout = paused ? static_cast<int>(pauseUntil_ - now) : -1;
        int r = poll(fds, static_cast<nfds_t>(nfds), timeout);
        if (r < 0) {
            if (errno == EINTR) continue;
            log("poll failed: %s", strerror(errno));
            sleepMs(10);
            continue;
        }
        if (fds[0].revents & POLLIN) {
            unsigned char sigs[32];
            ssize_t n;
            while ((n = read(gSignalPipe[0], sigs, sizeof sigs)) > 0) {
                for (ssize_t k = 0; k < n; k++)
                    if (sigs[k] != SIGCHLD) stopping_ = true;
            }
            reapChildren();
            if (stopping_) {
                shutdownAll();
                return;
            }
        }
        if (fds[1].revents & POLLIN) {
            serveControl(ctlFd_);
            if (stopping_) return;
        }
        // Descriptors may have changed under a replug or unplug just served.
        if (iDev >= 0 && fds[iDev].fd == dev_.master) {
            if (fds[iDev].revents & (POLLIN | POLLHUP | POLLERR)) pumpRead(dev_.master, &toHost_, false);
            if (fds[iDev].revents & POLLOUT) pumpWrite(dev_.master, &toDevice_);
        }
        if (iHost >= 0) {
            if (fds[iHost].revents & (POLLIN | POLLHUP | POLLERR)) pumpRead(host_.master, &toDevice_, true);
            if (fds[iHost].revents & POLLOUT) pumpWrite(host_.master, &toHost_);
        }
        if (dev_.master < 0) toDevice_.clear();  // unplugged: the host types into nothing
        // Opportunistic flushes so that freshly read bytes do not wait a turn.
        if (dev_.master >= 0 && !toDevice_.empty()) pumpWrite(dev_.master, &toDevice_);
        if (!toHost_.empty()) pumpWrite(host_.master, &toHost_);
    }
}

void Supervisor::shutdownAll() {
    stopping_ = true;
    if (tolkd_ > 0 && !tolkdEnded_) terminate(tolkd_, "tolkd");
    for (auto &p : peers_) {
        if (p.second > 0) terminate(p.second, "peer " + p.first);
        p.second = -1;
        unlink(L_.pidFile(p.first).c_str());
    }
    reapChildren();
    unlink(L_.ctlSocket().c_str());
    unlink(L_.pidFile("supervisor").c_str());
    log("down");
}

int Supervisor::run() {
    log_ = fopen(L_.supervisorLog().c_str(), "a");
    if (log_) fcntl(fileno(log_), F_SETFD, FD_CLOEXEC);
    log("supervisor %d for %s", getpid(), L_.root.c_str());
    std::string err;
    if (!setUp(&err)) {
        log("%s", err.c_str());
        ready("error " + err);
        return 1;
    }
    for (const auto &name : peerNames()) {
        std::string dev;
        if (name == "radio") dev = "/dev/hwbinder/radio.slot1";
        if (name == "generic") dev = "/dev/socket/tolk-service";
        if (name == "audio") dev = "/dev/socket/tolk-audio";
        if (!dev.empty()) unlink((L_.root + dev).c_str());  // a stale socket is not a ready peer
        spawnPeer(name);
    }
    waitForPeers();
    tolkd_ = spawnTolkd();
    if (tolkd_ < 0) {
        ready("error cannot fork tolkd");
        shutdownAll();
        return 1;
    }
    // init keeps no copy of a service's socket once the service has it.
    if (adbFd_ >= 0) {
        close(adbFd_);
        adbFd_ = -1;
    }
    writeEnvFile();
    waitForServing();
    relayLoop();
    return 0;
}

void prepareRoot(const UpOptions &opt, std::string *err) {
    RootLayout L{opt.root};
    for (const char *d : {"dev/socket", "host", "run", "log", "journal", "nvram", "sys/class/BOOT/BOOT/boot"}) {
        if (!makeDirs(L.path(d))) {
            *err = "cannot create " + L.path(d) + ": " + strerror(errno);
            return;
        }
    }
    std::string bootFile = L.path("sys/class/BOOT/BOOT/boot/boot_mode");
    if (opt.writeBootMode) {
        if (!writeFile(bootFile, opt.bootMode)) {
            *err = "cannot write " + bootFile;
            return;
        }
    } else {
        unlink(bootFile.c_str());
    }
    if (!opt.adcLines.empty()) {
        std::string content;
        for (const auto &l : opt.adcLines) content += l + "\n";
        if (!writeFile(L.path("dev/OV_pmic_adc_cali"), content)) {
            *err = "cannot write the ADC device file";
            return;
        }
    }
    std::string store = L.path("nvram/PRODUCT_INFO");
    std::string shape = store + ".shape";
    if (!opt.nvram) {
        unlink(store.c_str());
        unlink(shape.c_str());
    } else if (opt.nvramShapeGiven) {
        if (!writeFile(store, std::string(static_cast<size_t>(opt.nvramSize * opt.nvramCount), '\0')) ||
            !writeFile(shape, std::to_string(opt.nvramSize) + " " + std::to_string(opt.nvramCount) + "\n")) {
            *err = "cannot write the NVRAM store";
            return;
        }
    } else if (!fileExists(store)) {
        // NVRAM outlives the daemon: an existing store of this root is kept.
        unlink(shape.c_str());
        if (!writeFile(store, std::string(1024, '\0'))) {
            *err = "cannot write the NVRAM store";
            return;
        }
    }
    for (const auto &p : opt.props) {
        char cur[PROP_VALUE_MAX];
        property_get(p.first.c_str(), cur, "\x01");
        if (p.second == cur) continue;  // a write-once ro. value set again
        if (property_set(p.first.c_str(), p.second.c_str()) != 0) {
            *err = "the property " + p.first + "=" + p.second + " was refused";
            return;
        }
    }
}

}  // namespace

bool parseUpOptions(const std::vector<std::string> &args, size_t i, UpOptions *opt, std::string *err,
                    std::vector<std::string> *extra) {
    auto need = [&](const std::string &o) -> const std::string * {
        if (i + 1 >= args.size()) {
            *err = o + " needs a value";
            return nullptr;
        }
        return &args[++i];
    };
    for (; i < args.size(); i++) {
        const std::string &a = args[i];
        const std::string *v = nullptr;
        if (a == "--root") {
            if (!(v = need(a))) return false;
            opt->root = *v;
        } else if (a == "--prop") {
            if (!(v = need(a))) return false;
            size_t eq = v->find('=');
            if (eq == std::string::npos || eq == 0) {
                *err = "--prop needs NAME=VALUE, got '" + *v + "'";
                return false;
            }
            opt->props.emplace_back(v->substr(0, eq), v->substr(eq + 1));
        } else if (a == "--boot-mode") {
            if (!(v = need(a))) return false;
            opt->writeBootMode = true;
            opt->bootMode = *v;
        } else if (a == "--no-boot-mode") {
            opt->writeBootMode = false;
        } else if (a == "--no-control-socket") {
            opt->controlSocket = false;
        } else if (a == "--log-tags") {
            if (!(v = need(a))) return false;
            opt->logTags = *v;
        } else if (a == "--adc") {
            if (!(v = need(a))) return false;
            size_t eq = v->find('=');
            char *end = nullptr;
            if (eq == std::string::npos) {
                *err = "--adc needs CHANNEL=VALUE[,STATUS], got '" + *v + "'";
                return false;
            }
            std::string ch = v->substr(0, eq), rest = v->substr(eq + 1), st = "0";
            size_t comma = rest.find(',');
            if (comma != std::string::npos) {
                st = rest.substr(comma + 1);
                rest = rest.substr(0, comma);
            }
            for (const std::string *num : {&ch, &rest, &st}) {
                strtol(num->c_str(), &end, 10);
                if (num->empty() || *end != '\0') {
                    *err = "--adc needs numbers: CHANNEL=VALUE[,STATUS], got '" + *v + "'";
                    return false;
                }
            }
            opt->adcLines.push_back(ch + " " + rest + " " + st);
        } else if (a == "--modem-tty") {
            if (!(v = need(a))) return false;
            opt->modemTty = *v;
        } else if (a == "--nvram-shape") {
            if (!(v = need(a))) return false;
            long size = 0, count = 0;
            char tail = 0;
            if (sscanf(v->c_str(), "%ld,%ld%c", &size, &count, &tail) != 2 || size < 0 || count < 0 ||
                size * count > 64L * 1024 * 1024) {
                *err = "--nvram-shape needs SIZE,COUNT, got '" + *v + "'";
                return false;
            }
            opt->nvram = true;
            opt->nvramShapeGiven = true;
            opt->nvramSize = size;
            opt->nvramCount = count;
        } else if (a == "--no-nvram") {
            opt->nvram = false;
            opt->nvramShapeGiven = false;
        } else if (a == "--tolkd") {
            if (!(v = need(a))) return false;
            opt->tolkdBinary = *v;
        } else if (a == "--quiet" || a == "-q") {
            opt->quiet = true;
        } else if (extra) {
            extra->push_back(a);
        } else {
            *err = "unknown option '" + a + "'";
            return false;
        }
    }
    return true;
}

int cmdUp(UpOptions opt) {
    if (opt.root.empty()) {
        fprintf(stderr, "tolk-sim up: --root DIR is required\n");
        return 2;
    }
    if (opt.tolkdBinary.empty()) opt.tolkdBinary = TOLKD_DEFAULT_BINARY;
    opt.tolkdBinary = absolutePath(opt.tolkdBinary);
    if (access(opt.tolkdBinary.c_str(), X_OK) != 0) {
        fprintf(stderr, "tolk-sim up: no tolkd binary at %s\n", opt.tolkdBinary.c_str());
        return 2;
    }
    if (!makeDirs(absolutePath(opt.root))) {
        fprintf(stderr, "tolk-sim up: cannot create %s: %s\n", opt.root.c_str(), strerror(errno));
        return 1;
    }
    char real[4096];
    if (!realpath(opt.root.c_str(), real)) {
        fprintf(stderr, "tolk-sim up: %s: %s\n", opt.root.c_str(), strerror(errno));
        return 1;
    }
    opt.root = real;
    RootLayout L{opt.root};
    if (!fitsSocketPath(L.adbSocket()) || !fitsSocketPath(L.ctlSocket())) {
        fprintf(stderr,
                "tolk-sim up: the root path is too long for a socket path (%zu bytes; at most %zu): "
                "use a shorter folder such as /tmp/tolk.XXXX\n",
                L.adbSocket().size(), sizeof(((struct sockaddr_un *)nullptr)->sun_path) - 1);
        return 2;
    }
    setenv(TOLKD_ROOT_ENV, opt.root.c_str(), 1);
    std::string answer;
    if (controlRequest(opt.root, "status", &answer, 2000)) {
        fprintf(stderr, "tolk-sim up: a device is already up on %s (tolk-sim down --root %s)\n",
                opt.root.c_str(), opt.root.c_str());
        return 1;
    }
    std::string err;
    prepareRoot(opt, &err);
    if (!err.empty()) {
        fprintf(stderr, "tolk-sim up: %s\n", err.c_str());
        return 1;
    }

    int pfd[2];
    if (pipe2(pfd, O_CLOEXEC) != 0) {
        perror("tolk-sim up: pipe");
        return 1;
    }
    fflush(stdout);
    fflush(stderr);
    pid_t child = fork();
    if (child < 0) {
        perror("tolk-sim up: fork");
        return 1;
    }
    if (child == 0) {
        close(pfd[0]);
        setsid();
        pid_t grand = fork();
        if (grand != 0) _exit(grand < 0 ? 1 : 0);
        if (chdir("/") != 0) _exit(1);
        int nul = open("/dev/null", O_RDWR);
        if (nul >= 0) {
            dup2(nul, 0);
            dup2(nul, 1);
            if (nul > 2) close(nul);
        }
        // Anything the supervisor itself prints (a sanitizer report) is kept.
        int err = open(RootLayout{opt.root}.supervisorLog().c_str(), O_WRONLY | O_CREAT | O_APPEND, 0644);
        if (err >= 0) {
            dup2(err, 2);
            if (err > 2) close(err);
        }
        Supervisor sup(opt, pfd[1]);
        _exit(sup.run());
    }
    close(pfd[1]);
    int st;
    waitpid(child, &st, 0);

    std::string line;
    char buf[512];
    long long deadline = nowMs() + kServeTimeoutMs + kPeerReadyTimeoutMs + 5000;
    while (line.find('\n') == std::string::npos && nowMs() < deadline) {
        struct pollfd p = {pfd[0], POLLIN, 0};
        if (poll(&p, 1, 200) <= 0) continue;
        ssize_t n = read(pfd[0], buf, sizeof buf);
        if (n <= 0) break;
        line.append(buf, static_cast<size_t>(n));
    }
    close(pfd[0]);
    while (!line.empty() && (line.back() == '\n' || line.back() == '\r')) line.pop_back();

    auto lastLog = [&]() {
        std::string tail = tailLines(L.tolkdLog(), 15);
        if (!tail.empty()) fprintf(stderr, "last lines of %s:\n%s\n", L.tolkdLog().c_str(), tail.c_str());
        std::string out = tailLines(L.tolkdOut(), 15);
        if (!out.empty()) fprintf(stderr, "last lines of %s:\n%s\n", L.tolkdOut().c_str(), out.c_str());
    };
    if (line.compare(0, 8, "serving ") == 0) {
        if (!opt.quiet)
            printf("tolkd is serving (pid %s); root %s; environment in %s\n", line.c_str() + 8,
                   opt.root.c_str(), L.envFile().c_str());
        return 0;
    }
    if (line.compare(0, 7, "exited ") == 0) {
        std::string s = line.substr(7);
        if (s.compare(0, 7, "signal ") == 0)
            fprintf(stderr, "tolkd was killed by signal %s\n", s.c_str() + 7);
        else
            fprintf(stderr, "tolkd exited with status %s\n", s.c_str());
        lastLog();
        return 1;
    }
    if (line.compare(0, 8, "timeout ") == 0) {
        fprintf(stderr, "tolkd (pid %s) did not start serving within %d s\n", line.c_str() + 8,
                kServeTimeoutMs / 1000);
        lastLog();
        return 1;
    }
    if (line.compare(0, 6, "error ") == 0) {
        fprintf(stderr, "tolk-sim up: %s\n", line.c_str() + 6);
        return 1;
    }
    fprintf(stderr, "tolk-sim up: the supervisor did not report (see %s)\n", L.supervisorLog().c_str());
    return 1;
}

int cmdDown(const std::string &rootArg) {
    char real[4096];
    if (!realpath(rootArg.c_str(), real)) return 0;  // no root, nothing runs there
    std::string root = real;
    RootLayout L{root};
    pid_t sup = readPidFile(L.pidFile("supervisor"));
    std::string answer;
    if (controlRequest(root, "down", &answer, kGraceMs * 6 + 2000)) {
        long long deadline = nowMs() + 3000;
        while (sup > 0 && processBelongsToRoot(sup, root) && nowMs() < deadline) sleepMs(10);
    }
    // Whatever is still left (a supervisor that did not answer, or orphans of
    // one that was killed): only processes that name this root are touched.
    std::vector<pid_t> left;
    for (const std::string &name : {std::string("supervisor"), std::string("tolkd"), std::string("radio"),
                                    std::string("generic"), std::string("audio"), std::string("cit")}) {
        pid_t pid = readPidFile(L.pidFile(name));
        if (pid > 0 && processBelongsToRoot(pid, root)) left.push_back(pid);
    }
    for (pid_t pid : left) kill(pid, SIGTERM);
    long long deadline = nowMs() + kGraceMs;
    for (;;) {
        bool any = false;
        for (pid_t pid : left)
            if (processBelongsToRoot(pid, root)) any = true;
        if (!any || nowMs() >= deadline) break;
        sleepMs(10);
    }
    for (pid_t pid : left)
        if (processBelongsToRoot(pid, root)) kill(pid, SIGKILL);
    for (const std::string &name : {std::string("supervisor"), std::string("tolkd"), std::string("radio"),
                                    std::string("generic"), std::string("audio"), std::string("cit")})
        unlink(L.pidFile(name).c_str());
    unlink(L.ctlSocket().c_str());
    return 0;
}

}  // namespace sim
