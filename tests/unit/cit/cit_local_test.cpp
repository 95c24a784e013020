// The CIT commands answered by the daemon itself: flags kept in the NVRAM record,
// the result file, the start marker and the power-off.
#include <gtest/gtest.h>

#include <unistd.h>

#include <string>
#include <vector>

#include "cit/cit_cmd.h"
#include "cit/pro_info.h"
#include "cit_fakes.h"
#include "test_root.h"

namespace {

const char kStore[] = "/nvram/PRODUCT_INFO";

class CitLocal : public ::testing::Test {
protected:
    void SetUp() override { sock_id = -1; }

    int run(const std::string &line) {
        std::vector<char> buf(line.begin(), line.end());
        buf.push_back('\0');
        return cit_test_pase(buf.data());
    }

    // Runs a line and gives what the host received.
    std::string ask(const std::string &line) {
        run(line);
        return host_.take();
    }

    std::string record(size_t size = PRODUCT_INFO_SIZE) { return std::string(size, '\0'); }

    void storeFlag(size_t index, unsigned char value) {
        std::string r = root_.read(kStore);
        r[index] = static_cast<char>(value);
        root_.write(kStore, r);
    }

    TestRoot root_;
    HostCapture host_;
};

// Each fixed flag has two known values and shows nothing for any other.
TEST_F(CitLocal, FixedFlagsAreReadIntoTheirAnswers) {
    root_.write(kStore, record());
    struct Case {
        size_t index;
        unsigned char value;
        const char *line;
        std::string host;
    } cases[] = {
        // "MMI1 _..." begins with the raw-answer prefix "MM": it reaches the host unframed.
        {FLAG_MMI1_RESULT, 0, "AT*CIT_READMMI1", "MMI1 _F\r\nOK\r\n"},
        {FLAG_MMI1_RESULT, 1, "AT*CIT_READMMI1", "MMI1 _P\r\nOK\r\n"},
        {FLAG_MMI1_RESULT, 2, "AT*CIT_READMMI1", "MMI1 _\r\nOK\r\n"},
        {FLAG_USER_AT, 1, "AT*CIT_READUSERAT", "\r\nUserAT =1\r\nOK\r\n"},
        {FLAG_USER_AT, '1', "AT*CIT_READUSERAT", "\r\nUserAT =\r\nOK\r\n"},
        {FLAG_RESET_STATE, 'b', "AT*CIT_READRESET", "\r\nReset =b\r\nOK\r\n"},
        {FLAG_RESET_STATE, 1, "AT*CIT_READRESET", "\r\nReset =1\r\nOK\r\n"},
        {FLAG_RESET_STATE, '1', "AT*CIT_READRESET", "\r\nReset =\r\nOK\r\n"},
    };
    for (const Case &c : cases) {
        storeFlag(c.index, c.value);
        EXPECT_EQ(0, run(c.line));
        EXPECT_EQ(c.host, host_.take()) << c.line << " " << int(c.value);
    }

    std::string r = root_.read(kStore);
    EXPECT_EQ(0, run("AT*CIT_WRITEUSERAT"));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", host_.take());
    r[FLAG_USER_AT] = '\0';
    EXPECT_EQ(r, root_.read(kStore)) << "only the user-AT flag changes";
}

TEST_F(CitLocal, ProInfoReadsAndWritesAnyByteOfTheRecord) {
    root_.write(kStore, record());
    storeFlag(FLAG_MMI1_RESULT, 1);
    EXPECT_EQ("\r\nResult=1\r\nOK\r\n", ask("AT*CIT_READPROINFO=202"));
    // Only the low 8 bits of the value are stored.
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WRITEPROINFO=209,257"));
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WRITEPROINFO=1023,-1"));
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WRITEPROINFO=0,200"));
    std::string expect = record();
    expect[0] = '\xc8';
    expect[FLAG_MMI1_RESULT] = 1;
    expect[FLAG_USER_AT] = 1;
    expect[1023] = '\xff';
    EXPECT_EQ(expect, root_.read(kStore));
    EXPECT_EQ("\r\nResult=255\r\nOK\r\n", ask("AT*CIT_READPROINFO=1023"));
}

// Nothing may be read or written outside the 1024-byte record.
TEST_F(CitLocal, ProInfoRefusesIndexesOutsideTheRecord) {
    root_.write(kStore, record());
    const std::string before = root_.read(kStore);
    for (const char *line : {"AT*CIT_READPROINFO=1024", "AT*CIT_READPROINFO=-1", "AT*CIT_READPROINFO",
                             "AT*CIT_READPROINFO=99999999999999999999", "AT*CIT_WRITEPROINFO=1024,1",
                             "AT*CIT_WRITEPROINFO=-5,1", "AT*CIT_WRITEPROINFO=4294967296,1"}) {
        EXPECT_EQ(0, run(line)) << line;
        EXPECT_EQ("\r\nERROR\r\n", host_.take()) << line;
    }
    // Without both "=" and "," a write gets no answer at all.
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO=5"));
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO 5,6"));
    EXPECT_EQ("", host_.take());
    EXPECT_EQ(before, root_.read(kStore));
}

TEST_F(CitLocal, ResultFileIsCreatedSetAndCleared) {
    EXPECT_EQ("\r\nx0000000\r\nOK\r\n", ask("AT*CIT_GACITF")) << "no file yet";
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_WCITF")) << "no folder: neither opened nor created";

    root_.write("/data/prod/.keep", "");
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WCITF"));
    EXPECT_EQ("x0000001", root_.read(CIT_RESULT_FILE));
    EXPECT_EQ("\r\nx0000001\r\nOK\r\n", ask("AT*CIT_GACITF"));
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_CCITF"));
    EXPECT_EQ("x0000000", root_.read(CIT_RESULT_FILE));

    // An existing file keeps its other characters; only character 7 changes.
    root_.write(CIT_RESULT_FILE, "y1234560tail");
    ask("AT*CIT_WCITF");
    EXPECT_EQ("y1234561tail", root_.read(CIT_RESULT_FILE));
    // A file too short to hold character 7 is written whole, never padded with NULs.
    root_.write(CIT_RESULT_FILE, "x00");
    ask("AT*CIT_WCITF");
    EXPECT_EQ("x0000001", root_.read(CIT_RESULT_FILE));
    // At most 32 characters of the first line are shown.
    root_.write(CIT_RESULT_FILE, std::string(40, '7'));
    EXPECT_EQ("\r\n" + std::string(32, '7') + "\r\nOK\r\n", ask("AT*CIT_GACITF"));
}

}  // namespace
