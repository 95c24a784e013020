// The text writer: framing, numeric result codes, raw audio answers and the
// final-result prefixes. The host end of the link is a SOCK_SEQPACKET socket, so
// every write() of the writer arrives as one record.
#include <sys/socket.h>

#include "serial_test_util.h"

namespace {

using Records = std::vector<std::string>;

class ResponseWriterTest : public serial_test::SerialFixture {
protected:
    void SetUp() override {
        SerialFixture::SetUp();
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET, 0, serial_));
        gSerialDevice.fd[DEVICE_SERIAL] = serial_[0];
        own(serial_[1]);
    }
    static Records records(int fd) {
        Records out;
        static char buf[16384];
        ssize_t n;
        while ((n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT)) > 0) out.emplace_back(buf, static_cast<size_t>(n));
        return out;
    }
    // What the serial host receives for one answer, which must take one write.
    std::string hostGets(const char *data, int len) {
        writeDataToSerial(data, len);
        Records got = records(serial_[1]);
        EXPECT_EQ(1u, got.size());
        return got.empty() ? "<nothing>" : got[0];
    }
    std::string hostGets(const std::string &data) { return hostGets(data.data(), static_cast<int>(data.size())); }

    int serial_[2] = {-1, -1};
};

TEST_F(ResponseWriterTest, FramesAnswersOnce) {
    const std::pair<std::string, std::string> cases[] = {
        {"\r\nOK\r\n", "\r\nOK\r\n"},
        {"OK", "\r\nOK\r\n"},
        {"\r\n", "\r\n\r\n"},
        {"\r\n+CSQ: 20,99\r\n\r\nOK\r\n", "\r\n+CSQ: 20,99\r\n\r\nOK\r\n"},
        {"\r\n\r\nX\r\n\r\n", "\r\n\r\nX\r\n\r\n"},  // one CR LF off each end only
        {"X\r\n", "\r\nX\r\n"},
        {"\n\r", "\r\n\n\r\r\n"},
        // A counted NUL defeats the tail test; text ends at its first NUL.
        {std::string("ERROR:No Modem", 15), "\r\nERROR:No Modem\r\n"},
        {std::string("\r\n> ", 5), "\r\n> \r\n"},
        {std::string("AB\0CD\r\n", 7), "\r\nAB\r\n"},
        {"", "\r\n\r\n"},
    };
    for (const auto &c : cases) EXPECT_EQ(c.second, hostGets(c.first)) << c.first;

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
        EXPECT_EQ(std::string("\r\n") + digits[i] + "\r\n", hostGets(verbose[i])) << verbose[i];
        EXPECT_EQ(std::string("\r\n") + digits[i] + "\r\n", hostGets(std::string("\r\n") + verbose[i] + "\r\n"));
    }
    // Only a body that is exactly a table text is converted.
    for (const char *same : {"ok", "OK ", "CONNECT 9600", "+CSQ: 20,99\r\n\r\nOK"}) {
        EXPECT_EQ(std::string("\r\n") + same + "\r\n", hostGets(same));
    }
}

TEST_F(ResponseWriterTest, AudioAnswersPassRaw) {
    for (bool numeric : {false, true}) {
        gNumericMode = numeric;
        for (const std::string &raw : {std::string("AUD+VOL\r\n\0\x01", 11), std::string("mm\0\r\nOK\r\n", 9),
                                       std::string("aud"), std::string("MM")}) {
            EXPECT_EQ(raw, hostGets(raw));
        }
    }
    gNumericMode = false;
    // Prefixes count within the given length only, and case-exactly.
    EXPECT_EQ("\r\nAU\r\n", hostGets("AUD", 2));
    EXPECT_EQ("\r\nMm\r\n", hostGets("Mm"));
}

// The relay's table covers the common prefixes; these are the edges.
TEST(FinalResult, PrefixMatch) {
    EXPECT_TRUE(isFinalResult("\r\n+CNMA: 0", 10));
    // The prefix must lie within the bytes received.
    EXPECT_FALSE(isFinalResult("\r\nOK", 3));
    EXPECT_FALSE(isFinalResult(nullptr, 10));
}

}  // namespace
