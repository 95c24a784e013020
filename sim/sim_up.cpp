// `tolk-sim up` and `down`: the options, the detached supervisor, the report of
// whether tolkd serves, and the stop of everything a root runs.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include <tolk_platform/device_root.h>

#include "sim_privilege.h"
#include "sim_supervisor.h"

#ifndef TOLKD_DEFAULT_BINARY
#define TOLKD_DEFAULT_BINARY "tolkd"
#endif

namespace sim {


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
    if (!runsWithPhoneUsers())
        fprintf(stderr, "tolk-sim up: not root: tolkd runs as uid %u with the caller's rights, not as the phone's "
                        "service user\n", (unsigned)getuid());
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
    if (line.compare(0, 5, "idle ") == 0) {
        fprintf(stderr, "tolkd (pid %s) is idle and serves nothing (engineering boot mode)\n", line.c_str() + 5);
        lastLog();
        return 1;
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
