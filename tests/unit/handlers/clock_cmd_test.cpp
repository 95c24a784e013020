// AT+CCLK and AT+CSDF against the simulated clock of the device root.
#include <cstdlib>
#include <ctime>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

constexpr time_t k20240229Noon = 1709208000;  // 2024-02-29 12:00:00 UTC

class ClockCmdTest : public HandlerTest {
protected:
    void SetUp() override {
        HandlerTest::SetUp();
        const char *tz = std::getenv("TZ");
        hadTz_ = tz != nullptr;
        if (hadTz_) savedTz_ = tz;
    }
    void TearDown() override {
        if (hadTz_) setenv("TZ", savedTz_.c_str(), 1);
        else unsetenv("TZ");
        tzset();
        HandlerTest::TearDown();
    }
    int cclk(const char *param, int op) { return call(pas_cclk_handler, param, op); }
    int csdf(const char *param, int op) { return call(pas_csdf_handler, param, op); }
    // The simulated clock of the device root.
    static time_t now() { return time(nullptr); }

private:
    bool hadTz_ = false;
    std::string savedTz_;
};

// The environment is never written: other threads read it while a set runs.
TEST_F(ClockCmdTest, SetTakesTheFieldsAsUtcAndLeavesTzAlone) {
    static char tz[] = "TZ=EST5EDT";
    putenv(tz);
    tzset();
    EXPECT_EQ(0, cclk("\"24/02/29,12:00:00+32\"", AT_SET_OP));
    EXPECT_LE(std::llabs(static_cast<long long>(now() - k20240229Noon)), 2);
    EXPECT_EQ(32, gCclkTz);
    EXPECT_EQ(tz + 3, std::getenv("TZ")) << "the caller's TZ entry itself, not a copy";

    unsetenv("TZ");
    tzset();
    // Hour 24, minute 60 and second 60 pass the check and roll over.
    EXPECT_EQ(0, cclk("24/02/29, 24:60:60", AT_SET_OP));
    EXPECT_LE(std::llabs(static_cast<long long>(now() - 1709254860)), 2);
    EXPECT_EQ(nullptr, std::getenv("TZ")) << "an unset TZ stays unset";
    EXPECT_EQ(32, gCclkTz) << "17 characters leave the stored zone";
    EXPECT_STREQ("", response);
}

TEST_F(ClockCmdTest, SetRefusesBadFieldsAndZones) {
    for (const char *bad : {"24/13/01,00:00:00", "24/00/01,00:00:00", "24/01/32,00:00:00", "24/01/01,25:00:00",
                            "24/01/01,00:61:00", "ab/01/01,00:00:00", "24/02/29,12:00:00+99"}) {
        EXPECT_EQ(4, cclk(bad, AT_SET_OP)) << bad;
        EXPECT_STREQ("", response) << bad;
    }
    EXPECT_EQ(65535, gCclkTz) << "a zone out of range is not stored";
    EXPECT_GT(now(), k20240229Noon + 10000000) << "no refused value moved the clock";
}

TEST_F(ClockCmdTest, OverlongValueAnswersTheCmeLineCutToFit) {
    // The working copy stops at 39 characters, the answer at the buffer's end.
    std::string huge(5000, '1');
    EXPECT_EQ(4, cclk(huge.c_str(), AT_SET_OP));
    EXPECT_EQ(RESPONSE_BUF_SIZE - 1, static_cast<int>(std::strlen(response)));
    EXPECT_EQ(0, std::string(response).rfind("CME ERROR: Invalid parameters: [5000] cmdline:111", 0));
}

}  // namespace
