// SMS commands with a text body: recognition, message format, and merging the body
// into one command.
#include <cutils/properties.h>

#include "host_links.h"

using SmsMergeTest = HostLinks;

TEST_F(SmsMergeTest, OnlyTheSendingFormsOfTheFourCommandsTakeText) {
    EXPECT_EQ(1, isMsgCmd("AT+CMGS=\"123\""));
    EXPECT_EQ(1, isMsgCmd("AT+CMGS"));
    EXPECT_EQ(1, isMsgCmd("AT+CNMA=0"));
    EXPECT_EQ(1, isMsgCmd("AT+CMGC=2,3"));
    EXPECT_EQ(0, isMsgCmd("AT+CMGS=?"));
    EXPECT_EQ(0, isMsgCmd("AT+CMGS?"));
    EXPECT_EQ(0, isMsgCmd("AT+CMGS="));
    EXPECT_EQ(0, isMsgCmd("AT+CMGSX=1"));
    EXPECT_EQ(0, isMsgCmd("AT+CMGR=1"));
}

TEST_F(SmsMergeTest, CmgfSetsTheMessageFormatOnlyWithANumber) {
    isMsgCmd("AT+CMGF=1");
    EXPECT_EQ(1, msgCmdMode);
    isMsgCmd("AT+CMGF?");
    isMsgCmd("AT+CMGF=?");
    isMsgCmd("AT+CMGF=x");
    isMsgCmd("AT+CMGF");
    EXPECT_EQ(1, msgCmdMode);
    isMsgCmd("AT+CMGF=0");
    EXPECT_EQ(0, msgCmdMode);
}

TEST_F(SmsMergeTest, ParameterCountTreatsAQuotedCommaAsText) {
    EXPECT_EQ(2, getMsgCmdParameterCount("AT+CMGS=\"1,2\",129"));
    EXPECT_EQ(1, getMsgCmdParameterCount("AT+CMGS=12"));
    EXPECT_EQ(3, getMsgCmdParameterCount("AT+CMGS=\"1\",129,7"));
    EXPECT_EQ(0, getMsgCmdParameterCount("AT+CMGS"));
    EXPECT_EQ(0, getMsgCmdParameterCount("AT+CMGS=?"));
    EXPECT_EQ(0, getMsgCmdParameterCount("AT+CMGS="));
}

// Holds cmd in cmdBuf as the reader and routing leave it, and tries to start merging.
static int startMerge(const char *cmd) {
    memset(gSerialDevice.cmdBuf, 0, sizeof(gSerialDevice.cmdBuf));
    snprintf(gSerialDevice.cmdBuf, sizeof(gSerialDevice.cmdBuf), "%s", cmd);
    gSerialDevice.cmdLen = (int)strlen(cmd) + 1;
    gSerialDevice.currDevice = DEVICE_SERIAL;
    int started = startMergeMsgCmdInputIfNeed(&gSerialDevice, gSerialDevice.cmdBuf);
    if (started) isNeedMergeMsgCmdInput = true;
    return started;
}

static std::string textLine(const std::string &text) {
    static char lineBuf[DATA_BUF_SIZE];
    memset(lineBuf, 0, sizeof(lineBuf));
    memcpy(lineBuf, text.data(), text.size());
    return handleMsgTextLine(&gSerialDevice, lineBuf, (int)text.size());
}

TEST_F(SmsMergeTest, SuffixDependsOnParameterCountAndFormat) {
    struct {
        int mode;
        const char *cmd;
        const char *sent;  // nullptr: no merging, the command goes to the modem as is
    } cases[] = {
        {1, "AT+CMGS=\"123\"", "AT+EMGS=\"123\",,\"hi\"\r\n"},
        {1, "AT+CMGS=\"123\",129", "AT+EMGS=\"123\",129,\"hi\"\r\n"},
        {0, "AT+CMGS=23", "AT+EMGS=23,\"hi\"\r\n"},
        {1, "AT+CNMA=1", "AT+ENMA=1,,\"hi\"\r\n"},
        {0, "AT+CMGS=23,1", nullptr},
        {1, "AT+CMGS=\"1\",129,7", nullptr},
        {1, "AT+CMGS", nullptr},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.cmd);
        msgCmdMode = c.mode;
        isNeedMergeMsgCmdInput = false;
        int started = startMerge(c.cmd);
        EXPECT_EQ(c.sent != nullptr, started != 0);
        if (!started) {
            EXPECT_EQ(c.cmd, std::string(gSerialDevice.cmdBuf));
            EXPECT_EQ("", drain(serial.master, 50));
            continue;
        }
        EXPECT_EQ("\r\n> \r\n", drain(serial.master));
        EXPECT_EQ(c.sent, textLine("hi\x1A"));
        EXPECT_FALSE(isNeedMergeMsgCmdInput);
    }
}

TEST_F(SmsMergeTest, CdmaModemSelectionNeverMerges) {
    property_set("persist.service.tolk.sim", "9");
    msgCmdMode = 1;
    EXPECT_EQ(0, startMerge("AT+CMGS=\"123\""));
}

TEST_F(SmsMergeTest, MultiLineTextKeepsDelimitersAppliesBackspacesAndEndsAtEsc) {
    msgCmdMode = 1;
    ASSERT_EQ(1, startMerge("AT+CMGW=\"555\""));
    drain(serial.master);

    EXPECT_EQ("AT+CMGW=\"555\",,\"ac\n", textLine("ab\bc\n"));
    EXPECT_TRUE(isNeedMergeMsgCmdInput);
    routeMsgTextLine(&gSerialDevice);  // unfinished: one prompt, nothing to the modem
    EXPECT_EQ("\r\n> \r\n", drain(serial.master));

    EXPECT_EQ("AT+EMGW=\"555\",,\"ac\nd\"\r\n", textLine("d\x1B"));
    EXPECT_FALSE(isNeedMergeMsgCmdInput);
}

TEST_F(SmsMergeTest, AdbTextLineEndsAtCrSoCtrlZStaysInTheText) {
    msgCmdMode = 1;
    ASSERT_EQ(1, startMerge("AT+CMGS=\"123\""));
    EXPECT_EQ("AT+EMGS=\"123\",,\"hi\x1A\"\r\n", textLine("hi\x1A\r"));
}

TEST_F(SmsMergeTest, TextThatWouldOverflowIsLeftOutButTheMessageCompletes) {
    msgCmdMode = 0;
    ASSERT_EQ(1, startMerge("AT+CMGS=23"));
    std::string fits(6000, 'a');
    std::string tooMuch(200, 'b');
    textLine(fits + "\n");
    textLine(tooMuch + "\n");
    std::string sent = textLine("end\x1A");
    EXPECT_EQ("AT+EMGS=23,\"" + fits + "\nend\"\r\n", sent);
    EXPECT_LT(sent.size(), (size_t)DATA_BUF_SIZE);
}

TEST_F(SmsMergeTest, OverlongHeldCommandFallsBackToRelay) {
    msgCmdMode = 0;
    std::string cmd = "AT+CMGS=" + std::string(6136, '1');  // 6144 characters
    EXPECT_EQ(0, startMerge(cmd.c_str()));
    EXPECT_EQ(cmd, std::string(gSerialDevice.cmdBuf));
}

TEST_F(SmsMergeTest, BackspaceEditingKeepsBytesAfterAnEmbeddedNul) {
    char line[16] = {'A', 'X', '\b', 'T', '\0', 'z', '\n'};
    int n = applyBackspacesCounted(line, 7);
    EXPECT_EQ(5, n);
    EXPECT_EQ(std::string("AT\0z\n", 5), std::string(line, 5));
    EXPECT_EQ('\0', line[5]);

    char start[8] = "\b\bAT";
    applyBackspaces(start);
    EXPECT_STREQ("AT", start);
}
