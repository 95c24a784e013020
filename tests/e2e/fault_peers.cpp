// Peers that die, restart, stay silent or hang up early. Whatever they do, the
// host gets an answer or a defined failure, the daemon keeps serving, keeps its
// descriptor count, and every command reaches the peer exactly once.
#include <unistd.h>

#include <atomic>
#include <thread>

#include <gtest/gtest.h>

#include "fault_checks.h"
#include "modem_e2e.h"

using namespace fault_checks;
using namespace modem_e2e;

namespace {

const std::string kCsq = "\r\n+CSQ: 20,99\r\n\r\nOK\r\n";
const std::string kNoModem = "\r\nERROR:No Modem\r\n";

// Reads the answer to one modem command: up to its final line, or 2 s.
std::string modemAnswer(HostLink &host) {
    std::string got;
    for (int i = 0; i < 20; i++) {
        got += readQuiet(host.fd(), 100, 200);
        if (got.find("OK\r\n") != std::string::npos || got.find("No Modem\r\n") != std::string::npos) break;
    }
    return got;
}

// The service is stopped and started by another thread while the host keeps
// sending: each command ends in its answer or "ERROR:No Modem"; only a command in
// flight at the moment of a kill may go unanswered, at most one per kill.
TEST(FaultPeers, RadioServiceFlappingUnderTraffic) {
    SimDevice d(openModem());
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible(kCsq), visible(d.at("AT+CSQ", true)));
    int fds = baselineFds(d);
    HostLink adb(d, true);

    const int kKills = 5;
    std::atomic<bool> done(false);
    std::thread flapper([&] {
        for (int i = 0; i < kKills; i++) {
            usleep(150 * 1000);
            d.sim({"stop", "radio"});
            usleep(150 * 1000);
            d.sim({"start", "radio"});
        }
        done = true;
    });
    int answered = 0, refused = 0, silent = 0, commands = 0;
    while (!done && commands < 400) {
        writeAll(adb.fd(), "AT+CSQ\r");
        commands++;
        std::string got = modemAnswer(adb);
        if (got == kCsq) {
            answered++;
        } else if (got == kNoModem) {
            refused++;
        } else {
            EXPECT_EQ("", visible(got)) << "command " << commands;
            silent++;
        }
    }
    flapper.join();
    EXPECT_GT(answered, 0);
    EXPECT_LE(silent, kKills);
    // The restarted service serves the next command, and no stray answer is left.
    EXPECT_EQ(visible(kCsq), visible(adb.cmd("AT+CSQ")));
    EXPECT_EQ(answered + 1 + 1, countOf(radioJournal(d, 1), "AT+CSQ\\x00\n") - silent)
        << answered << " answered, " << refused << " refused, " << silent << " silent";
    expectServing(d, fds, "after flapping");
}

TEST(FaultPeers, GenericServiceSilentClosingAndKilled) {
    SimDevice d(openModem());
    ASSERT_TRUE(d.started()) << d.upOutput();
    genericScript(d, "AT+SN => (none)\nAT+MODEL => (close)\nAT+POWERKEY => (none)\n");
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(d.at("AT%OSVER", true)));
    int fds = baselineFds(d);
    HostLink adb(d, true);

    // A silent answer to an ordinary command holds nothing up.
    EXPECT_EQ("", adb.cmd("AT+SN", 300));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.cmd("AT+CSDF?")));
    // A service that hangs up instead of answering is reconnected for the next one.
    EXPECT_EQ("", adb.cmd("AT+MODEL", 300));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AT%OSVER")));

    // The power key waits for its answer (by design, without a limit); lines sent
    // meanwhile wait too, and are served once the service is gone.
    EXPECT_EQ("", adb.cmd("AT+POWERKEY", 300));
    EXPECT_EQ("", adb.cmd("AT+CSDF?", 300)) << "the daemon waits for the power key";
    int status = -1;
    d.sim({"stop", "generic"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.quiet(500)));
    d.sim({"start", "generic"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AT%OSVER")));

    // Closing early on the power key returns at once.
    genericScript(d, "AT+POWERKEY => (close)\n");
    EXPECT_EQ("", adb.cmd("AT+POWERKEY", 300));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.cmd("AT+CSDF?")));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AT%OSVER")));

    EXPECT_EQ("AT%OSVER\nAT+SN\nAT+MODEL\nAT%OSVER\nAT+POWERKEY\nAT%OSVER\nAT+POWERKEY\nAT%OSVER\n",
              genericJournal(d));
    expectServing(d, fds, "after the generic service faults");
}

TEST(FaultPeers, AudioServiceSilentClosingAndKilled) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(d.at("AT+EAPS=0", true)));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(d.at("AUD+TXT", true)));
    int fds = baselineFds(d);
    d.writeFile("/sim/audio/script", "AUD+TXT => (none)\nMM+LOOP=1 => (close)\n");
    HostLink adb(d, true);

    for (int round = 0; round < 3; round++) {
        SCOPED_TRACE("round " + std::to_string(round));
        // A silent audio service holds the daemon until it goes away.
        EXPECT_EQ("", adb.cmd("AUD+TXT", 300));
        EXPECT_EQ("", adb.cmd("AT+CSDF?", 200));
        int status = -1;
        d.sim({"stop", "audio"}, &status);
        ASSERT_EQ(0, status);
        EXPECT_EQ(visible(kCsdfAnswer), visible(adb.quiet(500)));
        d.sim({"start", "audio"}, &status);
        ASSERT_EQ(0, status);
        // `start` can return before the service accepts; a command sent until then
        // finds no service and is dropped (the daemon logs it).
        std::string probe;
        for (int i = 0; i < 50 && (probe = adb.cmd("AUD+BIN", 200)).empty(); i++) usleep(50 * 1000);
        EXPECT_EQ(visible("\r\nOK\r\n"), visible(probe));
        // Hanging up early: nothing for the host, the next command reconnects.
        EXPECT_EQ("", adb.cmd("MM+LOOP=1", 300));
        EXPECT_EQ(visible(kCsdfAnswer), visible(adb.cmd("AT+CSDF?")));
        EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AUD+BIN")));
    }
    std::string journal = d.readFile("/journal/audio.log");
    EXPECT_EQ(4, countOf(journal, "AUD+TXT\\x00\n")) << journal;
    EXPECT_EQ(3, countOf(journal, "MM+LOOP=1\\x00\n")) << journal;
    expectServing(d, fds, "after the audio service faults");
}

TEST(FaultPeers, CitApplicationSilentClosingAndKilled) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/cit/script", "GPS => (none)\nKEY => (close)\n");
    std::string first;
    for (int i = 0; i < 50 && (first = d.at("AT*CIT_SN", true)).empty(); i++) usleep(100 * 1000);
    int fds = baselineFds(d);
    HostLink adb(d, true);

    for (int round = 0; round < 3; round++) {
        SCOPED_TRACE("round " + std::to_string(round));
        EXPECT_EQ("", adb.cmd("AT*CIT_GPS", 300));
        EXPECT_EQ("", adb.cmd("AT+CSDF?", 300)) << "nothing else is served while the daemon waits";
        int status = -1;
        d.sim({"stop", "cit"}, &status);
        ASSERT_EQ(0, status);
        // The application went away without answering: no pass, then the
        // queued line is served.
        EXPECT_EQ(visible("\r\nERROR\r\n" + std::string(kCsdfAnswer)), visible(adb.quiet(500)));
        d.sim({"start", "cit"}, &status);
        ASSERT_EQ(0, status);
        std::string closed = adb.cmd("AT*CIT_KEY");
        EXPECT_NE(std::string::npos, closed.find("\r\n")) << "an answer, whatever the verdict: " << visible(closed);
        EXPECT_EQ(visible(kCsdfAnswer), visible(adb.cmd("AT+CSDF?")));
    }
    std::string journal = d.readFile("/journal/cit.log");
    EXPECT_EQ(3, countOf(journal, "GPS")) << journal;
    EXPECT_EQ(3, countOf(journal, "KEY")) << journal;
    expectServing(d, fds, "after the CIT application faults");
}

}  // namespace

// An audio answer longer than the daemon reads at once: the host gets its head,
// and the tail must not pass for the answers to the commands after it.
// The audio service restarted while the daemon kept its link: the first command
// afterwards finds the link ended, connects again and is answered.
TEST(FaultPeersAudio, FirstCommandAfterARestartIsAnswered) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    HostLink adb(d, true);
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AUD+BIN")));
    for (const char *step : {"stop", "start"}) {
        int status = -1;
        d.sim({step, "audio"}, &status);
        ASSERT_EQ(0, status) << step;
    }
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AUD+BIN")));
    EXPECT_EQ(2, countOf(d.readFile("/journal/audio.log"), "AUD+BIN\\x00\n"));
}

TEST(FaultPeersAudio, OverlongAnswerDoesNotShiftLaterAnswers) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/audio/script", "AUD+TXT => (long 100000) X\nAUD+VOL => (long 7000) V\n");
    HostLink adb(d, true);
    std::string head = adb.cmd("AUD+TXT", 500);
    ASSERT_GT(head.size(), 2u);
    EXPECT_EQ("\r\nX", head.substr(0, 3));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AUD+BIN")));
    EXPECT_EQ("\r\nV", adb.cmd("AUD+VOL", 500).substr(0, 3));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("AUD+BIN")));
    EXPECT_EQ(visible("\r\nOK\r\n"), visible(adb.cmd("MM+LOOP=1")));
}
