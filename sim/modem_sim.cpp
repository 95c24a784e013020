#include "modem_sim.h"

#include <algorithm>
#include <cctype>
#include <cstdlib>

namespace tolksim {

namespace {

const char kCtrlZ = '\x1a';
const char kEsc = '\x1b';
const int kStoreSize = 20;

std::string upper(std::string s) {
    for (char &c : s) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return s;
}

// Splits a parameter list at commas outside double quotes.
std::vector<std::string> splitParams(const std::string &s) {
    std::vector<std::string> out;
    std::string cur;
    bool quoted = false;
    for (char c : s) {
        if (c == '"') quoted = !quoted;
        if (c == ',' && !quoted) {
            out.push_back(cur);
            cur.clear();
        } else {
            cur += c;
        }
    }
    out.push_back(cur);
    return out;
}

std::string unquote(const std::string &s) {
    size_t b = 0, e = s.size();
    while (b < e && s[b] == ' ') b++;
    while (e > b && s[e - 1] == ' ') e--;
    if (e - b >= 2 && s[b] == '"' && s[e - 1] == '"') return s.substr(b + 1, e - b - 2);
    return s.substr(b, e - b);
}

// A whole decimal number within [lo, hi]; false otherwise.
bool intParam(const std::string &s, int lo, int hi, int *out) {
    std::string t = unquote(s);
    if (t.empty() || t.size() > 9) return false;
    for (char c : t)
        if (!std::isdigit(static_cast<unsigned char>(c))) return false;
    int v = std::atoi(t.c_str());
    if (v < lo || v > hi) return false;
    *out = v;
    return true;
}

// The command name of an extended command and what follows it.
struct Parsed {
    std::string name;    // "+CSQ", upper case
    enum Form { Exec, Read, Test, Set } form = Exec;
    std::string params;  // after "=" for Set
};

Parsed parseExtended(const std::string &cmd) {
    Parsed p;
    size_t i = 1;
    while (i < cmd.size() && (std::isalnum(static_cast<unsigned char>(cmd[i])) || cmd[i] == '_')) i++;
    p.name = upper(cmd.substr(0, i));
    std::string rest = cmd.substr(i);
    if (rest.empty()) {
        p.form = Parsed::Exec;
    } else if (rest == "?") {
        p.form = Parsed::Read;
    } else if (rest == "=?") {
        p.form = Parsed::Test;
    } else if (rest[0] == '=') {
        p.form = Parsed::Set;
        p.params = rest.substr(1);
    } else {
        p.form = Parsed::Set;  // malformed tail: let the command refuse it
        p.params = rest;
        p.name += "#";
    }
    return p;
}

const char *cmeText(int code) {
    switch (code) {
    case 3: return "operation not allowed";
    case 4: return "operation not supported";
    case 10: return "SIM not inserted";
    case 50: return "Incorrect parameters";
    case 100: return "unknown";
    default: return "unknown";
    }
}

}  // namespace

ModemSim::ModemSim(int slot) : slot_(slot) {}

std::string ModemSim::imei() const { return "35000000000000" + std::to_string(slot_); }
std::string ModemSim::imsi() const { return "00101000000000" + std::to_string(slot_); }
std::string ModemSim::iccid() const { return "8900100000000000000" + std::to_string(slot_); }

void ModemSim::reset() {
    textCmd_ = TextNone;
    textAddress_.clear();
    textBody_.clear();
}

std::string ModemSim::frame(const std::string &text) const { return "\r\n" + text + "\r\n"; }

std::string ModemSim::errorText(int cmeCode) const {
    if (cmeCode < 0) return frame("ERROR");
    if (cmeCode >= 300) return frame("+CMS ERROR: " + std::to_string(cmeCode));
    if (cmee_ == 1) return frame("+CME ERROR: " + std::to_string(cmeCode));
    if (cmee_ == 2) return frame(std::string("+CME ERROR: ") + cmeText(cmeCode));
    return frame("ERROR");
}

bool ModemSim::handle(const std::string &request, std::string *answer) {
    std::string data = request;
    if (!data.empty() && data.back() == '\0') data.pop_back();

    if (textCmd_ != TextNone) {
        size_t sub = data.find(kCtrlZ);
        size_t esc = data.find(kEsc);
        if (esc != std::string::npos && (sub == std::string::npos || esc < sub)) {
            reset();
            *answer = frame("OK");
            return true;
        }
        if (sub == std::string::npos) {
            textBody_ += data;
            *answer = "\r\n> ";
            return true;
        }
        textBody_ += data.substr(0, sub);
        TextCmd cmd = textCmd_;
        std::string address = textAddress_, body = textBody_;
        reset();
        *answer = finishText(cmd, address, body, cmgf_ == 0);
        return true;
    }

    std::string line = data;
    while (!line.empty() && (line.back() == '\r' || line.back() == '\n')) line.pop_back();
    std::string out = echo_ ? line + "\r" : std::string();
    *answer = out + runLine(line);
    return true;
}

std::string ModemSim::finishText(TextCmd cmd, const std::string &address, const std::string &body, bool pdu) {
    std::string b = body;
    while (!b.empty() && (b.back() == '\r' || b.back() == '\n')) b.pop_back();
    switch (cmd) {
    case TextCmgs:
        return frame("+CMGS: " + std::to_string(++messageRef_)) + frame("OK");
    case TextCmgc:
        return frame("+CMGC: " + std::to_string(++messageRef_)) + frame("OK");
    case TextCmgw: {
        if (static_cast<int>(store_.size()) >= kStoreSize) return errorText(322);  // memory full
        StoredSms sms{nextIndex_++, address, b, pdu};
        store_.push_back(sms);
        return frame("+CMGW: " + std::to_string(sms.index)) + frame("OK");
    }
    case TextCnma:
    case TextNone:
        break;
    }
    return frame("OK");
}

std::string ModemSim::runLine(const std::string &line) {
    if (line.size() < 2 || std::toupper(static_cast<unsigned char>(line[0])) != 'A' ||
        std::toupper(static_cast<unsigned char>(line[1])) != 'T') {
        return errorText(-1);
    }
    std::string info;
    size_t i = 2;
    while (i < line.size()) {
        char c = line[i];
        std::string cmd;
        if (c == '+' || c == '%' || c == '^' || c == '$' || c == '*' || c == '#') {
            // Extended command: up to a ';' outside quotes.
            bool quoted = false;
            size_t j = i;
            for (; j < line.size(); j++) {
                if (line[j] == '"') quoted = !quoted;
                if (line[j] == ';' && !quoted) break;
            }
            cmd = line.substr(i, j - i);
            i = j < line.size() ? j + 1 : j;
        } else if (c == ';' || c == ' ') {
            i++;
            continue;
        } else {
            // Basic command: [&]letter, then digits, or S-register access.
            size_t j = i;
            if (line[j] == '&') j++;
            if (j < line.size()) j++;
            if (std::toupper(static_cast<unsigned char>(line[i])) == 'S') {
                while (j < line.size() && (std::isdigit(static_cast<unsigned char>(line[j])))) j++;
                if (j < line.size() && line[j] == '?') {
                    j++;
                } else if (j < line.size() && line[j] == '=') {
                    j++;
                    while (j < line.size() && std::isdigit(static_cast<unsigned char>(line[j]))) j++;
                }
            } else {
                while (j < line.size() && std::isdigit(static_cast<unsigned char>(line[j]))) j++;
            }
            cmd = line.substr(i, j - i);
            i = j;
            if (runBasic(cmd, &info) != 0) return info + errorText(cmee_ ? 4 : -1);
            continue;
        }
        int code = -1;
        bool startsText = false;
        if (runCommand(cmd, &info, &code, &startsText) != 0) return info + errorText(code);
        if (startsText) return info + "\r\n> ";
    }
    return info + frame("OK");
}

int ModemSim::runBasic(const std::string &cmd, std::string *info) {
    std::string u = upper(cmd);
    char letter = u[0];
    int value = u.size() > 1 && std::isdigit(static_cast<unsigned char>(u[1])) ? std::atoi(u.c_str() + 1) : 0;
    if (letter == '&') {
        if (u == "&F" || u == "&F0" || u == "&W" || u == "&W0") {
            if (u[1] == 'F') {
                echo_ = false;
                verbose_ = true;
                cmee_ = 0;
                cmgf_ = 0;
            }
            return 0;
        }
        return -1;
    }
    switch (letter) {
    case 'E':
        if (value > 1) return -1;
        echo_ = value == 1;
        return 0;
    case 'V':
        // The HAL channel keeps verbose result codes whatever the host chose:
        // turning them into digits is the daemon's job on the host side.
        if (value > 1) return -1;
        verbose_ = value == 1;
        return 0;
    case 'Q':
        return value > 1 ? -1 : 0;
    case 'Z':
        echo_ = false;
        verbose_ = true;
        cmee_ = 0;
        reset();
        return 0;
    case 'I':
        *info += frame("TOLK-SIM\r\nTSM-100\r\nRevision: TSM-100 V1.0." + std::to_string(slot_));
        return 0;
    case 'S':
        if (!u.empty() && u.back() == '?') *info += frame("000");
        return 0;
    case 'L':
    case 'M':
    case 'X':
    case 'H':
        return 0;
    default:
        return -1;
    }
}

int ModemSim::runCommand(const std::string &cmd, std::string *info, int *cme, bool *startsText) {
    Parsed p = parseExtended(cmd);
    const std::string &n = p.name;
    std::vector<std::string> args = p.form == Parsed::Set ? splitParams(p.params) : std::vector<std::string>();
    *cme = 50;
    auto line = [&](const std::string &text) { *info += frame(text); };

    if (n == "+CGMI" || n == "+GMI") {
        if (p.form == Parsed::Test) return 0;
        if (p.form != Parsed::Exec) return -1;
        line("TOLK-SIM");
        return 0;
    }
    if (n == "+CGMM" || n == "+GMM") {
        if (p.form == Parsed::Test) return 0;
        if (p.form != Parsed::Exec) return -1;
        line("TSM-100");
        return 0;
    }
    if (n == "+CGMR" || n == "+GMR") {
        if (p.form == Parsed::Test) return 0;
        if (p.form != Parsed::Exec) return -1;
        line("TSM-100 V1.0." + std::to_string(slot_));
        return 0;
    }
    if (n == "+CGSN" || n == "+GSN") {
        if (p.form == Parsed::Test) return 0;
        if (p.form == Parsed::Read) return -1;
        line(imei());
        return 0;
    }
    if (n == "+CIMI") {
        if (p.form == Parsed::Test) return 0;
        if (p.form != Parsed::Exec) return -1;
        line(imsi());
        return 0;
    }
    if (n == "+CCID" || n == "+ICCID") {
        if (p.form == Parsed::Test) return 0;
        line(n.substr(0) + ": " + iccid());
        return 0;
    }
    if (n == "+GCAP") {
        line("+GCAP: +CGSM");
        return 0;
    }
    if (n == "+CPIN") {
        if (p.form == Parsed::Read) line("+CPIN: READY");
        if (p.form == Parsed::Exec) return -1;
        if (p.form == Parsed::Set && unquote(args[0]).empty()) return -1;
        return 0;
    }
    if (n == "+CSQ") {
        if (p.form == Parsed::Test) line("+CSQ: (0-31,99),(0-7,99)");
        else if (p.form == Parsed::Exec) line("+CSQ: 20,99");
        else return -1;
        return 0;
    }
    if (n == "+CREG") {
        if (p.form == Parsed::Read) line("+CREG: " + std::to_string(creg_) + ",1");
        else if (p.form == Parsed::Test) line("+CREG: (0-2)");
        else if (p.form == Parsed::Set) return intParam(args[0], 0, 2, &creg_) ? 0 : -1;
        else creg_ = 0;
        return 0;
    }
    if (n == "+COPS") {
        if (p.form == Parsed::Read) line("+COPS: 0,0,\"TOLK SIM\",7");
        else if (p.form == Parsed::Test) line("+COPS: (2,\"TOLK SIM\",\"TOLK\",\"00101\",7),,(0-4),(0-2)");
        else if (p.form == Parsed::Set) {
            int mode;
            return intParam(args[0], 0, 4, &mode) ? 0 : -1;
        }
        return 0;
    }
    if (n == "+CMEE") {
        if (p.form == Parsed::Read) line("+CMEE: " + std::to_string(cmee_));
        else if (p.form == Parsed::Test) line("+CMEE: (0-2)");
        else if (p.form == Parsed::Set) return intParam(args[0], 0, 2, &cmee_) ? 0 : -1;
        else cmee_ = 0;
        return 0;
    }
    if (n == "+CSCS") {
        if (p.form == Parsed::Read) line("+CSCS: \"" + cscs_ + "\"");
        else if (p.form == Parsed::Test) line("+CSCS: (\"IRA\",\"GSM\",\"UCS2\")");
        else if (p.form == Parsed::Set) {
            std::string set = upper(unquote(args[0]));
            if (set != "IRA" && set != "GSM" && set != "UCS2") return -1;
            cscs_ = set;
        }
        return 0;
    }
    if (n == "+CMGF") {
        if (p.form == Parsed::Read) line("+CMGF: " + std::to_string(cmgf_));
        else if (p.form == Parsed::Test) line("+CMGF: (0,1)");
        else if (p.form == Parsed::Set) return intParam(args[0], 0, 1, &cmgf_) ? 0 : -1;
        else cmgf_ = 0;
        return 0;
    }
    if (n == "+CPMS") {
        std::string used = std::to_string(store_.size()) + "," + std::to_string(kStoreSize);
        if (p.form == Parsed::Read)
            line("+CPMS: \"SM\"," + used + ",\"SM\"," + used + ",\"SM\"," + used);
        else if (p.form == Parsed::Test)
            line("+CPMS: (\"SM\"),(\"SM\"),(\"SM\")");
        else if (p.form == Parsed::Set) {
            for (const std::string &a : args)
                if (upper(unquote(a)) != "SM") {
                    *cme = 302;  // operation not allowed
                    return -1;
                }
            line("+CPMS: " + used + "," + used + "," + used);
        } else {
            return -1;
        }
        return 0;
    }
    if (n == "+CMGL") {
        if (p.form == Parsed::Test) {
            line(cmgf_ ? "+CMGL: (\"REC UNREAD\",\"REC READ\",\"STO UNSENT\",\"STO SENT\",\"ALL\")"
                       : "+CMGL: (0-4)");
            return 0;
        }
        if (p.form == Parsed::Read) return -1;
        for (const StoredSms &s : store_) {
            if (s.pdu)
                line("+CMGL: " + std::to_string(s.index) + ",2,," + s.address + "\r\n" + s.body);
            else
                line("+CMGL: " + std::to_string(s.index) + ",\"STO UNSENT\",\"" + s.address + "\",,\r\n" + s.body);
        }
        return 0;
    }
    if (n == "+CMGR" || n == "+CMGD") {
        if (p.form == Parsed::Test) return 0;
        int index;
        if (p.form != Parsed::Set || !intParam(args[0], 0, 9999, &index)) return -1;
        auto it = std::find_if(store_.begin(), store_.end(), [&](const StoredSms &s) { return s.index == index; });
        if (n == "+CMGD") {
            if (it != store_.end()) store_.erase(it);
            return 0;
        }
        if (it == store_.end()) {
            *cme = 321;  // invalid memory index
            return -1;
        }
        if (it->pdu)
            line("+CMGR: 2,," + it->address + "\r\n" + it->body);
        else
            line("+CMGR: \"STO UNSENT\",\"" + it->address + "\",\r\n" + it->body);
        return 0;
    }
    if (n == "+CMGS" || n == "+CMGW" || n == "+CMGC" || n == "+CNMA") {
        if (p.form == Parsed::Test) return 0;
        if (p.form == Parsed::Read) return -1;
        if (n == "+CNMA" && p.form == Parsed::Exec) return 0;  // plain acknowledgement
        if ((n == "+CMGS" || n == "+CMGC") && p.form == Parsed::Exec) return -1;
        textCmd_ = n == "+CMGS" ? TextCmgs : n == "+CMGW" ? TextCmgw : n == "+CMGC" ? TextCmgc : TextCnma;
        textAddress_ = args.empty() ? std::string() : unquote(args[0]);
        textBody_.clear();
        *startsText = true;
        return 0;
    }
    if (n == "+EMGS" || n == "+EMGW" || n == "+EMGC" || n == "+ENMA") {
        // One-line form of the SMS commands: the text is the last, quoted parameter.
        if (p.form != Parsed::Set || args.size() < 2) return -1;
        std::string body = unquote(args.back());
        TextCmd cmd = n == "+EMGS" ? TextCmgs : n == "+EMGW" ? TextCmgw : n == "+EMGC" ? TextCmgc : TextCnma;
        // With text mode the first parameter is the address; in PDU mode it is the
        // PDU length, which is what a listing shows too.
        bool pdu = args.size() == 2 && cmgf_ == 0;
        std::string done = finishText(cmd, unquote(args[0]), body, pdu);
        if (done.compare(0, 6, "\r\n+CMS") == 0) {
            *cme = std::atoi(done.c_str() + 13);
            return -1;
        }
        // finishText framed the final OK too; keep only the information part here.
        size_t ok = done.rfind(frame("OK"));
        *info += done.substr(0, ok);
        return 0;
    }
    *cme = 4;
    return -1;
}

}  // namespace tolksim
