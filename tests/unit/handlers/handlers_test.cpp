// Local command handlers called the way the dispatcher calls them, where the
// end-to-end tables cannot reach: the clock's environment, SIM counts other than
// two, quoted switch values and a property store that refuses.
#include <cstdlib>
#include <ctime>
#include <filesystem>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

constexpr time_t k20240229Noon = 1709208000;  // 2024-02-29 12:00:00 UTC

// The simulated clock of the device root.
long long secondsFrom(time_t t) { return std::llabs(static_cast<long long>(time(nullptr) - t)); }

class ClockCmdTest : public HandlerTest {
protected:
    void TearDown() override {
        unsetenv("TZ");
        tzset();
        HandlerTest::TearDown();
    }
    int cclk(const char *param) { return call(pas_cclk_handler, param, AT_SET_OP); }
};

// The environment is never written: other threads read it while a set runs.
TEST_F(ClockCmdTest, SetTakesTheFieldsAsUtcAndLeavesTzAlone) {
    static char tz[] = "TZ=EST5EDT";
    putenv(tz);
    tzset();
    EXPECT_EQ(0, cclk("\"24/02/29,12:00:00+32\""));
    EXPECT_LE(secondsFrom(k20240229Noon), 2);
    EXPECT_EQ(32, gCclkTz);
    EXPECT_EQ(tz + 3, std::getenv("TZ")) << "the caller's TZ entry itself, not a copy";

    unsetenv("TZ");
    tzset();
    // Hour 24, minute 60 and second 60 pass the check and roll over; hour 0 is a time.
    EXPECT_EQ(0, cclk("24/02/29, 24:60:60"));
    EXPECT_LE(secondsFrom(1709254860), 2);
    EXPECT_EQ(nullptr, std::getenv("TZ")) << "an unset TZ stays unset";
    EXPECT_EQ(32, gCclkTz) << "17 characters leave the stored zone";
    EXPECT_STREQ("", response);
    EXPECT_EQ(0, cclk("24/03/01,00:00:00"));
    EXPECT_LE(secondsFrom(k20240229Noon + 12 * 3600), 2);
}

TEST_F(ClockCmdTest, SetRefusesBadFieldsZonesAndCutsAnOverlongValue) {
    time_t before = time(nullptr);
    // Month 13 and a refused date with a good zone: local_commands.tx.
    for (const char *bad : {"24/00/01,00:00:00", "24/01/32,00:00:00", "24/01/01,25:00:00", "24/01/01,00:61:00",
                            "ab/01/01,00:00:00", "24/02/29,12:00:00+99"}) {
        EXPECT_EQ(4, cclk(bad)) << bad;
        EXPECT_STREQ("", response) << bad;
    }
    EXPECT_EQ(65535, gCclkTz) << "a zone out of range is not stored";
    EXPECT_LE(secondsFrom(before), 2) << "no refused value moved the clock";
    // The working copy stops at 39 characters, the answer at the buffer's end.
    std::string huge(5000, '1');
    EXPECT_EQ(4, cclk(huge.c_str()));
    EXPECT_EQ(RESPONSE_BUF_SIZE - 1, static_cast<int>(std::strlen(response)));
    EXPECT_EQ(0, std::string(response).rfind("CME ERROR: Invalid parameters: [5000] cmdline:111", 0));
}

// AT+ESUO on single and triple SIM devices, and in C2K mode, where value 9 picks
// the third modem and there is no SIM 3.
TEST_F(HandlerTest, SimSelectionFollowsTheSimCountAndC2kMode) {
    auto esuo = [&](const char *param, int op) { return call(pas_esuo_handler, param, op); };
    ASSERT_EQ(0, property_set("persist.radio.multisim.config", "ss"));
    EXPECT_EQ(4, esuo("5", AT_SET_OP));
    EXPECT_EQ("(unset)", prop("persist.service.tolk.sim"));
    EXPECT_EQ(0, esuo("4", AT_SET_OP));
    EXPECT_EQ("0", prop("persist.service.tolk.sim"));
    EXPECT_EQ(0, esuo("", AT_TEST_OP));
    EXPECT_EQ("\r\n+ESUO: (4)\r\n", host.take());

    ASSERT_EQ(0, property_set("persist.radio.multisim.config", "tsts"));
    EXPECT_EQ(0, esuo("6", AT_SET_OP));
    EXPECT_EQ("2", prop("persist.service.tolk.sim"));
    // Any number but 0 is C2K mode; 2^32 must not wrap to 0.
    ASSERT_EQ(0, property_set("ro.boot.opt_c2k_lte_mode", "4294967296"));
    EXPECT_EQ(0, esuo("9", AT_SET_OP));
    EXPECT_EQ("9", prop("persist.service.tolk.sim"));
    EXPECT_EQ(4, esuo("6", AT_SET_OP)) << "no SIM 3 in C2K mode, even on a triple-SIM device";
    EXPECT_EQ("9", prop("persist.service.tolk.sim"));
    EXPECT_EQ(0, esuo("", AT_TEST_OP)) << "the test answer does not look at C2K mode";
    EXPECT_EQ("\r\n+ESUO: (4-6)\r\n", host.take());
}

// Echo takes only the digits 0 and 1; a switch takes a quoted value too. (AT%EURC
// shares the switch handler, and a stored number out of range: local_commands.tx.)
TEST_F(HandlerTest, EchoAndPropertySwitchesTakeOnlyTheirValues) {
    gSerialDevice.echoOption[DEVICE_SERIAL] = 1;
    EXPECT_EQ(4, call(pas_echo_handler, "ATE2", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ate0", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_tolk_handler, "1", AT_SET_OP));
    EXPECT_EQ(0, call(pas_tolk_handler, "\"0\"", AT_SET_OP));
    EXPECT_EQ("0", prop("persist.service.tolk.usermode"));
}

// AT@USBCONFIG: at most the first 91 characters count, and quotes dropped from
// them are not made up for by later ones; a store that cannot take the value
// gives ERROR with the value echoed.
TEST_F(HandlerTest, UsbConfigCutAndRefusedByTheStore) {
    const std::string param(89, 'a');
    EXPECT_EQ(0, call(pas_usbconfig_handler, ("'" + param + "'XYZ").c_str(), AT_SET_OP));
    EXPECT_EQ(param, prop("sys.usb.config"));
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ(4, call(pas_usbconfig_handler, "adb", AT_SET_OP));
    EXPECT_STREQ("\r\n@USBCONFIG=\"adb\"\r\n\r\nERROR\r\n", response);
}

}  // namespace
