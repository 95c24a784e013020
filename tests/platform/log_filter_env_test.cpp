// The log filter is re-read only when the environment changed; every way of
// changing ANDROID_LOG_TAGS must still take effect at the next call.
#include <android/log.h>

#include <gtest/gtest.h>

#include <stdlib.h>
#include <string.h>

#include <string>

#include "test_root.h"

namespace {

bool shown(const TestRoot &root, const std::string &text) {
    return root.read("/log/tolkd.log").find(text) != std::string::npos;
}

}  // namespace

TEST(LogFilterEnv, EveryChangeOfTheFilterVariableIsSeen) {
    unsetenv("TOLKD_LOG");
    unsetenv("TOLKD_LOG_STDERR");
    unsetenv("ANDROID_LOG_TAGS");
    TestRoot root;

    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "d-default");
    // Added while absent, then replaced, then removed.
    setenv("ANDROID_LOG_TAGS", "*:d", 1);
    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "d-added");
    setenv("ANDROID_LOG_TAGS", "*:e", 1);
    __android_log_print(ANDROID_LOG_WARN, "TOLKD", "w-replaced");
    unsetenv("ANDROID_LOG_TAGS");
    __android_log_print(ANDROID_LOG_INFO, "TOLKD", "i-removed");

    // Another variable removed and the filter added in its place: same count.
    setenv("TOLK_LOG_FILTER_TEST_OTHER", "1", 1);
    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "d-other");
    unsetenv("TOLK_LOG_FILTER_TEST_OTHER");
    setenv("ANDROID_LOG_TAGS", "*:v", 1);
    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "d-swapped");

    // A putenv string edited in place.
    static char entry[] = "ANDROID_LOG_TAGS=*:s";
    putenv(entry);
    __android_log_print(ANDROID_LOG_ERROR, "TOLKD", "e-silent");
    memcpy(entry + strlen("ANDROID_LOG_TAGS=*:"), "v", 1);
    __android_log_print(ANDROID_LOG_DEBUG, "TOLKD", "d-edited");
    unsetenv("ANDROID_LOG_TAGS");

    EXPECT_FALSE(shown(root, "d-default"));
    EXPECT_TRUE(shown(root, "d-added"));
    EXPECT_FALSE(shown(root, "w-replaced"));
    EXPECT_TRUE(shown(root, "i-removed"));
    EXPECT_FALSE(shown(root, "d-other"));
    EXPECT_TRUE(shown(root, "d-swapped"));
    EXPECT_FALSE(shown(root, "e-silent"));
    EXPECT_TRUE(shown(root, "d-edited"));
}
