// `tolk-sim up` and `down`: the options, the detached supervisor, the report of
// whether tolkd serves, and the stop of everything a root runs.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/file.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstring>

#include <tolk_platform/device_root.h>

#include "hostile.h"
#include "sim_privilege.h"
#include "sim_supervisor.h"

#ifndef TOLKD_DEFAULT_BINARY
#define TOLKD_DEFAULT_BINARY "tolkd"
#endif

namespace sim {

namespace {

// logcat's filter syntax, as the daemon's log reads ANDROID_LOG_TAGS: blank-
// separated items TAG[:LEVEL]. The daemon skips what it cannot read, so a typo
// would silently leave the default filter in force: it is refused here.
bool validLogTags(const std::string &tags) {
    size_t i = 0, items = 0;
    while (i < tags.size()) {
        if (tags[i] == ' ' || tags[i] == '\t') {
            i++;
            continue;
        }
        size_t end = tags.find_first_of(" \t", i);
        std::string item = tags.substr(i, end == std::string::npos ? std::string::npos : end - i);
        i = end == std::string::npos ? tags.size() : end;
        items++;
        size_t colon = item.find(':');
        std::string tag = item.substr(0, colon);
        if (colon != std::string::npos) {
            std::string level = item.substr(colon + 1);
            if (level.size() != 1 || !strchr("VDIWEFSvdiwefs", level[0])) return false;
        }
        if (tag.empty()) return false;
        if (tag == "*") continue;
        for (char c : tag)
            if (!isalnum(static_cast<unsigned char>(c)) && !strchr("_-.", c)) return false;
    }
    return items > 0;
}

// The processes a device root runs, by the names of their pid files.
const char *const kProcessNames[] = {"supervisor", "tolkd", "radio", "generic", "audio", "cit"};

// Names and pids of processes of this root that still run.
std::string liveProcesses(const RootLayout &L) {
    std::string live;
    for (const char *name : kProcessNames) {
        pid_t pid = readPidFile(L.pidFile(name));
        if (pid > 0 && processBelongsToRoot(pid, L.root))
            live += std::string(live.empty() ? "" : ", ") + name + " (pid " + std::to_string(pid) + ")";
    }
    return live;
}

// What a device leaves in its root that names a live terminal or socket: gone
// once it is down, so that nothing reaches another device's terminal through
// a link whose number the kernel gave out again.
void removeDeviceLinks(const RootLayout &L) {
    unlink(L.deviceTty().c_str());
    unlink(L.hostTty().c_str());
    unlink(L.adbSocket().c_str());
    unlink(L.ctlSocket().c_str());
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
            if (!validLogTags(*v)) {
                *err = "--log-tags needs logcat filters TAG:LEVEL (LEVEL one of V D I W E F S; TAG a name or *), "
                       "got '" + *v + "'";
                return false;
            }
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
        } else if (a == "--hostile" || a.compare(0, 10, "--hostile=") == 0) {
            uint64_t seed = 0;
            opt->hostile = true;
            opt->hostileSeed = a.size() > 10 ? a.substr(10) : "";
            if (!opt->hostileSeed.empty() && !parseHostileSeed(opt->hostileSeed, &seed)) {
                *err = "--hostile=SEED needs a decimal seed, got '" + opt->hostileSeed + "'";
                return false;
            }
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

int cmdUp(UpOptions opt, bool *started) {
    if (started) *started = false;
    if (opt.root.empty()) {
        fprintf(stderr, "tolk-sim up: --root DIR is required\n");
        return kExitUsage;
    }
    if (opt.tolkdBinary.empty()) opt.tolkdBinary = TOLKD_DEFAULT_BINARY;
    opt.tolkdBinary = absolutePath(opt.tolkdBinary);
    if (access(opt.tolkdBinary.c_str(), X_OK) != 0) {
        fprintf(stderr, "tolk-sim up: no tolkd binary at %s\n", opt.tolkdBinary.c_str());
        return kExitUsage;
    }
    std::string given = absolutePath(opt.root);
    struct stat st;
    bool created = false;
    if (stat(given.c_str(), &st) == 0) {
        if (!S_ISDIR(st.st_mode)) {
            fprintf(stderr, "tolk-sim up: %s is not a directory\n", opt.root.c_str());
            return kExitUsage;
        }
    } else {
        // Only the root folder itself is removed again after a failure; a
        // parent that makeDirs had to create stays (it may be shared).
        if (!makeDirs(given)) {
            fprintf(stderr, "tolk-sim up: cannot create %s: %s\n", opt.root.c_str(), strerror(errno));
            return kExitFailed;
        }
        created = true;
    }
    char real[4096];
    if (!realpath(given.c_str(), real)) {
        fprintf(stderr, "tolk-sim up: %s: %s\n", opt.root.c_str(), strerror(errno));
        if (created) removeTree(given);
        return kExitFailed;
    }
    opt.root = real;
    RootLayout L{opt.root};
    // Undoes what this call made when the device does not come up.
    auto fail = [&](int status) {
        if (created) removeTree(opt.root);
        return status;
    };
    if (!fitsSocketPath(L.adbSocket()) || !fitsSocketPath(L.ctlSocket())) {
        fprintf(stderr,
                "tolk-sim up: the root path is too long for a socket path (%zu bytes; at most %zu): "
                "use a shorter folder such as /tmp/tolk.XXXX\n",
                L.adbSocket().size(), sizeof(((struct sockaddr_un *)nullptr)->sun_path) - 1);
        return fail(kExitUsage);
    }
    setenv(TOLKD_ROOT_ENV, opt.root.c_str(), 1);

    // One device per root: the lock is held by this call until it returns and,
    // through the descriptor the supervisor inherits, for as long as the
    // device is up. A second `up` (started at the same moment or later) fails.
    if (!makeDirs(L.path("run"))) {
        fprintf(stderr, "tolk-sim up: cannot create %s: %s\n", L.path("run").c_str(), strerror(errno));
        return fail(kExitFailed);
    }
    int lockFd = open(L.lockFile().c_str(), O_RDWR | O_CREAT | O_CLOEXEC, 0644);
    if (lockFd < 0) {
        fprintf(stderr, "tolk-sim up: cannot open %s: %s\n", L.lockFile().c_str(), strerror(errno));
        return fail(kExitFailed);
    }
    if (flock(lockFd, LOCK_EX | LOCK_NB) != 0) {
        fprintf(stderr, "tolk-sim up: a device is already up on %s, or coming up (tolk-sim down --root %s)\n",
                opt.root.c_str(), opt.root.c_str());
        close(lockFd);
        return kExitFailed;
    }
    // A supervisor killed without its clean-up leaves its children behind: a
    // new device would fight them for the sockets.
    std::string live = liveProcesses(L);
    if (!live.empty()) {
        fprintf(stderr,
                "tolk-sim up: processes of an earlier device still run on %s: %s (tolk-sim down --root %s "
                "stops them)\n",
                opt.root.c_str(), live.c_str(), opt.root.c_str());
        close(lockFd);
        return kExitFailed;
    }
    removeDeviceLinks(L);
    if (!runsWithPhoneUsers())
        fprintf(stderr, "tolk-sim up: not root: tolkd runs as uid %u with the caller's rights, not as the phone's "
                        "service user\n", (unsigned)getuid());
    std::string err;
    prepareRoot(opt, &err);
    // The peers read the seed when they start (and again at `start NAME`); no
    // file means ordinary timing, also for a root that had one before.
    if (opt.hostile && opt.hostileSeed.empty())
        opt.hostileSeed = std::to_string(static_cast<unsigned long long>(nowMs()) ^ (unsigned)getpid());
    std::string seedFile = hostileSeedFile(opt.root);
    if (!opt.hostile) {
        unlink(seedFile.c_str());
    } else if (err.empty() && !(makeDirs(opt.root + "/sim") && writeFile(seedFile, opt.hostileSeed + "\n"))) {
        err = "cannot write " + seedFile;
    }
    if (!err.empty()) {
        fprintf(stderr, "tolk-sim up: %s\n", err.c_str());
        close(lockFd);
        return fail(kExitFailed);
    }

    int pfd[2];
    if (pipe2(pfd, O_CLOEXEC) != 0) {
        perror("tolk-sim up: pipe");
        close(lockFd);
        return fail(kExitFailed);
    }
    fflush(stdout);
    fflush(stderr);
    pid_t child = fork();
    if (child < 0) {
        perror("tolk-sim up: fork");
        close(pfd[0]);
        close(pfd[1]);
        close(lockFd);
        return fail(kExitFailed);
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
        Supervisor sup(opt, pfd[1], lockFd);
        _exit(sup.run());
    }
    close(pfd[1]);
    close(lockFd);  // the supervisor holds the lock from here on
    int st2;
    waitpid(child, &st2, 0);

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
        fprintf(stderr, "the device stays for a look at its state; tolk-sim down --root %s ends it\n",
                opt.root.c_str());
    };
    if (line.compare(0, 8, "serving ") == 0) {
        if (started) *started = true;
        if (!opt.quiet)
            printf("tolkd is serving (pid %s); root %s; environment in %s%s\n", line.c_str() + 8,
                   opt.root.c_str(), L.envFile().c_str(),
                   opt.hostile ? ("; hostile timing, seed " + opt.hostileSeed).c_str() : "");
        return kExitOk;
    }
    if (line.compare(0, 5, "idle ") == 0) {
        fprintf(stderr, "tolkd (pid %s) is idle and serves nothing (engineering boot mode)\n", line.c_str() + 5);
        lastLog();
        return 1;
    }
    if (line.compare(0, 7, "exited ") == 0) {
        if (started) *started = true;
        std::string s = line.substr(7);
        if (s.compare(0, 7, "signal ") == 0)
            fprintf(stderr, "tolkd was killed by signal %s\n", s.c_str() + 7);
        else
            fprintf(stderr, "tolkd exited with status %s\n", s.c_str());
        lastLog();
        return kExitFailed;
    }
    if (line.compare(0, 8, "timeout ") == 0) {
        if (started) *started = true;
        fprintf(stderr, "tolkd (pid %s) did not start serving within %d s\n", line.c_str() + 8,
                kServeTimeoutMs / 1000);
        lastLog();
        return kExitFailed;
    }
    // The supervisor took down what it had started before it reported an
    // error; a silent one is taken down here.
    if (line.compare(0, 6, "error ") == 0)
        fprintf(stderr, "tolk-sim up: %s\n", line.c_str() + 6);
    else
        fprintf(stderr, "tolk-sim up: the supervisor did not report (see %s)\n", L.supervisorLog().c_str());
    cmdDown(opt.root);
    return fail(kExitFailed);
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
    for (const char *name : kProcessNames) {
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
    for (const char *name : kProcessNames) unlink(L.pidFile(name).c_str());
    removeDeviceLinks(L);
    return kExitOk;
}


}  // namespace sim
