// Peers that die under traffic, restart or answer too much: the host gets an
// answer or a defined failure, the daemon keeps serving, keeps its descriptor
// count, and every command reaches the peer exactly once. (Peers silent,
// hanging up or stopped while the daemon waits: transcripts/peer_faults.tx.)

#include <atomic>
#include <map>
#include <thread>

#include "fault_checks.h"

const std::string kCsq = "\r\n+CSQ: 20,99\r\n\r\nOK\r\n";
const std::string kNoModem = "\r\nERROR:No Modem\r\n";
const std::string kOk = "\r\nOK\r\n";
// How long a command that may rightly stay unanswered is given.
const int kSilence = 1000;

// The radio service is stopped and started by another thread while the host
// keeps sending: each command ends in its answer or "ERROR:No Modem"; only a
// command in flight at the moment of a kill may go unanswered, at most one per
// kill. Then the other peers hang up, or stop while the daemon waits on them,
// and restart: their links are made again and none is left behind.
TEST(FaultPeers, RadioServiceFlappingUnderTraffic) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/generic/script", "AT+MODEL => (close)\nAT+POWERKEY => (none)\n");
    d.writeFile("/sim/audio/script", "MM+LOOP=1 => (close)\nAUD+TXT => (none)\n");
    d.writeFile("/sim/cit/script", "KEY => (close)\nGPS => (none)\n");
    const char *const everyPeer[] = {"AT+CSQ", "AT%OSVER", "AUD+BIN", "AT+EAPS=0", "AT*CIT_SN"};
    for (const char *line : everyPeer) EXPECT_NE("", d.at(line, true)) << line;
    int fds = baselineFds(d);

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
    std::map<std::string, int> seen;  // answers and how often each came
    for (int commands = 0; !done && commands < 400; commands++) seen[d.at("AT+CSQ", true, kSilence)]++;
    flapper.join();
    for (const auto &a : seen)
        EXPECT_TRUE(a.first == kCsq || a.first == kNoModem || a.first.empty()) << visible(a.first);
    int answered = seen[kCsq], silent = seen[""];
    EXPECT_GT(answered, 0);
    EXPECT_LE(silent, kKills);
    // The restarted service serves the next command, and no stray answer is left.
    EXPECT_EQ(visible(kCsq), visible(d.at("AT+CSQ", true)));
    EXPECT_EQ(answered + 1 + 1, countOf(d.readFile("/journal/radio.slot1.log"), "-1\tAT+CSQ\\x00\n") - silent)
        << answered << " answered, " << silent << " silent";

    for (const char *hangUp : {"AT+MODEL", "MM+LOOP=1", "AT*CIT_KEY"}) d.at(hangUp, true, kSilence);
    const char *const held[][2] = {{"AT+POWERKEY", "generic"}, {"AUD+TXT", "audio"}, {"AT*CIT_GPS", "cit"}};
    for (const auto &h : held) {  // the peer stopped while the daemon waits on it
        d.at(h[0], true, kSilence);
        simOk(d, {"stop", h[1]});
        simOk(d, {"start", h[1]});
    }
    for (const char *line : everyPeer) EXPECT_NE("", d.at(line, true)) << line;
    expectServing(d, fds, "after the peers' faults");
}

// The audio service restarted while the daemon kept its link: the first command
// afterwards finds the link ended, connects again and is answered.
TEST(FaultPeersAudio, FirstCommandAfterARestartIsAnswered) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    EXPECT_EQ(visible(kOk), visible(d.at("AUD+BIN", true)));
    simOk(d, {"stop", "audio"});
    simOk(d, {"start", "audio"});
    EXPECT_EQ(visible(kOk), visible(d.at("AUD+BIN", true)));
    EXPECT_EQ("8 AUD+BIN\\x00\n8 AUD+BIN\\x00\n", d.readFile("/journal/audio.log"));
}

// An audio answer longer than the daemon reads at once: the host gets its head,
// and the tail must not pass for the answers to the commands after it.
TEST(FaultPeersAudio, OverlongAnswerDoesNotShiftLaterAnswers) {
    SimDevice d;
    ASSERT_TRUE(d.started()) << d.upOutput();
    d.writeFile("/sim/audio/script", "AUD+TXT => (long 100000) X\nAUD+VOL => (long 7000) V\n");
    EXPECT_EQ("\r\nX", d.at("AUD+TXT", true).substr(0, 3));
    EXPECT_EQ(visible(kOk), visible(d.at("AUD+BIN", true)));
    // A text answer: the pieces after the first are framed like it, the last one too.
    const std::string vol = d.at("AUD+VOL", true);
    EXPECT_EQ("\r\nV", vol.substr(0, 3));
    EXPECT_EQ("\r\n", vol.substr(vol.size() - 2));
    EXPECT_EQ(visible(kOk + kOk), visible(d.at(std::vector<std::string>{"AUD+BIN", "MM+LOOP=1"}, true)));
}
