// The command line reader against real descriptors.
#include "host_links.h"

using ReaderTest = HostLinks;

TEST_F(ReaderTest, SerialLinesAreFilteredAndEditedAndLoseTheirDelimiter) {
    writeAll(master, "A\n\nhello\nAT\nat+cclk?\x1A" "AT+X\x1B" "MM+VOL=3\nAT+CX\bCLK\n\b\bAT\n" "AT\b\nAT+Z\n");
    EXPECT_EQ("AT", nextLine());  // shorter lines and non-commands dropped
    EXPECT_EQ(3, gSerialDevice.cmdLen);
    EXPECT_EQ(DEVICE_SERIAL, gSerialDevice.currDevice);
    EXPECT_EQ("at+cclk?", nextLine());  // Ctrl-Z ends a line; case is routing's business
    EXPECT_EQ("AT+X", nextLine());      // so does ESC
    EXPECT_EQ("MM+VOL=3", nextLine());  // audio commands need no "AT"
    EXPECT_EQ("AT+CCLK", nextLine());
    EXPECT_EQ(8, gSerialDevice.cmdLen);
    EXPECT_EQ("AT", nextLine());    // backspaces at the start do nothing
    EXPECT_EQ("AT+Z", nextLine());  // "AT\b" edited to two bytes is no command
}

TEST_F(ReaderTest, AdbLinesAreAssembledUpToCrOneLinePerPacket) {
    writeAll(adbHost, "A");
    writeLater(adbHost, "T+\nX\r");
    EXPECT_EQ("AT+\nX", nextLine());  // LF is an ordinary byte on adb
    EXPECT_EQ(6, gSerialDevice.cmdLen);
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);

    writeAll(adbHost, "AT\rAT+CCLK\r");
    EXPECT_EQ("AT", nextLine());
    writeAll(adbHost, "AT+Z\r");
    EXPECT_EQ("AT+Z", nextLine());  // the rest of the earlier packet is gone

    std::string big = "AT" + std::string(7000, 'x');
    writeAll(adbHost, big);
    EXPECT_EQ(big.substr(0, 6143), nextLine());
    EXPECT_EQ(6144, gSerialDevice.cmdLen);
}

TEST_F(ReaderTest, HalfAssembledAdbLineSurvivesASerialLine) {
    writeAll(adbHost, "AT+CS");
    writeLater(master, "AT+S\n");
    EXPECT_EQ("AT+S", nextLine());
    writeAll(adbHost, "Q\r");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

TEST_F(ReaderTest, AdbConnectionsComeAndGoOneAtATime) {
    writeAll(adbHost, "AT+OL");
    close(adbHost);
    adbHost = -1;
    EXPECT_EQ("<null>", nextLine());
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);

    int first = connectAdbClient();
    writeAll(first, "AT+NEW\r");
    EXPECT_EQ("AT+NEW", nextLine());  // the old partial line did not leak in

    int second = connectAdbClient();
    writeAll(second, "AT\r");
    EXPECT_EQ("AT", nextLine());
    char c;
    EXPECT_EQ(0, read(first, &c, 1));  // replaced, and closed rather than leaked
    close(first);
    close(second);
}

static std::string mmitestLine(size_t len) {
    std::string f = "at^mmitest=";
    while (f.size() + 1 < len) f += (char)('A' + f.size() % 26);
    return f + "\n";
}

TEST_F(ReaderTest, MmitestFrameRepair) {
    // 49 bytes that lost 0x00 0xA8 at offset 12: put back without any further read.
    std::string frame = mmitestLine(49);
    writeAll(master, frame + "AT\n");
    char *line = readline(&gSerialDevice);
    ASSERT_EQ(51, gSerialDevice.cmdLen);
    EXPECT_EQ(frame.substr(0, 12) + std::string("\0\xA8", 2) + frame.substr(12), std::string(line, 51));
    EXPECT_EQ("AT", nextLine());

    // A short piece waits for exactly the missing rest.
    std::string piece = mmitestLine(20), rest = std::string(28, 'z') + "\n";
    writeAll(master, piece);
    writeLater(master, rest + "AT\n");
    line = readline(&gSerialDevice);
    ASSERT_EQ(51, gSerialDevice.cmdLen);
    EXPECT_EQ(piece.substr(0, 12) + std::string("\0\xA8", 2) + piece.substr(12) + rest, std::string(line, 51));
    EXPECT_EQ("AT", nextLine());

    // A longer line is no damaged frame: untouched, and the next line is not taken.
    std::string longLine = mmitestLine(60);
    writeAll(master, longLine + "AT\n");
    line = readline(&gSerialDevice);
    EXPECT_EQ(longLine, std::string(line, gSerialDevice.cmdLen));
    EXPECT_EQ("AT", nextLine());
}

TEST_F(ReaderTest, SmsTextSkipsTheFilterButNotALoneLf) {
    isMsgCmdInput = true;
    writeAll(master, "\nhe\bllo\x1A");
    EXPECT_EQ("he\bllo\x1A", nextLine());  // relayed raw, delimiter kept
    EXPECT_EQ(7, gSerialDevice.cmdLen);
}
