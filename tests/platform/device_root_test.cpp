// Device-root resolution: in this binary open() and fopen() are the daemon's,
// wrapped at link time. Were a path to miss the root, every file test would read
// or write the host's own files and pass or fail for the wrong reason.
#include <tolk_platform/device_root.h>

#include <gtest/gtest.h>

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <sys/stat.h>
#include <unistd.h>

#include <string>

#include "test_root.h"

namespace {

std::string resolved(const char *path) {
    char buf[4096];
    const char *r = tolk_device_path(path, buf, sizeof(buf));
    return r != nullptr ? std::string(r) : std::string("<null>");
}

}  // namespace

TEST(DeviceRoot, PathsResolveUnderTheRootOnce) {
    TestRoot root;
    EXPECT_EQ(resolved("/dev/ttyGS0"), root.path() + "/dev/ttyGS0");
    EXPECT_EQ(resolved("relative/file"), "relative/file");
    // Already resolved: not prefixed twice. A sibling whose name merely starts
    // like the root is not under it.
    EXPECT_EQ(resolved(root.at("/data/prod/citf").c_str()), root.at("/data/prod/citf"));
    std::string sibling = root.path() + "x/file";
    EXPECT_EQ(resolved(sibling.c_str()), root.path() + sibling);
    char small[8];
    EXPECT_EQ(tolk_device_path("/dev/ttyGS0", small, sizeof(small)), nullptr);
    unsetenv("TOLKD_ROOT");
    EXPECT_EQ(resolved("/sys/class"), "/sys/class");
}

TEST(DeviceRoot, OpenAndFopenReachTheRoot) {
    TestRoot root;
    root.write("/sys/boot_mode", "5\n");
    FILE *f = fopen("/sys/boot_mode", "r");
    ASSERT_NE(f, nullptr);
    fclose(f);
    // O_CREAT carries its mode through the variadic argument.
    umask(022);
    int fd = open("/sys/new", O_WRONLY | O_CREAT | O_EXCL, 0600);
    ASSERT_GE(fd, 0);
    close(fd);
    struct stat st;
    ASSERT_EQ(stat(root.at("/sys/new").c_str(), &st), 0);
    EXPECT_EQ(st.st_mode & 0777, 0600u);

    // The root is looked up at the moment of the open.
    TestRoot other;
    EXPECT_LT(open("/sys/new", O_RDONLY), 0);
    EXPECT_EQ(fopen("/sys/boot_mode", "r"), nullptr);
}
