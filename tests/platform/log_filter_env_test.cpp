// The log filter is re-read only when the environment changed; every way of
// changing ANDROID_LOG_TAGS must still take effect at the next call.
#include <android/log.h>

#include <gtest/gtest.h>

#include <stdlib.h>

#include <functional>
#include <string>

#include "test_root.h"

TEST(LogFilterEnv, EveryChangeOfTheFilterVariableIsSeen) {
    unsetenv("TOLKD_LOG");
    unsetenv("TOLKD_LOG_STDERR");
    unsetenv("ANDROID_LOG_TAGS");
    TestRoot root;
    static char entry[] = "ANDROID_LOG_TAGS=*:s";
    const struct {
        std::function<void()> change;
        int priority;
        bool shown;
    } steps[] = {
        {[] {}, ANDROID_LOG_DEBUG, false},  // the default is info
        {[] { setenv("ANDROID_LOG_TAGS", "*:d", 1); }, ANDROID_LOG_DEBUG, true},  // added
        {[] { setenv("ANDROID_LOG_TAGS", "*:e", 1); }, ANDROID_LOG_WARN, false},  // replaced
        {[] { unsetenv("ANDROID_LOG_TAGS"); }, ANDROID_LOG_INFO, true},            // removed
        {[] { setenv("TOLK_LOG_FILTER_TEST_OTHER", "1", 1); }, ANDROID_LOG_DEBUG, false},
        // Another variable removed and the filter added in its place: the same count.
        {[] {
             unsetenv("TOLK_LOG_FILTER_TEST_OTHER");
             setenv("ANDROID_LOG_TAGS", "*:v", 1);
         },
         ANDROID_LOG_DEBUG, true},
        {[] { putenv(entry); }, ANDROID_LOG_ERROR, false},
        {[] { entry[sizeof(entry) - 2] = 'v'; }, ANDROID_LOG_DEBUG, true},  // the putenv string edited in place
    };
    const int count = sizeof(steps) / sizeof(steps[0]);
    for (int i = 0; i < count; i++) {
        steps[i].change();
        __android_log_print(steps[i].priority, "TOLKD", "step %d.", i);
    }
    unsetenv("ANDROID_LOG_TAGS");
    const std::string log = root.read("/log/tolkd.log");
    for (int i = 0; i < count; i++) {
        EXPECT_EQ(steps[i].shown, log.find("step " + std::to_string(i) + ".") != std::string::npos) << i;
    }
}
