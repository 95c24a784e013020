// The modem route as a factory host sees it: the user-mode gate, numeric result
// codes, SIM slot selection, the radio service going away and coming back, and
// where unsolicited modem output goes.
#include "modem_e2e.h"

#include <pty.h>
#include <termios.h>

using namespace modem_e2e;

namespace {

const char kRefused[] = "\r\nNot access to modem in User Mode.\r\n";
const char kNoModem[] = "\r\nERROR:No Modem\r\n";

}  // namespace

TEST(ModemRoute, UserModeGateOnProductionBuilds) {
    SimDevice dev;  // ro.build.type unset counts as "user"
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    for (bool adb : {false, true}) {
        HostLink host(dev, adb);
        EXPECT_EQ(visible(host.cmd("AT")), visible("\r\nOK\r\n")) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("at")), visible("\r\nOK\r\n")) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("AT+CPIN?")), visible(kRefused)) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("ATV0")), visible(kRefused)) << "adb " << adb;
        // Local and framework commands are not the modem's and are not gated.
        EXPECT_EQ(visible(host.cmd("AT+ESUO?")), visible("\r\n+ESUO:4\r\n\r\nOK\r\n")) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("AT+SN")), visible("\r\nOK\r\n")) << "adb " << adb;
    }
    // On adb a line ends at CR only: an LF inside it ends nothing, so what follows
    // it is a command and the line is refused; "AT" with only line ends passes,
    // LF and all, and the radio HAL refuses a command line that carries a line end.
    HostLink adb(dev, true);
    EXPECT_EQ(visible(adb.cmd("AT\n+CFUN=0")), visible(kRefused));
    EXPECT_EQ(visible(adb.cmd("AT\n")), visible("\r\nERROR\r\n"));
    // Refused lines never reach the modem (nor change the numeric switch).
    EXPECT_EQ(radioJournal(dev, 1), "AT\\x00\nAT\\x00\nAT\\x00\nAT\\x00\n"
                                    "AT\\n\\x00\trefused: line end inside a command line\n");
    EXPECT_EQ(genericJournal(dev), "AT+SN\nAT+SN\n");

    // The switch is read for every line: opening it takes effect at once.
    dev.setprop("persist.service.tolk.usermode", "1");
    EXPECT_EQ(visible(dev.at("AT+CPIN?", true)), visible("\r\n+CPIN: READY\r\n\r\nOK\r\n"));
}

TEST(ModemRoute, EngineeringBuildAndUserModeSwitchOpenTheModem) {
    {  // the user-mode switch opens it too: every test started with openModem()
        SimDevice dev({"--prop", "ro.build.type=eng"});
        ASSERT_TRUE(dev.started()) << dev.upOutput();
        EXPECT_EQ(visible(dev.at("AT+CPIN?", true)), visible("\r\n+CPIN: READY\r\n\r\nOK\r\n"));
        EXPECT_EQ(radioJournal(dev, 1), "AT+CPIN?\\x00\n");
    }
    // Any other build type and switch value keep the gate shut.
    SimDevice dev({"--prop", "ro.build.type=userdebug", "--prop", "persist.service.tolk.usermode=2"});
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ(visible(dev.at("AT+CSQ", true)), visible(kRefused));
}

TEST(ModemRoute, NumericResultCodesForAnswersAndUnsolicitedRing) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    for (bool adb : {false, true}) {
        HostLink host(dev, adb);
        // Lower case is upper-cased first, so it switches too; the modem still
        // receives the line and its verbose OK is shown as the digit.
        EXPECT_EQ(visible(host.cmd("atv0")), visible("\r\n0\r\n")) << "adb " << adb;
        // Only a body that is exactly a result text turns into a digit.
        EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n")) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("AT+NOSUCH")), visible("\r\n4\r\n")) << "adb " << adb;
        int status = -1;
        dev.sim({"urc", "--slot", "1", "\\r\\nRING\\r\\n"}, &status);
        EXPECT_EQ(status, 0);
        EXPECT_EQ(visible(host.quiet()), visible("\r\n2\r\n")) << "adb " << adb;
        // "ATV" alone changes nothing.
        EXPECT_EQ(visible(host.cmd("ATV")), visible("\r\n0\r\n")) << "adb " << adb;
        // The switch back applies to the answer of ATV1 itself.
        EXPECT_EQ(visible(host.cmd("ATV1")), visible("\r\nOK\r\n")) << "adb " << adb;
        dev.sim({"urc", "--slot", "1", "\\r\\nRING\\r\\n"});
        EXPECT_EQ(visible(host.quiet()), visible("\r\nRING\r\n")) << "adb " << adb;
        EXPECT_EQ(visible(host.cmd("AT+NOSUCH")), visible("\r\nERROR\r\n")) << "adb " << adb;
    }
}

TEST(ModemRoute, SimSlotSelection) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink host(dev, true);
    EXPECT_EQ(visible(host.cmd("AT+CGSN")), visible("\r\n350000000000001\r\n\r\nOK\r\n"));
    // The selection takes effect with the next command, without reconnecting.
    EXPECT_EQ(visible(host.cmd("AT+ESUO=5")), visible("\r\nOK\r\n"));
    EXPECT_EQ(dev.getprop("persist.service.tolk.sim"), "1");
    EXPECT_EQ(visible(host.cmd("AT+CGSN")), visible("\r\n350000000000002\r\n\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+ESUO=4")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(host.cmd("AT+CIMI")), visible("\r\n001010000000001\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1), "AT+CGSN\\x00\nAT+CIMI\\x00\n");
    EXPECT_EQ(radioJournal(dev, 2), "AT+CGSN\\x00\n");

    // Values the bridge does not know never reach any slot (each value and CDMA
    // slot against its answer: FaultRoot.PropertiesAtTheirLimitsAndNonNumeric).
    std::string slot1 = radioJournal(dev, 1), others = radioJournal(dev, 2) + radioJournal(dev, 4);
    for (const char *v : {"4", "-1"}) {
        dev.setprop("persist.service.tolk.sim", v);
        EXPECT_EQ(visible(host.cmd("AT+CGSN")), visible(kNoModem)) << v;
    }
    EXPECT_EQ(radioJournal(dev, 1), slot1);
    EXPECT_EQ(radioJournal(dev, 2) + radioJournal(dev, 4), others);
    EXPECT_EQ(radioJournal(dev, 3), "");
}

TEST(ModemRoute, SimSelectionOfTheCdmaModemInC2kMode) {
    SimDevice dev(openModem({"--prop", "ro.boot.opt_c2k_lte_mode=1", "--prop", "persist.radio.cdma_slot=2"}));
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    EXPECT_EQ(visible(dev.at("AT+ESUO=9", true)), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(dev.at("AT+ESUO?", true)), visible("\r\n+ESUO:9\r\n\r\nOK\r\n"));
    EXPECT_EQ(visible(dev.at("AT+CGSN", true)), visible("\r\n350000000000002\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 2), "AT+CGSN\\x00\n");
}

TEST(ModemRoute, RadioServiceAbsentKilledAndRestarted) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    dev.sim({"stop", "radio"});
    for (bool adb : {false, true}) {
        HostLink host(dev, adb);
        EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible(kNoModem)) << "adb " << adb;
    }
    int status = -1;
    dev.sim({"urc", "\\r\\n+CREG: 9\\r\\n"}, &status);
    EXPECT_NE(0, status) << "no service, no unsolicited output";
    // Each command looks again: once the service is there, it is served.
    dev.sim({"start", "radio"});
    usleep(300 * 1000);
    HostLink host(dev, true);
    EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"));

    // Killed while a command waits for its answer: that answer never comes, the
    // next command after the restart sets the proxy up again and is served.
    radioScript(dev, "AT+SLOW => (delay 5000) \\r\\nOK\\r\\n\n");
    EXPECT_EQ(visible(host.cmd("AT+SLOW", 300)), "");
    dev.sim({"stop", "radio"});
    EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible(kNoModem));
    dev.sim({"start", "radio"});
    usleep(300 * 1000);
    EXPECT_EQ(visible(host.cmd("AT+CSQ")), visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"));
    EXPECT_EQ(visible(host.quiet(300)), "");
    // Unsolicited output of the restarted service reaches the host again.
    dev.sim({"urc", "\\r\\n+CREG: 1\\r\\n"}, &status);
    EXPECT_EQ(0, status);
    EXPECT_EQ(visible(host.quiet()), visible("\r\n+CREG: 1\r\n"));
    // The serial link is served the same way.
    HostLink serial(dev, false);
    EXPECT_EQ(visible(serial.cmd("AT+CGSN")), visible("\r\n350000000000001\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1), "AT+CSQ\\x00\nAT+SLOW\\x00\nAT+CSQ\\x00\nAT+CGSN\\x00\n");
    EXPECT_EQ(dev.tolkdExitStatus(0), -1);  // still running
}

TEST(ModemRoute, UnsolicitedOutputGoesToTheLinkOfTheLastCommand) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink serial(dev, false), adb(dev, true);
    EXPECT_EQ(visible(adb.cmd("AT")), visible("\r\nOK\r\n"));
    int status = -1;
    dev.sim({"urc", "\\r\\n+CREG: 1\\r\\n"}, &status);
    EXPECT_EQ(status, 0);
    EXPECT_EQ(visible(adb.quiet()), visible("\r\n+CREG: 1\r\n"));
    EXPECT_EQ(visible(serial.quiet(200)), "");

    // A local command on the serial port moves the answers there too.
    EXPECT_EQ(visible(serial.cmd("AT+ESUO?")), visible("\r\n+ESUO:4\r\n\r\nOK\r\n"));
    dev.sim({"urc", "--slot", "1", "\\r\\nRING\\r\\n"});
    EXPECT_EQ(visible(serial.quiet()), visible("\r\nRING\r\n"));
    EXPECT_EQ(visible(adb.quiet(200)), "");

    // Output of a slot the daemon does not use has nobody to go to.
    dev.sim({"urc", "--slot", "2", "\\r\\nRING\\r\\n"}, &status);
    EXPECT_NE(status, 0);
}

TEST(ModemRoute, SlotOneCanBeAModemOnASerialDevice) {
    int master = -1, slave = -1;
    char name[64];
    ASSERT_EQ(openpty(&master, &slave, name, nullptr, nullptr), 0);
    SimDevice dev(openModem({"--modem-tty", name}));
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    HostLink host(dev, true);
    // The modem gets the command line with the CR it waits for...
    writeAll(host.fd(), "AT+CSQ\r");
    EXPECT_EQ(visible(readUntil(master, "\r", 3000)), visible("AT+CSQ\r"));
    // ...and whatever it says reaches the host, unsolicited lines included.
    writeAll(master, "\r\n+CSQ: 9,99\r\n\r\nOK\r\n");
    EXPECT_EQ(visible(host.quiet()), visible("\r\n+CSQ: 9,99\r\n\r\nOK\r\n"));
    writeAll(master, "\r\nRING\r\n");
    EXPECT_EQ(visible(host.quiet()), visible("\r\nRING\r\n"));
    // The other slots are still simulated.
    dev.setprop("persist.service.tolk.sim", "1");
    EXPECT_EQ(visible(host.cmd("AT+CGSN")), visible("\r\n350000000000002\r\n\r\nOK\r\n"));
    EXPECT_EQ(radioJournal(dev, 1), "AT+CSQ\\x00\n");
    close(master);
    close(slave);
}
