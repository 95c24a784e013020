// The target links: relaying target answers to the host, the synchronous reader
// loops, the audio links, and matching modem answers to customer MMI commands,
// driven through the modem link reader the way the main loop drives it.
#include <fcntl.h>
#include <sys/resource.h>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "dispatch/dispatcher.h"
#include "host_capture.h"

using TargetLinks = LinkTest;

TEST_F(TargetLinks, AnswersAreRelayedAsReceivedAndFinalResultsEndSmsInput) {
    int peer = link(&s_fdService_command);
    const struct {
        std::string answer;
        bool endsSmsInput;
    } cases[] = {
        {"\r\nOK\r\n", true}, {"OK\r\n", true},          {"+CMGS: 12\r\n\r\nOK", true},
        {"ERROR", true},      {"\r\n+CMS ERROR: 500\r\n", true}, {"\r\n+CNMA: 0", true},
        {"\r\n> ", false},    {"\r\n+CPIN: READY\r\n", false},   {"ok", false},
        {"+CMGS 12", false},  {"\n\rOK", false},
    };
    for (const auto &c : cases) {
        isMsgCmdInput = isATCmdInject = true;
        writeAll(peer, c.answer);
        readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
        EXPECT_EQ(!c.endsSmsInput, isMsgCmdInput) << c.answer;
        EXPECT_FALSE(isATCmdInject) << c.answer;
        EXPECT_NE("", host.drain(100)) << c.answer;
    }
    EXPECT_FALSE(isFinalResult("\r\nOK", 3)) << "a final result lies within the bytes received";
    EXPECT_GE(s_fdService_command, 0);
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
    s_fdAudio_command = pipeFds[0];  // recv on a pipe fails with ENOTSOCK
    isATCmdInject = true;
    readDataFromTarget(AUDIO_TYPE, &s_fdAudio_command);
    EXPECT_EQ(-1, fcntl(pipeFds[0], F_GETFD));
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_TRUE(isATCmdInject);
    EXPECT_EQ("", host.drain(100));
}

TEST_F(TargetLinks, ReadWithResultHonoursTheCallersSize) {
    int peer = link(&s_fdService_command);
    writeAll(peer, "0123456789");
    char buf[8], two[2], rest[DATA_BUF_SIZE];
    memset(buf, 'x', sizeof(buf));
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, buf, sizeof(buf));
    EXPECT_STREQ("0123456", buf);
    EXPECT_EQ("\r\n0123456\r\n", host.drain());
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, two, sizeof(two));
    EXPECT_STREQ("7", two);
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, rest, sizeof(rest));
    EXPECT_STREQ("89", rest);
    host.drain(100);

    // Shutdown: the link is closed and the outstanding-command flag left alone.
    isATCmdInject = true;
    closeFd(peers.back());  // the peer goes away
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, rest, sizeof(rest));
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_TRUE(isATCmdInject);
    EXPECT_EQ("", host.drain(100));
}

TEST_F(TargetLinks, DescriptorsBeyondSelectsRangeCountAsFailedWaits) {
    rlimit lim{};
    ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &lim));
    if (lim.rlim_cur <= FD_SETSIZE + 8) GTEST_SKIP() << "descriptor limit too low";
    int peer = link(&s_fdService_command);
    int high = dup2(s_fdService_command, FD_SETSIZE + 5);
    ASSERT_EQ(FD_SETSIZE + 5, high);
    close(s_fdService_command);
    s_fdService_command = high;
    writeAll(peer, "OK");
    // Neither loop may put the descriptor into an fd_set.
    EXPECT_EQ(-1, serviceReaderLoopWithResult("x"));
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_EQ(-1, fcntl(high, F_GETFD));
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
    // One modem answer arriving on the modem link and read by the main loop.
    void modemAnswer(const std::string &text) {
        writeAll(modem_, text);
        readDataFromTarget(RIL_TYPE, &s_fdRild_command);
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
    // Unsolicited lines and answers in pieces count as answers and push the count
    // below zero; a command queued afterwards must still get its own answer.
    ordinaryCommand();
    modemAnswer("\r\n+CSQ: 20,99\r\n");
    modemAnswer("\r\nOK\r\n");
    modemAnswer("\r\n+CREG: 1\r\n");
    EXPECT_EQ(-2, gMmiCmdSeq.idx);
    EXPECT_EQ(-1, s_fdService_command) << "nothing went to the MMI client";

    mmiCommand("AT+CUSD=+ORVTOLKJ");
    EXPECT_GE(gMmiCmdSeq.seq[0], 1);
    modemAnswer(std::string("USSD\0tail", 9));  // the text ends at its first NUL
    EXPECT_EQ("AT+CUSD=+ORVTOLKJUSSD;", mmiClient());
    EXPECT_EQ(-1, gMmiCmdSeq.seq[0]);

    // Surplus again, then an ordinary command before the MMI one: the MMI answer is
    // the second one, not the first.
    modemAnswer("\r\nRING\r\n");
    modemAnswer("\r\nRING\r\n");
    ordinaryCommand();
    mmiCommand("AT+CLIP?+ORVTOLKJ");
    modemAnswer("OK");
    EXPECT_EQ("", mmiClient());
    modemAnswer("+CLIP: 1,1");
    EXPECT_EQ("AT+CLIP?+ORVTOLKJ+CLIP: 1,1;", mmiClient());
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
        modemAnswer("R" + std::to_string(i));
        expected += "CMD" + std::to_string(i) + "R" + std::to_string(i) + ";";
    }
    modemAnswer("R10");  // the unqueued command's answer goes to the host only
    EXPECT_EQ(expected, mmiClient());

    // The indexes wrapped around; the queue works on.
    mmiCommand("AGAIN");
    modemAnswer("X");
    EXPECT_EQ("AGAINX;", mmiClient());
}
