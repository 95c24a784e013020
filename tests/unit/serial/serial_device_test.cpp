// The serial port's terminal settings, applied to a real pseudo-terminal: port open,
// the echo switch and the MMI test option set with its restore.
#include <sys/socket.h>

#include "serial_test_util.h"

namespace {

using serial_test::readFor;

struct termios settingsOf(int fd) {
    struct termios t = {};
    EXPECT_EQ(0, tcgetattr(fd, &t));
    return t;
}

bool sameSettings(const struct termios &a, const struct termios &b) {
    return a.c_iflag == b.c_iflag && a.c_oflag == b.c_oflag && a.c_cflag == b.c_cflag && a.c_lflag == b.c_lflag &&
           memcmp(a.c_cc, b.c_cc, sizeof(a.c_cc)) == 0;
}

const tcflag_t kOflagCleared = OPOST | OLCUC | OCRNL | ONOCR | ONLRET;

class SerialDeviceTest : public serial_test::SerialFixture {
protected:
    void SetUp() override {
        SerialFixture::SetUp();
        ASSERT_TRUE(pty_.ok());
        before_ = settingsOf(pty_.master);
    }
    // Opens the pty slave as the serial port that supplied the current line.
    int openPort() {
        int fd = open_serial_device(&gSerialDevice, pty_.slavePath.c_str());
        EXPECT_GE(fd, 0);
        gSerialDevice.fd[DEVICE_SERIAL] = fd;
        return fd;
    }
    // The adb connection, a socket without terminal settings, as the current link.
    void useAdbSocket() {
        int sv[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
        own(sv[1]);
        gSerialDevice.fd[DEVICE_ADB] = sv[0];
        gSerialDevice.currDevice = DEVICE_ADB;
    }
    serial_test::Pty pty_;
    struct termios before_ = {};
};

TEST_F(SerialDeviceTest, OpenOtherPortMasksOutputAndEchoes) {
    // Echo off recorded for the gadget port does not apply to other ports.
    gSerialDevice.echoOption[DEVICE_SERIAL] = 0;
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    EXPECT_EQ(0, fcntl(fd, F_GETFL) & O_NONBLOCK) << "later I/O must block";
    const struct termios t = settingsOf(fd);
    EXPECT_EQ(before_.c_oflag & ~kOflagCleared, t.c_oflag);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), t.c_lflag);
    EXPECT_EQ(0x1A, t.c_cc[VEOL]);
    EXPECT_EQ(0x1B, t.c_cc[VEOL2]);
    EXPECT_EQ(before_.c_iflag, t.c_iflag);
    EXPECT_EQ(before_.c_cflag, t.c_cflag);

    EXPECT_EQ(-1, open_serial_device(&gSerialDevice, "/nonexistent/ttyX"));
    EXPECT_EQ(-1, open_serial_device(&gSerialDevice, nullptr));
}

// Ctrl-D from the host is a byte like any other: were it the terminal's end-of-file
// character, the read would return 0 at a line start, which the reader takes for a
// dead port (close, reopen, queued input flushed), and would cut a line short after
// its last character elsewhere.
TEST_F(SerialDeviceTest, ControlDIsDataNotEndOfFile) {
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    ASSERT_EQ(4, write(pty_.master, "\x04" "AT\n", 4));
    char buf[64];
    struct pollfd p = {fd, POLLIN, 0};
    ASSERT_EQ(1, poll(&p, 1, 500));
    EXPECT_EQ(4, read(fd, buf, sizeof(buf))) << "a Ctrl-D at a line start must not read as end of file";
    ASSERT_EQ(8, write(pty_.master, "AT+CSQ\x04\n", 8));
    EXPECT_EQ(std::string("AT+CSQ\x04\n"), readFor(fd, 8)) << "nor end a line before its delimiter";
    // A NUL byte stays ordinary too, with end-of-file switched off.
    ASSERT_EQ(4, write(pty_.master, "A\0T\n", 4));
    EXPECT_EQ(std::string("A\0T\n", 4), readFor(fd, 4));
}

TEST_F(SerialDeviceTest, EchoSwitchKeepsSmsLineEnds) {
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    const struct termios opened = settingsOf(fd);

    EXPECT_EQ(0, setEchoOption(0));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
    struct termios t = settingsOf(fd);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | IEXTEN), t.c_lflag);
    EXPECT_EQ(opened.c_oflag, t.c_oflag);
    EXPECT_EQ(opened.c_iflag, t.c_iflag);

    // After ATE0 an SMS body ended by Ctrl-Z, or cancelled with ESC, without newline,
    // still reaches the reader with that character last.
    ASSERT_EQ(6, write(pty_.master, "hello\x1a", 6));
    EXPECT_EQ("hello\x1a", readFor(fd, 6));
    ASSERT_EQ(4, write(pty_.master, "bye\x1b", 4));
    EXPECT_EQ("bye\x1b", readFor(fd, 4));
    ASSERT_EQ(3, write(pty_.master, "AT+", 3));
    EXPECT_EQ("", readFor(fd, 0, 100));

    EXPECT_EQ(0, setEchoOption(1));
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), settingsOf(fd).c_lflag);

    // On the adb socket the setting is recorded although no terminal takes it.
    useAdbSocket();
    EXPECT_EQ(-1, setEchoOption(1));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_ADB]);
}

TEST_F(SerialDeviceTest, MmiTestSetAndRestore) {
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    const struct termios opened = settingsOf(fd);

    setMMITESTOption(1);
    EXPECT_TRUE(sameSettings(opened, last_deviceOptions));
    struct termios t = settingsOf(fd);
    EXPECT_EQ(0u, t.c_iflag);
    EXPECT_EQ(opened.c_oflag & ~kOflagCleared, t.c_oflag);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON), t.c_lflag);
    EXPECT_EQ(0, t.c_cc[VERASE]);
    EXPECT_EQ(opened.c_cflag, t.c_cflag);

    // An echo switch in test mode is undone by the restore but stays recorded.
    EXPECT_EQ(0, setEchoOption(0));
    EXPECT_EQ(static_cast<tcflag_t>(ICANON), settingsOf(fd).c_lflag);

    // Enable on the adb socket: nothing readable there, the saved record is kept.
    useAdbSocket();
    setMMITESTOption(1);
    EXPECT_TRUE(sameSettings(opened, last_deviceOptions));

    gSerialDevice.currDevice = DEVICE_SERIAL;
    setMMITESTOption(0);
    EXPECT_TRUE(sameSettings(opened, settingsOf(fd)));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
}

TEST_F(SerialDeviceTest, RestoreWithoutEnableLeavesPortAlone) {
    const int fd = openPort();
    ASSERT_GE(fd, 0);
    const struct termios opened = settingsOf(fd);
    // Nothing was saved: an empty record would switch off the receiver and speed.
    setMMITESTOption(0);
    EXPECT_TRUE(sameSettings(opened, settingsOf(fd)));
}

}  // namespace
