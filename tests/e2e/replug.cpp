// Losing the USB cable for good ends the daemon with status 1 (a replug is
// survived by reopening the port: FaultLinks.CableReplugsDuringTraffic).
#include <unistd.h>

#include <gtest/gtest.h>

#include "fault_checks.h"

using namespace fault_checks;

namespace {

const std::string kCsdf = kCsdfAnswer;

// An open adb connection does not keep the daemon alive once the cable is gone.
TEST(Replug, CablePulledForGoodEndsTheDaemonWithStatusOne) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fd = d.connectAdb();
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(writeAll(fd, "AT+CSDF?\r"));
    EXPECT_EQ(visible(kCsdf), visible(readUntil(fd, "OK\r\n", 3000)));
    int status = -1;
    d.sim({"unplug"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(1, d.tolkdExitStatus(5000));
    EXPECT_NE(std::string::npos, d.log().find("FATAL Error in serail read"));
    EXPECT_NE(std::string::npos, d.log().find("The process is terminated due to fatal error"));
    close(fd);
}

}  // namespace
