// The text writer: framing, numeric result codes, raw audio answers, the link chosen,
// and the final-result prefixes. The host side of each link is a SOCK_SEQPACKET
// socket, so every write() of the writer arrives as one record.
#include <sys/socket.h>

#include "serial_test_util.h"

namespace {

using serial_test::bytes;
using serial_test::SerialFixture;

class ResponseWriterTest : public SerialFixture {
protected:
    void SetUp() override {
        SerialFixture::SetUp();
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET, 0, serial_));
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_SEQPACKET, 0, adb_));
        gSerialDevice.fd[DEVICE_SERIAL] = serial_[0];
        gSerialDevice.fd[DEVICE_ADB] = adb_[0];
        own(serial_[1]);
        own(adb_[1]);
    }

    // The records that arrived on the host end of a link.
    static std::vector<std::string> records(int fd) {
        std::vector<std::string> out;
        static char buf[16384];
        for (;;) {
            ssize_t n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT);
            if (n <= 0) break;
            out.emplace_back(buf, static_cast<size_t>(n));
        }
        return out;
    }

    // What the host receives for one answer; fails when it took more than one write.
    std::string hostGets(const char *data, int len) {
        writeDataToSerial(data, len);
        std::vector<std::string> got = records(serial_[1]);
        EXPECT_EQ(1u, got.size()) << "answer not written as one record";
        return got.empty() ? std::string("<nothing>") : got[0];
    }
    std::string hostGets(const std::string &data) { return hostGets(data.data(), static_cast<int>(data.size())); }

    int serial_[2] = {-1, -1};
    int adb_[2] = {-1, -1};
};

TEST_F(ResponseWriterTest, FramesAnswersOnce) {
    EXPECT_EQ("\r\nOK\r\n", hostGets("\r\nOK\r\n"));
    EXPECT_EQ("\r\nOK\r\n", hostGets("OK"));
    EXPECT_EQ("\r\n\r\n", hostGets("\r\n"));
    EXPECT_EQ("\r\n+CSQ: 20,99\r\n\r\nOK\r\n", hostGets("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"));
    // Only one CR LF goes at each end; one-sided framing is completed.
    EXPECT_EQ("\r\n\r\nX\r\n\r\n", hostGets("\r\n\r\nX\r\n\r\n"));
    EXPECT_EQ("\r\nX\r\n", hostGets("\r\nX"));
    EXPECT_EQ("\r\nX\r\n", hostGets("X\r\n"));
    EXPECT_EQ("\r\n\n\r\r\n", hostGets("\n\r"));
}

TEST_F(ResponseWriterTest, CountedNulAndEmbeddedNul) {
    // Fixed error texts come with their NUL counted: the tail test fails, nothing is cut.
    EXPECT_EQ("\r\nERROR:No Modem\r\n", hostGets("ERROR:No Modem", 15));
    EXPECT_EQ("\r\nERROR:UE is not ready\r\n", hostGets("ERROR:UE is not ready", 22));
    EXPECT_EQ("\r\n> \r\n", hostGets("\r\n> ", 5));
    // Text ends at its first NUL.
    EXPECT_EQ("\r\nAB\r\n", hostGets(bytes("AB\0CD\r\n", 7)));
    EXPECT_EQ("\r\n\r\n", hostGets(bytes("\r\n\0X\r\n", 6)));
}

TEST_F(ResponseWriterTest, DegenerateInputIsFramedEmpty) {
    EXPECT_EQ("\r\n\r\n", hostGets("", 0));
    EXPECT_EQ("\r\n\r\n", hostGets(nullptr, 0));
    EXPECT_EQ("\r\n\r\n", hostGets(nullptr, 12));
    EXPECT_EQ("\r\n\r\n", hostGets("OK", -3));
    EXPECT_EQ("\r\nO\r\n", hostGets("OK", 1));
}

TEST_F(ResponseWriterTest, OversizedLengthIsBounded) {
    // More than one full data buffer: only the first 6145 bytes are looked at.
    std::string big(8000, 'A');
    big[0] = '\r';
    big[1] = '\n';
    std::string got = hostGets(big);
    EXPECT_EQ("\r\n" + std::string(DATA_BUF_SIZE - 2, 'A') + "\r\n", got);

    // A full relayed answer with its framing passes whole.
    std::string full = "\r\n" + std::string(MAX_DATA_LEN - 4, 'b') + "\r\n";
    EXPECT_EQ(full, hostGets(full));
}

TEST_F(ResponseWriterTest, NumericMode) {
    gNumericMode = true;
    EXPECT_EQ("\r\n0\r\n", hostGets("\r\nOK\r\n"));
    EXPECT_EQ("\r\n0\r\n", hostGets("OK"));
    EXPECT_EQ("\r\n2\r\n", hostGets("\r\nRING\r\n"));
    EXPECT_EQ("\r\n6\r\n", hostGets("\r\nNO DIALTONE\r\n"));
    // Every verbose text maps to its V.250 code; there is no code 5.
    const char *verbose[] = {"OK", "CONNECT", "RING", "NO CARRIER", "ERROR", "NO DIALTONE", "BUSY", "NO ANSWER"};
    const char digits[] = {'0', '1', '2', '3', '4', '6', '7', '8'};
    for (size_t i = 0; i < 8; i++) {
        EXPECT_EQ(std::string("\r\n") + digits[i] + "\r\n", hostGets(verbose[i])) << verbose[i];
    }
    // Only a body that is exactly a table text is converted.
    EXPECT_EQ("\r\nok\r\n", hostGets("ok"));
    EXPECT_EQ("\r\nOK \r\n", hostGets("OK "));
    EXPECT_EQ("\r\nCONNECT 9600\r\n", hostGets("\r\nCONNECT 9600\r\n"));
    EXPECT_EQ("\r\n+CSQ: 20,99\r\n\r\nOK\r\n", hostGets("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"));
    EXPECT_EQ("\r\n\r\n", hostGets("\r\n"));

    gNumericMode = false;
    EXPECT_EQ("\r\nOK\r\n", hostGets("\r\nOK\r\n"));
}

TEST_F(ResponseWriterTest, ResponseTypesInBothModes) {
    struct Case {
        int type;
        const char *verbose;
        const char *numeric;
    };
    const Case cases[] = {
        {RESPONSE_OK, "\r\nOK\r\n", "\r\n0\r\n"},
        {RESPONSE_DONE, "\r\n\r\n", "\r\n\r\n"},
        {RESPONSE_ERROR, "\r\nERROR\r\n", "\r\n4\r\n"},
        {RESPONSE_NOT_IMPLEMENTED, "\r\nNot Implement\r\n", "\r\nNot Implement\r\n"},
        {RESPONSE_INVALID, "\r\nUNKNOWN\r\n", "\r\nUNKNOWN\r\n"},
        {2, "\r\nUNKNOWN\r\n", "\r\nUNKNOWN\r\n"},
    };
    for (const Case &c : cases) {
        gNumericMode = false;
        writeDataToserialByResponseType(c.type);
        EXPECT_EQ(std::vector<std::string>{c.verbose}, records(serial_[1])) << c.type;
        gNumericMode = true;
        writeDataToserialByResponseType(c.type);
        EXPECT_EQ(std::vector<std::string>{c.numeric}, records(serial_[1])) << c.type;
    }
}

TEST_F(ResponseWriterTest, AudioAnswersPassRaw) {
    for (bool numeric : {false, true}) {
        gNumericMode = numeric;
        const std::string aud = bytes("AUD+VOL\r\n\0\x01", 11);
        EXPECT_EQ(aud, hostGets(aud));
        const std::string mm = bytes("mm\0\r\nOK\r\n", 9);
        EXPECT_EQ(mm, hostGets(mm));
        EXPECT_EQ("aud", hostGets("aud"));
        EXPECT_EQ("MM", hostGets("MM"));
    }
    gNumericMode = false;
    // Prefixes are matched within the given length and case-exactly.
    EXPECT_EQ("\r\nAU\r\n", hostGets("AUD", 2));
    EXPECT_EQ("\r\nMm\r\n", hostGets("Mm"));
    EXPECT_EQ("\r\nAud\r\n", hostGets("Aud"));
}

TEST_F(ResponseWriterTest, WritesToLinkOfCurrentLine) {
    // A line read after an accept on the listener is answered on the connection.
    for (int dev : {DEVICE_ADB_LISTEN, DEVICE_ADB}) {
        gSerialDevice.currDevice = dev;
        writeDataToSerial("OK", 2);
        EXPECT_EQ(std::vector<std::string>{"\r\nOK\r\n"}, records(adb_[1])) << dev;
        EXPECT_TRUE(records(serial_[1]).empty());
    }

    // A closed adb connection: nothing is written anywhere.
    close(gSerialDevice.fd[DEVICE_ADB]);
    gSerialDevice.fd[DEVICE_ADB] = -1;
    EXPECT_EQ(-1, writeDataToSerial("OK", 2));
    EXPECT_EQ(-1, writeDataToserialByResponseType(RESPONSE_OK));
    EXPECT_TRUE(records(serial_[1]).empty());
    EXPECT_TRUE(records(adb_[1]).empty());

    gSerialDevice.currDevice = DEVICE_SERIAL;
    EXPECT_EQ(6, writeDataToSerial("OK", 2));
    EXPECT_EQ(std::vector<std::string>{"\r\nOK\r\n"}, records(serial_[1]));
}

TEST(FinalResult, PrefixMatch) {
    EXPECT_TRUE(isFinalResult("+CMGS: 12\r\n", 11));
    EXPECT_TRUE(isFinalResult("\r\nOK\r\n", 6));
    EXPECT_TRUE(isFinalResult("\r\n+CMS ERROR: 500\r\n", 19));
    EXPECT_TRUE(isFinalResult("ERROR", 5));
    EXPECT_TRUE(isFinalResult("\r\n+CNMA: 0", 10));
    EXPECT_FALSE(isFinalResult("+CMGS 12", 8));
    EXPECT_FALSE(isFinalResult("\n\rOK", 4));
    EXPECT_FALSE(isFinalResult("ok", 2));
    EXPECT_FALSE(isFinalResult("\r\n+CSQ: 1", 9));
    // The prefix must lie within the bytes received.
    EXPECT_FALSE(isFinalResult("OK", 1));
    EXPECT_FALSE(isFinalResult("\r\nOK", 3));
    EXPECT_FALSE(isFinalResult("OK", 0));
    EXPECT_FALSE(isFinalResult(nullptr, 10));
}

}  // namespace
