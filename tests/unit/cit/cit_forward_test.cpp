// The commands passed to the test application: which word each line sends, how
// the answer is judged and framed, and what the host sees when the application
// is missing, silent or asked for something it has no case for.
#include <gtest/gtest.h>

#include <unistd.h>

#include <string>
#include <vector>

#include "cit/cit_cmd.h"
#include "cit_fakes.h"
#include "test_root.h"

namespace {

class CitForward : public ::testing::Test {
protected:
    void SetUp() override { sock_id = -1; }
    void TearDown() override {
        if (sock_id >= 0) close(sock_id);
        sock_id = -1;
    }

    int run(const std::string &line) {
        std::vector<char> buf(line.begin(), line.end());
        buf.push_back('\0');
        return cit_test_pase(buf.data());
    }

    TestRoot root_;
    HostCapture host_;
};

TEST(CitCheck, ClaimsEveryCaseOfTheCitPrefixAndNothingElse) {
    EXPECT_EQ(1, cit_test_check("AT*CIT_SN"));
    EXPECT_EQ(1, cit_test_check("at*cit"));
    EXPECT_EQ(1, cit_test_check("At*CiT_anything at all"));
    EXPECT_EQ(0, cit_test_check("AT*CI"));
    EXPECT_EQ(0, cit_test_check("AT+CIT_SN"));
    EXPECT_EQ(0, cit_test_check(" AT*CIT_SN"));
    EXPECT_EQ(0, cit_test_check(""));
}

// Longer names that share a beginning with later ones must win, in any case and
// with anything after the name.
TEST_F(CitForward, EachLineSendsItsWordOnAFreshConnection) {
    FakeTestApp app;
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"at*cit_Sn2", "sn2"},           {"AT*CIT_SNX=1", "sn"},
        {"AT*CIT_VERSION", "Version"},   {"AT*CIT_VER", "ver"},
        {"AT*CIT_AUTO_TP_RESULT", "AUTO_TP_result"}, {"AT*CIT_AUTO_TP", "auto_tp_test"},
        {"AT*CIT_TP_TEST_END", "tp_touchtest_end"},  {"AT*CIT_LCDL_OFF", "lcd_light_off"},
        {"AT*CIT_CAMERABPHOTONOFLASH", "camerab_photo_noflash"}, {"AT*CIT_FINISH", "finish"},
    };
    for (const auto &c : cases) {
        EXPECT_EQ(0, run(c.first)) << c.first;
        EXPECT_EQ(framedVerdict("OK", true), host_.take()) << c.first;
        EXPECT_EQ(-1, sock_id) << c.first;
    }
    ASSERT_TRUE(app.waitFor(cases.size()));
    auto got = app.received();
    ASSERT_EQ(cases.size(), got.size());
    for (size_t i = 0; i < cases.size(); ++i) {
        EXPECT_EQ(cases[i].second, got[i].second) << cases[i].first;
        EXPECT_EQ(static_cast<int>(i + 1), got[i].first) << "one connection per command";
    }
}

TEST_F(CitForward, UnknownNameIsRefusedAndTheLinkServesTheNextCommand) {
    FakeTestApp app;
    app.reply("sn", "SN123");
    EXPECT_EQ(-1, run("AT*CIT_IMEI"));
    EXPECT_EQ("\r\ntest_fail_no_case\r\nERROR\r\n\r\n", host_.take());
    EXPECT_GE(sock_id, 0);

    EXPECT_EQ(0, run("AT*CIT_SN"));
    EXPECT_EQ(framedVerdict("SN123", true), host_.take());
    ASSERT_TRUE(app.waitFor(1));
    auto got = app.received();
    ASSERT_EQ(1u, got.size());
    EXPECT_EQ(1, got[0].first) << "the word travels on the link opened for the unknown name";
    EXPECT_EQ("sn", got[0].second);
}

TEST_F(CitForward, MissingTestApplicationAnswersTestFail) {
    EXPECT_EQ(-1, run("AT*CIT_SN"));
    EXPECT_EQ("\r\ntest_fail\r\nERROR\r\n\r\n", host_.take());
    EXPECT_EQ(-1, sock_id);
    // Also before the name is looked at.
    EXPECT_EQ(-1, run("AT*CIT_NOSUCH"));
    EXPECT_EQ("\r\ntest_fail\r\nERROR\r\n\r\n", host_.take());
}

TEST_F(CitForward, JudgingRulesAtTheirBoundaries) {
    FakeTestApp app;
    struct Case {
        const char *line;
        const char *word;
        const char *answer;
        bool ok;
    };
    const Case cases[] = {
        {"AT*CIT_SIM1", "SIM1", "fAIL: no card", false}, {"AT*CIT_SIM1", "SIM1", "Fai", true},
        {"AT*CIT_WIFI", "WIFI", "NULL", false},          {"AT*CIT_GPS", "GPS", "nul", true},
        {"AT*CIT_PSENSOR", "PSensor", "0.2551", false},  {"AT*CIT_LSENSOR", "LSensor", "0.25", true},
        {"AT*CIT_KEY", "KEY", "ok", true},               {"AT*CIT_KEY", "KEY", "O", false},
        {"AT*CIT_HEADSET_KEY", "headset_key", "Fail", false},
        {"AT*CIT_LCD_RED", "lcd_red", "Fail", true},
    };
    for (const Case &c : cases) {
        app.reply(c.word, c.answer);
        EXPECT_EQ(0, run(c.line)) << c.line << " / " << c.answer;
        EXPECT_EQ(framedVerdict(c.answer, c.ok), host_.take()) << c.line << " / " << c.answer;
    }
}

TEST_F(CitForward, ApplicationClosingWithoutAnAnswerIsJudgedAsEmpty) {
    FakeTestApp app;
    app.closeOn("SIM2");
    app.closeOn("MENU");
    app.closeOn("vibrate_on");
    EXPECT_EQ(0, run("AT*CIT_SIM2"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ(0, run("AT*CIT_MENU"));
    EXPECT_EQ("\r\nERROR\r\n", host_.take());
    EXPECT_EQ(0, run("AT*CIT_VIBRATE_ON"));
    EXPECT_EQ("\r\nOK\r\n", host_.take());
    EXPECT_EQ(-1, sock_id);
}

std::string pattern(const std::string &head, size_t n) {
    std::string s = head;
    while (s.size() < n) s.push_back(static_cast<char>('a' + s.size() % 26));
    return s.substr(0, n);
}

// The answer buffer holds 1024 bytes: a long answer is cut so that its final
// result and terminator always fit, and the host always gets a whole final line.
TEST_F(CitForward, LongAnswersAreCutSoTheFinalResultFits) {
    FakeTestApp app;
    struct Case {
        const char *line;
        const char *word;
        std::string answer;
        std::string shown;
        bool ok;
    };
    const std::string full = pattern("Pass ", 1024);
    const std::string failFull = pattern("Fail ", 1024);
    const Case cases[] = {
        {"AT*CIT_SN", "sn", pattern("Pass ", 1009), pattern("Pass ", 1009), true},
        {"AT*CIT_SN", "sn", pattern("Pass ", 1010), pattern("Pass ", 1010), true},
        {"AT*CIT_SN", "sn", pattern("Pass ", 1011), pattern("Pass ", 1010), true},
        {"AT*CIT_SN", "sn", full, pattern("Pass ", 1010), true},
        {"AT*CIT_SN", "sn", pattern("Fail ", 1014), pattern("Fail ", 1014), false},
        {"AT*CIT_SN", "sn", pattern("Fail ", 1015), pattern("Fail ", 1014), false},
        {"AT*CIT_SN", "sn", failFull, pattern("Fail ", 1014), false},
        {"AT*CIT_KEY", "KEY", pattern("no key ", 1024), pattern("no key ", 1014), false},
    };
    for (const Case &c : cases) {
        app.reply(c.word, c.answer);
        EXPECT_EQ(0, run(c.line));
        std::string got = host_.take();
        EXPECT_EQ(framedVerdict(c.shown, c.ok), got)
            << c.answer.size() << " bytes answered, " << got.size() << " bytes shown";
    }
}

}  // namespace
