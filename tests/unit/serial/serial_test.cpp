// The serial link: the port's terminal settings on a real pseudo-terminal (open,
// the echo switch, the MMI test option), the text writer's framing and numeric
// codes, and the raw audio writer's fatal errors. What the port and the writers
// do around whole commands is checked end to end (audio, links and SMS tables).
#include <fcntl.h>
#include <signal.h>
#include <termios.h>

#include "eventually.h"
#include "host_capture.h"

namespace {

bool pollIn(int fd) {
    struct pollfd p = {fd, POLLIN, 0};
    return poll(&p, 1, 0) == 1;
}

struct termios settingsOf(int fd) {
    struct termios t = {};
    EXPECT_EQ(0, tcgetattr(fd, &t));
    return t;
}

// A freshly reset record per test, a pseudo-terminal standing in for the port, no
// device root (so that its path opens as it is), descriptors closed afterwards.
class SerialTest : public ::testing::Test {
protected:
    void SetUp() override {
        unsetenv("TOLKD_ROOT");
        reset();
        master_ = posix_openpt(O_RDWR | O_NOCTTY);
        ASSERT_TRUE(master_ >= 0 && grantpt(master_) == 0 && unlockpt(master_) == 0);
        slavePath_ = ptsname(master_);
    }
    void TearDown() override {
        for (int &fd : gSerialDevice.fd) closeFd(fd);
        closeFd(master_);
        reset();
    }
    static void reset() {
        initSerialDevice(&gSerialDevice);
        memset(&last_deviceOptions, 0, sizeof(last_deviceOptions));
        gNumericMode = false;
    }
    // Opens the pty slave as the serial port that supplied the current line.
    int openPort() {
        int fd = open_serial_device(&gSerialDevice, slavePath_.c_str());
        EXPECT_GE(fd, 0);
        return gSerialDevice.fd[DEVICE_SERIAL] = fd;
    }

    int master_ = -1;
    std::string slavePath_;
};
using SerialDeviceTest = SerialTest;
using AudioWriterTest = SerialTest;

// The text writer to a SOCK_SEQPACKET host end, so that every write() of the
// writer arrives as one record: an answer must take exactly one.
class ResponseWriterTest : public SerialTest {
protected:
    void SetUp() override {
        SerialTest::SetUp();
        host_ = socketLink(&gSerialDevice.fd[DEVICE_SERIAL], SOCK_SEQPACKET);
    }
    void TearDown() override {
        closeFd(host_);
        SerialTest::TearDown();
    }
    std::string hostGets(const char *data, int len) {
        writeDataToSerial(data, len);
        static char buf[16384];
        const ssize_t n = recv(host_, buf, sizeof(buf), MSG_DONTWAIT);
        const std::string got = n > 0 ? std::string(buf, n) : "<nothing>";
        EXPECT_EQ(-1, recv(host_, buf, sizeof(buf), MSG_DONTWAIT)) << "one write, one answer";
        return got;
    }
    std::string hostGets(const std::string &data) { return hostGets(data.data(), static_cast<int>(data.size())); }
    int host_ = -1;
};

}  // namespace

// Ctrl-D from the host is a byte like any other: were it the terminal's end-of-file
// character, the read would return 0 at a line start, which the reader takes for a
// dead port (close, reopen, queued input flushed), and would cut a line short.
TEST_F(SerialDeviceTest, ControlDIsDataNotEndOfFile) {
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    EXPECT_EQ(0, fcntl(fd, F_GETFL) & O_NONBLOCK) << "later I/O must block";
    writeAll(master_, "\x04" "AT\n");
    char buf[64];
    struct pollfd p = {fd, POLLIN, 0};
    ASSERT_EQ(1, poll(&p, 1, 500));
    EXPECT_EQ(4, read(fd, buf, sizeof(buf))) << "a Ctrl-D at a line start must not read as end of file";
    writeAll(master_, "AT+CSQ\x04\n");
    EXPECT_EQ("AT+CSQ\x04\n", drainFd(fd)) << "nor end a line before its delimiter";
    EXPECT_EQ(-1, open_serial_device(&gSerialDevice, "/nonexistent/ttyX"));
}

// Linux ends a canonical line at VEOL2 (ESC) only with IEXTEN: without it an SMS
// body cancelled with ESC after ATE0 would never reach the reader (sms.tx sends
// such bodies after the switch).
TEST_F(SerialDeviceTest, EchoSwitchKeepsSmsLineEnds) {
    const int fd = openPort();
    const struct termios opened = settingsOf(fd);
    writeAll(master_, "AT+CSQ\n");  // typed right behind ATE0: it must still be read
    ASSERT_TRUE(eventually([&] { return pollIn(fd); }));
    EXPECT_EQ(0, setEchoOption(0));
    EXPECT_EQ("AT+CSQ\n", drainFd(fd));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
    struct termios t = settingsOf(fd);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | IEXTEN), t.c_lflag);
    EXPECT_EQ(opened.c_oflag, t.c_oflag);
    EXPECT_EQ(opened.c_iflag, t.c_iflag);
    EXPECT_EQ(0, setEchoOption(1));
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), settingsOf(fd).c_lflag);
}

TEST_F(SerialDeviceTest, RestoreWithoutEnableLeavesPortAlone) {
    const int fd = openPort();
    const struct termios opened = settingsOf(fd);
    // Nothing was saved: an empty record would switch off line mode, the receiver and speed.
    setMMITESTOption(0);
    const struct termios now = settingsOf(fd);
    EXPECT_EQ(opened.c_lflag, now.c_lflag);
    EXPECT_EQ(opened.c_cflag, now.c_cflag);
}

TEST_F(ResponseWriterTest, FramesAnswersOnce) {
    const std::pair<std::string, std::string> cases[] = {
        {"OK", "\r\nOK\r\n"},
        {"\r\n", "\r\n\r\n"},
        {"\r\n\r\nX\r\n\r\n", "\r\n\r\nX\r\n\r\n"},  // one CR LF off each end only
        {"X\r\n", "\r\nX\r\n"},
        {"\n\r", "\r\n\n\r\r\n"},
        // Text ends at its first NUL (a counted NUL after the text: "ERROR:No Modem"
        // in modem.tx, the SMS prompt in sms.tx).
        {std::string("AB\0CD\r\n", 7), "\r\nAB\r\n"},
        {"", "\r\n\r\n"},
        // Audio answers pass raw (AUD: audio.tx); their prefixes count within the
        // length only, and case-exactly.
        {std::string("mm\0\r\nOK\r\n", 9), std::string("mm\0\r\nOK\r\n", 9)},
        {"Mm", "\r\nMm\r\n"},
    };
    for (const auto &c : cases) EXPECT_EQ(c.second, hostGets(c.first)) << c.first;
    EXPECT_EQ("\r\nAU\r\n", hostGets("AUD", 2));
    EXPECT_EQ("\r\n\r\n", hostGets(nullptr, 12));
    EXPECT_EQ("\r\n\r\n", hostGets("OK", -3));
    EXPECT_EQ("\r\nO\r\n", hostGets("OK", 1));
    // Beyond one full data buffer only the first 6145 bytes are looked at.
    std::string big = "\r\n" + std::string(8000, 'A');
    EXPECT_EQ("\r\n" + std::string(DATA_BUF_SIZE - 2, 'A') + "\r\n", hostGets(big));
}

TEST_F(ResponseWriterTest, NumericMode) {
    gNumericMode = true;
    const char *verbose[] = {"OK", "CONNECT", "RING", "NO CARRIER", "ERROR", "NO DIALTONE", "BUSY", "NO ANSWER"};
    const char digits[] = "01234678";  // there is no code 5
    for (size_t i = 0; i < 8; i++) {
        EXPECT_EQ(std::string("\r\n") + digits[i] + "\r\n", hostGets(std::string("\r\n") + verbose[i] + "\r\n"));
    }
    // Only a body that is exactly a table text is converted; audio answers stay raw.
    for (const char *same : {"ok", "OK ", "CONNECT 9600"}) {
        EXPECT_EQ(std::string("\r\n") + same + "\r\n", hostGets(same));
    }
    EXPECT_EQ("aud", hostGets("aud"));
}

// A broken or closed adb connection is dropped, never waited on.
TEST_F(AudioWriterTest, FatalErrorOnAdbDropsConnection) {
    struct sigaction ignore = {}, old = {};
    ignore.sa_handler = SIG_IGN;
    ASSERT_EQ(0, sigaction(SIGPIPE, &ignore, &old));
    close(socketLink(&gSerialDevice.fd[DEVICE_ADB]));
    gSerialDevice.currDevice = DEVICE_ADB;
    const int fd = gSerialDevice.fd[DEVICE_ADB];
    writeDataToSerialByAudioType("AUD+X", 5);
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);
    EXPECT_EQ(-1, fcntl(fd, F_GETFD)) << "the broken connection must be closed";
    sigaction(SIGPIPE, &old, nullptr);

    gSerialDevice.fd[DEVICE_ADB] = fd;  // no longer open: select reports EBADF
    writeDataToSerialByAudioType("AUD+X", 5);
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);
}

// Every reopen of the port (the audio writer's after a fatal write, the reader's
// after a fatal read, a replug) leaves it in the settings of the mode it was in.
TEST_F(AudioWriterTest, FatalErrorOnSerialReopensInTheModeThePortWasIn) {
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "%s", slavePath_.c_str());
    // A descriptor that cannot be written: the write fails with EBADF.
    auto breakPort = [&] {
        closeFd(gSerialDevice.fd[DEVICE_SERIAL]);
        gSerialDevice.fd[DEVICE_SERIAL] = open("/dev/null", O_RDONLY);
    };
    const std::string frame("\x10\0\r\n\x1a\x1b\r", 7);
    openPort();
    setMMITESTOption(1);
    breakPort();
    writeDataToSerialByAudioType(frame.data(), 7);
    int reopened = gSerialDevice.fd[DEVICE_SERIAL];
    ASSERT_GE(reopened, 0);
    EXPECT_EQ(frame, drainFd(master_));
    struct termios t = settingsOf(reopened);
    EXPECT_EQ(0u, t.c_iflag);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON), t.c_lflag);
    // What a later restore brings back are the line settings of before the test.
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), last_deviceOptions.c_lflag);
    EXPECT_NE(0u, last_deviceOptions.c_iflag & ICRNL);
    // Neither an erase nor a kill character: a frame holding 0x7F or 0x15 is whole.
    const std::string mmiFrame = std::string("at^mmitest=\x15\x7f\x08", 14) + std::string(36, 'F') + "\n";
    writeAll(master_, mmiFrame);
    EXPECT_EQ(mmiFrame, drainFd(reopened));

    // Restored, the mode is off, and the next reopen gives the line settings: in
    // the MMI settings CR would end no line.
    setMMITESTOption(0);
    breakPort();
    writeDataToSerialByAudioType(frame.data(), 7);
    reopened = gSerialDevice.fd[DEVICE_SERIAL];
    EXPECT_EQ(frame, drainFd(master_));
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), settingsOf(reopened).c_lflag);
    EXPECT_NE(0u, settingsOf(reopened).c_iflag & ICRNL);

    // A port that cannot be opened again ends the process.
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "/nonexistent/ttyGS9");
    close(reopened);
    gSerialDevice.fd[DEVICE_SERIAL] = open("/dev/null", O_RDONLY);
    EXPECT_EXIT(writeDataToSerialByAudioType("AUD", 3), ::testing::ExitedWithCode(1), "");
}
