// The journal lines and the fail control are checked end to end by the Wi-Fi
// command tests; here the measurement results and their reset.
#include <libwifitest.h>

#include <gtest/gtest.h>

#include <string>

#include "test_root.h"

TEST(WifiTest, ClearedResultsComeBackWithANewMeasurementPerRoot) {
    TestRoot root;
    int32_t first = 0, second = 0;
    root.write("/wifitest/control", "result 120 3\n");
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 120);
    EXPECT_EQ(second, 3);
    EXPECT_TRUE(WIFI_TEST_ClearResult());
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 0);
    EXPECT_EQ(second, 0);
    root.write("/wifitest/control", "result 200 9\n");
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 200);
    EXPECT_EQ(second, 9);

    // Another device root has its own chip: nothing cleared there yet.
    root.write("/wifitest/control", "result 5 5\n");
    EXPECT_TRUE(WIFI_TEST_ClearResult());
    TestRoot other;
    other.write("/wifitest/control", "result 5 5\n");
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 5);
    EXPECT_EQ(second, 5);
}
