// Start-up of the daemon on the simulated device: boot-mode gating, the ATM mode
// without a serial port, a missing control socket, and the PCT-mode switch
// written at every start.
#include <limits.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <dirent.h>

#include <gtest/gtest.h>

#include "fault_checks.h"

using namespace fault_checks;

namespace {

// True when tolkd holds a descriptor on the device side of the serial link.
bool tolkdHoldsSerialPort(const SimDevice &d) {
    char target[PATH_MAX];
    ssize_t n = readlink((d.root() + "/dev/ttyGS0").c_str(), target, sizeof target - 1);
    return n > 0 && tolkdFdList(d).find("->" + std::string(target, static_cast<size_t>(n)) + " ") != std::string::npos;
}

TEST(Startup, EngineeringBootModeStopsTheDaemonWithStatusZero) {
    for (const char *mode : {"5", "57"}) {
        SCOPED_TRACE(std::string("boot mode file \"") + mode + "\"");
        SimDevice d({"--boot-mode", mode});
        EXPECT_NE(0, d.upStatus());
        EXPECT_NE(std::string::npos, d.upOutput().find("tolkd exited with status 0")) << d.upOutput();
        EXPECT_EQ(0, d.tolkdExitStatus());
        EXPECT_NE(std::string::npos, d.log().find("advanced vemo mode, stop tolkd-daemon"));
        EXPECT_EQ(std::string::npos, d.log().find("tolkd-daemon start!!!"));
        // No property is touched in this mode.
        EXPECT_EQ("", d.getprop("persist.service.pct.mode"));
    }
}

TEST(Startup, OtherBootModesServe) {
    struct Case {
        std::vector<std::string> args;
        const char *logLine;
    };
    const Case cases[] = {
        {{"--boot-mode", ""}, "Boot mode = 0"},
        {{"--boot-mode", "x5"}, "Boot mode = 0"},
        {{"--boot-mode", "4"}, "Boot mode = 4"},
        {{"--boot-mode", "\xff\xfe"}, "tolkd-daemon start!!!"},
        {{"--no-boot-mode"}, "Boot mode = -1"},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.logLine);
        SimDevice d(c.args);
        ASSERT_TRUE(d.started()) << d.upOutput();
        EXPECT_NE(std::string::npos, d.log().find(c.logLine)) << d.log();
        EXPECT_NE(std::string::npos, d.log().find("tolkd-daemon start!!!"));
        EXPECT_EQ(kCsdfAnswer, d.at("AT+CSDF?", true)) << "adb link";
        if (c.args[0] == "--no-boot-mode") {
            EXPECT_NE(std::string::npos, d.log().find("Failed to open boot mode file /sys/class/BOOT/BOOT/boot/boot_mode"));
        }
    }
}

TEST(Startup, AtmModeServesTheAdbLinkOnly) {
    for (const char *atm : {"enable", "enabled"}) {
        SCOPED_TRACE(atm);
        SimDevice d({"--prop", std::string("ro.boot.atm=") + atm});
        ASSERT_TRUE(d.started()) << d.upOutput();
        EXPECT_FALSE(tolkdHoldsSerialPort(d));
        EXPECT_EQ(kCsdfAnswer, d.at("AT+CSDF?", true));
        // Nobody answers on the serial link (the idle port may still echo).
        std::string serial = d.at("AT+CSDF?");
        EXPECT_EQ(std::string::npos, serial.find("OK")) << visible(serial);
    }
    // Only the exact lower-case prefix counts.
    SimDevice d({"--prop", "ro.boot.atm=Enable"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_TRUE(tolkdHoldsSerialPort(d));
    EXPECT_EQ(std::string("AT+CSDF?\n") + kCsdfAnswer, d.at("AT+CSDF?"));
}

TEST(Startup, MissingControlSocketLeavesTheSerialLink) {
    SimDevice d({"--no-control-socket"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_NE(std::string::npos, d.log().find("Failed to get socket 'adb_tolk_socket'"));
    EXPECT_EQ(-1, d.connectAdb());
    EXPECT_EQ(std::string("AT+CSDF?\n") + kCsdfAnswer, d.at("AT+CSDF?"));
    EXPECT_EQ(-1, d.tolkdExitStatus(100)) << "tolkd must keep running";
}

TEST(Startup, AtmModeWithoutControlSocketStillRuns) {
    SimDevice d({"--prop", "ro.boot.atm=enable", "--no-control-socket"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(-1, d.tolkdExitStatus(200));
}

TEST(Startup, PctModeFollowsTheOperatorAtEveryStart) {
    struct Case {
        std::vector<std::string> args;
        const char *pct;
    } cases[] = {
        {{}, "1"},
        {{"--prop", "persist.operator.optr=OP07"}, "0"},
        // A stale "0" of an earlier operator is overwritten; the test is exact.
        {{"--prop", "persist.operator.optr=OP07X", "--prop", "persist.service.pct.mode=0"}, "1"},
    };
    for (const Case &c : cases) {
        SimDevice d(c.args);
        ASSERT_TRUE(d.started()) << d.upOutput();
        EXPECT_EQ(c.pct, d.getprop("persist.service.pct.mode"));
        if (c.args.size() == 2) {
            EXPECT_NE(std::string::npos, d.log().find("operator is OP07 and set PCT mode 0 for AT&T"));
        }
    }
}

}  // namespace

namespace {

bool processAlive(pid_t pid) { return pid > 0 && kill(pid, 0) == 0; }

// The simulator itself: one device per root, and down leaves nothing running.
TEST(Simulator, DownStopsEverythingAndIsIdempotent) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    pid_t tolkd = d.tolkdPid();
    pid_t supervisor = static_cast<pid_t>(atol(d.env("TOLK_SIM_PID").c_str()));
    ASSERT_TRUE(processAlive(tolkd));
    ASSERT_TRUE(processAlive(supervisor));
    EXPECT_EQ(d.root() + "/host/ttyACM0", d.env("TOLK_HOST_TTY"));
    EXPECT_EQ(d.root() + "/dev/socket/adb_tolk_socket", d.env("TOLK_ADB_SOCKET"));

    std::string out;
    EXPECT_NE(0, runSim({"up", "--root", d.root()}, &out, true));
    EXPECT_NE(std::string::npos, out.find("already up")) << out;
    EXPECT_EQ(tolkd, d.tolkdPid());

    EXPECT_EQ(0, d.sim({"down"}).size());
    // tolkd and the supervisor are gone (a zombie of tolkd would be reaped by
    // the supervisor before it exits).
    for (int i = 0; i < 100 && (processAlive(tolkd) || processAlive(supervisor)); i++) usleep(20 * 1000);
    EXPECT_FALSE(processAlive(tolkd));
    EXPECT_FALSE(processAlive(supervisor));
    int status = -1;
    d.sim({"down"}, &status);
    EXPECT_EQ(0, status);
    d.sim({"replug"}, &status);
    EXPECT_NE(0, status) << "no device is up any more";
}

}  // namespace
