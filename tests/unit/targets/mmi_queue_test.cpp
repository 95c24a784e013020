// Matching modem answers to customer MMI commands, driven through the modem link
// reader the way the main loop drives it.
#include "targets_fixture.h"

#include <cstring>

namespace {

class MmiQueue : public TargetLinks {
protected:
    void SetUp() override {
        TargetLinks::SetUp();
        modem_ = link(&s_fdRild_command);
        service_ = listenOn(TOLK_SERVICE_SOCKET);
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
        sendAll(modem_, text);
        readDataFromTarget(RIL_TYPE, &s_fdRild_command);
    }
    // What the MMI client received on the generic service link so far.
    std::string mmiClient() {
        if (client_ < 0 && s_fdService_command >= 0) client_ = acceptFrom(service_);
        return client_ < 0 ? std::string() : drainFd(client_, 200);
    }

    int modem_ = -1;
    int service_ = -1;
    int client_ = -1;
};

}  // namespace

TEST_F(MmiQueue, AnswersOnlyCountDownWhileNothingIsQueued) {
    modemAnswer("\r\nRING\r\n");
    modemAnswer("OK");
    EXPECT_EQ(-2, gMmiCmdSeq.idx);
    EXPECT_EQ(0, gMmiCmdSeq.deSeqIdx);
    EXPECT_EQ(-1, s_fdService_command);  // nothing went to the MMI client
    EXPECT_EQ("\r\nRING\r\n\r\nOK\r\n", hostOutput());
}

TEST_F(MmiQueue, QueuedCommandGetsItsOwnAnswerBehindEarlierCommands) {
    ordinaryCommand();
    ordinaryCommand();
    mmiCommand("AT+CUSD=+ORVTOLKJ");
    EXPECT_EQ(3, gMmiCmdSeq.seq[0]);
    EXPECT_EQ(1, gMmiCmdSeq.enSeqIdx);
    EXPECT_EQ(0, gMmiCmdSeq.cusMmiCmdPending);

    modemAnswer("first");
    modemAnswer("second");
    EXPECT_EQ(1, gMmiCmdSeq.seq[0]);
    EXPECT_EQ(-1, s_fdService_command);

    // The service link is connected on demand; the text goes out without a NUL.
    modemAnswer("\r\n+CUSD: 0,\"Balance\",15\r\n");
    EXPECT_EQ("AT+CUSD=+ORVTOLKJ\r\n+CUSD: 0,\"Balance\",15\r\n;", mmiClient());
    EXPECT_EQ(-1, gMmiCmdSeq.seq[0]);
    EXPECT_EQ(1, gMmiCmdSeq.deSeqIdx);
    EXPECT_EQ(1, gMmiCmdSeq.SIdx);
    // The host gets every answer, the matched one included.
    EXPECT_EQ("\r\nfirst\r\n\r\nsecond\r\n\r\n+CUSD: 0,\"Balance\",15\r\n", hostOutput());

    // Two queued back to back, each paired with its own text.
    mmiCommand("AT+CLCK=+ORVTOLKJ");
    ordinaryCommand();
    mmiCommand("AT+CCFC?+ORVTOLKJ");
    EXPECT_EQ(1, gMmiCmdSeq.seq[1]);
    EXPECT_EQ(3, gMmiCmdSeq.seq[2]);
    modemAnswer("A");
    modemAnswer("B");
    modemAnswer("C");
    EXPECT_EQ("AT+CLCK=+ORVTOLKJA;AT+CCFC?+ORVTOLKJC;", mmiClient());
}

TEST_F(MmiQueue, SurplusModemOutputDoesNotStrandLaterCommands) {
    // Unsolicited lines and answers in pieces count as answers and push the count
    // below zero; a command queued afterwards must still get its own answer.
    ordinaryCommand();
    modemAnswer("\r\n+CSQ: 20,99\r\n");
    modemAnswer("\r\nOK\r\n");
    modemAnswer("\r\n+CREG: 1\r\n");
    EXPECT_EQ(-2, gMmiCmdSeq.idx);

    mmiCommand("AT+CUSD=+ORVTOLKJ");
    EXPECT_GE(gMmiCmdSeq.seq[0], 1);
    modemAnswer("USSD");
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
    char text[32];
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) {
        snprintf(text, sizeof(text), "CMD%d", i);
        mmiCommand(text);
        EXPECT_EQ(i + 1, gMmiCmdSeq.seq[i]);
    }
    EXPECT_EQ(0, gMmiCmdSeq.enSeqIdx);

    // The eleventh: the dispatcher keeps its text out of the ring when the entry is
    // taken, so only the pending flag arrives here.
    gMmiCmdSeq.cusMmiCmdPending = 1;
    mmiCmdSeqEnQueue();
    EXPECT_EQ(11, gMmiCmdSeq.idx);
    EXPECT_EQ(0, gMmiCmdSeq.enSeqIdx);
    EXPECT_EQ(0, gMmiCmdSeq.cusMmiCmdPending);
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) EXPECT_EQ(i + 1, gMmiCmdSeq.seq[i]);

    std::string expected;
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) {
        modemAnswer("R" + std::to_string(i));
        expected += "CMD" + std::to_string(i) + "R" + std::to_string(i) + ";";
    }
    modemAnswer("R10");  // the unqueued command's answer goes to the host only
    EXPECT_EQ(expected, mmiClient());
    EXPECT_EQ(0, gMmiCmdSeq.idx);
    EXPECT_EQ(0, gMmiCmdSeq.deSeqIdx);
    EXPECT_EQ(0, gMmiCmdSeq.SIdx);

    // The indexes wrapped around; the queue works on.
    mmiCommand("AGAIN");
    modemAnswer("X");
    EXPECT_EQ("AGAINX;", mmiClient());
}

TEST_F(MmiQueue, AnswerTextEndsAtItsFirstNulAndMissingAnswerSendsNothing) {
    mmiCommand("AT+CUSD=+ORVTOLKJ");
    modemAnswer(std::string("abc\0def", 7));
    EXPECT_EQ("AT+CUSD=+ORVTOLKJabc;", mmiClient());

    gMmiCmdSeq.SIdx = 4;
    sendCusMMICmdRspToMMI(nullptr);
    EXPECT_EQ(4, gMmiCmdSeq.SIdx);
    EXPECT_EQ("", mmiClient());
}
