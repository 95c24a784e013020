// SMS text input on both host links: relayed line by line to the modem, or, for
// operator OP12, merged into one single-line command. The modem journal shows the
// exact bytes the modem received (one line per request, NUL included).
#include "modem_e2e.h"

using namespace modem_e2e;

namespace {

const char kPrompt[] = "\r\n> \r\n";  // the modem's or the daemon's "\r\n> ", framed by the writer

std::string sent(int n) { return "\r\n+CMGS: " + std::to_string(n) + "\r\n\r\nOK\r\n"; }

}  // namespace

TEST(ModemSms, TextIsRelayedLineByLineOnTheSerialPort) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink host(dev, false);
    EXPECT_EQ(visible(host.cmd("AT+CMGF=1")), visible("\r\nOK\r\n"));
    // CR LF from the host makes a second, empty line (a lone LF): it is not text.
    EXPECT_EQ(visible(host.send("AT+CMGS=\"123\"\r\n")), visible(kPrompt));
    EXPECT_EQ(visible(host.cmd("hello")), visible(kPrompt));
    // Ctrl-Z ends the line on the serial port and the message with it.
    EXPECT_EQ(visible(host.send("world\x1a")), visible(sent(1)));
    // Text input is over: the next line is a command again.
    EXPECT_EQ(visible(host.cmd("AT")), visible("\r\nOK\r\n"));
    // ESC, too, ends a line after an echo switch: the message is abandoned and
    // the modem's OK ends the text input.
    EXPECT_EQ(visible(host.cmd("AT+CMGW=\"5\"")), visible(kPrompt));
    EXPECT_EQ(visible(host.send("draft\x1b")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+CMGS=?")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1),
              "AT+CMGF=1\\x00\n"
              "AT+CMGS=\"123\"\\x00\n"
              "hello\\n\\x00\n"
              "world\\x1a\\x00\n"
              "AT\\x00\n"
              "AT+CMGW=\"5\"\\x00\n"
              "draft\\x1b\\x00\n"
              "AT+CMGS=?\\x00\n"
              "AT+CSQ\\x00\n");
}

TEST(ModemSms, TextIsRelayedLineByLineOnTheAdbLink) {
    SimDevice dev(openModem({"--prop", "persist.operator.optr=OP07"}));
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink host(dev, true);
    EXPECT_EQ(visible(host.cmd("at+cmgs=\"123\"")), visible(kPrompt));
    // Text keeps its case, its CR and its backspaces: the modem gets it raw. (It
    // is in PDU mode, since AT+CMGF goes to the framework for this operator, and
    // refuses text that is no PDU; that final result ends the text input too.)
    EXPECT_EQ(visible(host.cmd("Line one")), visible(kPrompt));
    EXPECT_EQ(visible(host.send("ab\bc\x1a\r")), visible("\r\n+CMS ERROR: 304\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+CMGS?")), visible("\r\nERROR\r\n"));
    // ESC abandons a message; the modem's OK ends the text input.
    EXPECT_EQ(visible(host.cmd("AT+CMGW=\"5\"")), visible(kPrompt));
    EXPECT_EQ(visible(host.send("draft\x1b\r")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT")), visible("\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1),
              "AT+CMGS=\"123\"\\x00\n"
              "Line one\\r\\x00\n"
              "ab\\x08c\\x1a\\r\\x00\n"
              "AT+CMGS?\\x00\n"
              "AT+CMGW=\"5\"\\x00\n"
              "draft\\x1b\\r\\x00\n"
              "AT\\x00\n");
}

TEST(ModemSms, Op12MergesTextModeMessagesIntoOneLine) {
    SimDevice dev(openModem({"--prop", "persist.operator.optr=OP12"}));
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink serial(dev, false);
    EXPECT_EQ(visible(serial.cmd("AT+CMGF=1")), visible("\r\nOK\r\n"));
    // Destination only: the daemon prompts itself and holds the command back.
    EXPECT_EQ(visible(serial.cmd("AT+CMGS=\"123\"")), visible(kPrompt));
    EXPECT_EQ(visible(serial.cmd("hello")), visible(kPrompt));
    EXPECT_EQ(visible(serial.send("world\x1a")), visible(sent(1)));
    // Destination and type of address.
    EXPECT_EQ(visible(serial.cmd("AT+CMGS=\"123\",129")), visible(kPrompt));
    EXPECT_EQ(visible(serial.send("hi\x1a")), visible(sent(2)));
    // Three parameters do not merge: relayed as usual.
    EXPECT_EQ(visible(serial.cmd("AT+CMGW=\"123\",129,\"STO UNSENT\"")), visible(kPrompt));
    EXPECT_EQ(visible(serial.send("keep\x1a")), visible("\r\n+CMGW: 1\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1),
              "AT+CMGF=1\\x00\n"
              "AT+EMGS=\"123\",,\"hello\\nworld\"\\r\\n\\x00\n"
              "AT+EMGS=\"123\",129,\"hi\"\\r\\n\\x00\n"
              "AT+CMGW=\"123\",129,\"STO UNSENT\"\\x00\n"
              "keep\\x1a\\x00\n");

    // On the adb link the line ends with CR, so the Ctrl-Z stays inside the text;
    // backspaces are applied before the text is merged.
    HostLink adb(dev, true);
    EXPECT_EQ(visible(adb.cmd("AT+CMGS=\"77\"")), visible(kPrompt));
    EXPECT_EQ(visible(adb.send("hel\blo\x1a\r")), visible(sent(3)));
    EXPECT_EQ(visible(adb.cmd("AT")), visible("\r\nOK\r\n"));
    std::string journal = radioJournal(dev, 1);
    EXPECT_NE(journal.find("keep\\x1a\\x00\nAT+EMGS=\"77\",,\"helo\\x1a\"\\r\\n\\x00\nAT\\x00\n"), std::string::npos)
        << journal;
}

TEST(ModemSms, Op12MergesPduModeMessagesAndEscEndsTheText) {
    SimDevice dev(openModem({"--prop", "persist.operator.optr=OP12"}));
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    // Echo stays on: the port echoes each typed line, its CR turned into LF (no
    // output processing on the port), before the answer.
    HostLink host(dev, false, false);
    auto echoed = [](const std::string &line) { return line + "\n"; };
    // PDU mode is the start-up state: the length alone merges. The PDUs are
    // SMS-SUBMITs of one character to "123", without an SMSC address.
    const std::string pduA = "000100038121F300000141", pduB = "000100038121F300000142";
    EXPECT_EQ(visible(host.cmd("AT+CMGS=10")), visible(echoed("AT+CMGS=10") + kPrompt));
    EXPECT_EQ(visible(host.send(pduA + "\x1a")), visible(pduA + "\x1a" + sent(1)));
    // ESC completes the merged command just like Ctrl-Z.
    EXPECT_EQ(visible(host.cmd("AT+CMGS=10")), visible(echoed("AT+CMGS=10") + kPrompt));
    EXPECT_EQ(visible(host.send(pduB + "\x1b")), visible(pduB + "\x1b" + sent(2)));
    // The read form of AT+CMGF changes nothing; two parameters in PDU mode do
    // not merge: the line goes to the modem as it is (which refuses it).
    EXPECT_EQ(visible(host.cmd("AT+CMGF?")), visible(echoed("AT+CMGF?") + "\r\n+CMGF: 0\r\n\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+CMGS=17,1")), visible(echoed("AT+CMGS=17,1") + "\r\n+CMS ERROR: 304\r\n"));
    EXPECT_EQ(radioJournal(dev, 1),
              "AT+EMGS=10,\"" + pduA + "\"\\r\\n\\x00\n"
              "AT+EMGS=10,\"" + pduB + "\"\\r\\n\\x00\n"
              "AT+CMGF?\\x00\n"
              "AT+CMGS=17,1\\x00\n");

    // With the CDMA modem selected nothing is merged, and a relayed text line
    // that ends with ESC reaches the modem with it.
    dev.setprop("persist.service.tolk.sim", "9");
    EXPECT_EQ(visible(host.cmd("AT+CMGS=17")), visible(echoed("AT+CMGS=17") + kPrompt));
    EXPECT_EQ(visible(host.send("0011\x1b")), visible("0011\x1b\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT")), visible(echoed("AT") + "\r\nOK\r\n"));
    std::string journal = radioJournal(dev, 1);
    EXPECT_NE(journal.find("AT+CMGS=17,1\\x00\nAT+CMGS=17\\x00\n0011\\x1b\\x00\nAT\\x00\n"), std::string::npos)
        << journal;
}
