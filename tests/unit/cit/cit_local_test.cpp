// The CIT commands answered by the daemon itself: record indexes out of range and
// the result file's edge cases.
#include <gtest/gtest.h>

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

    // Runs a line and gives what the host received.
    std::string ask(const std::string &line) {
        std::vector<char> buf(line.begin(), line.end());
        buf.push_back('\0');
        EXPECT_EQ(0, cit_test_pase(buf.data())) << line;
        return host_.take();
    }

    TestRoot root_;
    HostCapture host_;
};

// Nothing may be read or written outside the 1024-byte record.
TEST_F(CitLocal, ProInfoRefusesIndexesOutsideTheRecord) {
    const std::string before(PRODUCT_INFO_SIZE, '\0');
    root_.write(kStore, before);
    for (const char *line : {"AT*CIT_READPROINFO=1024", "AT*CIT_READPROINFO=-1", "AT*CIT_READPROINFO",
                             "AT*CIT_READPROINFO=99999999999999999999", "AT*CIT_WRITEPROINFO=1024,1",
                             "AT*CIT_WRITEPROINFO=-5,1", "AT*CIT_WRITEPROINFO=4294967296,1"}) {
        EXPECT_EQ("\r\nERROR\r\n", ask(line)) << line;
    }
    // Without both "=" and "," a write gets no answer at all.
    EXPECT_EQ("", ask("AT*CIT_WRITEPROINFO 5,6"));
    EXPECT_EQ(before, root_.read(kStore));
}

// The station records a pass for every OK: a flag that did not reach the store is
// an error, a stored one is answered as always.
TEST_F(CitLocal, FlagWritesAnswerOkOnlyWhenStored) {
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_WRITEPROINFO=202,1")) << "no store";
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_WRITEUSERAT"));
    root_.write(kStore, std::string(PRODUCT_INFO_SIZE, '\x01'));
    EXPECT_EQ("\r\nOK\r\n", ask("AT*CIT_WRITEPROINFO=202,0"));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", ask("AT*CIT_WRITEUSERAT"));
    EXPECT_EQ(0, getFlag(202));
    EXPECT_EQ(0, getFlag(FLAG_USER_AT));
}

TEST_F(CitLocal, ResultFileEdges) {
    EXPECT_EQ("\r\nERROR\r\n", ask("AT*CIT_WCITF")) << "no folder: neither opened nor created";
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
