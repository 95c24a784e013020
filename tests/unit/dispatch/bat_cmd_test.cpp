// Battery ADC commands against the simulated PMIC ADC device: its file under the
// device root lists "CHANNEL SUM [STATUS]" per line.
#include <gtest/gtest.h>

#include <string>

#include "dispatch/bat_cmd.h"
#include "dispatch/dispatcher.h"
#include "host_capture.h"
#include "test_root.h"

namespace {

class BatCmdTest : public ::testing::Test {
protected:
    void adc(const std::string &content) { root.write(PMIC_ADC_DEV, content); }

    TestRoot root;
    HostCapture host;
};

TEST_F(BatCmdTest, BatteryReadingIsTheSampleSumOverFiveWhateverTheForm) {
    adc("1 1003\n66 0\n");
    EXPECT_EQ(1003, get_ADC_channel(1, ADC_COUNT));
    for (const char *line : {"AT@GBV", "AT@GBV?", "AT@GBV=1"}) {
        EXPECT_EQ(BAT_TYPE, process_cmd_line(line)) << line;
        EXPECT_EQ("\r\n200\r\nOK\r\n", host.take()) << line;
    }
    EXPECT_EQ(200, handleBatCmd("AT@GBV", 1));
    host.take();

    // The status channel answers 0 for a good reading.
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GCSF"));
    EXPECT_EQ("\r\n0\r\nOK\r\n", host.take());
}

TEST_F(BatCmdTest, DriverFailuresAndNegativeReadings) {
    adc("1 1000 -5\n66 12 3\n");
    EXPECT_EQ(-1, get_ADC_channel(1, ADC_COUNT));
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GBV"));
    EXPECT_EQ("\r\nERROR\r\n", host.take());
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GCSF"));
    EXPECT_EQ("\r\n1\r\nOK\r\n", host.take());

    // A channel the driver does not know fails like a bad status.
    adc("66 -7\n");
    EXPECT_EQ(-1, get_ADC_channel(1, ADC_COUNT));
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GCSF"));
    EXPECT_EQ("\r\n1\r\nOK\r\n", host.take()) << "a negative status reading counts as failed";

    // An average of -1 cannot be told from a failure.
    adc("1 -5\n");
    EXPECT_EQ(-1, handleBatCmd("AT@GBV", 1));
    EXPECT_EQ("\r\nERROR\r\n", host.take());
    adc("1 -4\n");
    EXPECT_EQ(0, handleBatCmd("AT@GBV", 1)) << "the fraction is dropped toward zero";
    EXPECT_EQ("\r\n0\r\nOK\r\n", host.take());
}

TEST_F(BatCmdTest, MissingDevice) {
    EXPECT_EQ(-1, get_ADC_channel(1, ADC_COUNT));
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GBV"));
    EXPECT_EQ("\r\nERROR\r\n", host.take());
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@GCSF"));
    EXPECT_EQ("\r\n1\r\nOK\r\n", host.take());
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@SCC"));
    EXPECT_EQ("\r\n0\r\nOK\r\n", host.take());
    EXPECT_FALSE(root.exists("/journal/adc_set.log"));
}

TEST_F(BatCmdTest, ChargeCommandSendsSixteenAndOnlyExactNamesMatch) {
    adc("1 500\n");
    EXPECT_EQ(BAT_TYPE, process_cmd_line("AT@SCC=5"));
    EXPECT_EQ("\r\n0\r\nOK\r\n", host.take());
    EXPECT_NE(std::string::npos, root.read("/journal/adc_set.log").find("16"));

    EXPECT_EQ(0, bat_command_hdlr("AT@GBVX"));
    EXPECT_EQ(0, bat_command_hdlr("AT@GB"));
    EXPECT_EQ(0, bat_command_hdlr("at@gbv"));
    EXPECT_EQ(RIL_TYPE, process_cmd_line("AT@GBVX"));
    EXPECT_EQ("", host.take());
}

}  // namespace
