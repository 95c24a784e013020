// Battery ADC commands against the simulated PMIC ADC device: its file under the
// device root lists "CHANNEL SUM [STATUS]" per line.
#include "dispatch/bat_cmd.h"
#include "handler_state.h"

namespace {

class BatCmdTest : public HandlerTest {
protected:
    void adc(const std::string &content) { root.write(PMIC_ADC_DEV, content); }
};

TEST_F(BatCmdTest, DriverFailuresAndNegativeReadings) {
    // A bad status, and a channel the driver does not know.
    for (const char *device : {"1 1000 -5\n66 12 3\n", "66 -7\n"}) {
        adc(device);
        EXPECT_EQ(-1, get_ADC_channel(1, ADC_COUNT)) << device;
        EXPECT_EQ(-1, handleBatCmd("AT@GBV", 1)) << device;
        EXPECT_EQ("\r\nERROR\r\n", host.take()) << device;
        EXPECT_EQ(1, handleBatCmd("AT@GCSF", 0)) << device;
        EXPECT_EQ("\r\n1\r\nOK\r\n", host.take()) << device;
    }
    // An average of -1 cannot be told from a failure; the fraction is dropped.
    adc("1 -5\n");
    EXPECT_EQ(-1, handleBatCmd("AT@GBV", 1));
    adc("1 -4\n");
    EXPECT_EQ(0, handleBatCmd("AT@GBV", 1));
    EXPECT_EQ("\r\nERROR\r\n\r\n0\r\nOK\r\n", host.take());
}

}  // namespace
