// The two host links as a factory host sees them: the serial port's line
// discipline (line ends, echo, backspace) and the adb link's line assembly.
#include <unistd.h>

#include <chrono>
#include <functional>

#include <gtest/gtest.h>

#include "fault_checks.h"

namespace {

const std::string kCsdf = "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n";

class Links : public ::testing::Test {
protected:
    void SetUp() override { ASSERT_TRUE(dev.started()) << dev.upOutput(); }

    // Sends raw bytes on a fresh serial descriptor and returns what comes back.
    std::string serial(const std::string &bytes, int quietMs = 400) {
        int fd = dev.openSerial();
        EXPECT_GE(fd, 0);
        if (fd < 0) return "";
        EXPECT_TRUE(writeAll(fd, bytes));
        std::string got = readQuiet(fd, quietMs);
        close(fd);
        return got;
    }

    SimDevice dev;
};

TEST_F(Links, SerialLineEndsAtCrLfCtrlZAndEsc) {
    // The port echoes as the host types; a CR arrives as LF (ICRNL).
    EXPECT_EQ("AT+CSDF?\n" + kCsdf, serial("AT+CSDF?\r"));
    EXPECT_EQ("AT+CSDF?\n" + kCsdf, serial("AT+CSDF?\n"));
    // Ctrl-Z and ESC end a line too; the delimiter is echoed and then dropped.
    EXPECT_EQ(visible("AT+CSDF?\x1a" + kCsdf), visible(serial("AT+CSDF?\x1a")));
    EXPECT_EQ(visible("AT+CSDF?\x1b" + kCsdf), visible(serial("AT+CSDF?\x1b")));
    // Lower case is accepted; the command name is upper-cased before dispatch.
    EXPECT_EQ("at+csdf?\n" + kCsdf, serial("at+csdf?\r"));
}

TEST_F(Links, EchoFollowsAte0AndAte1PerLink) {
    EXPECT_EQ("ATE0\n\r\nOK\r\n", dev.at("ATE0"));
    EXPECT_EQ(visible(kCsdf), visible(dev.at("AT+CSDF?")));
    // Echo is a serial matter: the adb link never echoes, and its ATE1 does not
    // switch the serial port's echo back on.
    EXPECT_EQ("\r\nOK\r\n", dev.at("ATE1", true));
    EXPECT_EQ(visible(kCsdf), visible(dev.at("AT+CSDF?", true)));
    EXPECT_EQ(visible(kCsdf), visible(dev.at("AT+CSDF?")));
    EXPECT_EQ("\r\nOK\r\n", dev.at("ATE1"));
    EXPECT_EQ(visible("AT+CSDF?\n" + kCsdf), visible(dev.at("AT+CSDF?")));
    // ATQ0V1E keeps the current setting.
    EXPECT_EQ("ATQ0V1E\n\r\nOK\r\n", dev.at("ATQ0V1E"));
    EXPECT_EQ(visible("AT+CSDF?\n" + kCsdf), visible(dev.at("AT+CSDF?")));
}

TEST_F(Links, BackspaceEditsTheLineOnBothLinks) {
    EXPECT_EQ(visible("AT+CSX\bDF?\n" + kCsdf), visible(serial("AT+CSX\bDF?\r")));
    EXPECT_EQ(visible(kCsdf), visible(dev.at("AT+CSX\\bDF?", true)));
    // A backspace at the start of the line removes nothing.
    EXPECT_EQ(visible(kCsdf), visible(dev.at("\\bAT+CSDF?", true)));
    // Editing "AT" away leaves a line that is not a command.
    EXPECT_EQ("", dev.at("AT\\b\\b+CSDF?", true));
}

long long elapsedMs(const std::function<void()> &f) {
    auto start = std::chrono::steady_clock::now();
    f();
    return std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start).count();
}

// The host client ends an exchange at the final result, not at the quiet time.
TEST_F(Links, HostClientStopsAtTheFinalResult) {
    std::string got;
    EXPECT_LT(elapsedMs([&] { got = dev.at("AT+CSDF?", true, 3000); }), 2500);
    EXPECT_EQ(visible(kCsdf), visible(got));
    // Several lines on one adb connection, each answered in turn.
    got = dev.at(std::vector<std::string>{"AT+CSDF=2", "AT+CSDF?", "AT+CSDF=1"}, true);
    EXPECT_EQ(visible("\r\nOK\r\n\r\n+CSDF: 2,1\n\r\n\r\nOK\r\n\r\nOK\r\n"), visible(got));
}

TEST_F(Links, AdbAssemblesALineAcrossPacketsAndTakesOneLinePerPacket) {
    int fd = dev.connectAdb();
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(writeAll(fd, "AT+C"));
    usleep(100 * 1000);
    ASSERT_TRUE(writeAll(fd, "SDF"));
    usleep(100 * 1000);
    ASSERT_TRUE(writeAll(fd, "?\r"));
    EXPECT_EQ(visible(kCsdf), visible(readQuiet(fd)));

    // A second line in the same packet is discarded.
    ASSERT_TRUE(writeAll(fd, "AT+CSDF=?\rAT+CSDF?\r"));
    EXPECT_EQ(visible("\r\n+CSDF: (1,2,3,4,5,6,7),(1,2)\n\r\n\r\nOK\r\n"), visible(readQuiet(fd)));
    // LF does not end an adb line; it stays in the line and the CR ends it.
    ASSERT_TRUE(writeAll(fd, "AT+CSDF?\n"));
    EXPECT_EQ("", readQuiet(fd));
    ASSERT_TRUE(writeAll(fd, "\r"));
    EXPECT_NE("", readQuiet(fd));
    close(fd);
}

TEST_F(Links, AdbLineIsCutAt6144Bytes) {
    int fd = dev.connectAdb();
    ASSERT_GE(fd, 0);
    // 6144 bytes without CR make one complete line; its last byte is dropped as
    // the delimiter and trailing blanks are trimmed.
    std::string line = "AT+CSDF=3" + std::string(6144 - 9, ' ');
    ASSERT_TRUE(writeAll(fd, line));
    EXPECT_EQ("\r\nOK\r\n", readQuiet(fd));
    ASSERT_TRUE(writeAll(fd, "AT+CSDF?\r"));
    EXPECT_EQ(visible("\r\n+CSDF: 3,1\n\r\n\r\nOK\r\n"), visible(readQuiet(fd)));
    close(fd);  // longer lines and their tails: FaultLinks.OverlongLinesOnBothLinks
}

// A connection that says nothing holds up neither the serial port nor its own
// later line; a newer connection then replaces it, and the old one is closed
// rather than left open and forgotten (repeated replacement: FaultLinks).
TEST_F(Links, SilentAdbClientAndItsReplacement) {
    int first = dev.connectAdb();
    ASSERT_GE(first, 0);
    usleep(200 * 1000);  // connected, accepted, and nothing sent
    EXPECT_EQ(visible("AT+CSDF?\n" + kCsdf), visible(dev.at("AT+CSDF?")));
    ASSERT_TRUE(writeAll(first, "AT+CSDF?\r"));
    EXPECT_EQ(visible(kCsdf), visible(readQuiet(first)));
    int count = fault_checks::stableFdCount(dev);

    int second = dev.connectAdb();
    ASSERT_GE(second, 0);
    ASSERT_TRUE(writeAll(second, "AT+CSDF?\r"));
    EXPECT_EQ(visible(kCsdf), visible(readQuiet(second)));
    char c;
    EXPECT_EQ(0, read(first, &c, 1));
    EXPECT_EQ(count, fault_checks::settledFdCount(dev, count));
    close(first);
    close(second);
}

}  // namespace
