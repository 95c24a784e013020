// The simulated modem behind one radio HAL slot: an interpreter of the common
// V.250 / 3GPP TS 27.007 / 27.005 commands a factory station sends, with the SMS
// text phase. It turns one request (the bytes the daemon sent, its trailing NUL
// included) into at most one answer; the transport is the radio peer's business.
#ifndef TOLK_SIM_MODEM_SIM_H
#define TOLK_SIM_MODEM_SIM_H

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

    // One request; returns false when the modem stays silent (never for now, but
    // callers must not rely on an answer), else fills answer.
    bool handle(const std::string &request, std::string *answer);
    // A new client: an unfinished text phase is dropped.
    void reset();

    std::string imei() const;
    std::string imsi() const;
    std::string iccid() const;
    bool inTextPhase() const { return textCmd_ != TextNone; }

private:
    enum TextCmd { TextNone, TextCmgs, TextCmgw, TextCmgc, TextCnma };

    std::string runLine(const std::string &line);
    // Runs one extended or basic command; appends information text to info.
    // Returns 0 OK, otherwise an error: -1 plain/CME, -2 a CMS error (cms set).
    int runCommand(const std::string &cmd, std::string *info, int *cmeCode, bool *startsText);
    int runBasic(const std::string &cmd, std::string *info);
    std::string finishText(TextCmd cmd, const std::string &address, const std::string &body, bool pdu);
    std::string errorText(int cmeCode) const;
    std::string frame(const std::string &text) const;

    int slot_;
    bool echo_ = false;
    bool verbose_ = true;
    int cmee_ = 0;
    int creg_ = 0;
    int cmgf_ = 0;
    std::string cscs_ = "IRA";
    int messageRef_ = 0;
    int nextIndex_ = 1;
    std::vector<StoredSms> store_;
    TextCmd textCmd_ = TextNone;
    std::string textAddress_;
    std::string textBody_;
};

}  // namespace tolksim

#endif
