// The libc calls of the daemon as this binary sees them: wrapped at link time.
#include <gtest/gtest.h>

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

// 2024-02-29 12:00:00 UTC.
constexpr time_t kLeapNoon = 1709208000;

}  // namespace

TEST(IoWraps, SystemJournalsAndNeverRuns) {
    TestRoot root;
    std::string marker = root.at("/ran");
    EXPECT_EQ(system(("touch " + marker).c_str()), 0);
    EXPECT_EQ(system("reboot -p"), 0);
    EXPECT_EQ(system("echo a\necho b"), 0);
    sync();
    EXPECT_FALSE(root.exists("/ran"));
    std::string log = root.read("/journal/shell.log");
    EXPECT_NE(log.find(" touch " + marker + "\n"), std::string::npos) << log;
    EXPECT_NE(log.find(" reboot -p\n"), std::string::npos) << log;
    // One line per call even when the command holds a line break.
    EXPECT_NE(log.find(" echo a\\necho b\n"), std::string::npos) << log;
    int lines = 0;
    for (char c : log) lines += c == '\n';
    EXPECT_EQ(lines, 3);
    EXPECT_NE(system(nullptr), 0);
}

TEST(IoWraps, SettimeofdayMovesOnlyTheSimulatedClock) {
    TestRoot root;
    struct timeval tv = {kLeapNoon, 250000};
    ASSERT_EQ(settimeofday(&tv, nullptr), 0);
    EXPECT_LE(llabs(static_cast<long long>(time(nullptr)) - kLeapNoon), 2);
    time_t out = 0;
    time(&out);
    EXPECT_LE(llabs(static_cast<long long>(out) - kLeapNoon), 2);
    struct timeval now;
    struct timezone tz = {123, 9};
    ASSERT_EQ(gettimeofday(&now, &tz), 0);
    EXPECT_LE(llabs(static_cast<long long>(now.tv_sec) - kLeapNoon), 2);
    EXPECT_EQ(tz.tz_minuteswest, 0);
    EXPECT_EQ(tz.tz_dsttime, 0);
    // The host clock has not moved.
    EXPECT_GT(host_seconds(), 1750000000LL);
    EXPECT_FALSE(root.read("/clock/offset").empty());

    // Another process (a restarted daemon) sees the same clock through the file.
    root.write("/clock/offset", "-86400 500000\n");
    long long expect = host_seconds() - 86400;
    EXPECT_LE(llabs(static_cast<long long>(time(nullptr)) - expect), 2);

    root.write("/clock/tz_minuteswest", "-330\n");
    ASSERT_EQ(gettimeofday(&now, &tz), 0);
    EXPECT_EQ(tz.tz_minuteswest, -330);
    // tv NULL only sets the zone.
    struct timezone west = {480, 0};
    EXPECT_EQ(settimeofday(nullptr, &west), 0);
    ASSERT_EQ(gettimeofday(&now, &tz), 0);
    EXPECT_EQ(tz.tz_minuteswest, 480);
    EXPECT_LE(llabs(static_cast<long long>(time(nullptr)) - expect), 2);
}

TEST(IoWraps, SettimeofdayRefusesWhatTheKernelRefuses) {
    TestRoot root;
    struct timeval bad = {kLeapNoon, 1000000};
    EXPECT_EQ(settimeofday(&bad, nullptr), -1);
    EXPECT_EQ(errno, EINVAL);
    struct timeval before1970 = {-5, 0};
    EXPECT_EQ(settimeofday(&before1970, nullptr), -1);
    EXPECT_FALSE(root.exists("/clock/offset"));
    EXPECT_LE(llabs(static_cast<long long>(time(nullptr)) - host_seconds()), 1);
}

TEST(IoWraps, ClockWithoutRootLivesInMemory) {
    const char *saved = getenv("TOLKD_ROOT");
    std::string keep = saved != nullptr ? saved : "";
    unsetenv("TOLKD_ROOT");
    struct timeval tv = {kLeapNoon, 0};
    ASSERT_EQ(settimeofday(&tv, nullptr), 0);
    EXPECT_LE(llabs(static_cast<long long>(time(nullptr)) - kLeapNoon), 2);
    EXPECT_GT(host_seconds(), 1750000000LL);
    // Put it back for the rest of the process.
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    tv.tv_sec = ts.tv_sec;
    tv.tv_usec = ts.tv_nsec / 1000;
    settimeofday(&tv, nullptr);
    if (!keep.empty()) setenv("TOLKD_ROOT", keep.c_str(), 1);
}

TEST(IoWraps, PmicAdcDeviceAnswersFromItsFile) {
    TestRoot root;
    EXPECT_LT(open("/dev/OV_pmic_adc_cali", O_RDONLY), 0);  // no device, no open
    root.write("/dev/OV_pmic_adc_cali", "# channel value status\n1 18755\n66 -3 0\n2 7 5\n");
    int fd = open("/dev/OV_pmic_adc_cali", O_RDONLY);
    ASSERT_GE(fd, 0);
    int io[2] = {1, 5};
    EXPECT_EQ(ioctl(fd, 0x40046B04, io), 0);
    EXPECT_EQ(io[0], 18755);
    EXPECT_EQ(io[1], 0);
    int neg[2] = {66, 5};
    EXPECT_EQ(ioctl(fd, 0x40046B04, neg), 0);
    EXPECT_EQ(neg[0], -3);
    EXPECT_EQ(neg[1], 0);
    int failing[2] = {2, 5};
    EXPECT_EQ(ioctl(fd, 0x40046B04, failing), 0);
    EXPECT_EQ(failing[1], 5);
    int missing[2] = {9, 5};
    EXPECT_EQ(ioctl(fd, 0x40046B04, missing), 0);
    EXPECT_EQ(missing[1], -1);
    int value = 16;
    EXPECT_EQ(ioctl(fd, 0x40046B06, &value), 0);
    EXPECT_EQ(ioctl(fd, 0x40046B06, &value), 0);
    close(fd);
    EXPECT_EQ(root.read("/journal/adc_set.log"), "16\n16\n");

    // The same request numbers on any other descriptor go to the kernel.
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
