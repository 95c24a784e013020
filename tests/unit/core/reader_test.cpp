// The command line reader against real descriptors: serial lines from a pseudo-
// terminal, adb bytes from socket pairs, connections from a listening socket.
#include <sys/stat.h>

#include "host_links.h"

using ReaderTest = HostLinks;

TEST_F(ReaderTest, SerialLinesEndAtLfCtrlZAndEscAndLoseTheirDelimiter) {
    writeAll(serial.master, "AT+CSQ\nat+cclk?\x1A" "AT+X\x1B");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(7, gSerialDevice.cmdLen);
    EXPECT_EQ(DEVICE_SERIAL, gSerialDevice.currDevice);
    EXPECT_EQ("at+cclk?", nextLine());  // case is routing's business
    EXPECT_EQ(9, gSerialDevice.cmdLen);
    EXPECT_EQ("AT+X", nextLine());
}

TEST_F(ReaderTest, FilterDropsWhatIsNotACommandButKeepsAudioLines) {
    writeAll(serial.master, "A\n\nhello\nAT\nMM+VOL=3\n");
    EXPECT_EQ("AT", nextLine());
    EXPECT_EQ(3, gSerialDevice.cmdLen);
    EXPECT_EQ("MM+VOL=3", nextLine());
}

TEST_F(ReaderTest, BackspacesEditTheLineAndItsLength) {
    writeAll(serial.master, "AT+CX\bCLK\n\b\bAT\bT+Q\n");
    EXPECT_EQ("AT+CCLK", nextLine());
    EXPECT_EQ(8, gSerialDevice.cmdLen);
    EXPECT_EQ("AT+Q", nextLine());
    // Edited down below three bytes, the line is no command any more.
    writeAll(serial.master, "AT\b\n" "AT+Z\n");
    EXPECT_EQ("AT+Z", nextLine());
}

TEST_F(ReaderTest, AdbLineIsAssembledAcrossPacketsAndEndsAtCr) {
    writeAll(adbHost, "A");
    later(100, [this] { writeAll(adbHost, "T+\nX\r"); });
    EXPECT_EQ("AT+\nX", nextLine());  // LF is an ordinary byte on adb
    EXPECT_EQ(6, gSerialDevice.cmdLen);
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

TEST_F(ReaderTest, AdbPacketYieldsOneLineAndDropsTheRest) {
    writeAll(adbHost, "AT\rAT+CCLK\r");
    EXPECT_EQ("AT", nextLine());
    writeAll(adbHost, "AT+Z\r");
    EXPECT_EQ("AT+Z", nextLine());
}

TEST_F(ReaderTest, AdbLineIsCutAt6144Bytes) {
    std::string big = "AT" + std::string(7000, 'x');
    writeAll(adbHost, big);
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    EXPECT_EQ(6144, gSerialDevice.cmdLen);
    EXPECT_EQ(6143u, strlen(line));
    EXPECT_EQ(big.substr(0, 6143), std::string(line));
}

TEST_F(ReaderTest, HalfAssembledAdbLineSurvivesASerialLine) {
    writeAll(adbHost, "AT+CS");
    later(100, [this] { writeAll(serial.master, "AT+S\n"); });
    EXPECT_EQ("AT+S", nextLine());
    EXPECT_EQ(DEVICE_SERIAL, gSerialDevice.currDevice);
    writeAll(adbHost, "Q\r");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

TEST_F(ReaderTest, AdbDisconnectDiscardsThePartialLineAndANewClientIsServed) {
    writeAll(adbHost, "AT+OL");
    close(adbHost);
    adbHost = -1;
    EXPECT_EQ("<null>", nextLine());
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);

    int client = connectAdbClient();
    writeAll(client, "AT+NEW\r");
    EXPECT_EQ("AT+NEW", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);

    // A second connection replaces the first, which is closed rather than leaked.
    int second = connectAdbClient();
    writeAll(second, "AT\r");
    EXPECT_EQ("AT", nextLine());
    char c;
    EXPECT_EQ(0, read(client, &c, 1));
    close(client);
    close(second);
}

static std::string frameBody(size_t len) {
    std::string f = "at^mmitest=";
    for (size_t i = f.size(); i + 1 < len; i++) f += (char)('A' + i % 26);
    return f + "\n";
}

TEST_F(ReaderTest, MmitestFrameOf49BytesGetsItsLostPairBack) {
    std::string frame = frameBody(49);
    writeAll(serial.master, frame + "AT\n");
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    std::string want = frame.substr(0, 12) + std::string("\x00\xA8", 2) + frame.substr(12);
    ASSERT_EQ(51, gSerialDevice.cmdLen);
    EXPECT_EQ(want, std::string(line, 51));  // delimiter kept: a device-maker command
    EXPECT_EQ("AT", nextLine());             // no extra read took the next line
}

TEST_F(ReaderTest, MmitestFrameSplitByTheLineDisciplineIsJoined) {
    std::string first = frameBody(20);
    std::string rest = std::string(28, 'z') + "\n";
    writeAll(serial.master, first);
    later(100, [this, rest] { writeAll(serial.master, rest); });
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    ASSERT_EQ(51, gSerialDevice.cmdLen);
    std::string want = first.substr(0, 12) + std::string("\x00\xA8", 2) + first.substr(12) + rest.substr(0, 29);
    EXPECT_EQ(want, std::string(line, 51));
}

TEST_F(ReaderTest, LongMmitestLineIsPassedOnUntouched) {
    std::string longLine = frameBody(60);
    writeAll(serial.master, longLine + "AT\n");
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    EXPECT_EQ(60, gSerialDevice.cmdLen);
    EXPECT_EQ(longLine, std::string(line, 60));
    EXPECT_EQ("AT", nextLine());
}

TEST_F(ReaderTest, SmsTextBypassesTheFilterExceptALoneLf) {
    isMsgCmdInput = true;
    writeAll(serial.master, "\nhe\bllo\x1A");
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    // Relayed raw: no editing, delimiter kept.
    EXPECT_EQ("he\bllo\x1A", std::string(line));
    EXPECT_EQ(7, gSerialDevice.cmdLen);
}

TEST_F(ReaderTest, DeadSerialPortIsReopened) {
    Pty replacement;
    ASSERT_GE(replacement.slave, 0);
    close(replacement.slave);  // the reader opens it by name
    std::string dev = root.at("/dev/ttyGS0");
    mkdir(root.at("/dev").c_str(), 0755);
    ASSERT_EQ(0, symlink(replacement.slavePath.c_str(), dev.c_str()));
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], 64, "%s", SERIAL_DEV_NAME);
    gSerialDevice.echoOption[DEVICE_SERIAL] = 0;

    close(serial.master);  // hang-up: the slave reads fail
    serial.master = -1;
    // The open discards pending input, so the host types after the reopen.
    later(300, [&replacement] { writeAll(replacement.master, "AT+R\n"); });
    EXPECT_EQ("AT+R", nextLine());
    EXPECT_GE(gSerialDevice.fd[DEVICE_SERIAL], 0);
}

TEST_F(ReaderTest, SerialPortThatCannotBeReopenedEndsTheProcess) {
    // gtest reads its capture file in /tmp back with fopen(), which resolves under the root.
    ASSERT_EQ(0, symlink("/tmp", root.at("/tmp").c_str()));
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], 64, "%s", SERIAL_DEV_NAME);  // absent under the root
    close(serial.master);
    serial.master = -1;
    EXPECT_EXIT(readline(&gSerialDevice), ::testing::ExitedWithCode(1), "");
}
