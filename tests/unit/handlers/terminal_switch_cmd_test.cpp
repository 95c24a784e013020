// Echo, refused commands, reboot and the switch commands (AT%EURC, AT+TOLK,
// AT+VZWTOLKCFG, AT+CMEC), called the way the dispatcher calls them.
#include "../dispatch/handler_state.h"
#include "attok/at_tok.h"

namespace {

using SwitchCmdTest = HandlerTest;

TEST_F(SwitchCmdTest, EchoFollowsTheDigitAfterE) {
    gSerialDevice.echoOption[DEVICE_SERIAL] = 0;
    EXPECT_EQ(0, call(pas_echo_handler, "ATE1", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    // The E of ATQ0V1E is its last character: the setting is re-applied as is.
    EXPECT_EQ(0, call(pas_echo_handler, "ATQ0V1E", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(4, call(pas_echo_handler, "ATE2", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ate0", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
}

TEST_F(SwitchCmdTest, RebootOnlyForTheActionForm) {
    EXPECT_EQ(4, call(pas_reboot_handler, "1", AT_SET_OP));
    EXPECT_FALSE(root.exists("/journal/shell.log"));
    EXPECT_EQ(0, call(pas_reboot_handler, "AT%REBOOT", AT_ACTION_OP));
    EXPECT_NE(std::string::npos, root.read("/journal/shell.log").find("shutdown -r -t 3\n"));
}

TEST_F(SwitchCmdTest, PropertySwitchesReadSetAndTest) {
    struct {
        CmdHandler handler;
        const char *property;
        std::string prefix;
    } switches[] = {
        {pas_eurc_handler, "persist.service.tolk_urc.enable", "+EURC:"},
        {pas_tolk_handler, "persist.service.tolk.usermode", "+TOLK:"},
    };
    for (const auto &s : switches) {
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(s.prefix + "0\r\n", response) << "unset reads as 0";
        EXPECT_EQ(0, call(s.handler, "1", AT_SET_OP));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(s.prefix + "1\r\n", response);
        // Other numbers are accepted and ignored; text is no number.
        EXPECT_EQ(0, call(s.handler, "2", AT_SET_OP));
        EXPECT_EQ(-1, call(s.handler, "x", AT_SET_OP));
        EXPECT_EQ("1", prop(s.property));
        EXPECT_EQ(0, call(s.handler, "\"0\"", AT_SET_OP));
        EXPECT_EQ("0", prop(s.property));

        for (const char *odd : {"7", "4294967297"}) {  // a huge number must not wrap onto 1
            ASSERT_EQ(0, property_set(s.property, odd));
            EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
            EXPECT_EQ(s.prefix + "invalid value.\r\n", response) << odd;
        }
        EXPECT_EQ(0, call(s.handler, "", AT_TEST_OP));
        EXPECT_STREQ("", response);
        EXPECT_EQ("\r\n" + s.prefix + "(0,1)\r\n", host.take());
    }
}

TEST_F(SwitchCmdTest, VzwTolkCfgAndCmecKeepTheirValuesOnBadInput) {
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "1", AT_SET_OP));
    for (const char *bad : {"2", "abc", "-1"}) EXPECT_EQ(4, call(pas_vzwtolkcfg_handler, bad, AT_SET_OP)) << bad;
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "", AT_READ_OP));
    EXPECT_STREQ("+VZWTOLKCFG:1\r\n", response);
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "", AT_TEST_OP));
    EXPECT_EQ("\r\n+VZWTOLKCFG:(0,1)\r\n", host.take());

    // +CMEC takes all four values or none.
    for (const char *bad : {"0,2,2", "0,2,2,3", "0,-1,2,2", "0,2,,2", "a,2,2,2"}) {
        EXPECT_EQ(4, call(pas_cmec_handler, bad, AT_SET_OP)) << bad;
        EXPECT_EQ(2, gCmecConfig[0]) << bad;
    }
    EXPECT_EQ(0, call(pas_cmec_handler, "0,2,1,0", AT_SET_OP));
    EXPECT_EQ(0, call(pas_cmec_handler, "", AT_READ_OP));
    EXPECT_STREQ("+CMEC:0,2,1,0\r\n", response);
    EXPECT_EQ(0, call(pas_cmec_handler, "", AT_TEST_OP));
    EXPECT_EQ("\r\n+CMEC:(0-2),(0-2),(0-2),(0-2)\r\n", host.take());
}

}  // namespace
