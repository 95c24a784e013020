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
    __android_log_print(ANDROID_LOG_ERROR, "NVRAM", "TOLKDget_ADC_channel - Can't open /dev/OV_pmic_adc_cali\n");
    __android_log_print(ANDROID_LOG_WARN, "TOLKD", "first\nsecond");
    auto lines = lines_of(env.log());
    ASSERT_EQ(lines.size(), 4u) << env.log();
    std::regex head(R"(^\d\d-\d\d \d\d:\d\d:\d\d\.\d\d\d +\d+ +\d+ ([VDIWEF]) (\w+): (.*)$)");
    std::smatch m;
    ASSERT_TRUE(std::regex_match(lines[0], m, head)) << lines[0];
    EXPECT_EQ(m[1], "I");
    EXPECT_EQ(m[2], "TOLKD");
    EXPECT_EQ(m[3], "120:main(): Boot mode = -1");
    // A trailing line break does not make an empty line; inner ones get a header each.
    ASSERT_TRUE(std::regex_match(lines[1], m, head)) << lines[1];
    EXPECT_EQ(m[1], "E");
    EXPECT_EQ(m[3], "TOLKDget_ADC_channel - Can't open /dev/OV_pmic_adc_cali");
    ASSERT_TRUE(std::regex_match(lines[3], m, head)) << lines[3];
    EXPECT_EQ(m[1], "W");
    EXPECT_EQ(m[3], "second");
}

TEST(Log, FilterFollowsAndroidLogTags) {
    {
        LogEnv env(nullptr);  // default: info and above
        __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "debug-hidden");
        __android_log_print(ANDROID_LOG_INFO, "TOLKD", "info-shown");
        __android_log_print(ANDROID_LOG_SILENT, "TOLKD", "never");
        std::string log = env.log();
        EXPECT_EQ(log.find("debug-hidden"), std::string::npos);
        EXPECT_NE(log.find("info-shown"), std::string::npos);
        EXPECT_EQ(log.find("never"), std::string::npos);
    }
    {
        LogEnv env("TOLKD:d *:s");
        __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "tolkd-debug");
        __android_log_print(ANDROID_LOG_VERBOSE, "TOLKD", "tolkd-verbose");
        __android_log_print(ANDROID_LOG_FATAL, "NVRAM", "nvram-fatal");
        std::string log = env.log();
        EXPECT_NE(log.find("tolkd-debug"), std::string::npos);
        EXPECT_EQ(log.find("tolkd-verbose"), std::string::npos);
        EXPECT_EQ(log.find("nvram-fatal"), std::string::npos);

        // A changed filter takes effect at the next call.
        setenv("ANDROID_LOG_TAGS", "NVRAM:V *:E bogus:q", 1);
        __android_log_print(ANDROID_LOG_VERBOSE, "NVRAM", "nvram-verbose");
        __android_log_print(ANDROID_LOG_WARN, "TOLKD", "tolkd-warn");
        __android_log_print(ANDROID_LOG_ERROR, "bogus", "bogus-error");
        log = env.log();
        EXPECT_NE(log.find("nvram-verbose"), std::string::npos);
        EXPECT_EQ(log.find("tolkd-warn"), std::string::npos);
        EXPECT_NE(log.find("bogus-error"), std::string::npos);
    }
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

TEST(Log, TolkdLogNamesTheFileOutsideTheRoot) {
    TestRoot elsewhere;
    LogEnv env(nullptr);  // the device root is now env.root, not elsewhere
    std::string file = elsewhere.at("/named.log");
    setenv("TOLKD_LOG", file.c_str(), 1);
    __android_log_print(ANDROID_LOG_ERROR, "TOLKD", "to-the-named-file");
    unsetenv("TOLKD_LOG");
    EXPECT_NE(elsewhere.read("/named.log").find("to-the-named-file"), std::string::npos);
    EXPECT_FALSE(env.root.exists("/log/tolkd.log"));
}
