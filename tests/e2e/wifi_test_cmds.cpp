// The Wi-Fi RF test commands end to end: the answers a station reads, the calls
// the test chip receives (its journal), and the framework switch through the
// generic service.
#include <gtest/gtest.h>

#include <string>
#include <vector>

#include "sim_device.h"

namespace {

std::string cmd(SimDevice &dev, const std::string &line) { return dev.at(line, true); }

std::string info(const std::string &text, const std::string &result = "OK") {
    return "\r\n" + text + "\r\n\r\n" + result + "\r\n";
}

const char kOk[] = "\r\nOK\r\n";
const char kError[] = "\r\nERROR\r\n";

TEST(WifiTest, TestModeDrivesTheChip) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ(info("-1"), cmd(dev, "AT^WIENABLE?"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIBAND?"));
    EXPECT_EQ(info("0"), cmd(dev, "AT^WIFREQ?"));

    EXPECT_EQ(kOk, cmd(dev, "AT^WIENABLE=2"));
    EXPECT_EQ(info("2"), cmd(dev, "AT^WIENABLE?"));

    dev.writeFile("/wifitest/control", "mode 3\nresult 120 3\n");
    EXPECT_EQ(info("3"), cmd(dev, "AT^WIMODE=?"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIMODE=4"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIMODE=5"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIMODE=-1"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIMODE?"));

    EXPECT_EQ(info("40MHZ"), cmd(dev, "AT^WIBAND=1"));
    EXPECT_EQ(info("40MHZ"), cmd(dev, "AT^WIBAND?"));
    EXPECT_EQ(info("20MHZ"), cmd(dev, "AT^WIBAND=0"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIBAND=2"));
    EXPECT_EQ(info("20MHZ"), cmd(dev, "AT^WIBAND?"));

    EXPECT_EQ(kOk, cmd(dev, "AT^WIFREQ=2412"));
    EXPECT_EQ(info("2412"), cmd(dev, "AT^WIFREQ?"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIDATARATE=54"));
    EXPECT_EQ(info("54"), cmd(dev, "AT^WIDATARATE?"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIPOW=17"));
    EXPECT_EQ(info("17"), cmd(dev, "AT^WIPOW?"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WITX=7"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WITX=0"));

    // Each address is the six low bytes of its number, least significant first.
    EXPECT_EQ(kOk, cmd(dev, "AT^WIRX=1,1234605616436508552,281474976710655"));
    EXPECT_EQ("\r\nUNKNOWN\r\n", cmd(dev, "AT^WIRX=1,5"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIRX=0"));
    EXPECT_EQ(kError, cmd(dev, "AT^WIRX=2"));

    EXPECT_EQ(info("120,3 OK"), cmd(dev, "AT^WIRPCKG?"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIRPCKG=1"));
    EXPECT_EQ(info("0,0 OK"), cmd(dev, "AT^WIRPCKG?"));

    EXPECT_EQ(kOk, cmd(dev, "AT^WIENABLE=0"));
    EXPECT_EQ(info("0"), cmd(dev, "AT^WIENABLE?"));

    EXPECT_EQ("WIFI_TEST_OpenDUT\n"
              "WIFI_TEST_GetSupportedMode\n"
              "WIFI_TEST_SetMode 4\n"
              "WIFI_TEST_SetBandwidth 1\n"
              "WIFI_TEST_SetBandwidth 0\n"
              "WIFI_TEST_SetFrequency 2412 0\n"
              "WIFI_TEST_SetRate 54\n"
              "WIFI_TEST_SetTXPower 17\n"
              "WIFI_TEST_SetTX 1\n"
              "WIFI_TEST_SetTX 0\n"
              "WIFI_TEST_SetRX 1 887766554433 ffffffffffff\n"
              "WIFI_TEST_SetRX 0 000000000000 000000000000\n"
              "WIFI_TEST_GetResult\n"
              "WIFI_TEST_ClearResult\n"
              "WIFI_TEST_GetResult\n"
              "WIFI_TEST_CloseDUT\n",
              dev.readFile("/journal/wifitest.log"));
    EXPECT_EQ(std::string::npos, dev.readFile("/journal/generic.log").find("WITOF"));
}

// Turning Wi-Fi on and off for normal use goes through the framework, never the
// chip; the service's answer is shown before the final result.
TEST(WifiTest, FrameworkSwitchThroughTheGenericService) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ("\r\nOK\r\n\r\nOK\r\n", cmd(dev, "AT^WIENABLE=1"));
    EXPECT_EQ(info("1"), cmd(dev, "AT^WIENABLE?"));
    EXPECT_EQ("\r\nOK\r\n\r\nOK\r\n", cmd(dev, "AT^WIENABLE=0"));
    EXPECT_EQ(info("0"), cmd(dev, "AT^WIENABLE?"));
    EXPECT_EQ("AT+WITOF=2\nAT+WITOF=1\n", dev.readFile("/journal/generic.log"));
    EXPECT_FALSE(dev.fileExists("/journal/wifitest.log")) << dev.readFile("/journal/wifitest.log");

    // A refusal keeps the state: the framework is asked again to turn off.
    dev.writeFile("/sim/generic/script", "AT+WITOF=2 => \\r\\nERROR\\r\\n\n");
    EXPECT_EQ("\r\nERROR\r\n\r\nERROR\r\n", cmd(dev, "AT^WIENABLE=1"));
    EXPECT_EQ(info("0"), cmd(dev, "AT^WIENABLE?"));
    dev.writeFile("/sim/generic/script", "AT+WITOF=1 => \\r\\n+WITOF: busy\\r\\n\n");
    EXPECT_EQ("\r\nOK\r\n\r\nOK\r\n", cmd(dev, "AT^WIENABLE=1"));
    EXPECT_EQ("\r\n+WITOF: busy\r\n\r\nERROR\r\n", cmd(dev, "AT^WIENABLE=0"));
    EXPECT_EQ(info("1"), cmd(dev, "AT^WIENABLE?"));

    // No framework service at all.
    int status = -1;
    dev.sim({"stop", "generic"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(kError, cmd(dev, "AT^WIENABLE=0"));
    EXPECT_EQ(info("1"), cmd(dev, "AT^WIENABLE?"));
    EXPECT_FALSE(dev.fileExists("/journal/wifitest.log"));
}

TEST(WifiTest, EveryLibraryFailureAnswersError) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ(info("20MHZ"), cmd(dev, "AT^WIBAND=0"));
    EXPECT_EQ(kOk, cmd(dev, "AT^WIFREQ=2437"));

    struct Case {
        const char *fail;
        const char *line;
        std::string answer;
        const char *readLine;  // a read that shows what stayed (or nullptr)
        std::string readAnswer;
    } cases[] = {
        {"OpenDUT", "AT^WIENABLE=2", kError, "AT^WIENABLE?", info("-1")},
        {"CloseDUT", "AT^WIENABLE=0", kError, "AT^WIENABLE?", info("-1")},
        {"GetSupportedMode", "AT^WIMODE=?", info("0", "ERROR"), nullptr, ""},
        {"SetMode", "AT^WIMODE=1", kError, nullptr, ""},
        {"SetBandwidth", "AT^WIBAND=1", kError, "AT^WIBAND?", info("20MHZ")},
        {"SetFrequency", "AT^WIFREQ=2412", kError, "AT^WIFREQ?", info("-1")},
        {"SetRate", "AT^WIDATARATE=6", kError, "AT^WIDATARATE?", info("-1")},
        {"SetTXPower", "AT^WIPOW=20", kError, "AT^WIPOW?", info("-1")},
        {"SetTX", "AT^WITX=1", kError, nullptr, ""},
        {"SetRX", "AT^WIRX=0", kError, nullptr, ""},
        {"SetRX", "AT^WIRX=1,1,2", kError, nullptr, ""},
        {"GetResult", "AT^WIRPCKG?", info("0,0 OK", "ERROR"), nullptr, ""},
        {"ClearResult", "AT^WIRPCKG=0", kError, nullptr, ""},
    };
    for (const Case &c : cases) {
        dev.writeFile("/wifitest/control", std::string("mode 2\nresult 7 8\nfail ") + c.fail + "\n");
        EXPECT_EQ(c.answer, cmd(dev, c.line)) << c.fail;
        if (c.readLine != nullptr) {
            EXPECT_EQ(c.readAnswer, cmd(dev, c.readLine)) << c.fail;
        }
    }
    std::string journal = dev.readFile("/journal/wifitest.log");
    EXPECT_NE(std::string::npos, journal.find("WIFI_TEST_SetRX 1 010000000000 020000000000\n")) << journal;
}

}  // namespace
