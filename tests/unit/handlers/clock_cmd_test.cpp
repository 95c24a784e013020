// AT+CCLK and AT+CSDF against the simulated clock of the device root.
#include <gtest/gtest.h>

#include <cstring>

#include <cstdlib>
#include <ctime>
#include <string>
#include <sys/time.h>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"
#include "dispatch/dispatcher.h"
#include "handlers/handlers.h"
#include "test_root.h"

namespace {

constexpr time_t k20240229Noon = 1709208000;  // 2024-02-29 12:00:00 UTC

class ClockCmdTest : public ::testing::Test {
protected:
    void SetUp() override {
        resetHandlerState();
        const char *tz = std::getenv("TZ");
        hadTz_ = tz != nullptr;
        if (hadTz_) savedTz_ = tz;
    }
    void TearDown() override {
        resetHandlerState();
        if (hadTz_) setenv("TZ", savedTz_.c_str(), 1);
        else unsetenv("TZ");
        tzset();
    }

    int cclk(const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return pas_cclk_handler(param, op, response);
    }
    int csdf(const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return pas_csdf_handler(param, op, response);
    }
    // Seconds of the simulated clock (time() is the device's clock here).
    static time_t now() { return time(nullptr); }

    TestRoot root;
    char response[RESPONSE_BUF_SIZE];

private:
    bool hadTz_ = false;
    std::string savedTz_;
};

TEST_F(ClockCmdTest, SetTakesTheFieldsAsUtcAndStoresTheZone) {
    // A zone in TZ must not shift the clock, and TZ must come back unchanged.
    setenv("TZ", "EST5EDT", 1);
    tzset();
    EXPECT_EQ(0, cclk("\"24/02/29,12:00:00+32\"", AT_SET_OP));
    EXPECT_LE(std::llabs(static_cast<long long>(now() - k20240229Noon)), 2);
    EXPECT_EQ(32, gCclkTz);
    ASSERT_NE(nullptr, std::getenv("TZ"));
    EXPECT_STREQ("EST5EDT", std::getenv("TZ"));

    unsetenv("TZ");
    tzset();
    EXPECT_EQ(0, cclk("24/02/29, 12:00:00", AT_SET_OP)) << "blanks are dropped";
    EXPECT_EQ(nullptr, std::getenv("TZ")) << "an unset TZ stays unset";
    EXPECT_EQ(32, gCclkTz) << "17 characters leave the stored zone";
    EXPECT_STREQ("", response);

    // Hour 24, minute 60 and second 60 pass the check and roll over.
    EXPECT_EQ(0, cclk("24/02/29,24:60:60", AT_SET_OP));
    EXPECT_LE(std::llabs(static_cast<long long>(now() - 1709254860)), 2);
}

TEST_F(ClockCmdTest, SetRefusesBadFieldsAndZones) {
    EXPECT_EQ(4, cclk("24/13/01,00:00:00", AT_SET_OP));
    EXPECT_EQ(4, cclk("24/00/01,00:00:00", AT_SET_OP));
    EXPECT_EQ(4, cclk("24/01/32,00:00:00", AT_SET_OP));
    EXPECT_EQ(4, cclk("24/01/01,25:00:00", AT_SET_OP));
    EXPECT_EQ(4, cclk("24/01/01,00:61:00", AT_SET_OP));
    EXPECT_EQ(4, cclk("ab/01/01,00:00:00", AT_SET_OP));
    EXPECT_STREQ("", response);

    EXPECT_EQ(4, cclk("24/02/29,12:00:00+99", AT_SET_OP));
    EXPECT_EQ(4, cclk("24/02/29,12:00:00-97", AT_SET_OP));
    EXPECT_EQ(65535, gCclkTz) << "a zone out of range is not stored";
    // A good zone is kept even though the time fails.
    EXPECT_EQ(4, cclk("24/02/30,25:00:00-08", AT_SET_OP));
    EXPECT_EQ(-8, gCclkTz);
    EXPECT_GT(now(), k20240229Noon + 10000000) << "no refused value moved the clock";
    EXPECT_EQ(0, cclk("24/02/29,12:00:00+96", AT_SET_OP)) << "+96 is the largest zone";
    EXPECT_EQ(96, gCclkTz);

    EXPECT_LE(std::llabs(static_cast<long long>(now() - k20240229Noon)), 2);
}

TEST_F(ClockCmdTest, WrongLengthAnswersTheCmeLineCutToFit) {
    EXPECT_EQ(4, cclk("\"2024/02/29,12:00:00\"", AT_SET_OP));
    EXPECT_STREQ("CME ERROR: Invalid parameters: [21] cmdline:\"2024/02/29,12:00:00\"; [19] "
                 "cclkSetCmd:2024/02/29,12:00:00",
                 response);
    EXPECT_EQ(4, cclk("", AT_SET_OP));
    EXPECT_STREQ("CME ERROR: Invalid parameters: [0] cmdline:; [0] cclkSetCmd:", response);

    // The working copy stops at 39 characters; the answer at the buffer's end.
    std::string huge(5000, '1');
    EXPECT_EQ(4, cclk(huge.c_str(), AT_SET_OP));
    EXPECT_EQ(RESPONSE_BUF_SIZE - 1, static_cast<int>(std::strlen(response)));
    EXPECT_EQ(0, std::string(response).rfind("CME ERROR: Invalid parameters: [5000] cmdline:111", 0));
}

TEST_F(ClockCmdTest, ReadReportsUtcWithTheStoredOrKernelZone) {
    ASSERT_EQ(0, cclk("24/02/29,12:00:00", AT_SET_OP));

    // Before any zone was stored: the kernel's, in whole hours, times 4.
    root.write("/clock/tz_minuteswest", "-330\n");
    EXPECT_EQ(0, cclk("", AT_READ_OP));
    std::string r = response;
    EXPECT_EQ(0, r.rfind("+CCLK: \"24/02/29,12:00:0", 0)) << r;
    EXPECT_EQ("+20\"\n", r.substr(r.size() - 5)) << r;

    root.write("/clock/tz_minuteswest", "300\n");
    EXPECT_EQ(0, cclk("", AT_READ_OP));
    r = response;
    EXPECT_EQ("-20\"\n", r.substr(r.size() - 5)) << r;

    // A stored zone wins; negative zones print with their own sign.
    ASSERT_EQ(0, cclk("24/02/29,12:00:00-08", AT_SET_OP));
    EXPECT_EQ(0, cclk("", AT_READ_OP));
    r = response;
    EXPECT_EQ(0, r.rfind("+CCLK: \"24/02/29,12:00:0", 0)) << r;
    EXPECT_EQ("-08\"\n", r.substr(r.size() - 5)) << r;

    ASSERT_EQ(0, csdf("1,2", AT_SET_OP));
    ASSERT_EQ(0, cclk("24/02/29,12:00:00+00", AT_SET_OP));
    EXPECT_EQ(0, cclk("", AT_READ_OP));
    r = response;
    EXPECT_EQ(0, r.rfind("+CCLK: \"2024/02/29,12:00:0", 0)) << r;
    EXPECT_EQ("+00\"\n", r.substr(r.size() - 5)) << r;
    EXPECT_EQ(32u, r.size()) << r;

    EXPECT_EQ(0, cclk("", AT_TEST_OP));
    EXPECT_STREQ("+CCLK: yy/MM/dd,hh:mm:ss[+/-tz]", response);
}

TEST_F(ClockCmdTest, CsdfModesDefaultsAndRanges) {
    EXPECT_EQ(0, csdf("", AT_READ_OP));
    EXPECT_STREQ("+CSDF: 1,1\n", response);
    EXPECT_EQ(0, csdf("", AT_TEST_OP));
    EXPECT_STREQ("+CSDF: (1,2,3,4,5,6,7),(1,2)\n", response);

    EXPECT_EQ(0, csdf("3", AT_SET_OP));
    EXPECT_EQ(3, gCsdfMode);
    EXPECT_EQ(1, gCsdfAuxmode);
    EXPECT_EQ(0, csdf(",2", AT_SET_OP));
    EXPECT_EQ(1, gCsdfMode);
    EXPECT_EQ(2, gCsdfAuxmode);

    for (const char *bad : {"8,1", "1,3", "0", "-1,1", "", "7,0"}) {
        EXPECT_EQ(4, csdf(bad, AT_SET_OP)) << bad;
        EXPECT_EQ(1, gCsdfMode) << bad;
        EXPECT_EQ(2, gCsdfAuxmode) << bad;
    }
    EXPECT_EQ(0, csdf("7,1", AT_SET_OP));
    EXPECT_EQ(0, csdf("", AT_READ_OP));
    EXPECT_STREQ("+CSDF: 7,1\n", response);
}

}  // namespace
