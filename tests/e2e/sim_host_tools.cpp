// The simulator's own promises that tests, station scripts and host tools lean
// on: exit statuses that tell the truth, one device per root and nothing of it
// left once it is down, the host port with the modem lines of a USB ACM port,
// and the forwarder serving the adb link on a loopback TCP port. (That `start`
// returns once the peer accepts is met by every test that restarts a peer and
// sends its next command at once.) Real host programs through `tolk-sim host`
// are in host_clients.cpp.
#include <arpa/inet.h>
#include <dirent.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <linux/serial.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

#include <thread>

#include <gtest/gtest.h>

#include "../../sim/sim_util.h"
#include "../support/eventually.h"
#include "sim_device.h"

static int tcpConnect(int port) {
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_in a = {AF_INET, htons(static_cast<uint16_t>(port)), {htonl(INADDR_LOOPBACK)}, {}};
    if (fd >= 0 && connect(fd, reinterpret_cast<struct sockaddr *>(&a), sizeof a) == 0) return fd;
    if (fd >= 0) close(fd);
    return -1;
}

// True when the peer closes fd within ms, with nothing more to read before.
static bool closedWithin(int fd, int ms) {
    struct pollfd p = {fd, POLLIN, 0};
    char c;
    return poll(&p, 1, ms) == 1 && read(fd, &c, 1) == 0;
}

// Pids of every process whose environment names this device root.
static std::vector<pid_t> processesOf(const std::string &root) {
    std::vector<pid_t> found;
    DIR *proc = opendir("/proc");
    while (struct dirent *e = proc ? readdir(proc) : nullptr) {
        pid_t pid = static_cast<pid_t>(atol(e->d_name));
        if (pid > 0 && sim::processBelongsToRoot(pid, root)) found.push_back(pid);
    }
    if (proc) closedir(proc);
    return found;
}

static std::string joined(const std::vector<std::string> &args) {
    std::string all;
    for (const auto &a : args) all += a + " ";
    return all;
}

// A folder of its own for tests that run `up` themselves; removed at the end.
struct ScratchDir {
    char path[14] = "/tmp/tsXXXXXX";
    ScratchDir() { EXPECT_NE(nullptr, mkdtemp(path)); }
    ~ScratchDir() { runSim({"down", "--root", path}); sim::removeTree(path); }
};

// Wrong invocations are named and exit 2; commands that need a device refuse a
// root that is down with 1; a failed `up` removes the folder it made.
TEST(SimTools, WrongInvocationsAndRootsThatAreDown) {
    ScratchDir scratch;
    const std::string down = scratch.path, file = down + "/file", made = down + "/made";
    ASSERT_TRUE(sim::writeFile(file, "x"));
    const std::string longValue(92, 'v');
    const struct {
        std::vector<std::string> args;
        int status;
        const char *says;
    } cases[] = {
        {{"frobnicate"}, 2, "unknown command 'frobnicate'"},
        {{"--version"}, 2, "unknown option '--version'"},
        {{"up", "--root", file}, 2, "is not a directory"},
        {{"getprop", "--root", file}, 2, "is not a directory"},
        {{"up", "--root", made, "--log-tags", "garbage!!"}, 2, "--log-tags"},
        {{"up", "--root", made, "--log-tags", "TOLKD:x"}, 2, "--log-tags"},
        {{"up", "--root", made, "--prop", "persist.x=" + longValue}, 1, "was refused"},
        {{"at", "--root", down}, 2, "no LINE"},
        {{"at", "--root", down, "--timeout", "0", "AT"}, 2, "--timeout"},
        {{"at", "--root", down, "--quiet-ms", "1x", "AT"}, 2, "--quiet-ms"},
        {{"at", "--root", down, "--frob", "AT"}, 2, "unknown option '--frob'"},
        {{"urc", "--root", down, "--slot", "9", "X"}, 2, "--slot"},
        {{"forward", "--root", down, "tcp:x"}, 2, "tcp:PORT"},
        {{"pause-host", "--root", down, "soon"}, 2, "MS"},
        {{"at", "--root", down, "AT"}, 1, "no simulated device is up"},
        {{"console", "--root", down}, 1, "no simulated device is up"},
        {{"forward", "--root", down, "--background", "tcp:0"}, 1, "no simulated device is up"},
        {{"host", "--root", down, "--", "true"}, 1, "no simulated device is up"},
        {{"urc", "--root", down, "X"}, 1, "no simulated device is up"},
        {{"replug", "--root", down}, 1, "no simulated device is up"},
    };
    for (const auto &c : cases) {
        std::string out;
        SCOPED_TRACE(joined(c.args));
        EXPECT_EQ(c.status, runSim(c.args, &out, true)) << out;
        EXPECT_NE(std::string::npos, out.find(c.says)) << out;
        EXPECT_FALSE(sim::fileExists(made)) << "a failed up leaves the folder it made";
    }
}

// A root that is down keeps no link to a terminal: the kernel gives its number
// to the next device, and an old link would reach that one. Even a stale link
// that names another device's terminal is not used.
TEST(SimTools, ARootThatIsDownReachesNoOtherDevice) {
    SimDevice old, other({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(old.started() && other.started()) << old.upOutput() << other.upOutput();
    const std::string link = old.root() + "/host/ttyACM0";
    EXPECT_EQ("", old.sim({"down"}));
    for (const char *gone : {"/host/ttyACM0", "/dev/ttyGS0", "/dev/socket/adb_tolk_socket", "/run/sim.ctl"})
        EXPECT_FALSE(old.fileExists(gone)) << gone;
    ASSERT_EQ(0, symlink(other.env("TOLK_HOST_TTY").c_str(), link.c_str()));
    std::string out;
    EXPECT_EQ(1, runSim({"at", "--root", old.root(), "AT*CIT_Start", "AT+CGSN"}, &out, true)) << out;
    EXPECT_EQ(1, runSim({"console", "--root", old.root()}, &out, true)) << out;
    EXPECT_EQ("", other.readFile("/journal/radio.slot1.log"));
    EXPECT_EQ("\r\nOK\r\n", other.at("AT", true));
}

// `at` exits 0 only when every line got a complete answer, however late and
// whatever form it takes, and says so when none came.
TEST(SimTools, AtWaitsForACompleteAnswer) {
    SimDevice d({}, [](SimDevice &dev) {
        dev.writeFile("/sim/radio/script", "AT+SLOW => (delay 1000) \\r\\n+SLOW: 1\\r\\n\\r\\nOK\\r\\n\n");
        dev.writeFile("/sim/generic/script", "AT+SN => (none)\n");
        dev.writeFile("/sim/audio/script", "AT^BSN? => (delay 500) \\xfd\\x00\\r\\n3\nAUD+BIN => AUD\\x00\\r\\n\\x01\n");
    });
    ASSERT_TRUE(d.started()) << d.upOutput();
    const struct {
        const char *usermode;
        std::vector<std::string> args;
        int status;
        std::string answer;
    } cases[] = {
        // The user-mode refusal carries no final result by design.
        {"0", {"--adb", "AT+CSQ"}, 0, "\r\nNot access to modem in User Mode.\r\n"},
        {"0", {"--adb", "AT+SN", "--timeout", "0.5"}, 3, ""},
        // Raw answers of the audio service, the echo on the serial link before them.
        {"0", {"AT^BSN?"}, 0, std::string("AT^BSN?\n\xfd\0\r\n3", 13)},
        {"0", {"--adb", "AUD+BIN"}, 0, std::string("AUD\0\r\n\x01", 7)},
        {"1", {"--adb", "AT+SLOW"}, 0, "\r\n+SLOW: 1\r\n\r\nOK\r\n"},
        {"1", {"--adb", "ATV0", "AT+CSDF=1,2"}, 0, "\r\n0\r\n\r\n0\r\n"},
        {"1", {"--adb", "AT+CSDF=1,1", "--timeout", "0.5"}, 3, "\r\n0\r\n"},
        {"1", {"--adb", "--numeric", "AT+CSDF=1,1", "ATV1"}, 0, "\r\n0\r\n\r\nOK\r\n"},
    };
    for (const auto &c : cases) {
        std::vector<std::string> args = {"at"};
        args.insert(args.end(), c.args.begin(), c.args.end());
        SCOPED_TRACE(joined(args));
        if (d.getprop("persist.service.tolk.usermode") != c.usermode)
            d.setprop("persist.service.tolk.usermode", c.usermode);
        int status = -1;
        EXPECT_EQ(visible(c.answer), visible(d.sim(args, &status)));
        EXPECT_EQ(c.status, status);
    }
    int status = -1;
    // Right after a replug the fresh terminal echoes the line itself: no answer.
    d.sim({"replug"});
    std::string answer = d.sim({"at", "AT"}, &status);
    EXPECT_EQ(0, status);
    EXPECT_EQ("\r\nOK\r\n", answer.substr(answer.size() - 6)) << visible(answer);
    // The cable pulled for good: tolkd exits, and `at` says so at once.
    d.sim({"unplug"});
    EXPECT_EQ(1, d.tolkdExitStatus());
    EXPECT_EQ("", d.sim({"at", "AT"}, &status));
    EXPECT_EQ(1, status);
}

// One device per root: a second `up`, at the same moment or over the orphans of
// a killed supervisor, is refused; a peer that cannot serve fails `up`; and
// nothing of a failed or stopped device keeps running.
TEST(SimTools, OneDevicePerRootAndNothingLeftBehind) {
    ScratchDir dir;
    const std::string root = dir.path;
    int status[2] = {-1, -1};
    std::string out[2];
    std::thread second([&] { status[1] = runSim({"up", "--root", root, "-q"}, &out[1], true); });
    status[0] = runSim({"up", "--root", root, "-q"}, &out[0], true);
    second.join();
    EXPECT_EQ(1, status[0] + status[1]) << out[0] << out[1];
    EXPECT_NE(std::string::npos, (out[0] + out[1]).find("already up"));

    pid_t supervisor = static_cast<pid_t>(atol(sim::readFileOr(root + "/run/supervisor.pid").c_str()));
    ASSERT_GT(supervisor, 0);
    kill(supervisor, SIGKILL);
    ASSERT_TRUE(eventually([&] { return !sim::processBelongsToRoot(supervisor, root); }));
    std::string again;
    EXPECT_EQ(1, runSim({"up", "--root", root}, &again, true));
    EXPECT_NE(std::string::npos, again.find("processes of an earlier device still run")) << again;
    for (int twice = 0; twice < 2; twice++) EXPECT_EQ(0, runSim({"down", "--root", root}));
    EXPECT_EQ(std::vector<pid_t>{}, processesOf(root));

    ASSERT_TRUE(sim::makeDirs(root + "/dev/socket/tolk-service/blocked"));  // the generic peer cannot bind
    EXPECT_EQ(1, runSim({"up", "--root", root}, &again, true));
    EXPECT_NE(std::string::npos, again.find("peer generic")) << again;
    EXPECT_TRUE(eventually([&] { return processesOf(root).empty(); }));
    EXPECT_FALSE(sim::fileExists(root + "/host/ttyACM0"));
    sim::removeTree(root + "/dev/socket/tolk-service");
    EXPECT_EQ(0, runSim({"up", "--root", root, "-q"}, &again, true)) << again;
}

// `run` brings its device down and removes its folder when it is told to stop
// the way a terminal or a script stops it.
TEST(SimTools, RunStopsTheDeviceOnSignals) {
    for (int sig : {SIGHUP, SIGTERM, SIGINT}) {
        SCOPED_TRACE(strsignal(sig));
        int in[2], out[2];  // stdin stays open: the console waits on it
        ASSERT_TRUE(pipe2(in, O_CLOEXEC) == 0 && pipe2(out, O_CLOEXEC) == 0);
        pid_t run = startSim({"run"}, in[0], out[1]);
        close(in[0]);
        close(out[1]);
        std::string said = readUntil(out[0], "\n", 20000), mark = "simulated device ";
        ASSERT_NE(std::string::npos, said.find(mark)) << said;
        size_t from = said.find(mark) + mark.size();
        std::string root = said.substr(from, said.find('\n', from) - from);
        EXPECT_FALSE(processesOf(root).empty());
        kill(run, sig);
        int st = -1;
        EXPECT_TRUE(eventually([&] { return waitpid(run, &st, WNOHANG) == run; }, 10000));
        EXPECT_TRUE(WIFEXITED(st) && WEXITSTATUS(st) == 128 + sig) << st;
        EXPECT_EQ(std::vector<pid_t>{}, processesOf(root));
        EXPECT_FALSE(sim::fileExists(root));
        close(in[1]);
        close(out[0]);
    }
}

// The interposer `tolk-sim host` preloads, called as a host program calls ioctl:
// DTR and RTS as last set, by any descriptor or program; DSR, CTS and CD follow
// the cable, TIOCMIWAIT wakes on their change and TIOCGICOUNT counts it.
TEST(SimHostTools, HostPortHasTheModemLinesOfAUsbAcmPort) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    std::string lib = d.sim({"host", "--", "/bin/sh", "-c", "printf %s \"$LD_PRELOAD\""});
    lib = lib.substr(0, lib.find(' '));  // the runner puts its library first
    void *shim = dlopen(lib.c_str(), RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(nullptr, shim) << lib << ": " << dlerror();
    auto acmIoctl = reinterpret_cast<int (*)(int, unsigned long, ...)>(dlsym(shim, "ioctl"));
    ASSERT_NE(nullptr, acmIoctl);
    setenv("TOLK_ACM_TTY", (d.root() + "/host/ttyACM0").c_str(), 1);
    setenv("TOLK_ACM_LINES", (d.root() + "/run/acm.lines").c_str(), 1);
    int port = d.openSerial();
    ASSERT_GE(port, 0);
    auto lines = [&](int fd) {
        int v = -1;
        EXPECT_EQ(0, acmIoctl(fd, TIOCMGET, &v));
        return v;
    };
    const int kCable = TIOCM_DSR | TIOCM_CTS | TIOCM_CD;
    auto set = [&](unsigned long request, int bits) {
        EXPECT_EQ(0, acmIoctl(port, request, &bits));
        return lines(port);
    };
    EXPECT_EQ(TIOCM_DTR | TIOCM_RTS | kCable, lines(port)) << "raised at up, cable in";
    EXPECT_EQ(kCable, set(TIOCMBIC, TIOCM_DTR | TIOCM_RTS));
    EXPECT_EQ(TIOCM_RTS | kCable, set(TIOCMBIS, TIOCM_RTS | TIOCM_RI)) << "RI is not the host's to set";
    EXPECT_EQ(TIOCM_DTR | kCable, set(TIOCMSET, TIOCM_DTR));
    int next = d.openSerial();
    EXPECT_EQ(TIOCM_DTR | kCable, lines(next)) << "the next opener finds them as they were left";
    close(next);

    auto dcd = [&]() {
        struct serial_icounter_struct ic = {};
        EXPECT_EQ(0, acmIoctl(port, TIOCGICOUNT, &ic));
        return ic.dcd;
    };
    // TIOCMIWAIT wakes on the carrier's drop and rise during a replug, and on
    // its drop at an unplug. The waiter is a child process that an alarm ends,
    // so that a wait that never wakes fails the test instead of holding it.
    const struct {
        const char *command;
        bool in;
        int transitions;
    } cables[] = {{"replug", true, 2}, {"unplug", false, 1}, {"replug", true, 1}};
    for (const auto &cable : cables) {
        SCOPED_TRACE(cable.command);
        int before = dcd();
        pid_t waiter = fork();
        if (waiter == 0) {
            alarm(5);
            _exit(acmIoctl(port, TIOCMIWAIT, TIOCM_CD) == 0 ? 0 : 1);
        }
        ASSERT_GT(waiter, 0);
        int status = -1;
        EXPECT_FALSE(eventually([&] { return waitpid(waiter, &status, WNOHANG) == waiter; }, 50));
        d.sim({cable.command});
        waitpid(waiter, &status, 0);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "TIOCMIWAIT woke too early or never";
        EXPECT_EQ(cable.in ? kCable : 0, lines(port) & kCable);
        EXPECT_EQ(before + cable.transitions, dcd());
    }
    close(port);
    dlclose(shim);
}

TEST(SimHostTools, ForwarderRelaysTheAdbLinkOverLoopbackTcp) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    std::string out;
    ASSERT_EQ(0, runSim({"forward", "--root", d.root(), "--background", "tcp:0"}, &out)) << out;
    int port = 0, pid = 0;
    ASSERT_EQ(2, sscanf(out.c_str(), "%d\n%d\n", &port, &pid)) << "the port picked, then the pid: " << out;

    const std::string direct = d.at("AT*CIT_GACITF", true);
    // A second connection is a second adb connection: the daemon serves it and
    // drops the first, whose end reaches the TCP client.
    int first = -1, second = -1;
    for (int *fd : {&first, &second}) {
        ASSERT_GE(*fd = tcpConnect(port), 0);
        ASSERT_TRUE(writeAll(*fd, "AT*CIT_GACITF\r"));
        EXPECT_EQ(visible(direct), visible(readUntil(*fd, "OK\r\n")));
    }
    EXPECT_TRUE(closedWithin(first, 3000)) << "the replaced connection is closed";
    // The client's half-close reaches the daemon, which closes its end.
    shutdown(second, SHUT_WR);
    EXPECT_TRUE(closedWithin(second, 3000));
    close(first);
    close(second);

    kill(pid, SIGTERM);
    EXPECT_TRUE(eventually([&] { return !sim::processBelongsToRoot(pid, d.root()); }, 3000))
        << "the forwarder ends at SIGTERM";
}
