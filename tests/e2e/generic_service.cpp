// The generic framework service as the host meets it: its answers come back
// asynchronously except for AT+POWERKEY, which holds the daemon up; modem answers
// to customer MMI commands are fed back to it; its link going away while a modem
// command is outstanding is reported to the host once.
#include "modem_e2e.h"

using namespace modem_e2e;

namespace {

const char kEsuo[] = "\r\n+ESUO:4\r\n\r\nOK\r\n";
const char kNotReady[] = "\r\nERROR:UE is not ready\r\n";

}  // namespace

TEST(GenericService, CommandsAreAsynchronousButPowerkeyBlocks) {
    SimDevice dev;
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    genericScript(dev,
                  "AT+SN => (delay 1200) \\r\\n+SN: TS0001\\r\\n\\r\\nOK\\r\\n\n"
                  "AT+POWERKEY => (hold) \\r\\n+POWERKEY: 1\\r\\n\\r\\nOK\\r\\n\n"
                  "AT+POWERKEY=1 => (hold) \\r\\nOK\\r\\n\n");
    // Serial first: a fresh adb connection holds the reader until its first line.
    HostLink serial(dev, false), adb(dev, true);

    // A slow answer does not hold up other commands, local or generic.
    EXPECT_EQ(visible(adb.cmd("AT+SN", 200)), "");
    EXPECT_EQ(visible(adb.cmd("AT+ESUO?", 200)), visible(kEsuo));
    EXPECT_EQ(visible(adb.cmd("AT+MODEL", 200)), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(adb.until("OK\r\n", 3000)), visible("\r\n+SN: TS0001\r\n\r\nOK\r\n"));

    // Only the exact line AT+POWERKEY waits for its answer.
    EXPECT_EQ(visible(adb.cmd("AT+POWERKEY=1", 200)), "");
    EXPECT_EQ(visible(adb.cmd("AT+ESUO?", 200)), visible(kEsuo));
    releaseGeneric(dev);
    EXPECT_EQ(visible(adb.quiet()), visible("\r\nOK\r\n"));

    // AT+POWERKEY: nothing else is read, on either link, until its answer came.
    EXPECT_EQ(visible(adb.cmd("AT+POWERKEY", 200)), "");
    EXPECT_EQ(visible(adb.cmd("AT+ESUO?", 500)), "");
    EXPECT_EQ(visible(serial.cmd("AT+ESUO?", 500)), "");
    releaseGeneric(dev);
    EXPECT_EQ(visible(adb.quiet()), visible("\r\n+POWERKEY: 1\r\n\r\nOK\r\n" + std::string(kEsuo)));
    EXPECT_EQ(visible(serial.quiet()), visible(kEsuo));

    EXPECT_EQ(genericJournal(dev), "AT+SN\nAT+MODEL\nAT+POWERKEY=1\nAT+POWERKEY\n");
    EXPECT_EQ(radioJournal(dev, 1), "");
}

TEST(GenericService, PinAnswersAreFedBackToTheFramework) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    // Two ordinary commands are still waiting when the PIN command goes out; the
    // answers come back in order.
    radioScript(dev,
                "AT+CSQ => (delay 500) \\r\\n+CSQ: 20,99\\r\\n\\r\\nOK\\r\\n\n"
                "AT+CIMI => (delay 800) \\r\\n001010000000001\\r\\n\\r\\nOK\\r\\n\n"
                "AT+CPIN=\"1234\" => (delay 1100) \\r\\n+CPIN: READY\\r\\n\\r\\nOK\\r\\n\n");
    HostLink adb(dev, true);
    EXPECT_EQ(visible(adb.cmd("AT+CSQ", 50)), "");
    EXPECT_EQ(visible(adb.cmd("AT+CIMI", 50)), "");
    EXPECT_EQ(visible(adb.cmd("at+cpin=\"1234\"", 50)), "");
    // The host gets every answer unchanged.
    EXPECT_EQ(visible(adb.until("READY\r\n\r\nOK\r\n", 4000)),
              visible("\r\n+CSQ: 20,99\r\n\r\nOK\r\n"
                      "\r\n001010000000001\r\n\r\nOK\r\n"
                      "\r\n+CPIN: READY\r\n\r\nOK\r\n"));
    // The framework gets the PIN command's answer only, after its command text.
    usleep(300 * 1000);
    EXPECT_EQ(genericJournal(dev), "AT+CPIN=+ORVTOLKJ\\r\\n+CPIN: READY\\r\\n\\r\\nOK\\r\\n;\n");

    // The read and test forms are not fed back; a set form with nothing
    // outstanding is, and the framework's silence leaves the host untouched.
    EXPECT_EQ(visible(adb.cmd("AT+CPIN?")), visible("\r\n+CPIN: READY\r\n\r\nOK\r\n"));
    EXPECT_EQ(visible(adb.cmd("AT+CPIN=?")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(adb.cmd("AT+CPIN=\"0000\"")), visible("\r\nOK\r\n"));
    usleep(200 * 1000);
    EXPECT_EQ(genericJournal(dev),
              "AT+CPIN=+ORVTOLKJ\\r\\n+CPIN: READY\\r\\n\\r\\nOK\\r\\n;\n"
              "AT+CPIN=+ORVTOLKJ\\r\\nOK\\r\\n;\n");
    EXPECT_EQ(visible(adb.quiet(300)), "");
}

TEST(GenericService, LinkLossWithAModemCommandOutstandingIsReportedOnce) {
    SimDevice dev(openModem());
    ASSERT_TRUE(dev.started()) << dev.upOutput();
    radioScript(dev, "AT+HANG => (none)\n");
    genericScript(dev, "AT+MODEL => (close)\n");
    HostLink adb(dev, true);
    EXPECT_EQ(visible(adb.cmd("AT+SN")), visible("\r\nOK\r\n"));  // the generic link is up

    // Nothing outstanding: the service going away is not the host's business.
    dev.sim({"stop", "generic"});
    EXPECT_EQ(visible(adb.quiet()), "");
    dev.sim({"start", "generic"});
    usleep(300 * 1000);
    EXPECT_EQ(visible(adb.cmd("AT+SN")), visible("\r\nOK\r\n"));

    // A modem command without an answer, then the service stops.
    EXPECT_EQ(visible(adb.cmd("AT+HANG", 200)), "");
    dev.sim({"stop", "generic"});
    EXPECT_EQ(visible(adb.quiet()), visible(kNotReady));
    dev.sim({"start", "generic"});
    usleep(300 * 1000);
    // The report is not repeated for the next loss of the link...
    EXPECT_EQ(visible(adb.cmd("AT+MODEL")), "");
    // ...until another modem command is outstanding.
    EXPECT_EQ(visible(adb.cmd("AT+HANG", 200)), "");
    EXPECT_EQ(visible(adb.cmd("AT+MODEL")), visible(kNotReady));
    // An answered modem command clears it.
    EXPECT_EQ(visible(adb.cmd("AT")), visible("\r\nOK\r\n"));
    EXPECT_EQ(visible(adb.cmd("AT+MODEL")), "");
    EXPECT_EQ(genericJournal(dev), "AT+SN\nAT+SN\nAT+MODEL\nAT+MODEL\nAT+MODEL\n");
    EXPECT_EQ(radioJournal(dev, 1), "AT+HANG\\x00\nAT+HANG\\x00\nAT\\x00\n");
}
