// The simulator's host-side promises that tests and host tools lean on: the host
// port has the modem lines of a USB ACM port, and the forwarder serves the adb
// link on a loopback TCP port. (That `start` returns once the peer accepts is
// met by every test that restarts a peer and sends its next command at once.)
// Real host programs through `tolk-sim host` are in host_clients.cpp.
#include <arpa/inet.h>
#include <dlfcn.h>
#include <linux/serial.h>
#include <poll.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/wait.h>
#include <unistd.h>

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

// Gone, or a zombie that its new parent has not reaped yet.
static bool ended(pid_t pid) {
    std::string stat = sim::readFileOr("/proc/" + std::to_string(pid) + "/stat");
    size_t paren = stat.rfind(')');
    return stat.empty() || (paren != std::string::npos && stat.compare(paren + 1, 3, " Z ") == 0);
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
    EXPECT_TRUE(eventually([&] { return ended(pid); }, 3000)) << "the forwarder ends at SIGTERM";
}
