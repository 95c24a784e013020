// The process and thread ids in the log's line headers are cached; they must still
// name the process and thread that logged, also in a forked child and in a thread
// that starts after the first line.
#include <android/log.h>

#include <gtest/gtest.h>

#include <stdio.h>
#include <stdlib.h>
#include <sys/syscall.h>
#include <sys/wait.h>
#include <unistd.h>

#include <sstream>
#include <string>
#include <thread>

#include "test_root.h"

namespace {

std::string ids(long pid, long tid) { return std::to_string(pid) + " " + std::to_string(tid); }

// "pid tid" of the line whose message is text ("12-06 07:45:15.123  4711  4712 I TOLKD: text").
std::string idsOf(const std::string &log, const std::string &text) {
    std::istringstream in(log);
    for (std::string line; std::getline(in, line);) {
        long pid = 0, tid = 0;
        int end = 0;
        if (sscanf(line.c_str(), "%*s %*s %ld %ld %*c TOLKD: %n", &pid, &tid, &end) == 2 && end > 0 &&
            line.substr(end) == text)
            return ids(pid, tid);
    }
    return "none";
}

}  // namespace

TEST(LogIds, HeadersNameTheLoggingProcessAndThread) {
    unsetenv("TOLKD_LOG");
    unsetenv("TOLKD_LOG_STDERR");
    unsetenv("ANDROID_LOG_TAGS");
    TestRoot root;
    const long self = getpid(), mainTid = syscall(SYS_gettid);
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "parent before");
    long threadTid = 0;
    std::thread([&] {
        threadTid = syscall(SYS_gettid);
        __android_log_print(ANDROID_LOG_INFO, "TOLKD", "from a thread");
    }).join();
    pid_t child = fork();
    ASSERT_GE(child, 0);
    if (child == 0) {
        __android_log_print(ANDROID_LOG_INFO, "TOLKD", "from the child");
        _exit(0);
    }
    ASSERT_EQ(waitpid(child, nullptr, 0), child);
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "parent after");

    const std::string log = root.read("/log/tolkd.log");
    EXPECT_EQ(ids(self, mainTid), idsOf(log, "parent before")) << log;
    EXPECT_EQ(ids(self, threadTid), idsOf(log, "from a thread")) << log;
    EXPECT_EQ(ids(child, child), idsOf(log, "from the child")) << log;
    EXPECT_EQ(ids(self, mainTid), idsOf(log, "parent after")) << log;
}
