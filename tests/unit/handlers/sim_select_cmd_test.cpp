// AT+ESUO on single, dual and triple SIM devices and in C2K mode.
#include <utility>

#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

class SimSelectTest : public HandlerTest {
protected:
    int esuo(const char *param, int op) { return call(pas_esuo_handler, param, op); }
    std::string sim() { return prop("persist.service.tolk.sim"); }
    void multiSim(const char *config) { ASSERT_EQ(0, property_set("persist.radio.multisim.config", config)); }
};

TEST_F(SimSelectTest, SingleAndTripleSim) {
    multiSim("ss");
    EXPECT_EQ(4, esuo("5", AT_SET_OP));
    EXPECT_EQ("(unset)", sim());
    EXPECT_EQ(0, esuo("4", AT_SET_OP));
    EXPECT_EQ("0", sim());
    EXPECT_EQ(0, esuo("", AT_TEST_OP));
    EXPECT_EQ("\r\n+ESUO: (4)\r\n", host.take());

    multiSim("tsts");
    EXPECT_EQ(0, esuo("6", AT_SET_OP));
    EXPECT_EQ("2", sim());
    EXPECT_EQ(0, esuo("", AT_TEST_OP));
    EXPECT_EQ("\r\n+ESUO: (4-6)\r\n", host.take());
}

TEST_F(SimSelectTest, C2kModeSelectsTheThirdModemInsteadOfSim3) {
    multiSim("tsts");
    ASSERT_EQ(0, property_set("ro.boot.opt_c2k_lte_mode", "1"));
    EXPECT_EQ(0, esuo("9", AT_SET_OP));
    EXPECT_EQ("9", sim());
    EXPECT_EQ(4, esuo("6", AT_SET_OP)) << "no SIM 3 in C2K mode, even on a triple-SIM device";
    EXPECT_EQ("9", sim());
    // The test answer does not look at C2K mode.
    EXPECT_EQ(0, esuo("", AT_TEST_OP));
    EXPECT_EQ("\r\n+ESUO: (4-6)\r\n", host.take());
}

}  // namespace
