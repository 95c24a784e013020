// Boot-mode gating and the user-mode gate in front of the modem. No radio service
// runs under the test root, so a line that reaches the modem is answered
// "ERROR:No Modem" by the bridge: that is how these tests see it arrive.
#include <cutils/properties.h>

#include "core/startup.h"
#include "host_links.h"
#include "targets/mmi_queue.h"

TEST(BootModeTest, OnlyTheFirstCharacterCounts) {
    TestRoot root;
    EXPECT_EQ(-1, getBootMode());  // missing file
    for (auto [content, mode] : {std::pair{"5", 5}, {"57", 5}, {"", 0}, {"x", 0}}) {
        root.write(BOOT_MODE_FILE, content);
        EXPECT_EQ(mode, getBootMode()) << content;
    }
}

class UserModeGateTest : public HostLinks {
protected:
    std::string route(const char *text) {
        snprintf(gSerialDevice.cmdBuf, sizeof(gSerialDevice.cmdBuf), "%s", text);
        gSerialDevice.currDevice = DEVICE_SERIAL;
        routeCommandLine(&gSerialDevice, gSerialDevice.cmdBuf);
        return drain(master);
    }
};

static const char kRefused[] = "\r\nNot access to modem in User Mode.\r\n";
static const char kNoModem[] = "\r\nERROR:No Modem\r\n";

TEST_F(UserModeGateTest, UserBuildLetsOnlyBareAtThroughUnlessSwitchedOff) {
    property_set("ro.build.type", "user");
    EXPECT_EQ(kNoModem, route("AT"));
    EXPECT_EQ(kRefused, route("at+csq"));
    EXPECT_EQ(std::string::npos, route("AT+CCLK?").find("Not access"));  // local: not gated
    property_set("persist.service.tolk.usermode", "1");
    EXPECT_EQ(kNoModem, route("AT+CSQ"));
}

TEST_F(UserModeGateTest, RefusedMmiCommandLeavesNoTextForTheNextCommand) {
    mmiCmdSeqReset();
    property_set("ro.build.type", "user");
    EXPECT_EQ(kRefused, route("AT+CPIN=1234"));
    EXPECT_EQ(0, gMmiCmdSeq.cusMmiCmdPending);
    EXPECT_EQ(0, gMmiCmdSeq.EIdx);
    EXPECT_STREQ("", gMmiCmdSeq.cmd[0]);
    // The next modem command that passes is an ordinary one and gets no queue entry.
    EXPECT_EQ(kNoModem, route("AT"));
    EXPECT_EQ(-1, gMmiCmdSeq.seq[0]);
}

TEST_F(UserModeGateTest, EngBuildIsNotGated) {
    property_set("ro.build.type", "eng");
    EXPECT_EQ(kNoModem, route("AT+CSQ"));
}
