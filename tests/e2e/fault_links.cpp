// Hostile hosts: cables pulled during traffic, adb connections opened and
// dropped by the hundred, racing hosts. The daemon answers what it can, drops
// what it must, and keeps serving (over-long lines, stray control bytes and a
// half line left by a dropped connection: transcripts/link_faults.tx).
#include <signal.h>

#include <atomic>
#include <thread>

#include "../support/eventually.h"
#include "fault_checks.h"

// Each replug reopens the port (the old one closed: expectServing counts the
// descriptors), keeps the echo setting, and never disturbs the adb link; an
// unplug ends the daemon.
TEST(FaultLinks, CableReplugsDuringTrafficThenUnplugged) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);

    std::atomic<bool> stop(false);
    std::thread adbHost([&] {
        do {
            EXPECT_EQ(visible(kCsdfAnswer), visible(d.at("AT+CSDF?", true))) << "adb during the replugs";
        } while (!stop);
    });
    // A line typed before the daemon has reopened and set up the new port is
    // flushed with the port's stale input; wait for its settings to come back.
    std::string settings = d.sim({"tty-settings"});
    const int kReplugs = 4;
    for (int i = 1; i <= kReplugs; i++) {
        simOk(d, {"replug"});
        EXPECT_TRUE(eventually([&] { return d.sim({"tty-settings"}) == settings; }, 5000));
        std::string want = i < kReplugs ? "AT+CSDF?\n" + std::string(kCsdfAnswer) : kCsdfAnswer;
        EXPECT_EQ(visible(want), visible(d.at("AT+CSDF?"))) << "after replug " << i;
        if (i == kReplugs - 1) {
            EXPECT_EQ("ATE0\n\r\nOK\r\n", d.at("ATE0")) << "echo off before the last one";
            settings = d.sim({"tty-settings"});
        }
    }
    stop = true;
    adbHost.join();
    expectServing(d, fds, "after the replugs");

    // Losing the cable for good ends the daemon with status 1, an open adb
    // connection or not.
    int held = d.connectAdb();
    writeAll(held, "AT+CSDF?\r");
    EXPECT_EQ(visible(kCsdfAnswer), visible(readUntil(held, kCsdfAnswer)));
    simOk(d, {"unplug"});
    EXPECT_EQ(1, d.tolkdExitStatus(5000));
    EXPECT_NE(std::string::npos, d.log().find("FATAL Error in serail read"));
    EXPECT_NE(std::string::npos, d.log().find("The process is terminated due to fatal error"));
    close(held);
}

// Connections that say nothing, half a line or a whole one, two hundred times;
// then two hosts take turns grabbing the socket: the newest connection is the one
// served, an older one is closed. A half line dies with its connection (it is
// never glued to the next host's bytes), and nobody sees a torn or foreign answer.
TEST(FaultLinks, AdbConnectionsDroppedAndRacing) {
    signal(SIGPIPE, SIG_IGN);  // a host whose connection was replaced writes into a closed socket
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);
    // Nothing, half lines, a whole one; "AT+CSDF?\r" must not join the "AT+CSDF=1" before it.
    const char *const says[] = {"", "AT+CSD", "AT+CSDF=1", "AT+CSDF?\r"};
    for (int i = 0; i < 200; i++) {
        int fd = d.connectAdb();
        ASSERT_GE(fd, 0) << "connection " << i;
        writeAll(fd, says[i % 4]);
        usleep(1000);  // traffic shaping, not a wait: the daemon reads a half line before the hang-up
        if (i % 4 == 3) {
            EXPECT_EQ(visible(kCsdfAnswer), visible(readUntil(fd, "OK\r\n", 3000))) << "connection " << i;
        }
        close(fd);
    }

    std::atomic<int> complete(0);
    auto host = [&](const char *line, const std::string &answer) {
        for (int i = 0; i < 100; i++) {
            int fd = d.connectAdb();
            if (fd < 0) continue;
            writeAll(fd, line);
            std::string got = readUntil(fd, "OK\r\n", 1000);  // or the end of a replaced connection
            EXPECT_TRUE(got == answer || got.empty()) << visible(line) << " got " << visible(got);
            complete += got == answer;
            close(fd);
        }
    };
    std::thread a(host, "AT+CSDF?\r", std::string(kCsdfAnswer));
    std::thread b(host, "AT+ESUO?\r", std::string("\r\n+ESUO:4\r\n\r\nOK\r\n"));
    a.join();
    b.join();
    EXPECT_GT(complete.load(), 0);
    expectServing(d, fds, "after the connections");
}
