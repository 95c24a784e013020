// The process and thread ids in the log's line headers are cached; they must still
// name the process and thread that logged, also in a forked child and in a thread
// that starts after the first line.
#include <android/log.h>

#include <gtest/gtest.h>

#include <stdlib.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <regex>
#include <sstream>
#include <string>
#include <thread>

#include "test_root.h"

namespace {

// (pid, tid) of the line whose message is text; (-1, -1) when there is none.
std::pair<long, long> idsOf(const std::string &log, const std::string &text) {
    std::istringstream in(log);
    std::regex head(R"(^\d\d-\d\d \d\d:\d\d:\d\d\.\d\d\d +(\d+) +(\d+) [VDIWEF] \w+: (.*)$)");
    for (std::string line; std::getline(in, line);) {
        std::smatch m;
        if (std::regex_match(line, m, head) && m[3] == text) return {std::stol(m[1]), std::stol(m[2])};
    }
    return {-1, -1};
}

}  // namespace

TEST(LogIds, HeadersNameTheLoggingProcessAndThread) {
    unsetenv("TOLKD_LOG");
    unsetenv("TOLKD_LOG_STDERR");
    unsetenv("ANDROID_LOG_TAGS");
    TestRoot root;
    const long self = getpid();
    const long mainTid = syscall(SYS_gettid);
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "parent before");

    long threadTid = 0;
    std::thread t([&] {
        threadTid = syscall(SYS_gettid);
        __android_log_print(ANDROID_LOG_INFO, "TOLKD", "from a thread");
    });
    t.join();

    pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        __android_log_print(ANDROID_LOG_INFO, "TOLKD", "from the child");
        _exit(0);
    }
    int status = 0;
    ASSERT_EQ(waitpid(child, &status, 0), child);
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "parent after");

    std::string log = root.read("/log/tolkd.log");
    EXPECT_EQ(idsOf(log, "parent before"), std::make_pair(self, mainTid)) << log;
    EXPECT_EQ(idsOf(log, "from a thread"), std::make_pair(self, threadTid)) << log;
    EXPECT_EQ(idsOf(log, "from the child"), std::make_pair(static_cast<long>(child), static_cast<long>(child)))
        << log;
    EXPECT_EQ(idsOf(log, "parent after"), std::make_pair(self, mainTid)) << log;
}
