// Echo, refused commands, reboot and the switch commands (AT%EURC, AT+TOLK,
// AT+VZWTOLKCFG, AT+CMEC), called the way the dispatcher calls them.
#include <cutils/properties.h>
#include <gtest/gtest.h>

#include <cstring>

#include <string>

#include "../dispatch/handler_state.h"
#include "../dispatch/host_capture.h"
#include "attok/at_tok.h"
#include "dispatch/dispatcher.h"
#include "handlers/handlers.h"
#include "test_root.h"

namespace {

std::string prop(const char *name, const char *def = "") {
    char value[PROPERTY_VALUE_MAX];
    property_get(name, value, def);
    return value;
}

class SwitchCmdTest : public ::testing::Test {
protected:
    void SetUp() override {
        resetHandlerState();
        response[0] = '\0';
    }
    void TearDown() override { resetHandlerState(); }

    int call(CmdHandler h, const char *param, int op) {
        std::memset(response, 0, sizeof(response));
        return h(param, op, response);
    }

    TestRoot root;
    HostCapture host;
    char response[RESPONSE_BUF_SIZE];
};

TEST_F(SwitchCmdTest, EchoFollowsTheDigitAfterE) {
    gSerialDevice.echoOption[DEVICE_SERIAL] = 0;
    EXPECT_EQ(0, call(pas_echo_handler, "ATE1", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ATE1", AT_BASIC_OP)) << "already on";
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    // The E of ATQ0V1E is its last character: the setting is re-applied as is.
    EXPECT_EQ(0, call(pas_echo_handler, "ATQ0V1E", AT_BASIC_OP));
    EXPECT_EQ(1, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(0, call(pas_echo_handler, "ate0", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_EQ(4, call(pas_echo_handler, "ATE2", AT_BASIC_OP));
    EXPECT_EQ(0, gSerialDevice.echoOption[DEVICE_SERIAL]);
    EXPECT_STREQ("", response);
}

TEST_F(SwitchCmdTest, RefusedCommandsAndReboot) {
    for (int op : {AT_ACTION_OP, AT_READ_OP, AT_TEST_OP, AT_SET_OP}) {
        EXPECT_EQ(4, call(pas_modem_handler, "1", op));
    }
    EXPECT_EQ(4, call(pas_reboot_handler, "1", AT_SET_OP));
    EXPECT_FALSE(root.exists("/journal/shell.log"));
    EXPECT_EQ(0, call(pas_reboot_handler, "AT%REBOOT", AT_ACTION_OP));
    EXPECT_NE(std::string::npos, root.read("/journal/shell.log").find("shutdown -r -t 3\n"));
    EXPECT_STREQ("", response);
    EXPECT_EQ("", host.take());
}

TEST_F(SwitchCmdTest, PropertySwitchesReadSetAndTest) {
    struct {
        CmdHandler handler;
        const char *property;
        const char *prefix;
    } switches[] = {
        {pas_eurc_handler, "persist.service.tolk_urc.enable", "+EURC:"},
        {pas_tolk_handler, "persist.service.tolk.usermode", "+TOLK:"},
    };
    for (const auto &s : switches) {
        const std::string p = s.prefix;
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(p + "0\r\n", response) << "unset reads as 0";

        EXPECT_EQ(0, call(s.handler, "1", AT_SET_OP));
        EXPECT_EQ("1", prop(s.property));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(p + "1\r\n", response);

        // Other numbers are accepted and ignored; text is not a number.
        EXPECT_EQ(0, call(s.handler, "2", AT_SET_OP));
        EXPECT_EQ("1", prop(s.property));
        EXPECT_EQ(-1, call(s.handler, "x", AT_SET_OP));
        EXPECT_EQ(-1, call(s.handler, "", AT_SET_OP));
        EXPECT_EQ("1", prop(s.property));
        EXPECT_EQ(0, call(s.handler, "\"0\"", AT_SET_OP));
        EXPECT_EQ("0", prop(s.property));

        ASSERT_EQ(0, property_set(s.property, "7"));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(p + "invalid value.\r\n", response);
        ASSERT_EQ(0, property_set(s.property, "on"));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(p + "0\r\n", response);
        ASSERT_EQ(0, property_set(s.property, "4294967297"));
        EXPECT_EQ(0, call(s.handler, "", AT_READ_OP));
        EXPECT_EQ(p + "invalid value.\r\n", response) << "a huge number must not wrap onto 1";

        EXPECT_EQ(0, call(s.handler, "", AT_TEST_OP));
        EXPECT_STREQ("", response);
        EXPECT_EQ("\r\n" + p + "(0,1)\r\n", host.take());
    }
}

TEST_F(SwitchCmdTest, VzwTolkCfgKeepsItsValueOnBadInput) {
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "", AT_READ_OP));
    EXPECT_STREQ("+VZWTOLKCFG:0\r\n", response);
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "1", AT_SET_OP));
    EXPECT_EQ(1, gVzwTolkCfg);
    EXPECT_EQ(4, call(pas_vzwtolkcfg_handler, "2", AT_SET_OP));
    EXPECT_EQ(4, call(pas_vzwtolkcfg_handler, "abc", AT_SET_OP));
    EXPECT_EQ(4, call(pas_vzwtolkcfg_handler, "-1", AT_SET_OP));
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "", AT_READ_OP));
    EXPECT_STREQ("+VZWTOLKCFG:1\r\n", response);
    EXPECT_EQ(0, call(pas_vzwtolkcfg_handler, "", AT_TEST_OP));
    EXPECT_EQ("\r\n+VZWTOLKCFG:(0,1)\r\n", host.take());
}

TEST_F(SwitchCmdTest, CmecTakesAllFourValuesOrNone) {
    EXPECT_EQ(0, call(pas_cmec_handler, "", AT_READ_OP));
    EXPECT_STREQ("+CMEC:2,2,2,2\r\n", response);

    for (const char *bad : {"0,2,2", "0,2,2,3", "0,-1,2,2", "0,2,,2", "a,2,2,2", ""}) {
        EXPECT_EQ(4, call(pas_cmec_handler, bad, AT_SET_OP)) << bad;
        EXPECT_EQ(2, gCmecConfig[0]) << bad;
        EXPECT_EQ(2, gCmecConfig[1]) << bad;
    }
    EXPECT_EQ(0, call(pas_cmec_handler, "0,2,1,0", AT_SET_OP));
    EXPECT_EQ(0, call(pas_cmec_handler, "", AT_READ_OP));
    EXPECT_STREQ("+CMEC:0,2,1,0\r\n", response);

    EXPECT_EQ(0, call(pas_cmec_handler, "", AT_TEST_OP));
    EXPECT_EQ("\r\n+CMEC:(0-2),(0-2),(0-2),(0-2)\r\n", host.take());
}

}  // namespace
