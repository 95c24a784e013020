// Real host programs, written by others, drive the simulated phone through the
// daemon on the host serial port: gammu, gsmlib's gsmctl and gsmsendsms, pyserial
// toggling DTR, and wvdialconf looking for a modem. Each check holds what the
// program reports against what reached the modem (the slot 1 journal), and a
// program that is not installed is a skip that says so.
#include <sys/stat.h>
#include <unistd.h>

#include <cstdlib>
#include <regex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "sim_device.h"

namespace {

const char kPython[] = "/usr/bin/python3";
// Each program gets this long before timeout(1) ends it; they need a second or two.
const char kClientTimeout[] = "30";

class HostClients : public ::testing::Test {
protected:
    // One device for all: the programs leave the modem as they found it, apart
    // from settings each of them makes itself.
    static void SetUpTestSuite() { dev_ = new SimDevice({"--prop", "persist.service.tolk.usermode=1"}); }
    static void TearDownTestSuite() {
        delete dev_;
        dev_ = nullptr;
    }
    void SetUp() override {
        ASSERT_TRUE(dev_->started()) << dev_->upOutput();
        dev_->writeFile("/journal/radio.slot1.log", "");
    }

    static std::string port() { return dev_->root() + "/host/ttyACM0"; }
    // CMD ARGS... run by `tolk-sim host`, so the host port has the modem lines
    // of a USB ACM port; stdout and stderr together.
    static std::string host(const std::vector<std::string> &command, int *status = nullptr) {
        std::vector<std::string> args = {"host", "--root", dev_->root(), "--", "timeout", kClientTimeout};
        args.insert(args.end(), command.begin(), command.end());
        std::string out;
        int rc = runSim(args, &out, true);
        if (status) *status = rc;
        return out;
    }
    // The modem's requests, each sent with serial -1 and none refused, without the serial.
    static std::string journal() {
        std::string raw = dev_->readFile("/journal/radio.slot1.log");
        std::string j = std::regex_replace(raw, std::regex("(^|\n)-1\t"), "$1");
        EXPECT_EQ(std::string::npos, j.find("refused")) << j;
        EXPECT_EQ(std::string::npos, j.find('\t')) << "a serial other than -1: " << raw;
        return j;
    }

    static SimDevice *dev_;
};

SimDevice *HostClients::dev_ = nullptr;

bool installed(const char *path) { return access(path, X_OK) == 0; }

bool contains(const std::string &text, const std::string &part) { return text.find(part) != std::string::npos; }

// The line after "AT+CMGS=N" in the journal is the PDU the program typed, hex
// ended by Ctrl-Z; the modem checked it against N before it answered +CMGS.
void expectPduSent(const std::string &journal) {
    static const std::regex sent(R"(AT\+CMGS=\d+\\x00\n[0-9A-F]+\\x1a\\x00\n)");
    EXPECT_TRUE(std::regex_search(journal, sent)) << journal;
}

}  // namespace

TEST_F(HostClients, GammuIdentifiesReadsStatusAndSendsAPduMessage) {
    if (!installed("/usr/bin/gammu")) GTEST_SKIP() << "gammu is not installed (apt-get install gammu)";
    dev_->writeFile("/gammurc", "[gammu]\ndevice = " + port() + "\nconnection = at\n");
    // One batch: gammu sets the phone up once for all four commands.
    dev_->writeFile("/gammu.batch", "identify\ngetsecuritystatus\nnetworkinfo\n"
                                    "sendsms TEXT 123456 -text \"hello world\"\n");
    int status = -1;
    std::string out =
        host({"gammu", "-c", dev_->root() + "/gammurc", "batch", dev_->root() + "/gammu.batch"}, &status);
    EXPECT_EQ(0, status) << out;
    for (const char *reported : {"Manufacturer         : TOLK-SIM", "Firmware             : TSM-100 V1.0.1",
                                 "IMEI                 : 350000000000001", "SIM IMSI             : 001010000000001",
                                 "Nothing to enter.", "Network state        : home network",
                                 "LAC 0001, CID 00000101", "GPRS                 : attached"})
        EXPECT_TRUE(contains(out, reported)) << reported << " in\n" << out;
    EXPECT_TRUE(std::regex_search(out, std::regex("OK, message reference=\\d+"))) << out;
    std::string j = journal();
    for (const char *request : {"AT+CGSN\\x00\nAT+CIMI\\x00\n", "AT+CPIN?\\x00\n", "AT+CREG?\\x00\n",
                                "AT+COPS?\\x00\n", "AT+CGATT?\\x00\n", "AT+CMGF=0\\x00\n"})
        EXPECT_TRUE(contains(j, request)) << request << " in\n" << j;
    expectPduSent(j);
}

TEST_F(HostClients, GsmlibReadsTheModemAndSendsAMessage) {
    if (!installed("/usr/bin/gsmctl") || !installed("/usr/bin/gsmsendsms"))
        GTEST_SKIP() << "gsmctl and gsmsendsms are not installed (apt-get install gsm-utils)";
    int status = -1;
    std::string out = host({"gsmctl", "-d", port(), "ME", "SIG", "OP"}, &status);
    EXPECT_EQ(0, status) << out;
    EXPECT_TRUE(contains(out, "<ME0>  Manufacturer: TOLK-SIM")) << out;
    EXPECT_TRUE(contains(out, "<ME3>  Serial Number: 350000000000001")) << out;
    EXPECT_TRUE(contains(out, "<SIG0>  20")) << out;
    EXPECT_TRUE(contains(out, "Status: current  Long name: 'TOLK SIM'")) << out;
    std::string j = journal();
    // gsmlib resets the modem and asks for numeric errors and PDU mode first.
    EXPECT_EQ(0u, j.find("ATZ\\x00\nAT+CMEE=1\\x00\nAT+CMGF=0\\x00\n")) << j;
    EXPECT_TRUE(contains(j, "AT+CSQ\\x00\n") && contains(j, "AT+COPS=?\\x00\n")) << j;

    dev_->writeFile("/journal/radio.slot1.log", "");
    out = host({"gsmsendsms", "-d", port(), "123456", "hello there"}, &status);
    EXPECT_EQ(0, status) << out;
    expectPduSent(journal());
}

TEST_F(HostClients, PyserialWithDtrDroppedBetweenCommands) {
    if (!installed(kPython) || host({kPython, "-c", "import serial"}) != "")
        GTEST_SKIP() << "python3-serial is not installed (apt-get install python3-serial)";
    const char script[] = R"(
import sys, serial
port = serial.Serial(sys.argv[1], 115200, timeout=3)
def cmd(line):
    port.write((line + "\r").encode())
    return port.read_until(b"OK\r\n")
out = [cmd("ATE0")]
for line in ("AT+CGSN", "AT+CSQ", "AT+CPIN?"):
    out.append(cmd(line))
    port.dtr = False
    out.append(port.dtr)
    port.dtr = True
print(out)
)";
    int status = -1;
    std::string out = host({kPython, "-c", script, port()}, &status);
    EXPECT_EQ(0, status) << out;
    // ATE0 may be echoed before the port's echo goes off.
    std::string answers = out.substr(out.find("OK\\r\\n'") + 7);
    EXPECT_EQ(", b'\\r\\n350000000000001\\r\\n\\r\\nOK\\r\\n', False, b'\\r\\n+CSQ: 20,99\\r\\n\\r\\nOK\\r\\n', False, "
              "b'\\r\\n+CPIN: READY\\r\\n\\r\\nOK\\r\\n', False]\n",
              answers)
        << out;
    EXPECT_EQ("AT+CGSN\\x00\nAT+CSQ\\x00\nAT+CPIN?\\x00\n", journal());
}

// wvdialconf looks for modems among the serial devices under /dev. It runs in a
// mount namespace of its own whose /dev holds only the host port (as ttyACM0) and
// /dev/null, so that it opens no device of the machine.
TEST_F(HostClients, WvdialconfFindsTheModem) {
    if (!installed("/usr/bin/wvdialconf")) GTEST_SKIP() << "wvdialconf is not installed (apt-get install wvdial)";
    if (system("unshare -m true 2>/dev/null") != 0)
        GTEST_SKIP() << "no mount namespace here (unshare -m needs CAP_SYS_ADMIN): wvdialconf would scan the real /dev";
    const std::string dev = dev_->root() + "/wvdev", conf = dev_->root() + "/wvdial.conf";
    const std::string script = "set -e\n"
                               "mkdir -p " + dev + "\n"
                               "mount -t tmpfs none " + dev + "\n"
                               "touch " + dev + "/ttyACM0 " + dev + "/null\n"
                               "mount --bind \"$(readlink -f " + port() + ")\" " + dev + "/ttyACM0\n"
                               "mount --bind /dev/null " + dev + "/null\n"
                               "mkdir " + dev + "/pts\n"
                               "mount --rbind /dev/pts " + dev + "/pts\n"
                               "mount --rbind " + dev + " /dev\n"
                               "exec wvdialconf " + conf + "\n";
    int status = -1;
    std::string out = host({"unshare", "-m", "sh", "-c", script}, &status);
    EXPECT_EQ(0, status) << out;
    EXPECT_TRUE(contains(out, "Found an USB modem on /dev/ttyACM0.")) << out;
    // It settles on the dialer's full set-up line: the modem took every part of it.
    EXPECT_TRUE(contains(out, "ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0 -- OK")) << out;
    std::string wrote = dev_->readFile("/wvdial.conf");
    EXPECT_TRUE(contains(wrote, "Modem = /dev/ttyACM0")) << wrote;
    EXPECT_TRUE(contains(wrote, "Init2 = ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0")) << wrote;
    std::string j = journal();
    EXPECT_TRUE(contains(j, "ATQ0 V1 E1 S0=0 &C1 &D2 +FCLASS=0\\x00\n") && contains(j, "ATI\\x00\n")) << j;
}
