#include <android/log.h>

#include <gtest/gtest.h>

#include <stdlib.h>

#include <regex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

#include "test_root.h"

namespace {

std::vector<std::string> lines_of(const std::string &text) {
    std::vector<std::string> out;
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) out.push_back(line);
    return out;
}

// Each test logs into its own root with a filter of its choice.
struct LogEnv {
    explicit LogEnv(const char *tags) {
        unsetenv("TOLKD_LOG");
        unsetenv("TOLKD_LOG_STDERR");
        if (tags != nullptr) setenv("ANDROID_LOG_TAGS", tags, 1);
        else unsetenv("ANDROID_LOG_TAGS");
    }
    ~LogEnv() { unsetenv("ANDROID_LOG_TAGS"); }
    std::string log() const { return root.read("/log/tolkd.log"); }
    TestRoot root;
};

}  // namespace

TEST(Log, ThreadtimeLinesUnderTheRoot) {
    LogEnv env(nullptr);
    errno = 42;
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "%d:%s(): Boot mode = %d", 120, "main", -1);
    EXPECT_EQ(errno, 42);
    // A trailing line break does not make an empty line; inner ones get a header each.
    __android_log_print(ANDROID_LOG_WARN, "NVRAM", "first\nsecond\n");
    auto lines = lines_of(env.log());
    ASSERT_EQ(lines.size(), 3u) << env.log();
    std::regex head(R"(^\d\d-\d\d \d\d:\d\d:\d\d\.\d\d\d +\d+ +\d+ ([VDIWEF]) (\w+): (.*)$)");
    std::smatch m;
    ASSERT_TRUE(std::regex_match(lines[0], m, head)) << lines[0];
    EXPECT_EQ(m[1], "I");
    EXPECT_EQ(m[2], "TOLKD");
    EXPECT_EQ(m[3], "120:main(): Boot mode = -1");
    ASSERT_TRUE(std::regex_match(lines[2], m, head)) << lines[2];
    EXPECT_EQ(m[2], "NVRAM");
    EXPECT_EQ(m[3], "second");
}

TEST(Log, FilterFollowsAndroidLogTags) {
    // The default filter and its changes are covered by LogFilterEnv.
    LogEnv env("TOLKD:d *:s");
    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "tolkd-debug");
    __android_log_print(ANDROID_LOG_VERBOSE, "TOLKD", "tolkd-verbose");
    __android_log_print(ANDROID_LOG_SILENT, "TOLKD", "never");
    __android_log_print(ANDROID_LOG_FATAL, "NVRAM", "nvram-fatal");
    std::string log = env.log();
    EXPECT_NE(log.find("tolkd-debug"), std::string::npos);
    EXPECT_EQ(log.find("tolkd-verbose"), std::string::npos);
    EXPECT_EQ(log.find("never"), std::string::npos);
    EXPECT_EQ(log.find("nvram-fatal"), std::string::npos);
}

TEST(Log, LongMessagesAreCutAndConcurrentLinesStayWhole) {
    LogEnv env(nullptr);
    std::string big(20000, 'x');
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "%s", big.c_str());
    auto lines = lines_of(env.log());
    ASSERT_EQ(lines.size(), 1u);
    EXPECT_GT(lines[0].size(), 6200u);
    EXPECT_LT(lines[0].size(), 8300u);

    std::vector<std::thread> threads;
    for (int t = 0; t < 4; t++)
        threads.emplace_back([t] {
            std::string body(300, static_cast<char>('a' + t));
            for (int i = 0; i < 200; i++) __android_log_print(ANDROID_LOG_INFO, "TOLKD", "%s", body.c_str());
        });
    for (auto &th : threads) th.join();
    lines = lines_of(env.log());
    ASSERT_EQ(lines.size(), 801u);
    for (size_t i = 1; i < lines.size(); i++) {
        std::string tail = lines[i].substr(lines[i].size() - 300);
        ASSERT_EQ(tail, std::string(300, tail[0])) << "line " << i;
        ASSERT_EQ(lines[i].find("TOLKD: "), lines[i].size() - 307) << "line " << i;
    }
}
