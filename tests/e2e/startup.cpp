// What start-up transcripts cannot show: the daemon's own exit in the
// engineering boot mode, and a simulator that leaves nothing running. The boot
// modes that serve, ATM mode and the PCT switch are in transcripts/startup.tx.
#include <signal.h>

#include <gtest/gtest.h>

#include "../support/eventually.h"
#include "sim_device.h"

TEST(Startup, EngineeringBootModeStopsTheDaemonWithStatusZero) {
    for (const char *mode : {"5", "57"}) {
        SCOPED_TRACE(std::string("boot mode file \"") + mode + "\"");
        SimDevice d({"--boot-mode", mode});
        EXPECT_NE(0, d.upStatus());
        EXPECT_EQ(0, d.tolkdExitStatus());
        EXPECT_NE(std::string::npos, d.log().find("advanced vemo mode, stop tolkd-daemon"));
        EXPECT_EQ(std::string::npos, d.log().find("tolkd-daemon start!!!"));
        // No property is touched in this mode.
        EXPECT_EQ("", d.getprop("persist.service.pct.mode"));
    }
}

static bool alive(pid_t pid) { return pid > 0 && kill(pid, 0) == 0; }

// One device per root, and down leaves nothing running.
TEST(Simulator, DownStopsEverythingAndIsIdempotent) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    pid_t tolkd = d.tolkdPid();
    pid_t supervisor = std::stoi(d.env("TOLK_SIM_PID"));
    ASSERT_TRUE(alive(tolkd) && alive(supervisor));

    std::string out;
    EXPECT_NE(0, runSim({"up", "--root", d.root()}, &out, true));
    EXPECT_NE(std::string::npos, out.find("already up")) << out;
    EXPECT_EQ(tolkd, d.tolkdPid());

    EXPECT_EQ("", d.sim({"down"}));
    // A zombie of tolkd is reaped by the supervisor before it exits.
    EXPECT_TRUE(eventually([&] { return !alive(tolkd) && !alive(supervisor); }, 5000));
    EXPECT_EQ(0, runSim({"down", "--root", d.root()}));
    EXPECT_NE(0, runSim({"replug", "--root", d.root()})) << "no device is up any more";
}
