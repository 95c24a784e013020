// Commands the daemon answers itself, byte for byte as the host receives them,
// on the adb link and on the serial port (with echo off, the two are equal).
#include <regex>
#include <utility>

#include <gtest/gtest.h>

#include "sim_device.h"

namespace {

using Exchanges = std::vector<std::pair<std::string, std::string>>;

const char kOk[] = "\r\nOK\r\n";
const char kError[] = "\r\nERROR\r\n";
const char kNotImpl[] = "\r\nNot Implement\r\n";
const char kUnknown[] = "\r\nUNKNOWN\r\n";
const char kUserMode[] = "\r\nNot access to modem in User Mode.\r\n";

class LocalCommands : public ::testing::Test {
protected:
    explicit LocalCommands(const std::vector<std::string> &upArgs = {}) : dev(upArgs) {}

    void SetUp() override {
        ASSERT_TRUE(dev.started()) << dev.upOutput();
        ASSERT_EQ("ATE0\n\r\nOK\r\n", dev.at("ATE0"));
    }

    void expectOn(bool adb, const Exchanges &xs) {
        for (const auto &x : xs)
            EXPECT_EQ(visible(x.second), visible(dev.at(x.first, adb)))
                << x.first << (adb ? " on adb" : " on serial");
    }
    // Commands without lasting effect: the same answer on both links.
    void expectBoth(const Exchanges &xs) {
        expectOn(true, xs);
        expectOn(false, xs);
    }

    SimDevice dev;
};

class Op12Commands : public LocalCommands {
protected:
    Op12Commands() : LocalCommands({"--prop", "persist.operator.optr=OP12", "--log-tags", "TOLKD:d *:i"}) {}
};

class BatteryCommands : public LocalCommands {
protected:
    BatteryCommands() : LocalCommands({"--adc", "1=18004", "--adc", "66=7"}) {}
};

class FailingAdc : public LocalCommands {
protected:
    FailingAdc() : LocalCommands({"--adc", "1=18000,1", "--adc", "66=7,3"}) {}
};

TEST_F(LocalCommands, TerminalAndRefusedCommands) {
    expectBoth({
        {"ATE0", kOk},
        {"ATQ0V1E", kOk},
        {"AT#CLS=?", kError},
        {"AT#CLS?", kNotImpl},
        {"AT+GCI?", kError},
        {"AT+GCI=?", kError},
        {"AT+GCI=1", kNotImpl},
        {"AT%WLAN?", kError},
        {"AT%WLAN", kError},
        {"AT%WLAN=?", kNotImpl},
        {"AT%MAC=?", kError},
        {"AT%REBOOT=1", kNotImpl},
        {"AT%REBOOT?", kNotImpl},
        {"AT+CCLK", kNotImpl},
    });
    // ATE1 is typed while echo is off; the next line is echoed again.
    expectOn(false, {{"ATE1", kOk}, {"AT#CLS=?", std::string("AT#CLS=?\n") + kError}});
}

TEST_F(LocalCommands, RebootRunsTheShellCommandBeforeOk) {
    EXPECT_EQ(kOk, dev.at("AT%REBOOT", true));
    EXPECT_NE(std::string::npos, dev.readFile("/journal/shell.log").find("shutdown -r -t 3"));
}

TEST_F(LocalCommands, UrcAndUserModeSwitches) {
    expectBoth({
        {"AT%EURC?", "\r\n+EURC:0\r\n\r\nOK\r\n"},
        {"AT%EURC=?", "\r\n+EURC:(0,1)\r\n\r\nOK\r\n"},
        {"AT+TOLK?", "\r\n+TOLK:0\r\n\r\nOK\r\n"},
        {"AT+TOLK=?", "\r\n+TOLK:(0,1)\r\n\r\nOK\r\n"},
        {"AT%EURC=x", kUnknown},
        {"AT+TOLK=x", kUnknown},
    });
    expectOn(true, {{"AT%EURC=1", kOk}, {"AT%EURC?", "\r\n+EURC:1\r\n\r\nOK\r\n"}});
    EXPECT_EQ("1", dev.getprop("persist.service.tolk_urc.enable"));
    expectOn(false, {{"AT%EURC=2", kOk}, {"AT%EURC?", "\r\n+EURC:1\r\n\r\nOK\r\n"}});
    expectOn(false, {{"AT%EURC=0", kOk}});
    EXPECT_EQ("0", dev.getprop("persist.service.tolk_urc.enable"));
    dev.setprop("persist.service.tolk_urc.enable", "7");
    expectBoth({{"AT%EURC?", "\r\n+EURC:invalid value.\r\n\r\nOK\r\n"}});

    // AT+CMEC is the modem's for operators other than OP12; AT+TOLK opens the
    // modem route on a user build.
    expectOn(false, {{"AT+CMEC=0,2,2,0", kUserMode}});
    expectOn(true, {{"AT+CMEC?", kUserMode}, {"AT+TOLK=1", kOk}, {"AT+TOLK?", "\r\n+TOLK:1\r\n\r\nOK\r\n"}});
    EXPECT_EQ("1", dev.getprop("persist.service.tolk.usermode"));
    EXPECT_NE(kUserMode, dev.at("AT+CMEC?", true));
}

TEST_F(LocalCommands, VzwTolkConfigLivesInMemory) {
    expectBoth({
        {"AT+VZWTOLKCFG?", "\r\n+VZWTOLKCFG:0\r\n\r\nOK\r\n"},
        {"AT+VZWTOLKCFG=?", "\r\n+VZWTOLKCFG:(0,1)\r\n\r\nOK\r\n"},
        {"AT+VZWTOLKCFG=2", kError},
        {"AT+VZWTOLKCFG=x", kError},
        {"AT+VZWTOLKCFG?", "\r\n+VZWTOLKCFG:0\r\n\r\nOK\r\n"},
    });
    expectOn(true, {{"AT+VZWTOLKCFG=1", kOk}});
    expectOn(false, {{"AT+VZWTOLKCFG?", "\r\n+VZWTOLKCFG:1\r\n\r\nOK\r\n"}});
}

TEST_F(Op12Commands, CmecIsLocalForOp12AndGatesKeypadAndTouch) {
    expectBoth({
        {"AT+CMEC?", "\r\n+CMEC:2,2,2,2\r\n\r\nOK\r\n"},
        {"AT+CMEC=?", "\r\n+CMEC:(0-2),(0-2),(0-2),(0-2)\r\n\r\nOK\r\n"},
        {"AT+CMEC=0,2,2", kError},
        {"AT+CMEC=0,2,2,3", kError},
        {"AT+CMEC=-1,2,2,2", kError},
        {"AT+CMEC?", "\r\n+CMEC:2,2,2,2\r\n\r\nOK\r\n"},
    });
    expectOn(true, {{"AT+CMEC=0,2,2,0", kOk}});
    expectOn(false, {{"AT+CMEC?", "\r\n+CMEC:0,2,2,0\r\n\r\nOK\r\n"}});
    // Keypad and touch screen set forms are refused while their element is 0.
    expectBoth({{"AT+CKPD=1", kError}, {"AT+CTSA=1", kError}});
    EXPECT_NE(std::string::npos, dev.log().find("Disabled by +CMEC"));
}

TEST_F(LocalCommands, ClockSetReadAndDateFormat) {
    const std::string cme =
        "\r\nCME ERROR: Invalid parameters: [21] cmdline:\"2024/02/29,12:00:00\"; [19] "
        "cclkSetCmd:2024/02/29,12:00:00\r\n\r\nERROR\r\n";
    expectBoth({
        {"AT+CCLK=?", "\r\n+CCLK: yy/MM/dd,hh:mm:ss[+/-tz]\r\n\r\nOK\r\n"},
        {"AT+CCLK=\"2024/02/29,12:00:00\"", cme},
        {"AT+CCLK=24/13/01,00:00:00", kError},
        {"AT+CCLK=24/02/29,12:00:00+99", kError},
        {"AT+CSDF?", "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n"},
        {"AT+CSDF=?", "\r\n+CSDF: (1,2,3,4,5,6,7),(1,2)\n\r\n\r\nOK\r\n"},
        {"AT+CSDF=8,1", kError},
        {"AT+CSDF=1,3", kError},
        {"AT+CSDF=", kError},
        {"AT+CSDF?", "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n"},
    });
    // Before any set the zone is the kernel's, in quarters of an hour.
    dev.writeFile("/clock/tz_minuteswest", "-330\n");
    std::string before = dev.at("AT+CCLK?", true);
    EXPECT_TRUE(std::regex_match(before, std::regex("\r\n\\+CCLK: \"\\d\\d/\\d\\d/\\d\\d,\\d\\d:\\d\\d:\\d\\d"
                                                    "\\+20\"\n\r\n\r\nOK\r\n")))
        << visible(before);

    EXPECT_EQ(kOk, dev.at("AT+CCLK=\"24/02/29,12:00:00+32\"", true));
    std::string read = dev.at("AT+CCLK?");
    EXPECT_TRUE(std::regex_match(read, std::regex("\r\n\\+CCLK: \"24/02/29,12:00:0\\d\\+32\"\n\r\n\r\nOK\r\n")))
        << visible(read);

    // A zone that passes its own check is kept even when the date fails.
    EXPECT_EQ(kError, dev.at("AT+CCLK=24/02/30,25:00:00-08"));
    EXPECT_EQ(kOk, dev.at("AT+CSDF=,2", true));
    EXPECT_EQ("\r\n+CSDF: 1,2\n\r\n\r\nOK\r\n", dev.at("AT+CSDF?"));
    read = dev.at("AT+CCLK?", true);
    EXPECT_TRUE(std::regex_match(read, std::regex("\r\n\\+CCLK: \"2024/02/29,12:00:\\d\\d-08\"\n\r\n\r\nOK\r\n")))
        << visible(read);
    // A set without a zone leaves the stored one.
    EXPECT_EQ(kOk, dev.at("AT+CCLK=30/01/02,03:04:05", true));
    read = dev.at("AT+CCLK?");
    EXPECT_TRUE(std::regex_match(read, std::regex("\r\n\\+CCLK: \"2030/01/02,03:04:0\\d-08\"\n\r\n\r\nOK\r\n")))
        << visible(read);
    EXPECT_EQ(kOk, dev.at("AT+CSDF=3"));
    EXPECT_EQ("\r\n+CSDF: 3,1\n\r\n\r\nOK\r\n", dev.at("AT+CSDF?", true));
}

TEST_F(LocalCommands, SimSelectionOnADualSimDevice) {
    expectBoth({
        {"AT+ESUO?", "\r\n+ESUO:4\r\n\r\nOK\r\n"},
        {"AT+ESUO=?", "\r\n+ESUO: (4-5)\r\n\r\nOK\r\n"},
        {"AT+ESUO=6", kError},
        {"AT+ESUO=9", kError},
        {"AT+ESUO=abc", kUnknown},
    });
    expectOn(true, {{"AT+ESUO=5", kOk}});
    EXPECT_EQ("1", dev.getprop("persist.service.tolk.sim"));
    expectOn(false, {{"AT+ESUO?", "\r\n+ESUO:5\r\n\r\nOK\r\n"}});
    dev.setprop("persist.service.tolk.sim", "3");
    expectBoth({{"AT+ESUO?", "\r\n+ESUO:7\r\n\r\nOK\r\n"}});
    dev.setprop("persist.service.tolk.sim", "5");
    expectBoth({{"AT+ESUO?", "\r\n+ESUO:Value unsupport\r\n\r\nOK\r\n"}});
}

TEST_F(LocalCommands, UsbTetheringAndConfiguration) {
    expectBoth({
        {"AT%USBTETHERING?", "\r\n+USBTETHERING:0\r\n\r\nOK\r\n"},
        {"AT%USBTETHERING=?", kNotImpl},
        {"AT%USBTETHERING=2", kError},
        {"AT%USBTETHERING=x", kUnknown},
        {"AT@USBCONFIG=?", kNotImpl},
        // Unset: the empty value, with the handler's ERROR and the final one.
        {"AT@USBCONFIG?", "\r\n@USBCONFIG: \"\"\r\n\r\nERROR\r\n\r\nERROR\r\n"},
        {"AT@USBCONFIG=\" \"", "\r\n-1\r\nERROR\r\n\r\n\r\nERROR\r\n"},
    });
    EXPECT_EQ("", dev.getprop("sys.usb.config"));
    expectOn(true, {{"AT%USBTETHERING=1", kOk}});
    EXPECT_EQ("1", dev.getprop("persist.service.usbtethering"));
    expectOn(false, {{"AT%USBTETHERING?", "\r\n+USBTETHERING:1\r\n\r\nOK\r\n"}});
    dev.setprop("persist.service.usbtethering", "5");
    expectOn(true, {{"AT%USBTETHERING?", "\r\n+USBTETHERING:0\r\n\r\nOK\r\n"}});

    const std::string set = "\r\n@USBCONFIG=\"rndis,adb\"\r\n\r\nOK\r\n\r\nOK\r\n";
    expectOn(true, {{"AT@USBCONFIG=RNDIS,ADB", set}});
    EXPECT_EQ("rndis,adb", dev.getprop("sys.usb.config"));
    expectOn(false, {{"AT@USBCONFIG=\"Rndis, Adb\"", set},
                     {"AT@USBCONFIG?", "\r\n@USBCONFIG: \"rndis,adb\"\r\n\r\nOK\r\n\r\nOK\r\n"}});
    // The value is cut to what a property holds.
    std::string longValue(100, 'm');
    expectOn(true, {{"AT@USBCONFIG=" + longValue,
                     "\r\n@USBCONFIG=\"" + std::string(91, 'm') + "\"\r\n\r\nOK\r\n\r\nOK\r\n"}});
    EXPECT_EQ(std::string(91, 'm'), dev.getprop("sys.usb.config"));
}

TEST_F(BatteryCommands, AdcReadingsAndTheChargerSwitch) {
    expectBoth({
        {"AT@GBV", "\r\n3600\r\nOK\r\n"},
        {"AT@GBV?", "\r\n3600\r\nOK\r\n"},
        {"AT@GCSF", "\r\n0\r\nOK\r\n"},
        {"AT@SCC", "\r\n0\r\nOK\r\n"},
        // Not a battery command: exact names only, so it ends at the modem gate.
        {"AT@GBVX", kUserMode},
    });
    EXPECT_NE(std::string::npos, dev.readFile("/journal/adc_set.log").find("16"));
}

TEST_F(FailingAdc, DriverFailuresAnswerErrorOrOne) {
    expectBoth({{"AT@GBV", kError}, {"AT@GCSF", "\r\n1\r\nOK\r\n"}});
}

}  // namespace
