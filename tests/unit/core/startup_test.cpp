// Start-up: the boot mode decides whether the daemon runs; a host link that cannot be
// set up ends it with status 1.
#include <sys/socket.h>
#include <sys/stat.h>

#include <cutils/properties.h>
#include <gtest/gtest.h>

#include "core/reader.h"
#include "core/startup.h"
#include "test_root.h"

TEST(BootModeTest, OnlyTheFirstCharacterCounts) {
    TestRoot root;
    EXPECT_EQ(-1, getBootMode());  // missing file
    struct {
        const char *content;
        int mode;
    } cases[] = {{"5", 5}, {"57", 5}, {"8\n", 8}, {"", 0}, {"x", 0}};
    for (const auto &c : cases) {
        SCOPED_TRACE(c.content);
        root.write(BOOT_MODE_FILE, c.content);
        EXPECT_EQ(c.mode, getBootMode());
    }
}

TEST(StartupDeathTest, EngineeringBootModeExitsAtOnceWithZero) {
    TestRoot root;
    // gtest reads its capture file in /tmp back with fopen(), which resolves under the root.
    ASSERT_EQ(0, symlink("/tmp", root.at("/tmp").c_str()));
    root.write(BOOT_MODE_FILE, "5\n");
    EXPECT_EXIT(tolkdMain(), ::testing::ExitedWithCode(0), "");
    char pct[PROPERTY_VALUE_MAX];
    property_get("persist.service.pct.mode", pct, "unset");
    EXPECT_STREQ("unset", pct);  // nothing touched
}

TEST(StartupTest, MissingSerialPortEndsStartupWithOne) {
    TestRoot root;
    root.write(BOOT_MODE_FILE, "0");
    EXPECT_EQ(1, tolkdMain());
}

TEST(StartupTest, AdbSocketThatCannotListenEndsStartupWithOne) {
    TestRoot root;
    property_set("ro.boot.atm", "enabled");  // no serial port in ATM mode
    int sp[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sp));  // connected: listen fails
    setenv("ANDROID_SOCKET_adb_tolk_socket", std::to_string(sp[0]).c_str(), 1);
    EXPECT_EQ(3, adb_socket_listen(sp[0]));
    EXPECT_EQ(1, tolkdMain());
    unsetenv("ANDROID_SOCKET_adb_tolk_socket");
    close(sp[0]);
    close(sp[1]);
}
