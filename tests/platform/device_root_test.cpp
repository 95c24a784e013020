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
#include <utility>

#include "test_root.h"

TEST(DeviceRoot, PathsResolveUnderTheRootOnceAndOpenAndFopenReachIt) {
    TestRoot root;
    const std::string sibling = root.path() + "x/file";  // starts like the root, is not under it
    const std::pair<std::string, std::string> cases[] = {
        {"/dev/ttyGS0", root.at("/dev/ttyGS0")},
        {"relative/file", "relative/file"},
        {root.at("/data/prod/citf"), root.at("/data/prod/citf")},  // not prefixed twice
        {sibling, root.path() + sibling},
    };
    char buf[4096], small[8];
    for (const auto &c : cases) {
        EXPECT_STREQ(c.second.c_str(), tolk_device_path(c.first.c_str(), buf, sizeof(buf))) << c.first;
    }
    EXPECT_EQ(tolk_device_path("/dev/ttyGS0", small, sizeof(small)), nullptr);

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

    // The root is looked up at the moment of the call.
    {
        TestRoot other;
        EXPECT_LT(open("/sys/new", O_RDONLY), 0);
        EXPECT_EQ(fopen("/sys/boot_mode", "r"), nullptr);
    }
    unsetenv("TOLKD_ROOT");
    EXPECT_STREQ("/sys/class", tolk_device_path("/sys/class", buf, sizeof(buf)));
}
