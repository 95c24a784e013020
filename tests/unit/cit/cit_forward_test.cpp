// The commands passed to the test application: an answer longer than the
// daemon's buffer is cut so that the verdict always fits.
#include <gtest/gtest.h>

#include <unistd.h>

#include <memory>
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

// The link kept after an unmatched line is checked before it is used again: after
// the application restarted, the command reaches the new one and is judged on its
// answer, never on the empty answer of the dead link.
TEST_F(CitForward, KeptLinkToARestartedApplicationIsNotReused) {
    auto app = std::make_unique<FakeTestApp>();
    EXPECT_EQ(-1, run("AT*CIT_NOSUCH"));
    EXPECT_EQ("\r\ntest_fail_no_case\r\nERROR\r\n\r\n", host_.take());
    ASSERT_GE(sock_id, 0) << "an unmatched line keeps the link";
    app.reset();  // the application restarts: its link ends, a new one serves
    app = std::make_unique<FakeTestApp>();
    app->reply("sn", "SN0042");
    EXPECT_EQ(0, run("AT*CIT_SN"));
    EXPECT_EQ(framedVerdict("SN0042", true), host_.take());
}

}  // namespace
