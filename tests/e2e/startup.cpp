// What start-up transcripts cannot show: the daemon's process as init starts it
// (its user, groups and capabilities, its control socket's owner as adbd and an
// app meet it) and its idle stay in the engineering boot mode. The boot modes
// that serve, ATM mode and the PCT switch are in transcripts/startup.tx; a
// simulator that leaves nothing running is checked in sim_host_tools.cpp.
#include <errno.h>
#include <grp.h>
#include <linux/capability.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <sys/wait.h>

#include <filesystem>

#include <gtest/gtest.h>

#include "../../sim/sim_privilege.h"
#include "../support/eventually.h"
#include "sim_device.h"

namespace {

// A client of the adb control socket under uid and groups (the first group is
// the primary one): what it received for one line, or "errno N" when it could
// not connect.
std::string askAs(const std::string &socketPath, uid_t uid, const std::vector<gid_t> &groups,
                  const std::string &line) {
    int pfd[2];
    if (pipe(pfd) != 0) return "pipe";
    if (fork() == 0) {
        std::string out = "cannot become uid " + std::to_string(uid);
        int fd = -1;
        if (setgroups(groups.size(), groups.data()) == 0 && setresgid(groups[0], groups[0], groups[0]) == 0 &&
            setresuid(uid, uid, uid) == 0)
            out = (fd = sim::connectUnix(socketPath)) < 0 ? "errno " + std::to_string(errno)
                  : writeAll(fd, line) ? readUntil(fd, "OK\r\n", 5000) : "cannot send";
        _exit(write(pfd[1], out.data(), out.size()) < 0);
    }
    close(pfd[1]);
    std::string got;
    char buf[512];
    for (ssize_t n; (n = read(pfd[0], buf, sizeof buf)) > 0;) got.append(buf, static_cast<size_t>(n));
    close(pfd[0]);
    wait(nullptr);
    return got;
}

bool alive(pid_t pid) { return pid > 0 && kill(pid, 0) == 0; }

}  // namespace

// As init starts it from device/tolkd.rc: user system, the groups of the
// sockets and devices it uses (system radio audio wifi; no inet, no
// net_admin), and SYS_TIME as the only capability in every set. Every other
// end-to-end test runs the daemon so, which shows it needs no more.
TEST(Startup, DaemonRunsAsItsServiceUserWithOnlyTheClockCapability) {
    if (!sim::runsWithPhoneUsers()) GTEST_SKIP() << "not root: the simulator runs tolkd as the caller";
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    const std::string status = sim::readFileOr("/proc/" + std::to_string(d.tolkdPid()) + "/status");
    char sysTime[20];
    snprintf(sysTime, sizeof sysTime, "%016llx\n", 1ULL << CAP_SYS_TIME);
    for (std::string field : {"Uid:\t1000\t1000\t1000\t1000\n", "Gid:\t1000\t1000\t1000\t1000\n",
                              "Groups:\t1000 1001 1005 1010 \n", "CapInh:\t", "CapPrm:\t", "CapEff:\t", "CapBnd:\t",
                              "CapAmb:\t"}) {
        if (field.back() == '\t') field += sysTime;
        EXPECT_NE(std::string::npos, status.find("\n" + field)) << field << "in\n" << status;
    }
    const std::string app = "/proc/" + std::to_string(atol(d.readFile("/run/cit.pid").c_str())) + "/status";
    EXPECT_NE(std::string::npos, sim::readFileOr(app).find("\nUid:\t10050\t")) << "the CIT application's own uid";
}

// adbd runs as uid and gid shell with a few supplementary groups on user
// builds: `adb forward ... localreserved:adb_tolk_socket` must reach the
// daemon. An app (its own uid, no group) must not.
TEST(Startup, AdbdReachesTheControlSocketAndAnAppDoesNot) {
    if (!sim::runsWithPhoneUsers()) GTEST_SKIP() << "not root: the socket keeps the caller's owner";
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    const std::string sock = d.env("TOLK_ADB_SOCKET");
    // shell; adb log input inet net_bt_admin net_bt sdcard_rw readproc
    const std::vector<gid_t> adbd = {2000, 1011, 1007, 1004, 3003, 3001, 3002, 1015, 3009};
    EXPECT_EQ("\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n", askAs(sock, 2000, adbd, "AT+CSDF?\r"));
    EXPECT_EQ("errno " + std::to_string(EACCES), askAs(sock, 10051, {10051}, "AT+CSDF?\r"));
}

// In the engineering boot mode the daemon serves nothing, but it does not exit
// either: init would start it again every few seconds for as long as the device
// runs. It stays, holding no link and touching no property.
TEST(Startup, EngineeringBootModeIdlesWithoutServing) {
    for (const char *mode : {"5", "57"}) {
        SCOPED_TRACE(std::string("boot mode file \"") + mode + "\"");
        SimDevice d({"--boot-mode", mode});
        EXPECT_NE(0, d.upStatus());
        EXPECT_NE(std::string::npos, d.upOutput().find("is idle and serves nothing")) << d.upOutput();
        EXPECT_EQ(-1, d.tolkdExitStatus(200)) << "the daemon must not exit";
        EXPECT_TRUE(alive(d.tolkdPid()));
        EXPECT_NE(std::string::npos, d.log().find("advanced vemo mode, stop tolkd-daemon"));
        EXPECT_EQ(std::string::npos, d.log().find("tolkd-daemon start!!!"));
        EXPECT_EQ("", d.getprop("persist.service.pct.mode"));
        std::error_code ec;
        for (const auto &e : std::filesystem::directory_iterator("/proc/" + std::to_string(d.tolkdPid()) + "/fd", ec))
            EXPECT_EQ(std::string::npos, std::filesystem::read_symlink(e.path(), ec).string().find("/dev/pts"))
                << "the serial port is open";
        EXPECT_LT(d.connectAdb(), 0) << "the control socket is not listened on";
    }
}
