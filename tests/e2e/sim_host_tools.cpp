// The simulator's host-side tools and promises: a fresh root has the phone's
// persistent folders, `start` returns once a peer accepts, the host runner gives
// the host port USB ACM modem lines, the forwarder serves the adb link on a
// loopback TCP port, and slot 1 can be a modem on a serial device.
#include <arpa/inet.h>
#include <dlfcn.h>
#include <fcntl.h>
#include <linux/serial.h>
#include <netinet/in.h>
#include <poll.h>
#include <pty.h>
#include <signal.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <unistd.h>

#include <cstdlib>
#include <cstring>
#include <fstream>
#include <sstream>
#include <string>

#include <gtest/gtest.h>

#include "../support/eventually.h"
#include "sim_device.h"

namespace {

const char kPython[] = "/usr/bin/python3";

// The modem lines of the host port as one word: D R (DTR, RTS), d c C (DSR,
// CTS, CD), as one host process sees them.
const char kLinesScript[] = R"(
import fcntl, os, struct, termios
fd = os.open(os.environ["TOLK_HOST_TTY"], os.O_RDWR | os.O_NOCTTY)
def lines(op=termios.TIOCMGET, bits=0):
    v = struct.unpack("i", fcntl.ioctl(fd, op, struct.pack("i", bits)))[0]
    if op != termios.TIOCMGET: return lines()
    return "".join(n for n, b in (("D", termios.TIOCM_DTR), ("R", termios.TIOCM_RTS), ("d", termios.TIOCM_DSR),
                                  ("c", termios.TIOCM_CTS), ("C", termios.TIOCM_CAR)) if v & b)
out = [lines()]
for arg in os.sys.argv[1:]:
    op, bits = arg.split("=")
    out.append(lines(getattr(termios, op), eval(bits, vars(termios))))
t = termios.tcgetattr(fd)
t[2] |= termios.CRTSCTS | termios.CLOCAL | termios.HUPCL
t[4] = t[5] = termios.B921600
termios.tcsetattr(fd, termios.TCSANOW, t)
out.append("921600" if termios.tcgetattr(fd)[4] == termios.B921600 else "speed lost")
try:
    fcntl.ioctl(os.open("/dev/null", os.O_RDWR), termios.TIOCMGET, struct.pack("i", 0))
    out.append("null answered")
except OSError as e:
    out.append("null errno %d" % e.errno)
print(" ".join(out))
)";

std::string hostLines(SimDevice &d, const std::vector<std::string> &ops = {}) {
    std::vector<std::string> args = {"host", "--", kPython, "-c", kLinesScript};
    args.insert(args.end(), ops.begin(), ops.end());
    return d.sim(args);
}

using IoctlFn = int (*)(int, unsigned long, ...);

int unixConnect(const std::string &path) {
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_un a = {};
    a.sun_family = AF_UNIX;
    snprintf(a.sun_path, sizeof a.sun_path, "%s", path.c_str());
    if (fd >= 0 && connect(fd, reinterpret_cast<struct sockaddr *>(&a), sizeof a) == 0) return fd;
    if (fd >= 0) close(fd);
    return -1;
}

int tcpConnect(int port) {
    int fd = socket(AF_INET, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_in a = {};
    a.sin_family = AF_INET;
    a.sin_port = htons(static_cast<uint16_t>(port));
    a.sin_addr.s_addr = htonl(INADDR_LOOPBACK);
    if (fd >= 0 && connect(fd, reinterpret_cast<struct sockaddr *>(&a), sizeof a) == 0) return fd;
    if (fd >= 0) close(fd);
    return -1;
}

// True when the peer closes fd within ms, with nothing more to read before.
bool closedWithin(int fd, int ms) {
    struct pollfd p = {fd, POLLIN, 0};
    char c;
    return poll(&p, 1, ms) == 1 && read(fd, &c, 1) == 0;
}

bool ended(pid_t pid) {
    std::ifstream in("/proc/" + std::to_string(pid) + "/stat");
    std::stringstream ss;
    ss << in.rdbuf();
    std::string stat = ss.str();
    size_t paren = stat.rfind(')');
    return stat.empty() || (paren != std::string::npos && stat.compare(paren + 1, 3, " Z ") == 0);
}

}  // namespace

TEST(SimHostTools, FreshRootHasDataProdAndStartWaitsUntilThePeerAccepts) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ("\r\nOK\r\n", d.at("AT*CIT_WCITF", true)) << "the CIT result folder exists on a fresh device";
    EXPECT_EQ("x0000001", d.readFile("/data/prod/citf"));

    // A stopped peer leaves its socket file behind; `start` returns only once a
    // connect succeeds, so the very first connect after it does.
    for (const char *peer : {"audio", "generic", "radio"}) {
        SCOPED_TRACE(peer);
        std::string path = d.root() + (std::string(peer) == "audio"     ? "/dev/socket/tolk-audio"
                                       : std::string(peer) == "generic" ? "/dev/socket/tolk-service"
                                                                        : "/dev/hwbinder/radio.slot1");
        int status = -1;
        d.sim({"stop", peer}, &status);
        ASSERT_EQ(0, status);
        d.sim({"start", peer}, &status);
        ASSERT_EQ(0, status);
        int fd = unixConnect(path);
        EXPECT_GE(fd, 0) << "connect right after start: " << strerror(errno);
        if (fd >= 0) close(fd);
    }
}

TEST(SimHostTools, HostRunnerGivesTheHostPortModemLines) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    if (access(kPython, X_OK) != 0) GTEST_SKIP() << kPython << " is missing: the host runner is not tested";
    EXPECT_EQ("DRdcC dcC RdcC DdcC 921600 null errno 25\n",
              hostLines(d, {"TIOCMBIC=TIOCM_DTR|TIOCM_RTS", "TIOCMBIS=TIOCM_RTS", "TIOCMSET=TIOCM_DTR"}))
        << "DTR and RTS as set, DSR CTS CD with the cable in, line settings taken, other descriptors untouched";
    EXPECT_EQ("DdcC 921600 null errno 25\n", hostLines(d)) << "the port keeps its lines for the next program";

    // The same interposer called directly, as a C program would call ioctl.
    std::string lib = d.sim({"host", "--", "/bin/sh", "-c", "printf %s \"$LD_PRELOAD\""});
    lib = lib.substr(0, lib.find(' '));  // the runner puts its library first
    void *shim = dlopen(lib.c_str(), RTLD_NOW | RTLD_LOCAL);
    ASSERT_NE(nullptr, shim) << lib << ": " << dlerror();
    IoctlFn acmIoctl = reinterpret_cast<IoctlFn>(dlsym(shim, "ioctl"));
    ASSERT_NE(nullptr, acmIoctl);
    setenv("TOLK_ACM_TTY", (d.root() + "/host/ttyACM0").c_str(), 1);
    setenv("TOLK_ACM_LINES", (d.root() + "/run/acm.lines").c_str(), 1);
    int port = d.openSerial();
    ASSERT_GE(port, 0);
    auto lines = [&]() {
        int v = -1;
        EXPECT_EQ(0, acmIoctl(port, TIOCMGET, &v));
        return v & (TIOCM_DSR | TIOCM_CTS | TIOCM_CD);
    };
    auto dcd = [&]() {
        struct serial_icounter_struct ic = {};
        EXPECT_EQ(0, acmIoctl(port, TIOCGICOUNT, &ic));
        return ic.dcd;
    };
    // TIOCMIWAIT wakes on the carrier's drop and rise during a replug, and on
    // its drop at an unplug. The waiter is a child process, so that a wait
    // that never ends fails the test instead of holding it.
    const struct {
        const char *command;
        bool in;
        int transitions;
    } cables[] = {{"replug", true, 2}, {"unplug", false, 1}, {"replug", true, 1}};
    for (const auto &cable : cables) {
        SCOPED_TRACE(cable.command);
        int before = dcd();
        pid_t waiter = fork();
        if (waiter == 0) _exit(acmIoctl(port, TIOCMIWAIT, TIOCM_CD) == 0 ? 0 : 1);
        ASSERT_GT(waiter, 0);
        int status = -1;
        auto done = [&]() { return waitpid(waiter, &status, WNOHANG) == waiter; };
        EXPECT_FALSE(eventually(done, 50)) << "no change yet";
        d.sim({cable.command});
        if (!eventually(done, 5000)) {
            kill(waiter, SIGKILL);
            waitpid(waiter, &status, 0);
            ADD_FAILURE() << "TIOCMIWAIT did not wake";
        }
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0);
        EXPECT_EQ(cable.in ? TIOCM_DSR | TIOCM_CTS | TIOCM_CD : 0, lines());
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
    int first = tcpConnect(port);
    ASSERT_GE(first, 0);
    ASSERT_TRUE(writeAll(first, "AT*CIT_GACITF\r"));
    EXPECT_EQ(visible(direct), visible(readUntil(first, "OK\r\n")));
    // A second connection is a second adb connection: the daemon serves it and
    // drops the first, whose end reaches the TCP client.
    int second = tcpConnect(port);
    ASSERT_GE(second, 0);
    ASSERT_TRUE(writeAll(second, "AT*CIT_GACITF\r"));
    EXPECT_EQ(visible(direct), visible(readUntil(second, "OK\r\n")));
    EXPECT_TRUE(closedWithin(first, 3000)) << "the replaced connection is closed";
    // The client's half-close reaches the daemon, which closes its end.
    shutdown(second, SHUT_WR);
    EXPECT_TRUE(closedWithin(second, 3000));
    close(first);
    close(second);

    kill(pid, SIGTERM);
    EXPECT_TRUE(eventually([&] { return ended(pid); }, 3000)) << "the forwarder ends at SIGTERM";
}

// The modem gets the command line with the CR it waits for, and whatever it says
// reaches the host, unsolicited lines included; the other slots stay simulated.
TEST(SimHostTools, SlotOneCanBeAModemOnASerialDevice) {
    int master = -1, slave = -1;
    char name[64];
    ASSERT_EQ(openpty(&master, &slave, name, nullptr, nullptr), 0);
    SimDevice d({"--prop", "persist.service.tolk.usermode=1", "--modem-tty", name});
    ASSERT_TRUE(d.started()) << d.upOutput();
    int adb = d.connectAdb();
    ASSERT_GE(adb, 0);
    writeAll(adb, "AT+CSQ\r");
    EXPECT_EQ(visible("AT+CSQ\r"), visible(readUntil(master, "\r", 3000)));
    writeAll(master, "\r\n+CSQ: 9,99\r\n\r\nOK\r\n");
    EXPECT_EQ(visible("\r\n+CSQ: 9,99\r\n\r\nOK\r\n"), visible(readUntil(adb, "OK\r\n", 3000)));
    writeAll(master, "\r\nRING\r\n");
    EXPECT_EQ(visible("\r\nRING\r\n"), visible(readUntil(adb, "RING\r\n", 3000)));
    d.setprop("persist.service.tolk.sim", "1");
    writeAll(adb, "AT+CGSN\r");
    EXPECT_EQ(visible("\r\n350000000000002\r\n\r\nOK\r\n"), visible(readUntil(adb, "OK\r\n", 3000)));
    EXPECT_EQ("-1\tAT+CSQ\\x00\n", d.readFile("/journal/radio.slot1.log"));
    close(adb);
    close(master);
    close(slave);
}
