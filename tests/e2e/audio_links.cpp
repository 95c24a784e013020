// Audio and device-maker test commands end to end: what the audio services
// receive (exact bytes and length), what the host reads back (byte for byte), the
// MMI test port settings around the answer, the repaired MMI test frame, and the
// raw writer waiting for a host that does not read.
#include <gtest/gtest.h>

#include <poll.h>
#include <time.h>
#include <unistd.h>

#include <sstream>
#include <string>

#include "sim_device.h"

namespace {

std::string bytes(const char *data, size_t n) { return std::string(data, n); }

std::string lastLine(const std::string &text) {
    std::string t = text;
    if (!t.empty() && t.back() == '\n') t.pop_back();
    size_t nl = t.rfind('\n');
    return nl == std::string::npos ? t : t.substr(nl + 1);
}

std::string ttyField(SimDevice &dev, const std::string &name) {
    std::istringstream in(dev.sim({"tty-settings"}));
    std::string line;
    while (std::getline(in, line)) {
        if (line.compare(0, name.size() + 1, name + "=") == 0) return line.substr(name.size() + 1);
    }
    return "?";
}

long long nowMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

TEST(AudioLinks, AnswersReachTheHostByteForByte) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    dev.writeFile("/sim/audio/script",
                  "AT^ALLVER? => \\r\\n^ALLVER: V1\\x00\\x0d\\x0a\\x00end\n"
                  "AUD+BIN => AUD\\x00\\r\\n\\x01\n"
                  "AUD+TXT => \\r\\nvolume 3\\r\\n\n"
                  "AUD+LONG => (long 7000) AUD\\x00\\r\\n\n");
    dev.writeFile("/sim/audio/md2.script", "AT+EADP* => \\r\\n+EADP: 2\\r\\n\\r\\nOK\\r\\n\n");

    // Device-maker commands: raw, with the line's CR delimiter sent along.
    EXPECT_EQ(bytes("\r\n^ALLVER: V1\0\r\n\0end", 20), dev.at("AT^ALLVER?", true));
    // Audio commands: the writer passes "AUD..." answers raw, frames the others.
    EXPECT_EQ(bytes("AUD\0\r\n\x01", 7), dev.at("AUD+BIN", true));
    EXPECT_EQ("\r\nvolume 3\r\n", dev.at("AUD+TXT", true));
    // A raw answer longer than one read stays raw to its last byte.
    std::string longAnswer = bytes("AUD\0\r\n", 6);
    while (longAnswer.size() < 7000) longAnswer.push_back(static_cast<char>('a' + longAnswer.size() % 26));
    EXPECT_TRUE(longAnswer == dev.at("AUD+LONG", true));
    EXPECT_EQ("\r\nOK\r\n", dev.at("MM+LOOP=1", true));
    EXPECT_EQ("\r\n+EADP: 2\r\n\r\nOK\r\n", dev.at("AT+EADP=1", true));
    EXPECT_EQ("\r\nOK\r\n", dev.at("AT+EAPS=0", true));

    EXPECT_EQ("11 AT^ALLVER?\\r\n"
              "8 AUD+BIN\\x00\n"
              "8 AUD+TXT\\x00\n"
              "9 AUD+LONG\\x00\n"
              "10 MM+LOOP=1\\x00\n",
              dev.readFile("/journal/audio.log"));
    EXPECT_EQ("10 AT+EADP=1\\x00\n"
              "10 AT+EAPS=0\\x00\n",
              dev.readFile("/journal/audio-md2.log"));
}

// The MMI test settings are in force before AT^MMITESTENABLE=1 is sent and stay
// until the answer to AT^MMITESTENABLE=0 has been written. In between, the
// station's raw test frames reach the audio service whole.
TEST(AudioLinks, MmiTestModeAroundItsAnswersAndTheRepairedFrame) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    dev.writeFile("/sim/audio/script",
                  "AT^MMITESTENABLE=1 => (delay 1000) \\r\\nOK\\r\\n\n"
                  "AT^MMITESTENABLE=0 => (delay 1000) \\r\\nOK\\r\\n\n");
    const std::string lflagBefore = ttyField(dev, "c_lflag");
    const std::string iflagBefore = ttyField(dev, "c_iflag");
    const std::string eraseBefore = ttyField(dev, "VERASE");
    EXPECT_EQ("0x800a", lflagBefore);

    int fd = dev.openSerial();
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(writeAll(fd, "AT^MMITESTENABLE=1\r"));
    usleep(400 * 1000);
    EXPECT_EQ("0x2", ttyField(dev, "c_lflag")) << "switched before the command is sent";
    EXPECT_EQ("0x0", ttyField(dev, "c_iflag"));
    EXPECT_EQ("0x00", ttyField(dev, "VERASE"));
    EXPECT_EQ("AT^MMITESTENABLE=1\n\r\nOK\r\n", readUntil(fd, "OK\r\n", 5000));

    // A frame that lost its 0x00 0xA8 on the way arrives as 49 bytes; the daemon
    // puts them back and the audio service receives 51.
    std::string frame = "at^mmitest=A";
    for (char c = 'B'; c <= 'Z'; c++) frame.push_back(c);
    for (char c = 'a'; c <= 'k'; c++) frame.push_back(c);
    frame.push_back('\n');
    ASSERT_EQ(49u, frame.size());
    ASSERT_TRUE(writeAll(fd, frame));
    const char answer[] = {'\xff', '\x99', 'A', '\x00', '\xa8', 'B', '\x00', '\r', '\n', '\x00', 51, '\r', '\n'};
    EXPECT_EQ(bytes(answer, sizeof(answer)), readQuiet(fd, 500));
    EXPECT_EQ("51 at^mmitest=A\\x00\\xa8BCDEFGHIJKLMNOPQRSTUVWXYZabcdefghijk\\n",
              lastLine(dev.readFile("/journal/audio.log")));

    // In the MMI test settings a line ends at LF only, and nothing is echoed.
    ASSERT_TRUE(writeAll(fd, "AT^MMITESTENABLE=0\n"));
    usleep(400 * 1000);
    EXPECT_EQ("0x2", ttyField(dev, "c_lflag")) << "kept while the answer is awaited";
    EXPECT_EQ("\r\nOK\r\n", readUntil(fd, "OK\r\n", 5000));
    std::string lflag;
    for (int i = 0; i < 100 && (lflag = ttyField(dev, "c_lflag")) != lflagBefore; i++) usleep(20 * 1000);
    EXPECT_EQ(lflagBefore, lflag) << "restored after the answer";
    EXPECT_EQ(iflagBefore, ttyField(dev, "c_iflag"));
    EXPECT_EQ(eraseBefore, ttyField(dev, "VERASE"));
    EXPECT_EQ("19 AT^MMITESTENABLE=0\\n", lastLine(dev.readFile("/journal/audio.log")));
    close(fd);
}

// Device-maker answers are written whole even when the host stops reading for a
// while: the writer waits and goes on, and each byte arrives once, in order.
TEST(AudioLinks, RawWriterWaitsForAHostThatDoesNotRead) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    dev.writeFile("/sim/audio/script",
                  "AT^TBATLVL => (long 6000) \\xff\\x00\\r\\n1\n"
                  "AT^TCHRENABLE => (long 6000) \\xfe\\x00\\r\\n2\n"
                  "AT^BSN? => (long 6000) \\xfd\\x00\\r\\n3\n");
    auto answer = [](const std::string &head) {
        std::string s = head;
        while (s.size() < 6000) s.push_back(static_cast<char>('a' + s.size() % 26));
        return s;
    };
    const std::string expect = answer(bytes("\xff\0\r\n1", 5)) + answer(bytes("\xfe\0\r\n2", 5)) +
                               answer(bytes("\xfd\0\r\n3", 5));

    int fd = dev.openSerial();
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(writeAll(fd, "ATE0\r"));
    ASSERT_NE(std::string::npos, readUntil(fd, "OK\r\n", 5000).find("OK"));

    int status = -1;
    dev.sim({"pause-host", "1500"}, &status);
    ASSERT_EQ(0, status);
    long long start = nowMs();
    ASSERT_TRUE(writeAll(fd, "AT^TBATLVL\rAT^TCHRENABLE\rAT^BSN?\r"));
    struct pollfd p = {fd, POLLIN, 0};
    ASSERT_EQ(1, poll(&p, 1, 5000));
    EXPECT_GE(nowMs() - start, 1200) << "nothing reaches the host while it is paused";
    std::string got = readQuiet(fd, 1000, 15000);
    EXPECT_EQ(expect.size(), got.size());
    EXPECT_TRUE(got == expect) << "the three answers, each byte once and in order";

    std::string log = dev.log();
    size_t count = 0;
    for (size_t pos = 0; (pos = log.find("write data to serial 6000 bytes successfully", pos)) != std::string::npos;
         pos++)
        count++;
    EXPECT_EQ(3u, count) << "each answer went out through the raw writer";
    close(fd);
}

}  // namespace
