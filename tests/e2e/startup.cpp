// What start-up transcripts cannot show: the daemon's own exit in the
// engineering boot mode. The boot modes that serve, ATM mode and the PCT switch
// are in transcripts/startup.tx; a simulator that leaves nothing running is
// checked in sim_host_tools.cpp.
#include <gtest/gtest.h>

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
