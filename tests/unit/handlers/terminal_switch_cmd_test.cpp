// Echo and the property switches (AT%EURC, AT+TOLK), called the way the
// dispatcher calls them.
#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

using SwitchCmdTest = HandlerTest;

TEST_F(SwitchCmdTest, EchoFollowsTheDigitAfterE) {
    gSerialDevice.echoOption[DEVICE_SERIAL] = 1;
    EXPECT_EQ(4, call(pas_echo_handler, "ATE2", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ate0", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
}

TEST_F(SwitchCmdTest, PropertySwitchesTakeQuotedValuesAndNeverWrapOntoOne) {
    struct {
        CmdHandler handler;
        const char *property;
        std::string prefix;
    } switches[] = {
        {pas_eurc_handler, "persist.service.tolk_urc.enable", "+EURC:"},
        {pas_tolk_handler, "persist.service.tolk.usermode", "+TOLK:"},
    };
    for (const auto &s : switches) {
        EXPECT_EQ(0, call(s.handler, "1", AT_SET_OP));
        EXPECT_EQ(0, call(s.handler, "\"0\"", AT_SET_OP));
        EXPECT_EQ("0", prop(s.property));
        ASSERT_EQ(0, property_set(s.property, "4294967297"));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(s.prefix + "invalid value.\r\n", response);
    }
}

}  // namespace
