// Relaying target answers to the host, the synchronous reader loops and the sends to
// the generic service and the audio links.
#include "targets_fixture.h"

#include <fcntl.h>
#include <sys/resource.h>

#include <cstring>

TEST_F(TargetLinks, AnswersAreRelayedAsReceivedAndFinalResultsEndSmsInput) {
    int peer = link(&s_fdService_command);
    const struct {
        std::string answer;
        bool endsSmsInput;
    } cases[] = {
        {"\r\nOK\r\n", true},
        {"+CMGS: 12\r\n\r\nOK", true},
        {"\r\n+CMS ERROR: 500\r\n", true},
        {"ERROR", true},
        {"\r\n> ", false},
        {"\r\n+CPIN: READY\r\n", false},
        {"ok", false},
        {"+CMGS 12", false},
        {"\n\rOK", false},
    };
    for (const auto &c : cases) {
        isMsgCmdInput = true;
        isATCmdInject = true;
        sendAll(peer, c.answer);
        readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
        EXPECT_EQ(!c.endsSmsInput, isMsgCmdInput) << c.answer;
        EXPECT_FALSE(isATCmdInject) << c.answer;
        EXPECT_NE("", hostOutput(100)) << c.answer;
    }
    sendAll(peer, "\r\n+CSQ: 20,99\r\n\r\nOK\r\n");
    readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
    EXPECT_EQ("\r\n+CSQ: 20,99\r\n\r\nOK\r\n", hostOutput());
    EXPECT_GE(s_fdService_command, 0);
}

TEST_F(TargetLinks, PeerShutdownReportsUeNotReadyOnceWhileAModemCommandIsOutstanding) {
    int peer = link(&s_fdService_command);
    isATCmdInject = true;
    close(peer);
    extra_.back() = -1;
    readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_FALSE(isATCmdInject);
    EXPECT_EQ("\r\nERROR:UE is not ready\r\n", hostOutput());

    // The next shutdown, with no command outstanding, says nothing.
    peer = link(&s_fdService_command);
    close(peer);
    extra_.back() = -1;
    readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_EQ("", hostOutput(100));

    // A failed receive closes the link silently, whatever is outstanding.
    int pipeFds[2];
    ASSERT_EQ(0, pipe(pipeFds));
    extra_.push_back(pipeFds[1]);
    s_fdAudio_command = pipeFds[0];  // recv on a pipe fails with ENOTSOCK
    isATCmdInject = true;
    readDataFromTarget(AUDIO_TYPE, &s_fdAudio_command);
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_EQ(-1, fcntl(pipeFds[0], F_GETFD));
    EXPECT_TRUE(isATCmdInject);
    EXPECT_EQ("", hostOutput(100));
}

TEST_F(TargetLinks, EachReceiveIsOneRelayOfAtMost6144Bytes) {
    int modem = link(&s_fdRild_command);
    std::string exact(MAX_DATA_LEN, 'a');
    sendAll(modem, exact);
    readDataFromTarget(RIL_TYPE, &s_fdRild_command);
    EXPECT_EQ("\r\n" + exact + "\r\n", hostOutput());
    EXPECT_EQ(-1, gMmiCmdSeq.idx);

    std::string longer = std::string(MAX_DATA_LEN, 'b') + std::string(856, 'c');
    sendAll(modem, longer);
    readDataFromTarget(RIL_TYPE, &s_fdRild_command);
    readDataFromTarget(RIL_TYPE, &s_fdRild_command);
    // Two pieces, two modem answers counted.
    EXPECT_EQ("\r\n" + std::string(MAX_DATA_LEN, 'b') + "\r\n\r\n" + std::string(856, 'c') + "\r\n", hostOutput());
    EXPECT_EQ(-3, gMmiCmdSeq.idx);
}

TEST_F(TargetLinks, ReadWithResultHonoursTheCallersSize) {
    int peer = link(&s_fdService_command);
    sendAll(peer, "0123456789");
    char buf[8];
    memset(buf, 'x', sizeof(buf));
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, buf, sizeof(buf));
    EXPECT_STREQ("0123456", buf);
    EXPECT_EQ("\r\n0123456\r\n", hostOutput());
    char rest[DATA_BUF_SIZE];
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, rest, sizeof(rest));
    EXPECT_STREQ("789", rest);
    hostOutput(100);

    // Shutdown: the link is closed and the outstanding-command flag left alone.
    isATCmdInject = true;
    close(peer);
    extra_.back() = -1;
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, rest, sizeof(rest));
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_TRUE(isATCmdInject);
    EXPECT_EQ("", hostOutput(100));
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
    sendAll(peer, "OK");
    // Neither loop may put the descriptor into an fd_set.
    EXPECT_EQ(-1, serviceReaderLoopWithResult("x"));
    EXPECT_EQ(-1, s_fdService_command);
    EXPECT_EQ(-1, fcntl(high, F_GETFD));

    s_fdAudio_command = dup2(peer, FD_SETSIZE + 6);
    audioReaderLoop(AUDIO_TYPE);
    EXPECT_EQ(-1, s_fdAudio_command);
    EXPECT_EQ("", hostOutput(100));
}

TEST_F(TargetLinks, AudioExchangesStayOnTheirTypesAndRelayWholeAnswers) {
    int audio = link(&s_fdAudio_command);
    // Outside the audio types nothing is sent and nothing is waited for.
    sendDataToAudio("nope", 4, GENERIC_TYPE);
    EXPECT_EQ("", drainFd(audio, 50));
    sendAll(audio, "pending");
    audioReaderLoop(GENERIC_TYPE);
    audioReaderLoop(RIL_TYPE);
    EXPECT_EQ("", hostOutput(50));
    drainFd(s_fdAudio_command, 50);

    // An answer longer than one read reaches the host whole, not just its first piece.
    std::string big(10000, '\x5a');
    big.replace(0, 3, "MM+");
    sendAll(audio, big);
    audioReaderLoop(BELVO_AUDIO_TYPE);
    EXPECT_EQ(big.size(), hostOutput().size());

    // A missing link is reported and skipped.
    sendDataToAudio("x", 1, AUDIO_EXT_TYPE);
    audioReaderLoop(AUDIO_EXT_TYPE);
    EXPECT_EQ(-1, s_fdAudioExt_command);
}

TEST_F(TargetLinks, GenericServiceGetsTheTextWithoutItsNul) {
    int peer = link(&s_fdService_command);
    EXPECT_EQ(0, sendDataToGenericService("AT+POWERKEY"));
    EXPECT_EQ("AT+POWERKEY", drainFd(peer));

    // A vanished service or a missing link is a lost send, not a signal.
    close(peer);
    extra_.back() = -1;
    EXPECT_EQ(0, sendDataToGenericService("AT+POWERKEY"));
    closeIfOpen(s_fdService_command);
    EXPECT_EQ(0, sendDataToGenericService("AT+POWERKEY"));
}
