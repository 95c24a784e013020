// The command line reader against real descriptors.
#include "host_links.h"

using ReaderTest = HostLinks;

TEST_F(ReaderTest, HalfAssembledAdbLineSurvivesASerialLine) {
    writeAll(adbHost, "AT+CS");
    writeLater(master, "AT+S\n");
    EXPECT_EQ("AT+S", nextLine());
    writeAll(adbHost, "Q\r");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
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
