// Local command handlers called the way the dispatcher calls them, where the
// end-to-end tables cannot reach: the clock's environment, SIM counts other than
// two, quoted switch values and a property store that refuses.
#include <cstdlib>
#include <ctime>
#include <filesystem>
#include <thread>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"
#include "targets/generic_link.h"

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
    EXPECT_EQ(0, cclk("24/02/29, 12:00:00"));
    EXPECT_EQ(nullptr, std::getenv("TZ")) << "an unset TZ stays unset";
    EXPECT_EQ(32, gCclkTz) << "17 characters leave the stored zone";
    EXPECT_STREQ("", response);
}

// Every day a calendar has, the zone limits, a leap second and the end of a day;
// nothing that would roll over into another date. (Hour 00, month 13 and the
// CME ERROR of a wrong length: local_commands.tx.)
TEST_F(ClockCmdTest, SetTakesRealDatesOnlyAndARefusalChangesNothing) {
    const std::pair<const char *, time_t> good[] = {
        {"24/01/31,00:00:00+96", 1706659200}, {"23/12/31,23:59:60-96", 1704067200},
        {"24/02/29,24:00:00", 1709251200},    {"00/02/29,00:00:00", 951782400},
        {"99/04/01,00:00:00", 4078684800},
    };
    for (const auto &g : good) {
        EXPECT_EQ(0, cclk(g.first)) << g.first;
        EXPECT_LE(secondsFrom(g.second), 2) << g.first;
    }
    EXPECT_EQ(-96, gCclkTz);
    const time_t before = time(nullptr);
    for (const char *bad : {"23/02/29,00:00:00", "24/02/30,12:00:00", "24/04/31,23:59:60+32", "24/00/01,00:00:00",
                            "24/01/32,00:00:00", "24/01/00,00:00:00", "24/01/01,12:60:00", "24/01/01,24:00:01",
                            "24/01/01,25:00:00", "24/02/29;12:34:56", "24/02/29,12:34.56", "2b/01/01,00:00:00",
                            "-1/01/01,00:00:00", "24/01/01,00:00:00+97", "24/01/01,00:00:00-97",
                            "24/01/01,00:00:00+3x", "24/01/01,00:00:00032", "24/01/01,00:00:61+04"}) {
        EXPECT_EQ(4, cclk(bad)) << bad;
        EXPECT_STREQ("", response) << bad;
    }
    EXPECT_EQ(-96, gCclkTz) << "a refused command stores no zone";
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
    for (const char *sim : {"5", "4", "9"}) {
        EXPECT_EQ(0, esuo(sim, AT_SET_OP));
        EXPECT_EQ(std::to_string(*sim == '9' ? 9 : *sim - '4'), prop("persist.service.tolk.sim")) << sim;
    }
    EXPECT_EQ(4, esuo("6", AT_SET_OP)) << "no SIM 3 in C2K mode, even on a triple-SIM device";
    EXPECT_EQ("9", prop("persist.service.tolk.sim"));
    EXPECT_EQ(0, esuo("", AT_TEST_OP)) << "the test answer does not look at C2K mode";
    EXPECT_EQ("\r\n+ESUO: (4-6)\r\n", host.take());
}

// Echo takes only the digits 0 and 1. (Quoted numbers: AtTok.)
TEST_F(HandlerTest, EchoTakesOnlyItsValues) {
    gSerialDevice.echoOption[DEVICE_SERIAL] = 1;
    EXPECT_EQ(4, call(pas_echo_handler, "ATE2", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ate0", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
}

// AT@USBCONFIG: at most the first 91 characters count, and quotes dropped from
// them are not made up for by later ones. A store that cannot take a value gives
// ERROR (AT@USBCONFIG with the value echoed): the setting did not change.
TEST_F(HandlerTest, UsbConfigCutAndPropertyWritesRefusedByTheStore) {
    const std::string param(89, 'a');
    EXPECT_EQ(0, call(pas_usbconfig_handler, ("'" + param + "'XYZ").c_str(), AT_SET_OP));
    EXPECT_EQ(param, prop("sys.usb.config"));
    std::filesystem::remove_all(root.at("/properties"));
    root.write("/properties", "not a folder");
    EXPECT_EQ(4, call(pas_usbconfig_handler, "adb", AT_SET_OP));
    EXPECT_STREQ("\r\n@USBCONFIG=\"adb\"\r\n\r\nERROR\r\n", response);
    for (CmdHandler h : {pas_tolk_handler, pas_eurc_handler, pas_usbTethering_handler, pas_esuo_handler}) {
        EXPECT_EQ(4, call(h, h == pas_esuo_handler ? "4" : "1", AT_SET_OP));
        EXPECT_EQ(4, call(h, h == pas_esuo_handler ? "5" : "0", AT_SET_OP));
    }
}

// What waited on the framework's link before the command is an earlier answer and
// goes to the host first; what came behind the final result line goes after the
// answer's own text. (The answers themselves: wifi_test.tx.)
TEST_F(HandlerTest, WifiFrameworkExchangeRelaysWhatIsNotItsAnswerInOrder) {
    int service = socketLink(&s_fdService_command);
    writeAll(service, "\r\n+EARLIER: 1\r\n\r\nERROR\r\n");
    std::thread framework([service] {
        EXPECT_EQ("AT+WITOF=2", drainFd(service, 3000, 0));
        writeAll(service, "\r\n+WITOF: 1\r\n\r\nOK\r\n\r\n+LATER\r\n");
    });
    EXPECT_EQ(0, call(pas_wienable_handler, "1", AT_SET_OP));
    framework.join();
    genericLinkQuiet();  // the main loop relays the rest once the link is quiet
    EXPECT_EQ("\r\n+EARLIER: 1\r\n\r\nERROR\r\n\r\n+WITOF: 1\r\n\r\n+LATER\r\n", host.take());
    closeFd(s_fdService_command);
    closeFd(service);
}

}  // namespace
