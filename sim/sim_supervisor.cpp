// The supervisor's own concerns: start-up of the device, tolkd, the children's
// ends and the shutdown. The link, the peers and the control socket have files
// of their own (sim_relay.cpp, sim_peers_start.cpp, sim_control.cpp).
#include "sim_supervisor.h"

#include "sim_privilege.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdarg.h>
#include <stdlib.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <time.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstring>
#include <sstream>

namespace sim {

namespace {

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

}  // namespace

void closeFrom(int first, int keep) {
    long max = sysconf(_SC_OPEN_MAX);
    if (max < 0 || max > 65536) max = 65536;
    for (int fd = first; fd < max; fd++)
        if (fd != keep) close(fd);
}

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
    signalFd_ = gSignalPipe[0];
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = onSignal;
    sa.sa_flags = SA_RESTART | SA_NOCLDSTOP;
    sigaction(SIGCHLD, &sa, nullptr);
    sigaction(SIGTERM, &sa, nullptr);
    sigaction(SIGINT, &sa, nullptr);
    sigaction(SIGHUP, &sa, nullptr);
    signal(SIGPIPE, SIG_IGN);

    if (!setUpLink(err)) return false;

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
        std::string err;
        if (!becomeServiceUser(&err)) {
            fprintf(stderr, "cannot start tolkd as its service user: %s\n", err.c_str());
            _exit(126);
        }
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

// In the engineering boot mode tolkd opens nothing and waits for its end.
bool Supervisor::tolkdIdle() {
    std::string s = readFileOr("/proc/" + std::to_string(tolkd_) + "/syscall");
    return !s.empty() && isdigit(static_cast<unsigned char>(s[0])) && atol(s.c_str()) == SYS_rt_sigsuspend;
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
        if (tolkdIdle()) {
            log("tolkd is idle");
            ready("idle " + std::to_string(tolkd_));
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


void Supervisor::shutdownAll() {
    stopping_ = true;
    if (tolkd_ > 0 && !tolkdEnded_) terminate(tolkd_, "tolkd");
    for (auto &p : peers_) {
        if (p.second > 0) terminate(p.second, "peer " + p.first);
        p.second = -1;
        unlink(L_.pidFile(p.first).c_str());
    }
    reapChildren();
    setCable(false);  // the device is gone: a host sees its carrier drop
    if (linesFd_ >= 0) close(linesFd_);
    linesFd_ = -1;
    // Nothing of this device may be reached through the root any more: the
    // terminals' numbers go to the next device that asks for one.
    unlink(L_.deviceTty().c_str());
    unlink(L_.hostTty().c_str());
    unlink(L_.adbSocket().c_str());
    unlink(L_.ctlSocket().c_str());
    unlink(L_.pidFile("supervisor").c_str());
    log("down");
    if (lockFd_ >= 0) close(lockFd_);  // the next `up` may start
    lockFd_ = -1;
}

int Supervisor::run() {
    log_ = fopen(L_.supervisorLog().c_str(), "a");
    if (log_) fcntl(fileno(log_), F_SETFD, FD_CLOEXEC);
    log("supervisor %d for %s", getpid(), L_.root.c_str());
    std::string err;
    if (!setUp(&err) || !prepareDeviceUsers(L_, &err)) {
        log("%s", err.c_str());
        shutdownAll();
        ready("error " + err);
        return 1;
    }
    for (const auto &name : peerNames()) {
        if (spawnPeer(name) < 0) {
            shutdownAll();
            ready("error cannot start peer " + name);
            return 1;
        }
    }
    if (!waitForPeers(&err)) {
        log("%s", err.c_str());
        shutdownAll();
        ready("error " + err);
        return 1;
    }
    log(runsWithPhoneUsers() ? "tolkd and the CIT peer run as the phone's users"
                             : "not root: tolkd and every peer run as the caller");
    tolkd_ = spawnTolkd();
    if (tolkd_ < 0) {
        shutdownAll();
        ready("error cannot fork tolkd");
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

}  // namespace sim
