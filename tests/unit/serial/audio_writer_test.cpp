// The raw audio writer: byte-exact delivery, waiting out a full link, partial writes,
// and recovery from fatal write errors on both kinds of link.
#include <signal.h>
#include <sys/socket.h>

#include <chrono>
#include <thread>

#include "serial_test_util.h"

namespace {

using serial_test::bytes;
using serial_test::Pty;
using serial_test::readFor;
using serial_test::SerialFixture;

std::string pattern(size_t n) {
    std::string s(n, '\0');
    for (size_t i = 0; i < n; i++) s[i] = static_cast<char>((i * 7 + i / 251) & 0xFF);
    return s;
}

class AudioWriterTest : public SerialFixture {};

TEST_F(AudioWriterTest, BytesPassUnchanged) {
    int sv[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
    own(sv[1]);
    gSerialDevice.fd[DEVICE_SERIAL] = sv[0];
    // A 51-byte test frame with NUL, CR and LF bytes inside and at its ends.
    std::string frame = bytes("\0\r\nMM\x01\xff\r\n", 9) + pattern(40) + bytes("\r\n", 2);
    ASSERT_EQ(51u, frame.size());
    writeDataToSerialByAudioType(frame.data(), static_cast<int>(frame.size()));
    EXPECT_EQ(frame, readFor(sv[1], 0, 100));

    // Nothing to write: nothing is sent.
    writeDataToSerialByAudioType(frame.data(), 0);
    writeDataToSerialByAudioType(nullptr, 5);
    EXPECT_EQ("", readFor(sv[1], 0, 50));
}

TEST_F(AudioWriterTest, NoLinkWritesNothing) {
    int sv[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
    own(sv[1]);
    gSerialDevice.fd[DEVICE_SERIAL] = sv[0];
    gSerialDevice.currDevice = DEVICE_ADB;
    writeDataToSerialByAudioType("AUD", 3);
    EXPECT_EQ("", readFor(sv[1], 0, 50));
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);
    EXPECT_EQ(sv[0], gSerialDevice.fd[DEVICE_SERIAL]);
}

TEST_F(AudioWriterTest, FullLinkGetsEveryByteOnceInOrder) {
    // A non-blocking link with a small send buffer: writes come back short or with
    // EAGAIN until the host reads, which it starts doing only after the first wait
    // budget of the writer has run out.
    int sv[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
    own(sv[1]);
    int small = 4096;
    ASSERT_EQ(0, setsockopt(sv[0], SOL_SOCKET, SO_SNDBUF, &small, sizeof(small)));
    ASSERT_EQ(0, fcntl(sv[0], F_SETFL, fcntl(sv[0], F_GETFL) | O_NONBLOCK));
    gSerialDevice.fd[DEVICE_ADB] = sv[0];
    gSerialDevice.currDevice = DEVICE_ADB;

    const std::string data = pattern(200000);
    std::string received;
    std::thread host([&] {
        std::this_thread::sleep_for(std::chrono::milliseconds(400));
        received = readFor(sv[1], data.size(), 2000);
    });
    const auto start = std::chrono::steady_clock::now();
    writeDataToSerialByAudioType(data.data(), static_cast<int>(data.size()));
    const auto took = std::chrono::steady_clock::now() - start;
    host.join();

    EXPECT_EQ(data.size(), received.size());
    EXPECT_TRUE(data == received) << "bytes lost, repeated or reordered";
    EXPECT_GE(took, std::chrono::milliseconds(350));
    EXPECT_LT(took, std::chrono::seconds(5));
    EXPECT_EQ(sv[0], gSerialDevice.fd[DEVICE_ADB]);
}

TEST_F(AudioWriterTest, FatalErrorOnAdbDropsConnection) {
    struct sigaction ignore = {}, old = {};
    ignore.sa_handler = SIG_IGN;
    ASSERT_EQ(0, sigaction(SIGPIPE, &ignore, &old));
    int sv[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sv));
    close(sv[1]);
    gSerialDevice.fd[DEVICE_ADB] = sv[0];
    gSerialDevice.currDevice = DEVICE_ADB;

    writeDataToSerialByAudioType("AUD+X", 5);
    EXPECT_EQ(-1, gSerialDevice.fd[DEVICE_ADB]);
    EXPECT_EQ(-1, fcntl(sv[0], F_GETFD)) << "the broken connection must be closed";
    sigaction(SIGPIPE, &old, nullptr);
}

TEST_F(AudioWriterTest, FatalErrorOnSerialReopensInMmiTestSet) {
    Pty pty;
    ASSERT_TRUE(pty.ok());
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "%s", pty.slavePath().c_str());
    // A descriptor that cannot be written: the write fails with EBADF.
    const int broken = open("/dev/null", O_RDONLY);
    ASSERT_GE(broken, 0);
    gSerialDevice.fd[DEVICE_SERIAL] = broken;

    const std::string frame = bytes("\x10\0\r\n\x1a\x1b\r", 7);
    writeDataToSerialByAudioType(frame.data(), static_cast<int>(frame.size()));

    const int reopened = gSerialDevice.fd[DEVICE_SERIAL];
    ASSERT_GE(reopened, 0);
    EXPECT_EQ(frame, readFor(pty.master(), frame.size()));
    struct termios t;
    ASSERT_EQ(0, tcgetattr(reopened, &t));
    EXPECT_EQ(0u, t.c_iflag);
    EXPECT_EQ(static_cast<tcflag_t>(ICANON), t.c_lflag);
    EXPECT_EQ(0u, t.c_oflag & OPOST);
    // What the restore will bring back is the freshly opened port.
    EXPECT_EQ(static_cast<tcflag_t>(ICANON | ECHO | IEXTEN), last_deviceOptions.c_lflag);
}

TEST_F(AudioWriterTest, SerialThatCannotBeRestoredEndsProcess) {
    GTEST_FLAG_SET(death_test_style, "threadsafe");
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "/nonexistent/ttyGS9");
    const int broken = open("/dev/null", O_RDONLY);
    ASSERT_GE(broken, 0);
    gSerialDevice.fd[DEVICE_SERIAL] = broken;
    EXPECT_EXIT(writeDataToSerialByAudioType("AUD", 3), ::testing::ExitedWithCode(1), "");
}

}  // namespace
