// Real host programs, written by others, drive the simulated phone through the
// daemon on the host serial port: gammu, gsmlib's gsmctl and gsmsendsms, pyserial
// toggling DTR, and wvdialconf looking for a modem. Each check holds what the
// program reports against what reached the modem (the slot 1 journal), and a
// program that is not installed is a skip that says so.
#include <unistd.h>

#include <cstdlib>
#include <regex>

#include <gtest/gtest.h>

#include "sim_device.h"

static bool installed(const char *path) { return access(path, X_OK) == 0; }

class HostClients : public ::testing::Test {
protected:
    // One device for all: the programs leave the modem as they found it, apart
    // from settings each of them makes itself.
    static void SetUpTestSuite() { dev_ = new SimDevice({"--prop", "persist.service.tolk.usermode=1"}); }
    static void TearDownTestSuite() { delete dev_; }
    void SetUp() override {
        ASSERT_TRUE(dev_->started()) << dev_->upOutput();
        dev_->writeFile("/journal/radio.slot1.log", "");
    }

    static std::string port() { return dev_->root() + "/host/ttyACM0"; }
    // CMD ARGS... run by `tolk-sim host`, so the host port has the modem lines of
    // a USB ACM port, with 30 s (they need a second or two) before timeout(1)
    // ends it; stdout and stderr together. It must succeed.
    static std::string host(std::vector<std::string> command) {
        command.insert(command.begin(), {"host", "--root", dev_->root(), "--", "timeout", "30"});
        std::string out;
        EXPECT_EQ(0, runSim(command, &out, true)) << out;
        return out;
    }
    // The modem's requests, each sent with serial -1 and none refused, without the serial.
    static std::string journal() {
        std::string raw = dev_->readFile("/journal/radio.slot1.log");
        std::string j = std::regex_replace(raw, std::regex("(^|\n)-1\t"), "$1");
        EXPECT_EQ(std::string::npos, j.find('\t')) << "a serial other than -1 or a refusal: " << raw;
        return j;
    }
    static void expectParts(const std::string &text, const std::vector<std::string> &parts) {
        for (const std::string &part : parts)
            EXPECT_NE(std::string::npos, text.find(part)) << part << " in\n" << text;
    }
    // The line after "AT+CMGS=N" in the journal is the PDU the program typed, hex
    // ended by Ctrl-Z; the modem checked it against N before it answered +CMGS.
    static void expectPduSent(const std::string &j) {
        EXPECT_TRUE(std::regex_search(j, std::regex(R"(AT\+CMGS=\d+\\x00\n[0-9A-F]+\\x1a\\x00\n)"))) << j;
    }

    inline static SimDevice *dev_ = nullptr;
};

TEST_F(HostClients, GammuIdentifiesReadsStatusAndSendsAPduMessage) {
    if (!installed("/usr/bin/gammu")) GTEST_SKIP() << "gammu is not installed (apt-get install gammu)";
    dev_->writeFile("/gammurc", "[gammu]\ndevice = " + port() + "\nconnection = at\n");
    // One batch: gammu sets the phone up once for all four commands.
    dev_->writeFile("/gammu.batch", "identify\ngetsecuritystatus\nnetworkinfo\n"
                                    "sendsms TEXT 123456 -text \"hello world\"\n");
    std::string out =
        host({"gammu", "-c", dev_->root() + "/gammurc", "batch", dev_->root() + "/gammu.batch"});
    expectParts(out, {"Manufacturer         : TOLK-SIM", "Firmware             : TSM-100 V1.0.1",
                      "IMEI                 : 350000000000001", "SIM IMSI             : 001010000000001",
                      "Nothing to enter.", "Network state        : home network", "LAC 0001, CID 00000101",
                      "GPRS                 : attached"});
    EXPECT_TRUE(std::regex_search(out, std::regex("OK, message reference=\\d+"))) << out;
    std::string j = journal();
    expectParts(j, {"AT+CGSN\\x00\nAT+CIMI\\x00\n", "AT+CPIN?\\x00\n", "AT+CREG?\\x00\n", "AT+COPS?\\x00\n",
                    "AT+CGATT?\\x00\n", "AT+CMGF=0\\x00\n"});
    expectPduSent(j);
}

TEST_F(HostClients, GsmlibReadsTheModemAndSendsAMessage) {
    if (!installed("/usr/bin/gsmctl") || !installed("/usr/bin/gsmsendsms"))
        GTEST_SKIP() << "gsmctl and gsmsendsms are not installed (apt-get install gsm-utils)";
    expectParts(host({"gsmctl", "-d", port(), "ME", "SIG", "OP"}),
                {"<ME0>  Manufacturer: TOLK-SIM", "<ME3>  Serial Number: 350000000000001", "<SIG0>  20",
                 "Status: current  Long name: 'TOLK SIM'"});
    std::string j = journal();
    // gsmlib resets the modem and asks for numeric errors and PDU mode first.
    EXPECT_EQ(0u, j.find("ATZ\\x00\nAT+CMEE=1\\x00\nAT+CMGF=0\\x00\n")) << j;
    expectParts(j, {"AT+CSQ\\x00\n", "AT+COPS=?\\x00\n"});

    host({"gsmsendsms", "-d", port(), "123456", "hello there"});
    expectPduSent(journal());
}

TEST_F(HostClients, PyserialWithDtrDroppedBetweenCommands) {
    if (system("/usr/bin/python3 -c 'import serial' 2>/dev/null") != 0)
        GTEST_SKIP() << "python3-serial is not installed (apt-get install python3-serial)";
    // ATE0 may be echoed before the port's echo goes off: its answer is not printed.
    const char script[] = R"(
import sys, serial
port = serial.Serial(sys.argv[1], 115200, timeout=3)
for line in ("ATE0", "AT+CGSN", "AT+CSQ", "AT+CPIN?"):
    port.write((line + "\r").encode())
    answer = port.read_until(b"OK\r\n")
    port.dtr = False
    port.dtr = True
    print(answer if line != "ATE0" else "")
)";
    EXPECT_EQ("\nb'\\r\\n350000000000001\\r\\n\\r\\nOK\\r\\n'\n"
              "b'\\r\\n+CSQ: 20,99\\r\\n\\r\\nOK\\r\\n'\nb'\\r\\n+CPIN: READY\\r\\n\\r\\nOK\\r\\n'\n",
              host({"/usr/bin/python3", "-c", script, port()}));
    EXPECT_EQ("AT+CGSN\\x00\nAT+CSQ\\x00\nAT+CPIN?\\x00\n", journal());
}

// wvdialconf looks for modems among the serial devices under /dev. It runs in a
// mount namespace of its own whose /dev holds only the host port (as ttyACM0) and
// /dev/null, so that it opens no device of the machine.
TEST_F(HostClients, WvdialconfFindsTheModem) {
    if (!installed("/usr/bin/wvdialconf"))
        GTEST_SKIP() << "wvdialconf is not installed (apt-get install wvdial)";
    if (system("unshare -m true 2>/dev/null") != 0)
        GTEST_SKIP() << "no mount namespace (unshare -m needs CAP_SYS_ADMIN), wvdialconf would scan /dev";
    // $1: the folder that becomes /dev, $2: the host port, $3: the file wvdialconf writes.
    const char script[] = R"sh(set -e
mkdir -p "$1" && mount -t tmpfs none "$1" && mkdir "$1/pts" && touch "$1/ttyACM0" "$1/null"
mount --bind "$(readlink -f "$2")" "$1/ttyACM0" && mount --bind /dev/null "$1/null"
mount --rbind /dev/pts "$1/pts" && mount --rbind "$1" /dev
exec wvdialconf "$3")sh";
    // It settles on the dialer's full set-up line: the modem took every part of it.
    expectParts(host({"unshare", "-m", "sh", "-c", script, "sh", dev_->root() + "/wvdev", port(),
                      dev_->root() + "/wvdial.conf"}),
                {"Found an USB modem on /dev/ttyACM0.", "ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0 -- OK"});
    expectParts(dev_->readFile("/wvdial.conf"),
                {"Modem = /dev/ttyACM0", "Init2 = ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0"});
    expectParts(journal(), {"ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0\\x00\n", "ATI\\x00\n"});
}
