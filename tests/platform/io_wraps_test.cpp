// The libc calls of the daemon as this binary sees them: wrapped at link time.
#include <gtest/gtest.h>

#include <algorithm>

#include <fcntl.h>
#include <stdlib.h>
#include <sys/ioctl.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <string>

#include "test_root.h"

namespace {

long long host_seconds() {
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    return ts.tv_sec;
}

bool near(long long a, long long b) { return llabs(a - b) <= 2; }

// 2024-02-29 12:00:00 UTC.
constexpr time_t kLeapNoon = 1709208000;

}  // namespace

TEST(IoWraps, SystemJournalsOneLinePerCallAndNeverRuns) {
    TestRoot root;
    std::string marker = root.at("/ran");
    EXPECT_EQ(system(("touch " + marker).c_str()), 0);
    EXPECT_EQ(system("echo a\necho b"), 0);
    EXPECT_FALSE(root.exists("/ran"));
    std::string log = root.read("/journal/shell.log");
    EXPECT_NE(log.find(" touch " + marker + "\n"), std::string::npos) << log;
    EXPECT_NE(log.find(" echo a\\necho b\n"), std::string::npos) << log;
    EXPECT_EQ(std::count(log.begin(), log.end(), '\n'), 2);
}

TEST(IoWraps, SettimeofdayMovesOnlyTheSimulatedClock) {
    TestRoot root;
    struct timeval tv = {kLeapNoon, 250000};
    ASSERT_EQ(settimeofday(&tv, nullptr), 0);
    EXPECT_TRUE(near(time(nullptr), kLeapNoon));
    struct timeval now;
    struct timezone tz = {123, 9};
    ASSERT_EQ(gettimeofday(&now, &tz), 0);
    EXPECT_TRUE(near(now.tv_sec, kLeapNoon));
    EXPECT_EQ(tz.tz_minuteswest, 0);
    EXPECT_GT(host_seconds(), 1750000000LL);  // the host clock has not moved

    // Another process (a restarted daemon) sees the same clock through the file.
    root.write("/clock/offset", "-86400 500000\n");
    long long expect = host_seconds() - 86400;
    EXPECT_TRUE(near(time(nullptr), expect));
    // tv NULL only sets the zone.
    struct timezone west = {480, 0};
    EXPECT_EQ(settimeofday(nullptr, &west), 0);
    ASSERT_EQ(gettimeofday(&now, &tz), 0);
    EXPECT_EQ(tz.tz_minuteswest, 480);
    EXPECT_TRUE(near(time(nullptr), expect));
}

TEST(IoWraps, SettimeofdayRefusesWhatTheKernelRefusesAndWorksWithoutRoot) {
    {
        TestRoot root;
        struct timeval bad = {kLeapNoon, 1000000};
        EXPECT_EQ(settimeofday(&bad, nullptr), -1);
        EXPECT_EQ(errno, EINVAL);
        struct timeval before1970 = {-5, 0};
        EXPECT_EQ(settimeofday(&before1970, nullptr), -1);
        EXPECT_FALSE(root.exists("/clock/offset"));
    }
    const char *saved = getenv("TOLKD_ROOT");
    std::string keep = saved != nullptr ? saved : "";
    unsetenv("TOLKD_ROOT");
    struct timeval tv = {kLeapNoon, 0};
    ASSERT_EQ(settimeofday(&tv, nullptr), 0);
    EXPECT_TRUE(near(time(nullptr), kLeapNoon));
    EXPECT_GT(host_seconds(), 1750000000LL);
    tv.tv_sec = host_seconds();  // put it back for the rest of the process
    settimeofday(&tv, nullptr);
    if (!keep.empty()) setenv("TOLKD_ROOT", keep.c_str(), 1);
}

TEST(IoWraps, PmicAdcRequestsOnOtherDescriptorsGoToTheKernel) {
    TestRoot root;
    EXPECT_LT(open("/dev/OV_pmic_adc_cali", O_RDONLY), 0);  // no device, no open
    int p[2];
    ASSERT_EQ(pipe(p), 0);
    int unused[2] = {1, 5};
    EXPECT_EQ(ioctl(p[0], 0x40046B04, unused), -1);
    ASSERT_EQ(write(p[1], "abc", 3), 3);
    int avail = 0;
    EXPECT_EQ(ioctl(p[0], FIONREAD, &avail), 0);
    EXPECT_EQ(avail, 3);
    close(p[0]);
    close(p[1]);
}
