// Hostile hosts: cables pulled during traffic, adb connections opened and
// dropped by the hundred, racing hosts. The daemon answers what it can, drops
// what it must, and keeps serving (over-long lines and stray control bytes:
// transcripts/link_faults.tx).
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <sstream>
#include <thread>

#include <gtest/gtest.h>

#include "../support/eventually.h"
#include "fault_checks.h"

using namespace fault_checks;

namespace {

// One local query on an open adb connection; true when its exact answer came.
bool adbQuery(int fd) {
    if (!writeAll(fd, "AT+CSDF?\r")) return false;
    return readUntil(fd, "OK\r\n", 3000) == kCsdfAnswer;
}

// Each replug reopens the port (the old one closed: expectServing counts the
// descriptors), keeps the echo setting, and never disturbs the adb link; an
// unplug ends the daemon.
TEST(FaultLinks, CableReplugsDuringTrafficThenUnplugged) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);

    std::atomic<bool> stop(false);
    std::atomic<int> asked(0), answered(0);
    std::thread adbHost([&] {
        int fd = d.connectAdb();
        while (fd >= 0 && !stop) {
            asked++;
            writeAll(fd, "AT+CSDF?\r");
            std::string got = readUntil(fd, "OK\r\n", 3000);
            if (got == kCsdfAnswer) {
                answered++;
            } else {
                ADD_FAILURE() << "adb answer during replugs: " << visible(got);
            }
        }
        if (fd >= 0) close(fd);
    });
    // A line typed before the daemon has reopened and set up the new port is
    // flushed with the port's stale input; wait for its settings to come back.
    std::string settings = d.sim({"tty-settings"});
    const int kReplugs = 4;
    for (int i = 1; i <= kReplugs; i++) {
        int status = -1;
        d.sim({"replug"}, &status);
        ASSERT_EQ(0, status);
        EXPECT_TRUE(eventually([&] { return d.sim({"tty-settings"}) == settings; }, 5000));
        std::string got = d.at("AT+CSDF?");
        EXPECT_EQ(visible(i < kReplugs ? "AT+CSDF?\n" + std::string(kCsdfAnswer) : kCsdfAnswer), visible(got))
            << "after replug " << i;
        if (i == kReplugs - 1) {
            EXPECT_EQ("ATE0\n\r\nOK\r\n", d.at("ATE0")) << "echo off before the last one";
            settings = d.sim({"tty-settings"});
        }
    }
    stop = true;
    adbHost.join();
    EXPECT_GT(asked.load(), 0);
    EXPECT_EQ(asked.load(), answered.load()) << "the adb link is not touched by the serial port's loss";
    expectServing(d, fds, "after the replugs");

    // Losing the cable for good ends the daemon with status 1, an open adb
    // connection or not.
    HostLink adb(d, true);
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    int status = -1;
    d.sim({"unplug"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(1, d.tolkdExitStatus(5000));
    EXPECT_NE(std::string::npos, d.log().find("FATAL Error in serail read"));
    EXPECT_NE(std::string::npos, d.log().find("The process is terminated due to fatal error"));
}

// Connections that say nothing, half a line or a whole one, two hundred times. A
// half line dies with its connection: it is never glued to the next host's bytes.
TEST(FaultLinks, AdbConnectionsOpenedAndDropped) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);
    int full = 0, answered = 0, refused = 0;
    for (int i = 0; i < 200; i++) {
        int fd = d.connectAdb();
        if (fd < 0) {
            refused++;
            continue;
        }
        switch (i % 4) {
        case 0:
            break;
        case 1:
            writeAll(fd, "AT+CSD");
            break;
        case 2:
            writeAll(fd, "AT+CSDF=1");  // then "F?\r" from the next one must not join it
            usleep(1000);
            break;
        default:
            full++;
            if (adbQuery(fd)) answered++;
        }
        close(fd);
    }
    EXPECT_EQ(0, refused);
    EXPECT_EQ(full, answered);
    // The tail of a line whose head went with a dropped connection is no command.
    int fd = d.connectAdb();
    writeAll(fd, "AT+CSD");
    close(fd);
    fd = d.connectAdb();
    writeAll(fd, "F?\r");
    EXPECT_EQ("", readQuiet(fd, 200));
    close(fd);
    expectServing(d, fds, "after the connections");
}

// Two hosts take turns grabbing the socket: the newest connection is the one
// served, an older one is closed. Nobody ever sees a torn or foreign answer.
TEST(FaultLinks, TwoHostsRacingForTheSocket) {
    // A host whose connection was replaced writes into a closed socket.
    signal(SIGPIPE, SIG_IGN);
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);
    std::atomic<int> complete(0), torn(0);
    auto host = [&](const char *line, const std::string &answer) {
        for (int i = 0; i < 100; i++) {
            int fd = d.connectAdb();
            if (fd < 0) continue;
            writeAll(fd, line);
            std::string got = readUntil(fd, "OK\r\n", 1000);  // or the end of a replaced connection
            if (got == answer) {
                complete++;
            } else if (!got.empty()) {
                torn++;
                ADD_FAILURE() << "host sent " << visible(line) << " got " << visible(got);
            }
            close(fd);
        }
    };
    std::thread a(host, "AT+CSDF?\r", std::string(kCsdfAnswer));
    std::thread b(host, "AT+ESUO?\r", std::string("\r\n+ESUO:4\r\n\r\nOK\r\n"));
    a.join();
    b.join();
    EXPECT_GT(complete.load(), 0);
    EXPECT_EQ(0, torn.load());
    expectServing(d, fds, "after the race");
}

}  // namespace
