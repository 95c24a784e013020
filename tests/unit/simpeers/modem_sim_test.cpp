// The simulated modem as strict as a modem and the radio HAL: a request that is no
// line plus its NUL, or SMS text a modem would refuse, is refused, so that a daemon
// that relays such bytes fails the end-to-end tests. What host tools get from it
// is checked end to end with the tools themselves, and the prompts, ESC and a
// second PDU-mode parameter by sms.tx.
#include "../../../sim/modem_sim.h"

#include <gtest/gtest.h>

using namespace tolksim;

static std::string ok(const std::string &info = "") { return info + "\r\nOK\r\n"; }
static std::string line(const std::string &text) { return "\r\n" + text + "\r\n"; }
const char kPrompt[] = "\r\n> ";
const std::string kNul(1, '\0');

// Each request in turn on one modem, with the answer it gets or the reason the
// radio HAL's request format refuses it (refused requests are given with their
// NUL or without it, every other one gets its NUL here).
TEST(ModemSim, RequestFormatAndSmsTextPhaseOnlyWithWhatTheModeNeeds) {
    const std::string pdu = "000100038121F300000141";  // 10 octets of TPDU
    const std::pair<std::string, std::string> steps[] = {
        {"AT+CSQ", "refused: no NUL at the end"},
        {"", "refused: no NUL at the end"},
        {"AT+CSQ" + kNul + "x" + kNul, "refused: NUL inside the request"},
        {"AT+CSQ\r\n" + kNul, "refused: line end inside a command line"},
        {"AT\rAT" + kNul, "refused: line end inside a command line"},
        {"AT+EMGS=\"1\",,\"hi\"" + kNul, "refused: merged SMS line without its closing quote and CR LF"},
        {"AT+EMGS=\"1\",,\"hi\r\n" + kNul, "refused: merged SMS line without its closing quote and CR LF"},
        {"AT+EMGS=1\"\r\n" + kNul, "refused: merged SMS line without a quoted text"},
        // PDU mode: a length is needed, and the PDU must be hex of that length
        // after its SMSC part. SMS errors ignore +CMEE.
        {"AT+CMGS=", line("+CMS ERROR: 304")},
        {"AT+CMGS=\"\"", line("+CMS ERROR: 304")},
        {"AT+CMGC=", line("+CMS ERROR: 304")},
        {"AT+CMGS=10", kPrompt},
        {pdu + "\x1a", ok(line("+CMGS: 1"))},
        {"AT+CMGS=11", kPrompt},
        {pdu + "\x1a", line("+CMS ERROR: 304")},
        {"AT+CMGW=10", kPrompt},
        {"0001000381\r", kPrompt},  // a PDU over two lines
        {"21F300000141\x1a", ok(line("+CMGW: 1"))},
        {"AT+CMGS=1", kPrompt},
        {"0G\x1a", line("+CMS ERROR: 304")},
        {"AT+CNMA=0,0", ok()},  // no PDU: nothing to type
        {"AT+EMGS=10,\"" + pdu + "\"\r\n", ok(line("+CMGS: 2"))},
        {"AT+EMGS=9,\"" + pdu + "\"\r\n", line("+CMS ERROR: 304")},
        // Text mode: a destination is needed, the text is anything.
        {"AT+CMGF=1", ok()},
        {"AT+CMGS=\"\"", line("+CMS ERROR: 305")},
        {"AT+CNMA=0,1", line("+CMS ERROR: 305")},  // text mode acknowledges without a PDU
        {"AT+CMGS", line("+CMS ERROR: 305")},
        {"AT+EMGW=\"5\",,\"a,b\nc\"\r\n", ok(line("+CMGW: 2"))},
        {"AT+EMGS=\"1\",,\"h\ni\"\r\n", ok(line("+CMGS: 3"))},
        {"AT+EMGS=\"\",,\"x\"\r\n", line("+CMS ERROR: 305")},
        {"AT+CMGR=2", ok(line("+CMGR: \"STO UNSENT\",\"5\",\r\na,b\nc"))},
        {"AT+CMGR=9", line("+CMS ERROR: 321")},
    };
    ModemSim m(1);
    for (const auto &step : steps) {
        bool refused = step.second.compare(0, 9, "refused: ") == 0;
        std::string request = refused ? step.first : step.first + kNul;
        std::string fault = m.requestFault(request), answer = "refused: " + fault;
        if (fault.empty()) m.handle(request, &answer);  // a modem always answers: else "refused: " shows
        EXPECT_EQ(step.second, answer) << "request: " << step.first;
    }
}
