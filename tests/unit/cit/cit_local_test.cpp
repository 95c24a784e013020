// The CIT commands answered by the daemon itself: flags kept in the NVRAM record,
// the result file, the start marker and the power-off.
#include <gtest/gtest.h>

#include <unistd.h>

#include <string>
#include <vector>

#include <cutils/properties.h>

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

    std::string record(size_t size = PRODUCT_INFO_SIZE) { return std::string(size, '\0'); }

    void storeFlag(size_t index, unsigned char value) {
        std::string r = root_.read(kStore);
        r[index] = static_cast<char>(value);
        root_.write(kStore, r);
    }

    TestRoot root_;
    HostLink host_;
};

TEST_F(CitLocal, FixedFlagsAreReadIntoTheirAnswers) {
    root_.write(kStore, record());
    // "MMI1 _..." begins with the raw-answer prefix "MM", so it reaches the host unframed.
    EXPECT_EQ(0, run("AT*CIT_READMMI1"));
    EXPECT_EQ("MMI1 _F\r\nOK\r\n", host_.take());
    storeFlag(FLAG_MMI1_RESULT, 1);
    run("AT*CIT_READMMI1");
    EXPECT_EQ("MMI1 _P\r\nOK\r\n", host_.take());
    storeFlag(FLAG_MMI1_RESULT, 2);
    run("AT*CIT_READMMI1");
    EXPECT_EQ("MMI1 _\r\nOK\r\n", host_.take());

    run("AT*CIT_READUSERAT");
    EXPECT_EQ("\r\nUserAT =0\r\nOK\r\n", host_.take());
    storeFlag(FLAG_USER_AT, 1);
    run("AT*CIT_READUSERAT");
    EXPECT_EQ("\r\nUserAT =1\r\nOK\r\n", host_.take());
    storeFlag(FLAG_USER_AT, '1');
    run("AT*CIT_READUSERAT");
    EXPECT_EQ("\r\nUserAT =\r\nOK\r\n", host_.take());

    const std::pair<unsigned char, const char *> resets[] = {
        {'a', "a"}, {'b', "b"}, {1, "1"}, {'1', ""}, {0, ""}};
    for (const auto &r : resets) {
        storeFlag(FLAG_RESET_STATE, r.first);
        run("AT*CIT_READRESET");
        EXPECT_EQ(std::string("\r\nReset =") + r.second + "\r\nOK\r\n", host_.take()) << int(r.first);
    }
}

TEST_F(CitLocal, WriteUserAtClearsTheFlagAndNothingElse) {
    std::string r(PRODUCT_INFO_SIZE, '\x5a');
    root_.write(kStore, r);
    EXPECT_EQ(0, run("AT*CIT_WRITEUSERAT"));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", host_.take());
    r[FLAG_USER_AT] = '\0';
    EXPECT_EQ(r, root_.read(kStore));
}

TEST_F(CitLocal, ProInfoReadsAndWritesAnyByteOfTheRecord) {
    root_.write(kStore, record());
    storeFlag(FLAG_MMI1_RESULT, 1);
    EXPECT_EQ(0, run("AT*CIT_READPROINFO=202"));
    EXPECT_EQ("\r\nResult=1\r\nOK\r\n", host_.take());

    // Only the low 8 bits of the value are stored.
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO=209,257"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO=1023,-1"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO=0,200"));
    host_.take();
    std::string expect = record();
    expect[0] = '\xc8';
    expect[FLAG_MMI1_RESULT] = 1;
    expect[FLAG_USER_AT] = 1;
    expect[1023] = '\xff';
    EXPECT_EQ(expect, root_.read(kStore));

    run("AT*CIT_READPROINFO=1023");
    EXPECT_EQ("\r\nResult=255\r\nOK\r\n", host_.take());
    run("at*cit_readproinfo=209");
    EXPECT_EQ("\r\nResult=1\r\nOK\r\n", host_.take());
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
    EXPECT_EQ(before, root_.read(kStore));
}

TEST_F(CitLocal, ProInfoWriteWithoutBothSeparatorsAnswersNothing) {
    root_.write(kStore, record());
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO=5"));
    EXPECT_EQ(0, run("AT*CIT_WRITEPROINFO 5,6"));
    EXPECT_EQ("", host_.take());
    EXPECT_EQ(record(), root_.read(kStore));
}

TEST_F(CitLocal, FlagAnswersShowTheFallbackValuesWhenNvramIsUnusable) {
    // No store: reads give 0, writes still answer OK.
    run("AT*CIT_READMMI1");
    EXPECT_EQ("MMI1 _F\r\nOK\r\n", host_.take());
    run("AT*CIT_READPROINFO=7");
    EXPECT_EQ("\r\nResult=0\r\nOK\r\n", host_.take());
    run("AT*CIT_WRITEPROINFO=7,1");
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_FALSE(root_.exists(kStore));

    // A record of the wrong shape: 255 everywhere, never written.
    root_.write(kStore, record(2048));
    run("AT*CIT_READMMI1");
    EXPECT_EQ("MMI1 _\r\nOK\r\n", host_.take());
    run("AT*CIT_READRESET");
    EXPECT_EQ("\r\nReset =\r\nOK\r\n", host_.take());
    run("AT*CIT_READPROINFO=3");
    EXPECT_EQ("\r\nResult=255\r\nOK\r\n", host_.take());
    run("AT*CIT_WRITEUSERAT");
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", host_.take());
    EXPECT_EQ(record(2048), root_.read(kStore));
}

TEST_F(CitLocal, ResultFileIsCreatedSetAndCleared) {
    run("AT*CIT_GACITF");
    EXPECT_EQ("\r\nx0000000\r\nOK\r\n", host_.take()) << "no file yet";

    // No folder for the file: it can be neither opened nor created.
    run("AT*CIT_WCITF");
    EXPECT_EQ("\r\nERROR\r\n", host_.take());
    EXPECT_FALSE(root_.exists(CIT_RESULT_FILE));

    root_.write("/data/prod/.keep", "");
    run("AT*CIT_WCITF");
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ("x0000001", root_.read(CIT_RESULT_FILE));
    run("AT*CIT_GACITF");
    EXPECT_EQ("\r\nx0000001\r\nOK\r\n", host_.take());
    run("AT*CIT_CCITF");
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ("x0000000", root_.read(CIT_RESULT_FILE));

    // An existing file keeps its other characters; only character 7 changes.
    root_.write(CIT_RESULT_FILE, "y1234560tail");
    run("AT*CIT_WCITF");
    host_.take();
    EXPECT_EQ("y1234561tail", root_.read(CIT_RESULT_FILE));
    run("AT*CIT_GACITF");
    EXPECT_EQ("\r\ny1234561tail\r\nOK\r\n", host_.take());

    // A file too short to hold character 7 is written whole, never padded with NULs.
    root_.write(CIT_RESULT_FILE, "x00");
    run("AT*CIT_WCITF");
    host_.take();
    EXPECT_EQ("x0000001", root_.read(CIT_RESULT_FILE));

    // GACITF shows at most 32 characters of the first line.
    root_.write(CIT_RESULT_FILE, std::string(40, '7'));
    run("AT*CIT_GACITF");
    EXPECT_EQ("\r\n" + std::string(32, '7') + "\r\nOK\r\n", host_.take());
}

TEST_F(CitLocal, StartMarksTheRunAndShutDownPowersOffBeforeAnswering) {
    EXPECT_EQ(0, run("AT*CIT_START"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    char value[PROPERTY_VALUE_MAX] = {0};
    property_get("debug.autocit.running", value, "");
    EXPECT_STREQ("1", value);

    EXPECT_EQ(0, run("AT*CIT_SHUTDOWN"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_NE(std::string::npos, root_.read("/journal/shell.log").find("reboot -p"));
}

}  // namespace
