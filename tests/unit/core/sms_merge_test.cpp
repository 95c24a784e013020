// SMS commands with a text body: recognition, message format, merging.
#include <cutils/properties.h>

#include "host_links.h"

using SmsMergeTest = HostLinks;

TEST_F(SmsMergeTest, RecognitionFormatAndParameterCount) {
    for (const char *yes : {"AT+CMGS=\"123\"", "AT+CMGS", "AT+CNMA=0", "AT+CMGW=1,2"}) EXPECT_EQ(1, isMsgCmd(yes)) << yes;
    for (const char *no : {"AT+CMGS=?", "AT+CMGS?", "AT+CMGS=", "AT+CMGSX=1", "AT+CMGR=1"}) EXPECT_EQ(0, isMsgCmd(no)) << no;

    isMsgCmd("AT+CMGF=1");
    for (const char *keep : {"AT+CMGF?", "AT+CMGF=?", "AT+CMGF=x", "AT+CMGF"}) isMsgCmd(keep);
    EXPECT_EQ(1, msgCmdMode);
    isMsgCmd("AT+CMGF=0");
    EXPECT_EQ(0, msgCmdMode);

    EXPECT_EQ(2, getMsgCmdParameterCount("AT+CMGS=\"1,2\",129"));  // quoted comma is text
    EXPECT_EQ(3, getMsgCmdParameterCount("AT+CMGS=\"1\",129,7"));
    EXPECT_EQ(0, getMsgCmdParameterCount("AT+CMGS=?"));
    EXPECT_EQ(0, getMsgCmdParameterCount("AT+CMGS"));
}

// Holds cmd in cmdBuf as routing leaves it and tries to start merging.
static int startMerge(const std::string &cmd) {
    memset(gSerialDevice.cmdBuf, 0, sizeof(gSerialDevice.cmdBuf));
    memcpy(gSerialDevice.cmdBuf, cmd.data(), cmd.size());
    gSerialDevice.currDevice = DEVICE_SERIAL;
    isNeedMergeMsgCmdInput = startMergeMsgCmdInputIfNeed(&gSerialDevice, gSerialDevice.cmdBuf) != 0;
    return isNeedMergeMsgCmdInput;
}

static std::string textLine(const std::string &text) {
    static char lineBuf[DATA_BUF_SIZE];
    memset(lineBuf, 0, sizeof(lineBuf));
    memcpy(lineBuf, text.data(), text.size());
    return handleMsgTextLine(&gSerialDevice, lineBuf, (int)text.size());
}

TEST_F(SmsMergeTest, SuffixFollowsParameterCountAndFormat) {
    struct {
        int mode;
        const char *cmd;
        const char *sent;  // nullptr: not merged
    } cases[] = {
        {1, "AT+CMGS=\"123\"", "AT+EMGS=\"123\",,\"hi\"\r\n"},
        {1, "AT+CMGS=\"123\",129", "AT+EMGS=\"123\",129,\"hi\"\r\n"},
        {0, "AT+CMGS=23", "AT+EMGS=23,\"hi\"\r\n"},
        {0, "AT+CMGS=23,1", nullptr},
        {1, "AT+CMGS=\"1\",129,7", nullptr},
        {1, "AT+CMGS", nullptr},
    };
    for (const auto &c : cases) {
        SCOPED_TRACE(c.cmd);
        msgCmdMode = c.mode;
        ASSERT_EQ(c.sent != nullptr, startMerge(c.cmd));
        if (c.sent == nullptr) {
            EXPECT_EQ(c.cmd, std::string(gSerialDevice.cmdBuf));
            continue;
        }
        EXPECT_EQ("\r\n> \r\n", drain(master));
        EXPECT_EQ(c.sent, textLine("hi\x1A"));
        EXPECT_FALSE(isNeedMergeMsgCmdInput);
    }
    property_set("persist.service.tolk.sim", "9");  // the CDMA modem takes no merged text
    EXPECT_FALSE(startMerge("AT+CMGS=23"));
    EXPECT_EQ("", drain(master, 50));
}

TEST_F(SmsMergeTest, TextLinesAreCollectedUntilCtrlZOrEsc) {
    msgCmdMode = 1;
    ASSERT_TRUE(startMerge("AT+CMGW=\"555\""));
    drain(master);
    EXPECT_EQ("AT+CMGW=\"555\",,\"ac\n", textLine("ab\bc\n"));  // backspaces applied
    routeMsgTextLine(&gSerialDevice);  // unfinished: one prompt, nothing to the modem
    EXPECT_EQ("\r\n> \r\n", drain(master));
    EXPECT_EQ("AT+EMGW=\"555\",,\"ac\nd\"\r\n", textLine("d\x1B"));

    // On adb the CR is the last byte, so the Ctrl-Z stays inside the text.
    ASSERT_TRUE(startMerge("AT+CMGS=\"1\""));
    EXPECT_EQ("AT+EMGS=\"1\",,\"hi\x1A\"\r\n", textLine("hi\x1A\r"));
}

TEST_F(SmsMergeTest, MergedCommandNeverOutgrowsTheBuffer) {
    std::string fits(6000, 'a');
    ASSERT_TRUE(startMerge("AT+CMGS=23"));
    textLine(fits + "\n");
    textLine(std::string(200, 'b') + "\n");  // would overflow: left out
    EXPECT_EQ("AT+EMGS=23,\"" + fits + "\nend\"\r\n", textLine("end\x1A"));

    // A held command with no room for suffix and closing is relayed instead.
    EXPECT_FALSE(startMerge("AT+CMGS=" + std::string(6136, '1')));
}
