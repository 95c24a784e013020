// The command line reader against real descriptors.
#include "host_links.h"

#include <sys/ioctl.h>
#include <sys/resource.h>


using ReaderTest = HostLinks;

TEST_F(ReaderTest, HalfAssembledAdbLineSurvivesASerialLine) {
    writeAll(adbHost, "AT+CS");
    writeLater(master, "AT+S\n");
    EXPECT_EQ("AT+S", nextLine());
    writeAll(adbHost, "Q\r");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

// Writes s on fd once the reader has taken everything waiting at its end readerFd,
// so that s arrives while the reader is in the middle of the line before it.
static void writeWhenRead(int fd, int readerFd, std::string s) {
    std::thread([fd, readerFd, s] {
        int pending = 1;
        while (ioctl(readerFd, FIONREAD, &pending) == 0 && pending > 0) usleep(200);
        if (write(fd, s.data(), s.size()) < 0) ADD_FAILURE();
    }).detach();
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

    // A short piece waits (briefly) for exactly the missing rest.
    std::string piece = mmitestLine(20), rest = std::string(28, 'z') + "\n";
    writeAll(master, piece);
    writeWhenRead(master, gSerialDevice.fd[DEVICE_SERIAL], rest + "AT\n");
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

// A raw frame is no typed text: a 0x08 inside it edits only the text before its
// first NUL, and the frame keeps its length and every byte from that NUL on.
TEST_F(ReaderTest, BackspaceInARawFrameLeavesTheFrameWhole) {
    std::string frame = std::string("at^mmitest=\b\0\xA8", 14);
    while (frame.size() < 50) frame += (char)('C' + frame.size() % 20);
    frame += "\n";
    writeAll(master, frame);
    char *line = readline(&gSerialDevice);
    ASSERT_EQ(51, gSerialDevice.cmdLen);
    EXPECT_EQ(std::string("at^mmitest\0\b\0\xA8", 14) + frame.substr(14), std::string(line, 51));

    writeAll(adbHost, "AT+CX\bSQ\r");  // text still shortens
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(7, gSerialDevice.cmdLen);
}

// A short frame on adb whose rest never comes does not hold up the links, and
// what the repair read past the frame's line end is the station's next lines.
TEST_F(ReaderTest, ShortFrameOnAdbWaitsBriefAndKeepsTheNextLines) {
    writeAll(adbHost, "at^mmitest=AB\r");
    writeWhenRead(adbHost, gSerialDevice.fd[DEVICE_ADB], "AT+CSQ\rAT\r");
    char *line = readline(&gSerialDevice);
    ASSERT_NE(nullptr, line);
    EXPECT_EQ(std::string("at^mmitest=A\0\xA8" "B\r", 16), std::string(line, gSerialDevice.cmdLen));
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ("AT", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

// A connection the listener cannot accept (descriptor table full) costs the
// connected station neither its connection nor its half-typed line.
TEST_F(ReaderTest, FailedAcceptKeepsTheLiveAdbConnection) {
    writeAll(adbHost, "AT+CS");
    int client = socket(AF_UNIX, SOCK_STREAM, 0);
    ASSERT_EQ(0, connect(client, (sockaddr *)&listenAddr, sizeof(listenAddr)));
    struct rlimit saved;
    ASSERT_EQ(0, getrlimit(RLIMIT_NOFILE, &saved));
    int lowest = dup(0);
    close(lowest);
    struct rlimit full = saved;
    full.rlim_cur = lowest;
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &full));
    writeLater(adbHost, "Q\r");
    std::string line = nextLine();
    setrlimit(RLIMIT_NOFILE, &saved);
    close(client);
    EXPECT_EQ("AT+CSQ", line);
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

TEST_F(ReaderTest, SmsTextSkipsTheFilterButNotALoneLf) {
    isMsgCmdInput = true;
    writeAll(master, "\nhe\bllo\x1A");
    EXPECT_EQ("he\bllo\x1A", nextLine());  // relayed raw, delimiter kept
    EXPECT_EQ(7, gSerialDevice.cmdLen);
}
