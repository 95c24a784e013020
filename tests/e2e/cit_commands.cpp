// The factory CIT commands end to end: what a station sends, what the test
// application receives, what the station reads back, and what stays on the
// device (the result file, the NVRAM record, the shell journal).
#include <gtest/gtest.h>

#include <unistd.h>

#include <string>
#include <vector>

#include "sim_device.h"

namespace {

// A station reads CIT answers on the adb link (no echo to strip).
std::string cit(SimDevice &dev, const std::string &line) { return dev.at(line, true); }

std::string framed(const std::string &text, bool ok) {
    return "\r\n" + text + "\r\n" + (ok ? "OK" : "ERROR") + "\r\n";
}

const char kTestFail[] = "\r\ntest_fail\r\nERROR\r\n\r\n";
const char kNoCase[] = "\r\ntest_fail_no_case\r\nERROR\r\n\r\n";

// Where one name begins another, the longer one must be tried first; case and
// trailing text do not matter. The journal shows exactly the words sent.
TEST(CitCommands, EachLineReachesTheTestApplicationAsItsWord) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    const std::vector<std::pair<std::string, std::string>> cases = {
        {"AT*CIT_SN2", "sn2"},         {"at*cit_Sn2", "sn2"},
        {"AT*CIT_SN", "sn"},           {"AT*CIT_SNQ", "sn"},
        {"AT*CIT_Version", "Version"}, {"AT*CIT_VER", "ver"},
        {"AT*CIT_AUTO_TP_RESULT", "AUTO_TP_result"}, {"AT*CIT_AUTO_TP", "auto_tp_test"},
        {"AT*CIT_TP_TEST_END", "tp_touchtest_end"},
    };
    std::string journal;
    for (const auto &c : cases) {
        EXPECT_EQ(framed("OK", true), cit(dev, c.first)) << c.first;
        journal += c.second + "\n";
    }
    EXPECT_EQ(journal, dev.readFile("/journal/cit.log"));

    // No such name: refused without a word, and the next command still works.
    EXPECT_EQ(kNoCase, cit(dev, "AT*CIT_IMEI"));
    EXPECT_EQ(framed("OK", true), cit(dev, "AT*CIT_IMEI1"));
    EXPECT_EQ(journal + "imei1\n", dev.readFile("/journal/cit.log"));

    // The serial link answers the same way; the port echoes the typed line first.
    dev.writeFile("/sim/cit/script", "sn => SN42\n");
    EXPECT_EQ("AT*CIT_SN\n" + framed("SN42", true), dev.at("AT*CIT_SN"));
    EXPECT_EQ(std::string("AT*CIT_IMEI\n") + kNoCase, dev.at("AT*CIT_IMEI"));
}

TEST(CitCommands, AnswersAreJudgedByTheRuleOfTheirCommand) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    dev.writeFile("/sim/cit/script",
                  "SIM1 => fail: no card\n"
                  "SIM2 => FAI\n"
                  "GPS => NULL fix\n"
                  "WIFI => nul\n"
                  "PSensor => 0.2557\n"
                  "LSensor => 0.25\n"
                  "HOME => okay\n"
                  "MENU => O\n"
                  "BACK => (close)\n"
                  "lcd_red => Fail\n"
                  "Emmc => (close)\n");
    struct Case {
        const char *line;
        std::string host;
    } cases[] = {
        {"AT*CIT_SIM1", framed("fail: no card", false)}, {"AT*CIT_SIM2", framed("FAI", true)},
        {"AT*CIT_GPS", framed("NULL fix", false)},       {"AT*CIT_WIFI", framed("nul", true)},
        {"AT*CIT_PSensor", framed("0.2557", false)},     {"AT*CIT_LSensor", framed("0.25", true)},
        {"AT*CIT_HOME", framed("okay", true)},           {"AT*CIT_MENU", framed("O", false)},
        {"AT*CIT_BACK", "\r\nERROR\r\n"},                {"AT*CIT_Emmc", "\r\nOK\r\n"},
        {"AT*CIT_LCD_Red", framed("Fail", true)},
    };
    for (const Case &c : cases) EXPECT_EQ(c.host, cit(dev, c.line)) << c.line;
}

TEST(CitCommands, MissingOrSilentTestApplication) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    int status = -1;
    dev.sim({"stop", "cit"}, &status);
    ASSERT_EQ(0, status);
    EXPECT_EQ(kTestFail, cit(dev, "AT*CIT_SN"));
    EXPECT_EQ(kTestFail, cit(dev, "AT*CIT_NOSUCH")) << "the link is tried before the name";
    EXPECT_NE(std::string::npos, dev.log().find("NVRAM")) << "CIT lines log under their own tag";
    // A silent application: FaultPeers.CitApplicationSilentClosingAndKilled.
}

TEST(CitCommands, ResultFileStartAndShutDown) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ("\r\nx0000000\r\nOK\r\n", cit(dev, "AT*CIT_GACITF"));
    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WCITF"));
    EXPECT_EQ("x0000001", dev.readFile("/data/prod/citf"));
    EXPECT_EQ("\r\nx0000001\r\nOK\r\n", cit(dev, "AT*CIT_GACITF"));
    EXPECT_EQ("\r\nOK\r\n", cit(dev, "at*cit_ccitf"));
    EXPECT_EQ("x0000000", dev.readFile("/data/prod/citf"));

    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_Start"));
    EXPECT_EQ("1", dev.getprop("debug.autocit.running"));

    // The power-off is started before the OK is written.
    int fd = dev.connectAdb();
    ASSERT_GE(fd, 0);
    ASSERT_TRUE(writeAll(fd, "AT*CIT_ShutDown\r"));
    EXPECT_EQ("\r\nOK\r\n", readUntil(fd, "OK\r\n", 5000));
    EXPECT_NE(std::string::npos, dev.readFile("/journal/shell.log").find("reboot -p"));
    close(fd);
}

TEST(CitCommands, FlagsAreReadAndWrittenThroughTheRecord) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ("MMI1 _F\r\nOK\r\n", cit(dev, "AT*CIT_ReadMMI1"));
    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=202,1"));
    EXPECT_EQ("MMI1 _P\r\nOK\r\n", cit(dev, "AT*CIT_ReadMMI1"));
    EXPECT_EQ("\r\nResult=1\r\nOK\r\n", cit(dev, "AT*CIT_ReadProInfo=202"));

    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=209,257"));
    EXPECT_EQ("\r\nUserAT =1\r\nOK\r\n", cit(dev, "AT*CIT_ReadUserAT"));
    EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", cit(dev, "AT*CIT_WriteUserAT"));
    EXPECT_EQ("\r\nUserAT =0\r\nOK\r\n", cit(dev, "AT*CIT_ReadUserAT"));

    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=208,98"));
    EXPECT_EQ("\r\nReset =b\r\nOK\r\n", cit(dev, "AT*CIT_ReadReset"));
    EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=1023,-1"));
    EXPECT_EQ("\r\nResult=255\r\nOK\r\n", cit(dev, "AT*CIT_ReadProInfo=1023"));

    // Indexes outside the 1024-byte record are refused; a write without "," gets
    // no answer at all.
    EXPECT_EQ("\r\nERROR\r\n", cit(dev, "AT*CIT_ReadProInfo=1024"));
    EXPECT_EQ("\r\nERROR\r\n", cit(dev, "AT*CIT_ReadProInfo"));
    EXPECT_EQ("\r\nERROR\r\n", cit(dev, "AT*CIT_WriteProInfo=1024,7"));
    EXPECT_EQ("", cit(dev, "AT*CIT_WriteProInfo=5"));

    std::string expect(1024, '\0');
    expect[202] = 1;
    expect[208] = 'b';
    expect[209] = 0;
    expect[1023] = '\xff';
    EXPECT_EQ(expect, dev.readFile("/nvram/PRODUCT_INFO"));
}

TEST(CitCommands, FlagFallbacksWithoutAUsableRecord) {
    {
        SimDevice dev({"--no-nvram"});
        ASSERT_TRUE(dev.started()) << dev.upOutput();
        EXPECT_EQ("MMI1 _F\r\nOK\r\n", cit(dev, "AT*CIT_ReadMMI1"));
        EXPECT_EQ("\r\nResult=0\r\nOK\r\n", cit(dev, "AT*CIT_ReadProInfo=5"));
        EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=5,1"));
        EXPECT_EQ("\r\nUserAT =0\r\nOK\r\n", cit(dev, "AT*CIT_ReadUserAT"));
        EXPECT_FALSE(dev.fileExists("/nvram/PRODUCT_INFO"));
    }
    {
        SimDevice dev({"--nvram-shape", "2048,1"});
        ASSERT_TRUE(dev.started()) << dev.upOutput();
        const std::string before = dev.readFile("/nvram/PRODUCT_INFO");
        EXPECT_EQ("MMI1 _\r\nOK\r\n", cit(dev, "AT*CIT_ReadMMI1"));
        EXPECT_EQ("\r\nResult=255\r\nOK\r\n", cit(dev, "AT*CIT_ReadProInfo=5"));
        EXPECT_EQ("\r\nOK\r\n", cit(dev, "AT*CIT_WriteProInfo=5,1"));
        EXPECT_EQ("\r\nWriteUserAT Pass\r\nOK\r\n", cit(dev, "AT*CIT_WriteUserAT"));
        EXPECT_EQ("\r\nReset =\r\nOK\r\n", cit(dev, "AT*CIT_ReadReset"));
        EXPECT_EQ(before, dev.readFile("/nvram/PRODUCT_INFO")) << "a record of the wrong shape is never written";
    }
}

}  // namespace
