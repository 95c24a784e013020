// The user-mode gate in front of the modem. No radio service runs under the test
// root, so a line that reaches the modem is answered "ERROR:No Modem" by the
// bridge: that is how this test sees it arrive.
#include <cutils/properties.h>

#include "core/startup.h"
#include "host_links.h"
#include "targets/mmi_queue.h"

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

