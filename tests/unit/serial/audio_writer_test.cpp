// The raw audio writer: byte-exact delivery, waiting out a full link, partial writes,
// and recovery from fatal write errors on both kinds of link.
#include <signal.h>
#include <sys/socket.h>

#include <chrono>
#include <thread>

#include "serial_test_util.h"

namespace {

using serial_test::readFor;

std::string pattern(size_t n) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; i++) s[i] = static_cast<char>((i * 7 + i / 251) & 0xFF);
    return s;
}

class AudioWriterTest : public serial_test::SerialFixture {
protected:
    // A socket pair as the link of the current line; returns the host end.
    int link(int device) {
        int sv[2];
        EXPECT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
        gSerialDevice.fd[device] = sv[0];
        gSerialDevice.currDevice = device;
        return own(sv[1]);
    }
    void write(const std::string &data) { writeDataToSerialByAudioType(data.data(), static_cast<int>(data.size())); }
};

TEST_F(AudioWriterTest, FullLinkGetsEveryByteOnceInOrder) {
    // A non-blocking link with a small send buffer: writes come back short or with
    // EAGAIN until the host starts reading, after the first wait budget is spent.
    const int host = link(DEVICE_ADB);
    const int fd = gSerialDevice.fd[DEVICE_ADB];
    int small = 4096;
    ASSERT_EQ(0, setsockopt(fd, SOL_SOCKET, SO_SNDBUF, &small, sizeof(small)));
    ASSERT_EQ(0, fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK));

    const std::string data = pattern(200000);
    std::string received;
    std::thread reader([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(400));
        received = readFor(host, data.size(), 2000);
    });
    const auto start = std::chrono::steady_clock::now();
    write(data);
    const auto took = std::chrono::steady_clock::now() - start;
    reader.join();

    EXPECT_EQ(data.size(), received.size());
    EXPECT_TRUE(data == received) << "bytes lost, repeated or reordered";
    EXPECT_GE(took, std::chrono::milliseconds(350));
    EXPECT_EQ(fd, gSerialDevice.fd[DEVICE_ADB]);
}

TEST_F(AudioWriterTest, FatalErrorOnAdbDropsConnection) {
    struct sigaction ignore = {}, old = {};
    ignore.sa_handler = SIG_IGN;
    ASSERT_EQ(0, sigaction(SIGPIPE, &ignore, &old));
    int sv[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
    close(sv[1]);
    const int fd = gSerialDevice.fd[DEVICE_ADB] = sv[0];
    gSerialDevice.currDevice = DEVICE_ADB;

    write("AUD+X");
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);
    EXPECT_EQ(-1, fcntl(fd, F_GETFD)) << "the broken connection must be closed";
    sigaction(SIGPIPE, &old, nullptr);
}

TEST_F(AudioWriterTest, FatalErrorOnSerialReopensInMmiTestSet) {
    serial_test::Pty pty;
    ASSERT_TRUE(pty.ok());
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "%s", pty.slavePath.c_str());
    // A descriptor that cannot be written: the write fails with EBADF.
    gSerialDevice.fd[DEVICE_SERIAL] = open("/dev/null", O_RDONLY);
    ASSERT_GE(gSerialDevice.fd[DEVICE_SERIAL], 0);

    const std::string frame("\x10\0\r\n\x1a\x1b\r", 7);
    write(frame);
    const int reopened = gSerialDevice.fd[DEVICE_SERIAL];
    ASSERT_GE(reopened, 0);
    EXPECT_EQ(frame, readFor(pty.master, frame.size()));
    struct termios t = {};
    ASSERT_EQ(0, tcgetattr(reopened, &t));
    EXPECT_EQ(0u, t.c_iflag);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON), t.c_lflag);
    // What a later restore brings back is the freshly opened port.
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), last_deviceOptions.c_lflag);
}

TEST_F(AudioWriterTest, SerialThatCannotBeRestoredEndsProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "/nonexistent/ttyGS9");
    gSerialDevice.fd[DEVICE_SERIAL] = open("/dev/null", O_RDONLY);
    ASSERT_GE(gSerialDevice.fd[DEVICE_SERIAL], 0);
    EXPECT_EXIT(write("AUD"), ::testing::ExitedWithCode(1), "");
}

}  // namespace
