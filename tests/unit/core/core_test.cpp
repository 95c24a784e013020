// The command line reader, SMS text merging and the user-mode gate against real
// descriptors in every slot the reader watches: a pseudo-terminal in canonical
// mode as the serial port, a socket pair as the accepted adb connection,
// a listening AF_UNIX socket as the control socket, and a modem pair.
#include <fcntl.h>
#include <sys/ioctl.h>
#include <sys/resource.h>
#include <sys/wait.h>
#include <sys/un.h>
#include <termios.h>

#include <cutils/properties.h>

#include "core/sms_merge.h"
#include "host_capture.h"
#include "test_root.h"

namespace {

class ReaderTest : public ::testing::Test {
protected:
    TestRoot root;
    int master = -1;  // host side of the serial port
    int adbHost = -1;
    int rildPeer = -1;
    sockaddr_un listenAddr = {};

    void SetUp() override {
        alarm(30);  // a reader that waits forever fails the run instead of hanging it
        memset(&gSerialDevice, 0, sizeof(gSerialDevice));
        master = posix_openpt(O_RDWR | O_NOCTTY);
        ASSERT_TRUE(master >= 0 && grantpt(master) == 0 && unlockpt(master) == 0);
        // open() resolves paths under the device root in this binary; openat() does not.
        int slave = openat(AT_FDCWD, ptsname(master), O_RDWR | O_NOCTTY);
        struct termios t;
        ASSERT_EQ(0, tcgetattr(slave, &t));
        t.c_iflag = t.c_oflag = 0;
        t.c_lflag = ICANON;  // no echo; lines end at LF only (the other line ends: links.tx)
        tcsetattr(slave, TCSANOW, &t);
        gSerialDevice.fd[DEVICE_SERIAL] = slave;

        adbHost = socketLink(&gSerialDevice.fd[DEVICE_ADB]);
        listenAddr.sun_family = AF_UNIX;
        snprintf(listenAddr.sun_path, sizeof(listenAddr.sun_path), "%s/adb", root.path().c_str());
        int lfd = socket(AF_UNIX, SOCK_STREAM, 0);
        ASSERT_EQ(0, bind(lfd, (sockaddr *)&listenAddr, sizeof(listenAddr)));
        ASSERT_EQ(0, adb_socket_listen(lfd));
        gSerialDevice.fd[DEVICE_ADB_LISTEN] = lfd;
        rildPeer = socketLink(&s_fdRild_command);

        isMsgCmdInput = isNeedMergeMsgCmdInput = false;
        msgCmdMode = 0;
        discardAdbLine();
    }
    void TearDown() override {
        // The writers below, done or ended by their alarm.
        while (wait(nullptr) > 0) continue;
        for (int &fd : gSerialDevice.fd) closeFd(fd);
        for (int *fd : {&master, &adbHost, &rildPeer, &s_fdRild_command}) closeFd(*fd);
        isMsgCmdInput = isNeedMergeMsgCmdInput = false;
        alarm(0);
    }
    // Writes s on fd once the reader has taken everything waiting at its end readerFd,
    // so that s arrives while the reader is in the middle of what came before. The
    // writer is a child process: a thread started while a test has the descriptor
    // table full trips the sanitizers' own bookkeeping.
    static void writeWhenRead(int fd, int readerFd, const std::string &s) {
        if (fork() != 0) return;
        alarm(5);  // a reader that never takes its bytes must not leave the writer behind
        int pending = 1;
        while (ioctl(readerFd, FIONREAD, &pending) == 0 && pending > 0) usleep(200);
        _exit(write(fd, s.data(), s.size()) == (ssize_t)s.size() ? 0 : 1);
    }
    // One reading cycle: the line as routing gets it (raw: its bytes as counted,
    // NULs included), "<null>" for none.
    std::string nextLine(bool raw = false) {
        char *line = readline(&gSerialDevice);
        if (line == nullptr) return "<null>";
        return raw ? std::string(line, gSerialDevice.cmdLen) : std::string(line);
    }
};

std::string mmitestLine(size_t len) {
    std::string f = "at^mmitest=";
    while (f.size() + 1 < len) f += (char)('A' + f.size() % 26);
    return f + "\n";
}

}  // namespace

TEST_F(ReaderTest, HalfAssembledAdbLineSurvivesASerialLine) {
    writeAll(adbHost, "AT+CS");
    writeWhenRead(master, gSerialDevice.fd[DEVICE_ADB], "AT+S\n");
    EXPECT_EQ("AT+S", nextLine());
    writeAll(adbHost, "Q\r");
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

// A frame that lost 0x00 0xA8 at offset 12 in one read is put back end to end
// (audio.tx); here the rest that the link delivers later, and the line that is none.
TEST_F(ReaderTest, MmitestFrameRepair) {
    // A short piece waits (briefly) for exactly the missing rest.
    std::string piece = mmitestLine(20), rest = std::string(28, 'z') + "\n";
    writeAll(master, piece);
    writeWhenRead(master, gSerialDevice.fd[DEVICE_SERIAL], rest + "AT\n");
    EXPECT_EQ(piece.substr(0, 12) + std::string("\0\xA8", 2) + piece.substr(12) + rest, nextLine(true));
    EXPECT_EQ("AT", nextLine());

    // A longer line is no damaged frame: untouched, and the next line is not taken.
    std::string longLine = mmitestLine(60);
    writeAll(master, longLine + "AT\n");
    EXPECT_EQ(longLine, nextLine(true));
    EXPECT_EQ("AT", nextLine());
}

// A raw frame is no typed text: a 0x08 inside it edits only the text before its
// first NUL, and the frame keeps its length and every byte from that NUL on.
TEST_F(ReaderTest, BackspaceInARawFrameLeavesTheFrameWhole) {
    std::string frame = std::string("at^mmitest=\b\0\xA8", 14);
    while (frame.size() < 50) frame += (char)('C' + frame.size() % 20);
    frame += "\n";
    writeAll(master, frame);
    EXPECT_EQ(std::string("at^mmitest\0\b\0\xA8", 14) + frame.substr(14), nextLine(true));

    writeAll(adbHost, "AT+CX\bSQ\r");  // text still shortens
    EXPECT_EQ("AT+CSQ", nextLine());
    EXPECT_EQ(7, gSerialDevice.cmdLen);
}

// A short frame on adb whose rest never comes does not hold up the links, and
// what the repair read past the frame's line end is the station's next lines.
TEST_F(ReaderTest, ShortFrameOnAdbWaitsBriefAndKeepsTheNextLines) {
    writeAll(adbHost, "at^mmitest=AB\r");
    writeWhenRead(adbHost, gSerialDevice.fd[DEVICE_ADB], "AT+CSQ\rAT\r");
    EXPECT_EQ(std::string("at^mmitest=A\0\xA8" "B\r", 16), nextLine(true));
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
    writeWhenRead(adbHost, gSerialDevice.fd[DEVICE_ADB], "Q\r");
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &full));
    std::string line = nextLine();
    setrlimit(RLIMIT_NOFILE, &saved);
    close(client);
    EXPECT_EQ("AT+CSQ", line);
    EXPECT_EQ(DEVICE_ADB, gSerialDevice.currDevice);
}

// Merged SMS text that would outgrow the buffer. (Merging itself, prompts, Ctrl-Z,
// ESC and backspaces on both links: sms.tx.)
using SmsMergeTest = ReaderTest;

TEST_F(SmsMergeTest, MergedCommandNeverOutgrowsTheBuffer) {
    // Holds cmd in cmdBuf as routing leaves it and tries to start merging.
    auto startMerge = [](const std::string &cmd) {
        snprintf(gSerialDevice.cmdBuf, sizeof(gSerialDevice.cmdBuf), "%s", cmd.c_str());
        return startMergeMsgCmdInputIfNeed(&gSerialDevice, gSerialDevice.cmdBuf) != 0;
    };
    // One text line in a line buffer of the reader's size, zero-filled behind it.
    auto textLine = [](std::string text) {
        const int n = (int)text.size();
        text.resize(DATA_BUF_SIZE);
        return std::string(handleMsgTextLine(&gSerialDevice, &text[0], n));
    };
    std::string fits(6000, 'a');
    ASSERT_TRUE(isNeedMergeMsgCmdInput = startMerge("AT+CMGS=23"));
    textLine(fits + "\n");
    textLine(std::string(200, 'b') + "\n");  // would overflow: left out
    EXPECT_EQ("AT+EMGS=23,\"" + fits + "\nend\"\r\n", textLine("end\x1A"));
    // A held command with no room for suffix and closing is relayed instead.
    EXPECT_FALSE(startMerge("AT+CMGS=" + std::string(6136, '1')));
}

// The user-mode gate in front of the modem. No radio service runs under the test
// root, so a line that reaches the modem is answered "ERROR:No Modem" by the
// bridge: that is how this test sees it arrive.
using UserModeGateTest = ReaderTest;

TEST_F(UserModeGateTest, RefusedMmiCommandLeavesNoTextForTheNextCommand) {
    auto route = [&](const char *text) {
        snprintf(gSerialDevice.cmdBuf, sizeof(gSerialDevice.cmdBuf), "%s", text);
        gSerialDevice.currDevice = DEVICE_SERIAL;
        routeCommandLine(&gSerialDevice, gSerialDevice.cmdBuf);
        return drainFd(master);
    };
    mmiCmdSeqReset();
    property_set("ro.build.type", "user");
    EXPECT_EQ("\r\nNot access to modem in User Mode.\r\n", route("AT+CPIN=1234"));
    EXPECT_EQ(0, gMmiCmdSeq.cusMmiCmdPending);
    EXPECT_EQ(0, gMmiCmdSeq.EIdx);
    EXPECT_STREQ("", gMmiCmdSeq.cmd[0]);
    // The next modem command that passes is an ordinary one and gets no queue entry.
    EXPECT_EQ("\r\nERROR:No Modem\r\n", route("AT"));
    EXPECT_EQ(-1, gMmiCmdSeq.seq[0]);
}
