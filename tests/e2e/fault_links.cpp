// Hostile and clumsy hosts: cables pulled during traffic, adb connections opened
// and dropped by the thousand, racing hosts, over-long lines and stray control
// bytes. The daemon answers what it can, drops what it must, and keeps serving.
#include <signal.h>
#include <unistd.h>

#include <atomic>
#include <sstream>
#include <thread>

#include <gtest/gtest.h>

#include "fault_checks.h"
#include "modem_e2e.h"

using namespace fault_checks;
using namespace modem_e2e;

namespace {

// One local query on an open adb connection; true when its exact answer came.
bool adbQuery(int fd) {
    if (!writeAll(fd, "AT+CSDF?\r")) return false;
    return readUntil(fd, "OK\r\n", 3000) == kCsdfAnswer;
}

// Each replug reopens the port (the old one closed: expectServing counts the
// descriptors), keeps the echo setting, and never disturbs the adb link.
TEST(FaultLinks, CableReplugsDuringTraffic) {
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
            usleep(5 * 1000);
        }
        if (fd >= 0) close(fd);
    });
    // A line typed before the daemon has reopened and set up the new port is
    // flushed with the port's stale input; wait for its settings to come back.
    std::string settings = d.sim({"tty-settings"});
    const int kReplugs = 10;
    for (int i = 1; i <= kReplugs; i++) {
        int status = -1;
        d.sim({"replug"}, &status);
        ASSERT_EQ(0, status);
        for (int t = 0; t < 100 && d.sim({"tty-settings"}) != settings; t++) usleep(50 * 1000);
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
}

// Connections that say nothing, half a line or a whole one, a thousand times. A
// half line dies with its connection: it is never glued to the next host's bytes.
TEST(FaultLinks, AdbConnectionsOpenedAndDroppedAThousandTimes) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    int fds = baselineFds(d);
    int full = 0, answered = 0, refused = 0;
    for (int i = 0; i < 1000; i++) {
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
    EXPECT_EQ("", readQuiet(fd, 300));
    close(fd);
    expectServing(d, fds, "after a thousand connections");
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
        for (int i = 0; i < 150; i++) {
            int fd = d.connectAdb();
            if (fd < 0) continue;
            writeAll(fd, line);
            std::string got = readQuiet(fd, 60, 1000);
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

// How long lines end up: adb lines are cut at 6144 bytes by the daemon (the rest
// of that read is dropped, later reads do not start with AT and are ignored);
// serial lines are cut by the kernel's canonical line buffer at 4095 bytes. The
// modem gets each line once, cut, and the next command is intact.
TEST(FaultLinks, OverlongLinesOnBothLinks) {
    SimDevice d(openModem());
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.at("AT+CSQ", true);
    int fds = baselineFds(d);
    struct Case {
        bool adb;
        size_t total;    // bytes sent, CR included
        size_t reached;  // command bytes the modem got
    } cases[] = {
        {true, 6143, 6142},   {true, 6144, 6143},   {true, 6145, 6143},   {true, 100000, 6143},
        {false, 4094, 4093},  {false, 4095, 4094},  {false, 4096, 4095},  {false, 6143, 4095},
        {false, 6144, 4095},  {false, 6145, 4095},  {false, 100000, 4095},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(std::string(c.adb ? "adb " : "serial ") + std::to_string(c.total));
        radioScript(d, "");
        d.writeFile("/journal/radio.slot1.log", "");
        HostLink host(d, c.adb);
        std::string line = "AT+X" + std::string(c.total - 5, 'Y') + "\r";
        EXPECT_EQ(visible("\r\nERROR\r\n"), visible(host.send(line, 800)));
        EXPECT_EQ(visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"), visible(host.cmd("AT+CSQ")));
        std::string journal = radioJournal(d, 1);
        std::string expect = "AT+X" + std::string(c.reached - 4, 'Y') + "\\x00\nAT+CSQ\\x00\n";
        EXPECT_EQ(expect.size(), journal.size());
        EXPECT_TRUE(journal == expect) << visible(journal.substr(0, 40)) << "...";
    }
    expectServing(d, fds, "after the long lines");
}

// Stray bytes: NULs, bytes above 0x7F, lone CRs, bare Ctrl-Z and ESC, more
// backspaces than the line has. Each case is followed by a clean command whose
// answer must be exact.
TEST(FaultLinks, StrayBytesOnBothLinks) {
    SimDevice d(openModem());
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.at("AT+CSQ", true);
    int fds = baselineFds(d);
    const std::string kErr = "\r\nERROR\r\n", kCsq = "\r\n+CSQ: 20,99\r\n\r\nOK\r\n";
    struct Case {
        std::string bytes, answer, journal;
    } cases[] = {
        {std::string("AT+C\0SQ\r", 8), kErr, "AT+C\\x00\n"},  // a NUL ends the command text
        {"AT+CSQ\x80\xff\r", kErr, "AT+CSQ\\x80\\xff\\x00\n"},
        {"\xff\xfe\r", "", ""},
        {std::string("\0\0\r", 3), "", ""},
        {"\r\r\r", "", ""},
        {"A\r", "", ""},
        {"XY+CSDF?\r", "", ""},
        {"\x1a\r", "", ""},
        {"\x1b\r", "", ""},
        {"\b\b\bAT+CSQ\r", kCsq, "AT+CSQ\\x00\n"},
        {"AT\b\b\b\b+CSQ\r", "", ""},  // what is left does not begin with AT
        {"AT+CSQ\r\r\r\r", kCsq, "AT+CSQ\\x00\n"},
    };
    for (bool adb : {true, false}) {
        for (const Case &c : cases) {
            SCOPED_TRACE(std::string(adb ? "adb " : "serial ") + visible(c.bytes));
            d.writeFile("/journal/radio.slot1.log", "");
            HostLink host(d, adb);
            EXPECT_EQ(visible(c.answer), visible(host.send(c.bytes, 400)));
            EXPECT_EQ(visible(kCsdfAnswer), visible(host.cmd("AT+CSDF?")));
            EXPECT_EQ(c.journal, radioJournal(d, 1));
        }
    }
    // On adb a bare Ctrl-Z without a line end heads the next line, which then
    // does not begin with AT; the line after that is served again.
    HostLink adb(d, true);
    EXPECT_EQ("", adb.send("\x1a", 200));
    EXPECT_EQ("", adb.cmd("AT+CSDF?"));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.cmd("AT+CSDF?")));
    expectServing(d, fds, "after the stray bytes");
}

}  // namespace
