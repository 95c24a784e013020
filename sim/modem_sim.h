// The simulated modem behind one radio HAL slot: an interpreter of the V.250 and
// 3GPP TS 27.007 / 27.005 commands that factory stations and host tools send,
// with the SMS text phase in text and PDU mode. It is as strict as a modem:
// what it does not know is an error, parameters are checked, and a request that
// is not a command line plus its NUL is refused before it is interpreted. The
// transport (frames, serials, answer order) is the radio peer's business.
#ifndef TOLK_SIM_MODEM_SIM_H
#define TOLK_SIM_MODEM_SIM_H

#include <map>
#include <string>
#include <vector>

namespace tolksim {

struct StoredSms {
    int index;
    std::string address;  // destination, or PDU length in PDU mode
    std::string body;     // text, or PDU hex
    bool pdu;
};

class ModemSim {
public:
    // slot: 1..4; the identity numbers end in the slot digit so a test can tell
    // which slot answered.
    explicit ModemSim(int slot);

    // Why a request breaks the HAL's request format (a command line or a text
    // line plus its NUL), or "" when it is well formed. Depends on the text phase:
    // text lines keep their own line end, command lines have none.
    std::string requestFault(const std::string &request) const;
    // One well-formed request; fills answer and returns true (a modem always
    // answers a command line, and prompts for more text).
    bool handle(const std::string &request, std::string *answer);
    // A new client: an unfinished text phase is dropped.
    void reset();

    std::string imei() const;
    std::string imsi() const;
    std::string iccid() const;
    bool inTextPhase() const { return textCmd_ != TextNone; }

private:
    enum TextCmd { TextNone, TextCmgs, TextCmgw, TextCmgc, TextCnma };
    // Outcome of one command of a line.
    struct Result {
        enum Kind { Ok, Error, CmeError, CmsError, StartsText } kind = Ok;
        int code = 0;
    };

    std::string runLine(const std::string &line);
    Result runExtended(const std::string &cmd, std::string *info);
    Result runBasic(const std::string &cmd, std::string *info);
    Result openText(const std::string &name, int form, const std::vector<std::string> &args);
    Result runMerged(const std::string &name, const std::string &params, std::string *info);
    Result finishText(TextCmd cmd, const std::string &address, const std::string &body, bool pdu,
                      std::string *info);
    Result smsParamError() const;
    std::string resultText(const Result &r) const;
    std::string frame(const std::string &text) const;
    void factoryDefaults();

    int slot_;
    bool echo_ = false;
    int cmee_ = 0;
    int creg_ = 0;
    int cgreg_ = 0;
    int cmgf_ = 0;
    int cfun_ = 1;
    int csms_ = 0;
    int copsFormat_ = 0;
    int cnmi_[5] = {0, 0, 0, 0, 0};
    std::string cscs_ = "IRA";
    std::string csca_ = "+10000000000";
    std::map<int, int> sregs_;
    int messageRef_ = 0;
    int nextIndex_ = 1;
    std::vector<StoredSms> store_;
    TextCmd textCmd_ = TextNone;
    bool textPdu_ = false;
    std::string textAddress_;
    std::string textBody_;
};

// Whether hex is an SMS PDU as AT+CMGS=<length> announces it in PDU mode: hex
// digits only (CR and LF between lines are not part of it), an SMSC part whose
// first octet gives its length, and then exactly length octets of TPDU.
bool validPdu(const std::string &hex, int length);

}  // namespace tolksim

#endif
