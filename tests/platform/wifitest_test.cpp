#include <libwifitest.h>

#include <gtest/gtest.h>

#include <string>

#include "test_root.h"

TEST(WifiTest, CallsAreJournalledWithTheirArguments) {
    TestRoot root;
    EXPECT_TRUE(WIFI_TEST_OpenDUT());
    EXPECT_TRUE(WIFI_TEST_SetMode(3));
    EXPECT_TRUE(WIFI_TEST_SetBandwidth(1));
    EXPECT_TRUE(WIFI_TEST_SetFrequency(2412, 0));
    EXPECT_TRUE(WIFI_TEST_SetRate(-5));
    EXPECT_TRUE(WIFI_TEST_SetTXPower(17));
    EXPECT_TRUE(WIFI_TEST_SetTX(true));
    unsigned char a1[6] = {0x66, 0x55, 0x44, 0x33, 0x22, 0x11};
    unsigned char a2[6] = {0, 0, 0, 0, 0, 0xff};
    EXPECT_TRUE(WIFI_TEST_SetRX(true, a1, a2));
    EXPECT_TRUE(WIFI_TEST_CloseDUT());
    EXPECT_EQ(root.read("/journal/wifitest.log"),
              "WIFI_TEST_OpenDUT\n"
              "WIFI_TEST_SetMode 3\n"
              "WIFI_TEST_SetBandwidth 1\n"
              "WIFI_TEST_SetFrequency 2412 0\n"
              "WIFI_TEST_SetRate -5\n"
              "WIFI_TEST_SetTXPower 17\n"
              "WIFI_TEST_SetTX 1\n"
              "WIFI_TEST_SetRX 1 665544332211 0000000000ff\n"
              "WIFI_TEST_CloseDUT\n");
}

TEST(WifiTest, ControlFileSteersAnswers) {
    TestRoot root;
    int32_t mode = -1;
    EXPECT_TRUE(WIFI_TEST_GetSupportedMode(&mode));
    EXPECT_EQ(mode, 0);
    root.write("/wifitest/control", "mode 7\nfail SetMode\nfail WIFI_TEST_OpenDUT\nresult 120 3\n");
    EXPECT_TRUE(WIFI_TEST_GetSupportedMode(&mode));
    EXPECT_EQ(mode, 7);
    EXPECT_FALSE(WIFI_TEST_SetMode(1));
    EXPECT_FALSE(WIFI_TEST_OpenDUT());
    EXPECT_TRUE(WIFI_TEST_SetRate(1));  // not named: still succeeds
    // A failed call is journalled too.
    EXPECT_NE(root.read("/journal/wifitest.log").find("WIFI_TEST_SetMode 1\n"), std::string::npos);

    int32_t first = 0, second = 0;
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 120);
    EXPECT_EQ(second, 3);
    EXPECT_TRUE(WIFI_TEST_ClearResult());
    EXPECT_TRUE(WIFI_TEST_GetResult(&first, &second));
    EXPECT_EQ(first, 0);
    EXPECT_EQ(second, 0);
    // A new measurement shows up again.
    root.write("/wifitest/control", "result 200 9\nfail GetResult\n");
    EXPECT_FALSE(WIFI_TEST_GetResult(&first, &second));
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
