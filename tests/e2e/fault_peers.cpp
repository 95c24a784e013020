// Peers that die, restart, stay silent or hang up early. Whatever they do, the
// host gets an answer or a defined failure, the daemon keeps serving, keeps its
// descriptor count, and every command reaches the peer exactly once.
#include <unistd.h>

#include <atomic>
#include <thread>

#include <gtest/gtest.h>

#include "fault_checks.h"

using namespace fault_checks;

namespace {

const std::string kCsq = "\r\n+CSQ: 20,99\r\n\r\nOK\r\n";
const std::string kNoModem = "\r\nERROR:No Modem\r\n";
const std::string kOk = "\r\nOK\r\n";

void peer(SimDevice &d, const char *step, const char *name) {
    int status = -1;
    d.sim({step, name}, &status);
    ASSERT_EQ(0, status) << step << " " << name;
}

// The service is stopped and started by another thread while the host keeps
// sending: each command ends in its answer or "ERROR:No Modem"; only a command in
// flight at the moment of a kill may go unanswered, at most one per kill.
TEST(FaultPeers, RadioServiceFlappingUnderTraffic) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible(kCsq), visible(d.at("AT+CSQ", true)));
    int fds = baselineFds(d);
    HostLink adb(d, true);

    const int kKills = 5;
    std::atomic<bool> done(false);
    std::thread flapper([&] {
        for (int i = 0; i < kKills; i++) {
            usleep(150 * 1000);  // traffic between the faults, not a wait
            d.sim({"stop", "radio"});
            usleep(150 * 1000);
            d.sim({"start", "radio"});
        }
        done = true;
    });
    int answered = 0, refused = 0, silent = 0, commands = 0;
    while (!done && commands < 400) {
        commands++;
        std::string got = adb.ask("AT+CSQ", 2000);
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
    EXPECT_EQ(visible(kCsq), visible(adb.ask("AT+CSQ")));
    EXPECT_EQ(answered + 1 + 1, countOf(d.readFile("/journal/radio.slot1.log"), "-1\tAT+CSQ\\x00\n") - silent)
        << answered << " answered, " << refused << " refused, " << silent << " silent";
    expectServing(d, fds, "after flapping");
}

// A silent answer to an ordinary command holds nothing up; a service that hangs
// up instead of answering is reconnected for the next one. The power key waits
// for its answer (by design, without a limit), lines sent meanwhile wait too and
// are served once the service is gone; closing early on it returns at once.
TEST(FaultPeers, GenericServiceSilentClosingAndKilled) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/generic/script", "AT+SN => (none)\nAT+MODEL => (close)\nAT+POWERKEY => (none)\n");
    EXPECT_EQ(visible(kOk), visible(d.at("AT%OSVER", true)));
    int fds = baselineFds(d);
    HostLink adb(d, true);

    EXPECT_EQ("", adb.silent("AT+SN"));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    EXPECT_EQ("", adb.silent("AT+MODEL"));
    EXPECT_EQ(visible(kOk), visible(adb.ask("AT%OSVER")));

    EXPECT_EQ("", adb.silent("AT+POWERKEY"));
    EXPECT_EQ("", adb.silent("AT+CSDF?")) << "the daemon waits for the power key";
    peer(d, "stop", "generic");
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.answer()));
    peer(d, "start", "generic");
    EXPECT_EQ(visible(kOk), visible(adb.ask("AT%OSVER")));

    d.writeFile("/sim/generic/script", "AT+POWERKEY => (close)\n");
    EXPECT_EQ("", adb.silent("AT+POWERKEY"));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    EXPECT_EQ(visible(kOk), visible(adb.ask("AT%OSVER")));

    EXPECT_EQ("AT%OSVER\nAT+SN\nAT+MODEL\nAT%OSVER\nAT+POWERKEY\nAT%OSVER\nAT+POWERKEY\nAT%OSVER\n",
              d.readFile("/journal/generic.log"));
    expectServing(d, fds, "after the generic service faults");
}

// A silent audio service holds the daemon until it goes away; one that hangs up
// early gives the host nothing, and the next command reconnects.
TEST(FaultPeers, AudioServiceSilentClosingAndKilled) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible(kOk), visible(d.at("AT+EAPS=0", true)));
    EXPECT_EQ(visible(kOk), visible(d.at("AUD+TXT", true)));
    int fds = baselineFds(d);
    d.writeFile("/sim/audio/script", "AUD+TXT => (none)\nMM+LOOP=1 => (close)\n");
    HostLink adb(d, true);

    EXPECT_EQ("", adb.silent("AUD+TXT"));
    EXPECT_EQ("", adb.silent("AT+CSDF?"));
    peer(d, "stop", "audio");
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.answer()));
    peer(d, "start", "audio");
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    EXPECT_EQ("", adb.silent("MM+LOOP=1"));
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    EXPECT_EQ("8 AUD+TXT\\x00\n8 AUD+TXT\\x00\n8 AUD+BIN\\x00\n10 MM+LOOP=1\\x00\n8 AUD+BIN\\x00\n",
              d.readFile("/journal/audio.log"));
    expectServing(d, fds, "after the audio service faults");
}

// The application went away without answering: no pass, then the queued line
// is served. One that hangs up instead of answering is no pass either.
TEST(FaultPeers, CitApplicationSilentClosingAndKilled) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/cit/script", "GPS => (none)\nKEY => (close)\n");
    EXPECT_NE("", d.at("AT*CIT_SN", true));
    int fds = baselineFds(d);
    HostLink adb(d, true);

    EXPECT_EQ("", adb.silent("AT*CIT_GPS"));
    EXPECT_EQ("", adb.silent("AT+CSDF?")) << "nothing else is served while the daemon waits";
    peer(d, "stop", "cit");
    EXPECT_EQ(visible("\r\nERROR\r\n" + std::string(kCsdfAnswer)), visible(adb.answer()));
    peer(d, "start", "cit");
    EXPECT_EQ(visible("\r\nERROR\r\n"), visible(adb.ask("AT*CIT_KEY"))) << "no answer is no pass";
    EXPECT_EQ(visible(kCsdfAnswer), visible(adb.ask("AT+CSDF?")));
    EXPECT_EQ("sn\nGPS\nKEY\n", d.readFile("/journal/cit.log"));
    expectServing(d, fds, "after the CIT application faults");
}

// The audio service restarted while the daemon kept its link: the first command
// afterwards finds the link ended, connects again and is answered.
TEST(FaultPeersAudio, FirstCommandAfterARestartIsAnswered) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    HostLink adb(d, true);
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    peer(d, "stop", "audio");
    peer(d, "start", "audio");
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    EXPECT_EQ("8 AUD+BIN\\x00\n8 AUD+BIN\\x00\n", d.readFile("/journal/audio.log"));
}

// An audio answer longer than the daemon reads at once: the host gets its head,
// and the tail must not pass for the answers to the commands after it.
TEST(FaultPeersAudio, OverlongAnswerDoesNotShiftLaterAnswers) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/audio/script", "AUD+TXT => (long 100000) X\nAUD+VOL => (long 7000) V\n");
    HostLink adb(d, true);
    EXPECT_EQ("\r\nX", adb.silent("AUD+TXT", 300).substr(0, 3));
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    EXPECT_EQ("\r\nV", adb.silent("AUD+VOL", 300).substr(0, 3));
    EXPECT_EQ(visible(kOk), visible(adb.ask("AUD+BIN")));
    EXPECT_EQ(visible(kOk), visible(adb.ask("MM+LOOP=1")));
}

}  // namespace
