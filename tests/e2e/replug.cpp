// Losing the USB cable: a replug is survived by reopening the port, a cable
// pulled for good ends the daemon with status 1.
#include <unistd.h>

#include <gtest/gtest.h>

#include "sim_device.h"

namespace {

const std::string kCsdf = "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n";
const char kReopened[] = "The FD is FATAL Error reopen successfully";

int countOf(const std::string &text, const std::string &needle) {
    int n = 0;
    for (size_t pos = text.find(needle); pos != std::string::npos; pos = text.find(needle, pos + 1)) n++;
    return n;
}

TEST(Replug, PortIsReopenedAndKeepsItsEchoSetting) {
    SimDevice d({"--log-tags", "*:d"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible("AT+CSDF?\n" + kCsdf), visible(d.at("AT+CSDF?")));
    int fds = d.tolkdFdCount();

    int status = -1;
    d.sim({"replug"}, &status);
    ASSERT_EQ(0, status);
    ASSERT_TRUE(d.waitForLog(kReopened));
    EXPECT_EQ(visible("AT+CSDF?\n" + kCsdf), visible(d.at("AT+CSDF?")));
    EXPECT_EQ(fds, d.tolkdFdCount()) << "the old port must be closed";

    // Echo switched off before the next replug stays off on the new port.
    EXPECT_EQ("ATE0\n\r\nOK\r\n", d.at("ATE0"));
    d.sim({"replug"}, &status);
    ASSERT_EQ(0, status);
    for (int i = 0; i < 500 && countOf(d.log(), kReopened) < 2; i++) usleep(10 * 1000);
    EXPECT_EQ(2, countOf(d.log(), kReopened));
    EXPECT_EQ(visible(kCsdf), visible(d.at("AT+CSDF?")));
    EXPECT_EQ(fds, d.tolkdFdCount());
    EXPECT_EQ(-1, d.tolkdExitStatus(50));
    // The adb link was never affected.
    EXPECT_EQ(visible(kCsdf), visible(d.at("AT+CSDF?", true)));
}

TEST(Replug, CablePulledForGoodEndsTheDaemonWithStatusOne) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int status = -1;
    d.sim({"unplug"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(1, d.tolkdExitStatus(5000));
    EXPECT_NE(std::string::npos, d.log().find("FATAL Error in serail read"));
    EXPECT_NE(std::string::npos, d.log().find("The process is terminated due to fatal error"));
}

}  // namespace
