#include "sim_device.h"

#include <errno.h>
#include <fcntl.h>
#include <ftw.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>
#include <filesystem>
#include <iterator>
#include <sstream>

#include <gtest/gtest.h>

#include "../../support/eventually.h"
#include "sim_privilege.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

int removeEntry(const char *path, const struct stat *, int, struct FTW *) { return remove(path); }

// In a child: becomes tolk-sim with args.
[[noreturn]] void execSim(const std::vector<std::string> &args) {
    std::vector<char *> argv;
    argv.push_back(const_cast<char *>(TOLK_SIM_BINARY));
    for (const auto &a : args) argv.push_back(const_cast<char *>(a.c_str()));
    argv.push_back(nullptr);
    execv(TOLK_SIM_BINARY, argv.data());
    _exit(127);
}

}  // namespace

int runSim(const std::vector<std::string> &args, std::string *out, bool errToo) {
    int pfd[2];
    if (pipe2(pfd, O_CLOEXEC) != 0) return -1;
    pid_t pid = fork();
    if (pid < 0) return -1;
    if (pid == 0) {
        dup2(pfd[1], 1);
        if (errToo) dup2(pfd[1], 2);
        execSim(args);
    }
    close(pfd[1]);
    std::string collected;
    char buf[8192];
    for (;;) {
        ssize_t n = read(pfd[0], buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) break;
        collected.append(buf, static_cast<size_t>(n));
    }
    close(pfd[0]);
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    if (out) *out = collected;
    if (WIFEXITED(status)) return WEXITSTATUS(status);
    return 128 + (WIFSIGNALED(status) ? WTERMSIG(status) : 0);
}

pid_t startSim(const std::vector<std::string> &args, int in, int out) {
    pid_t pid = fork();
    if (pid == 0) {
        dup2(in, 0);
        dup2(out, 1);
        execSim(args);
    }
    return pid;
}

SimDevice::SimDevice(const std::vector<std::string> &upArgs, const std::function<void(SimDevice &)> &beforeUp) {
    // Short: the sockets under the root must fit into 108 bytes.
    char tmpl[] = "/tmp/tsXXXXXX";
    if (!mkdtemp(tmpl)) {
        ADD_FAILURE() << "mkdtemp: " << strerror(errno);
        return;
    }
    root_ = tmpl;
    if (beforeUp) beforeUp(*this);
    // TOLK_E2E_TOLKD runs the daemon through something else, e.g. a valgrind wrapper.
    const char *tolkd = getenv("TOLK_E2E_TOLKD");
    std::vector<std::string> args = {"up", "--root", root_, "--tolkd", tolkd && *tolkd ? tolkd : TOLKD_BINARY};
    args.insert(args.end(), upArgs.begin(), upArgs.end());
    upStatus_ = runSim(args, &upOutput_, true);
}

SimDevice::~SimDevice() {
    if (root_.empty()) return;
    runSim({"down", "--root", root_});
    // A sanitizer report from tolkd, a peer or the supervisor fails the test
    // that ran them, even when every answer was right.
    std::error_code ec;
    for (const auto &entry : std::filesystem::directory_iterator(root_ + "/log", ec)) {
        std::string text = sim::readFileOr(entry.path().string());
        for (const char *mark : {"ERROR: AddressSanitizer", "ERROR: LeakSanitizer", "runtime error:"}) {
            size_t pos = text.find(mark);
            if (pos != std::string::npos)
                ADD_FAILURE() << "sanitizer report in " << entry.path().string() << ":\n"
                              << text.substr(pos > 200 ? pos - 200 : 0, 3000);
        }
    }
    const ::testing::TestInfo *info = ::testing::UnitTest::GetInstance()->current_test_info();
    bool failed = info && info->result() && info->result()->Failed();
    if (failed) {
        std::string tail = log();
        if (tail.size() > 6000) tail = "..." + tail.substr(tail.size() - 6000);
        fprintf(stderr, "---- tolkd log of %s ----\n%s---- end of log ----\n", root_.c_str(), tail.c_str());
    }
    const char *keep = getenv("TOLK_E2E_KEEP");
    if (keep && *keep && strcmp(keep, "0") != 0) {
        fprintf(stderr, "device root kept: %s\n", root_.c_str());
        return;
    }
    nftw(root_.c_str(), removeEntry, 16, FTW_DEPTH | FTW_PHYS);
}

std::string SimDevice::at(const std::vector<std::string> &lines, bool adb, int timeoutMs) {
    std::vector<std::string> args = {"at", "--timeout", std::to_string(timeoutMs / 1000.0)};
    if (adb) args.push_back("--adb");
    args.push_back("--");
    args.insert(args.end(), lines.begin(), lines.end());
    return sim(args);
}

std::string SimDevice::sim(const std::vector<std::string> &args, int *status) {
    std::vector<std::string> full(args);
    full.insert(full.begin() + (args.empty() ? 0 : 1), {"--root", root_});
    std::string out;
    int rc = runSim(full, &out);
    if (status) *status = rc;
    return out;
}

std::string SimDevice::getprop(const std::string &name) {
    std::string out = sim({"getprop", name});
    if (!out.empty() && out.back() == '\n') out.pop_back();
    return out;
}

void SimDevice::setprop(const std::string &name, const std::string &value) {
    int status = 0;
    sim({"setprop", name, value}, &status);
    EXPECT_EQ(0, status) << "setprop " << name << "=" << value << " refused";
}

std::string SimDevice::readFile(const std::string &devicePath) const { return sim::readFileOr(root_ + devicePath); }

void SimDevice::writeFile(const std::string &devicePath, const std::string &content) const {
    std::string path = root_ + devicePath;
    sim::makeDirs(path.substr(0, path.rfind('/')));
    EXPECT_TRUE(sim::writeFile(path, content)) << "cannot write " << path;
    // Written as root: the file gets the owner it has on the phone, so that the
    // daemon can use it as far as the phone lets it, and no further.
    sim::ownDevicePath(sim::RootLayout{root_}, devicePath);
}

bool SimDevice::fileExists(const std::string &devicePath) const { return sim::fileExists(root_ + devicePath); }

std::string SimDevice::log() const { return readFile("/log/tolkd.log"); }

std::string SimDevice::env(const std::string &key) const {
    // Values are single-quoted shell words; ours (numbers, paths under /tmp) hold no quote.
    std::istringstream in(readFile("/sim.env"));
    for (std::string line; std::getline(in, line);) {
        if (line.compare(0, key.size() + 1, key + "=") != 0) continue;
        std::string v = line.substr(key.size() + 1);
        v.erase(std::remove(v.begin(), v.end(), '\''), v.end());
        return v;
    }
    return "";
}

pid_t SimDevice::tolkdPid() const { return static_cast<pid_t>(atol(env("TOLKD_PID").c_str())); }

int SimDevice::tolkdExitStatus(int timeoutMs) const {
    std::string s;
    if (!eventually([&] { return !(s = readFile("/run/tolkd.status")).empty(); }, timeoutMs)) return -1;
    return s.compare(0, 7, "signal ") == 0 ? 128 + atoi(s.c_str() + 7) : atoi(s.c_str());
}

int SimDevice::tolkdFdCount() const {
    std::error_code ec;
    std::filesystem::directory_iterator it("/proc/" + std::to_string(tolkdPid()) + "/fd", ec);
    return ec || tolkdPid() <= 0 ? -1 : static_cast<int>(std::distance(it, std::filesystem::directory_iterator()));
}

int SimDevice::openSerial() const { return sim::openRawTty(sim::RootLayout{root_}.hostTty()); }

int SimDevice::connectAdb() const { return sim::connectUnix(sim::RootLayout{root_}.adbSocket()); }

bool writeAll(int fd, const std::string &data) {
    size_t done = 0;
    while (done < data.size()) {
        ssize_t n = write(fd, data.data() + done, data.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && errno == EAGAIN) {
            struct pollfd p = {fd, POLLOUT, 0};
            poll(&p, 1, 1000);
            continue;
        }
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

std::string readUntil(int fd, const std::string &needle, int timeoutMs) {
    std::string got;
    char buf[8192];
    for (long long left, end = sim::nowMs() + timeoutMs; (left = end - sim::nowMs()) > 0;) {
        struct pollfd p = {fd, POLLIN, 0};
        int r = poll(&p, 1, static_cast<int>(left));
        if (r < 0 && errno == EINTR) continue;
        if (r == 0) break;
        ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;
        if (n <= 0) break;
        got.append(buf, static_cast<size_t>(n));
        if (got.find(needle) != std::string::npos) break;
    }
    return got;
}

std::string visible(const std::string &bytes) { return sim::visibleBytes(bytes); }
