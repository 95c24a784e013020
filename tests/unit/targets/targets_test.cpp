// The target links: relaying target answers to the host, the synchronous reader
// loops, the audio links, and matching modem answers to customer MMI commands,
// driven through the modem link reader the way the main loop drives it. Answers
// reach the daemon cut and coalesced in every way a stream allows, and must reach
// the host as if each had come whole and alone.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/resource.h>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "dispatch/dispatcher.h"
#include "eventually.h"
#include "hal/tolkd_adaptation.h"
#include "host_capture.h"
#include "targets/generic_link.h"
#include "targets/modem_link.h"

namespace {

// One record as the radio HAL bridge writes it into its end of the modem pair.
std::string record(int kind, const std::string &data, int slot = 0) {
    ModemRecordHeader h = {};
    h.kind = static_cast<uint8_t>(kind);
    h.slot = static_cast<uint8_t>(slot);
    h.length = static_cast<uint32_t>(data.size());
    return std::string(reinterpret_cast<const char *>(&h), sizeof(h)) + data;
}

// The host end of a second host link in the adb slot, accepted as connection id.
int adbHost(int *daemonEnd) {
    int host = socketLink(daemonEnd);
    gAdbConnection++;
    return host;
}

}  // namespace

class TargetLinks : public LinkTest {
protected:
    void TearDown() override {
        closeFd(gSerialDevice.fd[DEVICE_ADB]);
        LinkTest::TearDown();
    }
};

// A long answer, NUL-terminated text, an indication between answers: whatever
// the pair's reads bring together or cut apart, the host gets each record framed
// once, exactly as if it had come whole and alone.
TEST_F(TargetLinks, ModemRecordsAreRelayedWholeHoweverThePairCutsThem) {
    // 7000 bytes: the buffer limit falls inside a CR LF of the listing.
    std::string listing = "\r\n";
    while (listing.size() < 7000) listing += "+CMGL: 1,0,,26\r\n07911326040000F0040B911346610089F60000\r\n";
    listing += "\r\nOK\r\n";
    const std::string stream = record(MODEM_RECORD_ANSWER, std::string("\r\n+CSQ: 20,99\r\n\r\nOK\r\n\0", 23)) +
                               record(MODEM_RECORD_INDICATION, std::string("\r\nRING\r\n\0", 9)) +
                               record(MODEM_RECORD_ANSWER, listing) + record(MODEM_RECORD_ANSWER, "OK") +
                               // An answer the modem handed over in two callbacks is one.
                               record(MODEM_RECORD_ANSWER, "\r\n+CGATT: 1\r\n") + record(MODEM_RECORD_ANSWER, "\r\nOK\r\n");
    const std::string expected =
        "\r\n+CSQ: 20,99\r\n\r\nOK\r\n\r\nRING\r\n" + listing + "\r\nOK\r\n\r\n+CGATT: 1\r\n\r\nOK\r\n";
    for (size_t cut : {stream.size(), size_t(1), size_t(5), size_t(6143), size_t(6145)}) {
        int bridge = link(&s_fdRild_command);
        modemLinkReset();
        for (size_t at = 0; at < stream.size(); at += cut) {
            writeAll(bridge, stream.substr(at, cut));
            // As the main loop does: serve while select finds the pair readable.
            for (int waiting = 1; ioctl(s_fdRild_command, FIONREAD, &waiting) == 0 && waiting > 0;) serveModemLink();
        }
        EXPECT_EQ(expected, host.drain()) << "pieces of " << cut;
        closeFd(s_fdRild_command);
    }
    // An answer without a final result line is whole once its slot has been quiet.
    writeAll(link(&s_fdRild_command), record(MODEM_RECORD_ANSWER, "\r\n+FOO: 1\r\n"));
    serveModemLink();
    EXPECT_EQ("\r\n+FOO: 1\r\n", host.drain());
    ASSERT_TRUE(eventually([] { return modemLinkQuietMs() == 0; }));
    modemLinkQuiet();
    EXPECT_EQ(-1, modemLinkQuietMs());
}

// The text phase ends with the last line of an answer that is a final result,
// whatever came before it.
TEST_F(TargetLinks, AnswersAreJudgedByTheirLastLine) {
    const struct {
        std::string answer;
        bool final;
    } cases[] = {
        {"\r\nOK\r\n", true},        {"OK", true},
        {"\r\n+CREG: 1\r\n\r\n+CMS ERROR: 330\r\n", true},
        {"\r\n+CME ERROR: 10\r\n", true}, {"+CMGS: 12", true},
        {"\r\nNO CARRIER\r\n", true}, {std::string("\r\nERROR\r\n\0\r\n> ", 14), true},
        {"\r\n> ", false},              {"\r\n+CPIN: READY\r\n", false},
        {"\r\nOK\r\n\r\n+CREG: 1\r\n", false}, {"ok", false}, {"OKAY", false},
    };
    for (const auto &c : cases) EXPECT_EQ(c.final, endsWithFinalResult(c.answer.data(), (int)c.answer.size())) << c.answer;
    // Where the first complete answer of a generic service read ends.
    auto end = [](const std::string &read) { return finalResultEnd(read.data(), (int)read.size()); };
    EXPECT_EQ(6, end("\r\nOK\r\nOK\r\n"));
    EXPECT_EQ(0, end("\r\n+SN: OK\r\n\r\nOK")) << "the final line has not ended yet";
    EXPECT_EQ(26, end("\r\n+X: 1\r\n\r\n+CME ERROR: 3\r\nOK\r\n"));
}

// The generic service link has no framing: a read brings several answers or part
// of one. Each answer goes to the link whose command it answers, and one without
// a final result line still goes out once its link is quiet.
TEST_F(TargetLinks, GenericAnswersAreCutApartPutTogetherAndGoWhereTheirCommandCameFrom) {
    int service = link(&s_fdService_command);
    int adb = adbHost(&gSerialDevice.fd[DEVICE_ADB]);
    peers.push_back(adb);
    HostLink viaAdb = {DEVICE_ADB, gAdbConnection}, viaSerial = {DEVICE_SERIAL, 0};
    gSerialDevice.currDevice = DEVICE_ADB;  // the link of the last line
    genericCommandSent(&viaSerial);
    genericCommandSent(&viaAdb);
    genericCommandSent(&viaSerial);

    writeAll(service, "\r\n+SN: 1\r\n\r\nOK\r\n\r\nER");
    serveGenericLink();
    EXPECT_EQ("\r\n+SN: 1\r\n\r\nOK\r\n", host.drain());
    EXPECT_EQ("", drainFd(adb, 0, 0)) << "half an answer waits for its rest";
    writeAll(service, "ROR\r\n\r\n+MOD");
    serveGenericLink();
    EXPECT_EQ("\r\nERROR\r\n", drainFd(adb));
    // No final result line: once the link is quiet what came goes out; a line cut
    // short waits for its rest, an answer of complete lines is whole.
    EXPECT_GE(genericLinkQuietMs(), 0) << "an answer is still incomplete";
    genericLinkQuiet();
    writeAll(service, "EL: X\r\n");
    serveGenericLink();
    genericLinkQuiet();
    EXPECT_EQ("\r\n+MODEL: X\r\n", host.drain());

    // Nothing outstanding: output goes to the current link. A connection that has
    // gone gets nothing, not even through the one that took its place.
    genericCommandSent(&viaAdb);
    closeFd(gSerialDevice.fd[DEVICE_ADB]);
    int adb2 = adbHost(&gSerialDevice.fd[DEVICE_ADB]);
    peers.push_back(adb2);
    writeAll(service, "\r\nOK\r\n\r\n+EVENT: 1\r\n\r\nOK\r\n");
    serveGenericLink();
    EXPECT_EQ("\r\n+EVENT: 1\r\n\r\nOK\r\n", drainFd(adb2)) << "the current link";
    EXPECT_EQ("", host.take());
    EXPECT_EQ(-1, genericLinkQuietMs());
}

// A synchronous exchange (AT+POWERKEY, AT^WIENABLE) judges only the answer that
// arrives after its command went out: an earlier command's answer waiting on the
// link goes to that command's link first.
TEST_F(TargetLinks, SynchronousExchangeJudgesOnlyItsOwnAnswer) {
    // Each write arrives as a read of its own, as the link may cut an answer.
    peers.push_back(socketLink(&s_fdService_command, SOCK_SEQPACKET));
    int service = peers.back();
    int adb = adbHost(&gSerialDevice.fd[DEVICE_ADB]);
    peers.push_back(adb);
    HostLink viaAdb = {DEVICE_ADB, gAdbConnection};
    genericCommandSent(&viaAdb);                      // a slow AT+SN from adb ...
    writeAll(service, "\r\n+SN: TS1\r\n\r\nOK\r\n");  // ... whose answer is waiting
    ASSERT_EQ(0, sendDataToGenericService("AT+WITOF=2"));  // AT^WIENABLE=1 from serial
    EXPECT_EQ("AT+WITOF=2", drainFd(service));
    writeAll(service, "\r\nERROR\r\n");
    char answer[DATA_BUF_SIZE];
    EXPECT_EQ(9, genericLinkAwaitAnswer(answer, sizeof(answer), true));
    EXPECT_STREQ("\r\nERROR\r\n", answer);
    EXPECT_EQ("\r\n+SN: TS1\r\n\r\nOK\r\n", drainFd(adb));
    EXPECT_EQ("\r\nERROR\r\n", host.drain());

    // An answer without a final result line ends when the link goes quiet.
    ASSERT_EQ(0, sendDataToGenericService("AT+WITOF=1"));
    writeAll(service, "\r\n+WITOF: busy\r\n");
    EXPECT_GT(genericLinkAwaitAnswer(answer, sizeof(answer), false), 0);
    EXPECT_STREQ("\r\n+WITOF: busy\r\n", answer);
    EXPECT_EQ("", host.drain(100)) << "kept from the host when the caller judges it";

    // An answer still owed to an earlier command comes first and goes to its own
    // link, even when it arrives after the waiting command went out, and longer
    // than a buffer; the waiting command's own, cut in two, is put together.
    const std::string listing = "\r\n+CMGL: " + std::string(6500, 'L') + "\r\n\r\nOK\r\n";
    genericCommandSent(&viaAdb);
    ASSERT_EQ(0, sendDataToGenericService("AT+POWERKEY"));
    for (size_t at : {size_t(0), size_t(4000), size_t(MAX_DATA_LEN)})  // as a buffer takes it
        writeAll(service, listing.substr(at, at == 0 ? 4000 : at == 4000 ? MAX_DATA_LEN - 4000 : std::string::npos));
    writeAll(service, "\r\n+POWERKEY: 1\r\n\r\nO");
    writeAll(service, "K\r\n");
    serviceReaderLoop();
    EXPECT_EQ(listing, drainFd(adb));
    EXPECT_EQ("\r\n+POWERKEY: 1\r\n\r\nOK\r\n", host.drain());

    // A send into a link whose service has gone fails and closes the link.
    closeFd(peers.front());
    EXPECT_EQ(-1, sendDataToGenericService("AT+SN"));
    EXPECT_EQ(-1, s_fdService_command);
}

// That the next shutdown, with no command outstanding, says nothing: generic.tx.
TEST_F(TargetLinks, PeerShutdownReportsUeNotReadyOnceWhileAModemCommandIsOutstanding) {
    link(&s_fdService_command);
    isATCmdInject = true;
    closeFd(peers.back());  // the peer goes away
    readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_FALSE(isATCmdInject);
    EXPECT_EQ("\r\nERROR:UE is not ready\r\n", host.drain());

    // A failed receive closes the link silently, whatever is outstanding.
    int pipeFds[2];
    ASSERT_EQ(0, pipe(pipeFds));
    peers.push_back(pipeFds[1]);
    s_fdAudio_command = pipeFds[0];  // readable, but recv on a pipe fails with ENOTSOCK
    writeAll(pipeFds[1], "x");
    isATCmdInject = true;
    readDataFromTarget(AUDIO_TYPE, &s_fdAudio_command);
    EXPECT_EQ(-1, fcntl(pipeFds[0], F_GETFD));
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_TRUE(isATCmdInject);
    EXPECT_EQ("", host.drain(100));
}

TEST_F(TargetLinks, DescriptorsBeyondSelectsRangeCountAsFailedWaits) {
    rlimit lim{};
    ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &lim));
    if (lim.rlim_cur <= FD_SETSIZE + 8) GTEST_SKIP() << "descriptor limit too low";
    int peer = link(&s_fdAudio_command);
    writeAll(peer, "OK");
    // The audio wait may not put the descriptor into an fd_set.
    closeFd(s_fdAudio_command);
    s_fdAudio_command = dup2(peer, FD_SETSIZE + 6);
    audioReaderLoop(AUDIO_TYPE);
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_EQ("", host.drain(100));
}

TEST_F(TargetLinks, AudioExchangesStayOnTheirTypesAndRelayWholeAnswers) {
    int audio = link(&s_fdAudio_command);
    // Outside the audio types nothing is sent and nothing is waited for.
    sendDataToAudio("nope", 4, GENERIC_TYPE);
    EXPECT_EQ("", drainFd(audio, 50));
    writeAll(audio, "pending");
    audioReaderLoop(GENERIC_TYPE);
    audioReaderLoop(RIL_TYPE);
    EXPECT_EQ("", host.drain(50));
    drainFd(s_fdAudio_command, 50);

    // A device-maker answer longer than one read reaches the host whole, not just
    // its first piece (an audio one: audio.tx, AUD+LONG).
    std::string big(10000, '\x5a');
    writeAll(audio, big);
    audioReaderLoop(BELVO_AUDIO_TYPE);
    EXPECT_EQ(big, host.drain());

    // The link cuts a text answer: it is framed once, as a whole. Bytes that come
    // after its piece wait are its rest and follow it, before the next command.
    closeFd(s_fdAudio_command);
    peers.push_back(socketLink(&s_fdAudio_command, SOCK_SEQPACKET));
    audio = peers.back();
    writeAll(audio, "\r\nvol");
    writeAll(audio, "ume 3\r\n\r\nOK\r\n");
    audioReaderLoop(AUDIO_TYPE);
    EXPECT_EQ("\r\nvolume 3\r\n\r\nOK\r\n", host.drain());
    writeAll(audio, "AUD\x01");
    audioReaderLoop(AUDIO_TYPE);
    writeAll(audio, std::string("\0\x02", 2));
    sendDataToAudio("AUD+X", 5, AUDIO_TYPE);
    EXPECT_EQ(std::string("AUD\x01\0\x02", 6), host.drain());
    EXPECT_EQ("AUD+X", drainFd(audio));

    // A missing link is reported and skipped.
    sendDataToAudio("x", 1, AUDIO_EXT_TYPE);
    audioReaderLoop(AUDIO_EXT_TYPE);
    EXPECT_EQ(-1, s_fdAudioExt_command);
}

// Modem answers counted against the queue of customer MMI commands; the matched
// answer goes, after its command's text, to the MMI client on the generic
// service link, which is connected on demand.
class MmiQueue : public LinkTest {
protected:
    void SetUp() override {
        LinkTest::SetUp();
        modem_ = link(&s_fdRild_command);
        service_ = tolk_local_server(TOLK_SERVICE_SOCKET, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 4);
        ASSERT_GE(service_, 0);
        peers.push_back(service_);
    }
    void ordinaryCommand() { mmiCmdSeqEnQueue(); }
    // What the dispatcher does for a customer MMI command, then the routing's enqueue.
    void mmiCommand(const char *text) {
        snprintf(gMmiCmdSeq.cmd[gMmiCmdSeq.EIdx], MMI_CMD_TEXT_SIZE, "%s", text);
        gMmiCmdSeq.EIdx = (gMmiCmdSeq.EIdx + 1) % MMI_QUEUE_SIZE;
        gMmiCmdSeq.cusMmiCmdPending = 1;
        mmiCmdSeqEnQueue();
    }
    // One modem answer, or unsolicited output, arriving on the modem link and read
    // by the main loop.
    void modemAnswer(const std::string &text, int kind = MODEM_RECORD_ANSWER) {
        writeAll(modem_, record(kind, text));
        serveModemLink();
    }
    // What the MMI client received on the generic service link so far.
    std::string mmiClient() {
        if (client_ < 0 && s_fdService_command >= 0) {
            peers.push_back(client_ = accept(service_, nullptr, nullptr));
        }
        return client_ < 0 ? std::string() : drainFd(client_, 200);
    }

    int modem_ = -1, service_ = -1, client_ = -1;
};

TEST_F(MmiQueue, SurplusModemOutputDoesNotStrandLaterCommands) {
    // Unsolicited output answers nothing, and an answer the modem hands over in
    // two pieces is one answer. A surplus answer pushes the count below zero; a
    // command queued afterwards must still get its own answer.
    ordinaryCommand();
    modemAnswer("\r\n+CREG: 1\r\n", MODEM_RECORD_INDICATION);
    EXPECT_EQ(1, gMmiCmdSeq.idx);
    modemAnswer("\r\n+CSQ: 20,99\r\n");
    modemAnswer("\r\nOK\r\n");
    EXPECT_EQ(0, gMmiCmdSeq.idx);
    modemAnswer("\r\nOK\r\n");
    EXPECT_EQ(-1, gMmiCmdSeq.idx);
    EXPECT_EQ(-1, s_fdService_command) << "nothing went to the MMI client";

    mmiCommand("AT+CUSD=+ORVTOLKJ");
    EXPECT_GE(gMmiCmdSeq.seq[0], 1);
    modemAnswer(std::string("USSD\r\nOK\0tail", 13));  // the text ends at its first NUL
    EXPECT_EQ("AT+CUSD=+ORVTOLKJUSSD\r\nOK;", mmiClient());
    EXPECT_EQ(-1, gMmiCmdSeq.seq[0]);

    // Surplus again, then an ordinary command before the MMI one: the MMI answer is
    // the second one, not the first.
    modemAnswer("\r\nOK\r\n");
    modemAnswer("\r\nRING\r\n", MODEM_RECORD_INDICATION);
    ordinaryCommand();
    mmiCommand("AT+CLIP?+ORVTOLKJ");
    modemAnswer("OK");
    EXPECT_EQ("", mmiClient());
    modemAnswer("+CLIP: 1,1\r\nOK");
    EXPECT_EQ("AT+CLIP?+ORVTOLKJ+CLIP: 1,1\r\nOK;", mmiClient());
}

TEST_F(MmiQueue, FullQueueStoresNothingAndKeepsTextsInStep) {
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) mmiCommand(("CMD" + std::to_string(i)).c_str());

    // The eleventh, through the dispatcher: with every entry taken it stores no text
    // and the enqueue no entry. Either would take the first command's place and
    // shift every answer below.
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT+CPIN=1"));
    EXPECT_EQ(1, gMmiCmdSeq.cusMmiCmdPending) << "flagged, so that the enqueue reports the full queue";
    mmiCmdSeqEnQueue();
    EXPECT_EQ(11, gMmiCmdSeq.idx);
    EXPECT_EQ(0, gMmiCmdSeq.cusMmiCmdPending);

    std::string expected;
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) {
        modemAnswer("R" + std::to_string(i) + "\r\nOK");
        expected += "CMD" + std::to_string(i) + "R" + std::to_string(i) + "\r\nOK;";
    }
    modemAnswer("R10\r\nOK");  // the unqueued command's answer goes to the host only
    EXPECT_EQ(expected, mmiClient());

    // The indexes wrapped around; the queue works on.
    mmiCommand("AGAIN");
    modemAnswer("ERROR");
    EXPECT_EQ("AGAINERROR;", mmiClient());
}
