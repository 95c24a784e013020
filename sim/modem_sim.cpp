#include "modem_sim.h"

#include <algorithm>
#include <cctype>
#include <cstdlib>

#include "sim_text.h"

namespace tolksim {

namespace {

const char kCtrlZ = '\x1a';
const char kEsc = '\x1b';
const int kStoreSize = 20;
// The longest TPDU a message can have (an SMS-SUBMIT with the full user data and
// the longest address and validity period).
const int kMaxTpduOctets = 176;

// 27.007 +CME ERROR codes used here.
const int kCmeNotAllowed = 3;
const int kCmeNotSupported = 4;
const int kCmeBadParameters = 50;
// 27.005 +CMS ERROR codes used here.
const int kCmsBadPduParameter = 304;
const int kCmsBadTextParameter = 305;
const int kCmsBadIndex = 321;
const int kCmsMemoryFull = 322;

// The merged one-line forms of the SMS commands that take text: the text is the
// last parameter, quoted, and the line ends with CR LF like the text would.
const char *const kMergedNames[] = {"+EMGS", "+EMGW", "+EMGC", "+ENMA"};

std::string upper(std::string s) {
    for (char &c : s) c = static_cast<char>(std::toupper(static_cast<unsigned char>(c)));
    return s;
}

bool isDigit(char c) { return std::isdigit(static_cast<unsigned char>(c)) != 0; }

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
        if (!isDigit(c)) return false;
    int v = std::atoi(t.c_str());
    if (v < lo || v > hi) return false;
    *out = v;
    return true;
}

// An optional numeric parameter: absent or empty is fine.
bool optIntParam(const std::vector<std::string> &args, size_t i, int lo, int hi, int *out) {
    if (i >= args.size() || unquote(args[i]).empty()) return true;
    return intParam(args[i], lo, hi, out);
}

bool isMergedName(const std::string &line) {
    for (const char *name : kMergedNames)
        if (sim::startsWithNoCase(line, std::string("AT") + name + "=")) return true;
    return false;
}

// The command name of an extended command and what follows it.
struct Parsed {
    std::string name;  // "+CSQ", upper case
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
        p.form = Parsed::Set;  // malformed tail: no command of that name exists
        p.params = rest;
        p.name += "#";
    }
    return p;
}

const char *cmeText(int code) {
    switch (code) {
    case kCmeNotAllowed: return "operation not allowed";
    case kCmeNotSupported: return "operation not supported";
    case kCmeBadParameters: return "Incorrect parameters";
    default: return "unknown";
    }
}

int sregDefault(int reg) {
    switch (reg) {
    case 3: return '\r';
    case 4: return '\n';
    case 5: return '\b';
    case 6: return 2;
    case 7: return 50;
    case 8: return 2;
    case 10: return 14;
    default: return 0;
    }
}
const int kLastSreg = 12;

std::string threeDigits(int v) {
    std::string s = std::to_string(v);
    return std::string(s.size() < 3 ? 3 - s.size() : 0, '0') + s;
}

}  // namespace

namespace {

// Whole octets in hex digits, at least one.
bool isHex(const std::string &hex) {
    if (hex.empty() || hex.size() % 2 != 0) return false;
    for (char c : hex)
        if (sim::hexDigitValue(c) < 0) return false;
    return true;
}

}  // namespace

bool validPdu(const std::string &text, int length) {
    std::string hex;
    for (char c : text)
        if (c != '\r' && c != '\n') hex += c;
    if (!isHex(hex)) return false;
    int octets = static_cast<int>(hex.size() / 2);
    int smscLength = sim::hexDigitValue(hex[0]) * 16 + sim::hexDigitValue(hex[1]);
    return length >= 1 && octets == 1 + smscLength + length;
}

ModemSim::ModemSim(int slot) : slot_(slot) { factoryDefaults(); }

std::string ModemSim::imei() const { return "35000000000000" + std::to_string(slot_); }
std::string ModemSim::imsi() const { return "00101000000000" + std::to_string(slot_); }
std::string ModemSim::iccid() const { return "8900100000000000000" + std::to_string(slot_); }

void ModemSim::reset() {
    textCmd_ = TextNone;
    textAddress_.clear();
    textBody_.clear();
}

void ModemSim::factoryDefaults() {
    echo_ = false;
    cmee_ = 0;
    creg_ = 0;
    cgreg_ = 0;
    cmgf_ = 0;
    csms_ = 0;
    copsFormat_ = 0;
    cscs_ = "IRA";
    sregs_.clear();
    for (int r = 0; r <= kLastSreg; r++) sregs_[r] = sregDefault(r);
    std::fill(std::begin(cnmi_), std::end(cnmi_), 0);
}

std::string ModemSim::frame(const std::string &text) const { return "\r\n" + text + "\r\n"; }

std::string ModemSim::resultText(const Result &r) const {
    switch (r.kind) {
    case Result::Ok: return frame("OK");
    case Result::StartsText: return "\r\n> ";
    case Result::CmsError: return frame("+CMS ERROR: " + std::to_string(r.code));
    case Result::CmeError:
        if (cmee_ == 1) return frame("+CME ERROR: " + std::to_string(r.code));
        if (cmee_ == 2) return frame(std::string("+CME ERROR: ") + cmeText(r.code));
        return frame("ERROR");
    case Result::Error: break;
    }
    return frame("ERROR");
}

std::string ModemSim::requestFault(const std::string &request) const {
    if (request.empty() || request.back() != '\0') return "no NUL at the end";
    std::string body = request.substr(0, request.size() - 1);
    if (body.find('\0') != std::string::npos) return "NUL inside the request";
    // Text lines are passed on as the host typed them, line end included.
    if (inTextPhase()) return "";
    if (isMergedName(body)) {
        // The text closes with a quote and the CR LF that ended it; a quote that
        // opens it must come before.
        const std::string end = "\"\r\n";
        if (body.size() < end.size() || body.compare(body.size() - end.size(), end.size(), end) != 0)
            return "merged SMS line without its closing quote and CR LF";
        size_t open = body.find('"');
        if (open >= body.size() - end.size()) return "merged SMS line without a quoted text";
        return "";
    }
    if (body.find_first_of("\r\n") != std::string::npos) return "line end inside a command line";
    return "";
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
        bool pdu = textPdu_;
        reset();
        std::string info;
        Result r = finishText(cmd, address, body, pdu, &info);
        *answer = info + resultText(r);
        return true;
    }

    std::string echo = echo_ ? data + "\r" : std::string();
    const std::string textEnd = "\"\r\n";
    if (isMergedName(data) && data.size() > textEnd.size() &&
        data.compare(data.size() - textEnd.size(), textEnd.size(), textEnd) == 0) {
        std::string line = data.substr(0, data.size() - 2);  // the CR LF that ended the text
        size_t eq = line.find('=');
        std::string info;
        Result r = runMerged(upper(line.substr(2, eq - 2)), line.substr(eq + 1), &info);
        *answer = echo + info + resultText(r);
        return true;
    }
    *answer = echo + runLine(data);
    return true;
}

ModemSim::Result ModemSim::smsParamError() const {
    return Result{Result::CmsError, cmgf_ == 1 ? kCmsBadTextParameter : kCmsBadPduParameter};
}

ModemSim::Result ModemSim::finishText(TextCmd cmd, const std::string &address, const std::string &body, bool pdu,
                                      std::string *info) {
    std::string b = body;
    while (!b.empty() && (b.back() == '\r' || b.back() == '\n')) b.pop_back();
    if (pdu && cmd != TextCnma && !validPdu(b, std::atoi(address.c_str())))
        return Result{Result::CmsError, kCmsBadPduParameter};
    switch (cmd) {
    case TextCmgs:
        *info += frame("+CMGS: " + std::to_string(++messageRef_));
        break;
    case TextCmgc:
        *info += frame("+CMGC: " + std::to_string(++messageRef_));
        break;
    case TextCmgw: {
        if (static_cast<int>(store_.size()) >= kStoreSize) return Result{Result::CmsError, kCmsMemoryFull};
        StoredSms sms{nextIndex_++, address, b, pdu};
        store_.push_back(sms);
        *info += frame("+CMGW: " + std::to_string(sms.index));
        break;
    }
    case TextCnma:
    case TextNone:
        break;
    }
    return Result{};
}

ModemSim::Result ModemSim::runMerged(const std::string &name, const std::string &params, std::string *info) {
    TextCmd cmd = name == "+EMGS" ? TextCmgs : name == "+EMGW" ? TextCmgw : name == "+EMGC" ? TextCmgc : TextCnma;
    bool pdu = cmgf_ == 0;
    // The parameters in front of the text: the length in PDU mode (the
    // acknowledgement's <n> for +ENMA), the address and its type in text mode.
    size_t headCount = pdu ? 1 : 2;
    std::vector<std::string> head;
    size_t i = 0;
    while (head.size() < headCount) {
        size_t start = i;
        if (i < params.size() && params[i] == '"') {
            size_t close = params.find('"', i + 1);
            if (close == std::string::npos) return smsParamError();
            i = close + 1;
        }
        while (i < params.size() && params[i] != ',' && params[i] != '"') i++;
        if (i >= params.size() || params[i] != ',') return smsParamError();
        head.push_back(params.substr(start, i - start));
        i++;
    }
    std::string quoted = params.substr(i);
    if (quoted.size() < 2 || quoted.front() != '"' || quoted.back() != '"') return smsParamError();
    std::string text = quoted.substr(1, quoted.size() - 2);
    int number = 0;
    if (pdu) {
        if (cmd == TextCnma) {
            if (!intParam(head[0], 0, 2, &number) || !isHex(text)) return smsParamError();
            return Result{};
        }
        if (!intParam(head[0], 1, kMaxTpduOctets, &number)) return smsParamError();
        return finishText(cmd, std::to_string(number), text, true, info);
    }
    if (cmd == TextCnma) return smsParamError();  // text mode acknowledges without text
    if (unquote(head[0]).empty() || !optIntParam(head, 1, 0, 255, &number)) return smsParamError();
    return finishText(cmd, unquote(head[0]), text, false, info);
}

std::string ModemSim::runLine(const std::string &line) {
    if (line.size() < 2 || std::toupper(static_cast<unsigned char>(line[0])) != 'A' ||
        std::toupper(static_cast<unsigned char>(line[1])) != 'T') {
        return resultText(Result{Result::Error, 0});
    }
    std::string info;
    size_t i = 2;
    while (i < line.size()) {
        char c = line[i];
        std::string cmd;
        Result r;
        if (c == '+' || c == '%' || c == '^' || c == '$' || c == '*' || c == '#') {
            // Extended command: up to a ';' outside quotes.
            bool quoted = false;
            size_t j = i;
            for (; j < line.size(); j++) {
                if (line[j] == '"') quoted = !quoted;
                if (line[j] == ';' && !quoted) break;
            }
            cmd = line.substr(i, j - i);
            // V.250 allows blanks between commands; the tail of a parameter list
            // keeps none.
            while (!cmd.empty() && cmd.back() == ' ') cmd.pop_back();
            i = j < line.size() ? j + 1 : j;
            r = runExtended(cmd, &info);
        } else if (c == ';' || c == ' ') {
            i++;
            continue;
        } else {
            // Basic command: [&]letter and a number, or an S-register access.
            size_t j = i;
            if (line[j] == '&') j++;
            if (j < line.size()) j++;
            if (std::toupper(static_cast<unsigned char>(line[j - 1])) == 'S' && line[i] != '&') {
                while (j < line.size() && isDigit(line[j])) j++;
                if (j < line.size() && line[j] == '?') {
                    j++;
                } else if (j < line.size() && line[j] == '=') {
                    j++;
                    while (j < line.size() && isDigit(line[j])) j++;
                }
            } else {
                while (j < line.size() && isDigit(line[j])) j++;
            }
            cmd = line.substr(i, j - i);
            i = j;
            r = runBasic(cmd, &info);
        }
        if (r.kind == Result::StartsText) return info + resultText(r);
        if (r.kind != Result::Ok) return info + resultText(r);
    }
    return info + frame("OK");
}

ModemSim::Result ModemSim::runBasic(const std::string &cmd, std::string *info) {
    const Result ok{}, bad{Result::CmeError, kCmeBadParameters}, unknown{Result::CmeError, kCmeNotSupported};
    std::string u = upper(cmd);
    bool amp = u[0] == '&';
    std::string name = u.substr(0, amp ? 2 : 1);
    std::string arg = u.substr(name.size());
    int value = 0;
    bool numeric = arg.empty() || std::all_of(arg.begin(), arg.end(), isDigit);
    if (numeric && !arg.empty()) value = arg.size() > 3 ? 1000 : std::atoi(arg.c_str());
    auto upTo = [&](int max) { return numeric && value <= max; };

    if (name == "S") {
        // S<n>? reads a register, S<n>=<v> sets it (0..255).
        size_t k = 0;
        while (k < arg.size() && isDigit(arg[k])) k++;
        if (k == 0 || k > 2) return unknown;
        int reg = std::atoi(arg.substr(0, k).c_str());
        if (reg > kLastSreg) return unknown;
        std::string rest = arg.substr(k);
        if (rest == "?") {
            *info += frame(threeDigits(sregs_[reg]));
            return ok;
        }
        int v = 0;
        if (rest.size() < 2 || rest[0] != '=' || !intParam(rest.substr(1), 0, 255, &v)) return bad;
        sregs_[reg] = v;
        return ok;
    }
    if (name == "&F") {
        if (!upTo(0)) return bad;
        factoryDefaults();
        return ok;
    }
    if (name == "&W") return upTo(0) ? ok : bad;
    if (name == "&C") return upTo(1) ? ok : bad;  // DCD follows the carrier, or stays on
    if (name == "&D") return upTo(2) ? ok : bad;  // what dropping DTR does
    if (amp) return unknown;
    switch (name[0]) {
    case 'E':
        if (!upTo(1)) return bad;
        echo_ = value == 1;
        return ok;
    case 'V':
    case 'Q':
        // The HAL channel keeps verbose result codes whatever the host chose:
        // turning them into digits (or nothing) is the daemon's job on the host side.
        return upTo(1) ? ok : bad;
    case 'Z':
        if (!upTo(0)) return bad;
        factoryDefaults();
        reset();
        return ok;
    case 'I':
        if (!upTo(0)) return bad;
        *info += frame("TOLK-SIM\r\nTSM-100\r\nRevision: TSM-100 V1.0." + std::to_string(slot_));
        return ok;
    case 'L':
        return upTo(3) ? ok : bad;
    case 'M':
        return upTo(2) ? ok : bad;
    case 'X':
        return upTo(4) ? ok : bad;
    case 'H':
        return upTo(0) ? ok : bad;  // on hook: there is no call to end
    default:
        return unknown;
    }
}

ModemSim::Result ModemSim::openText(const std::string &n, int form, const std::vector<std::string> &args) {
    const bool pdu = cmgf_ == 0;
    TextCmd cmd = n == "+CMGS" ? TextCmgs : n == "+CMGW" ? TextCmgw : n == "+CMGC" ? TextCmgc : TextCnma;
    int length = 0, number = 0;
    if (cmd == TextCnma) {
        // An acknowledgement carries a PDU only in PDU mode and only with a length.
        if (form == Parsed::Exec) return Result{};
        if (!pdu || args.size() > 2 || !intParam(args[0], 0, 2, &number) || !optIntParam(args, 1, 0, kMaxTpduOctets, &length))
            return smsParamError();
        if (length == 0) return Result{};
    } else if (pdu) {
        // <length>[,<stat>] for a written message, <length> alone otherwise.
        size_t most = cmd == TextCmgw ? 2 : 1;
        if (form != Parsed::Set || args.size() > most || !intParam(args[0], 1, kMaxTpduOctets, &length) ||
            !optIntParam(args, 1, 0, 3, &number))
            return smsParamError();
    } else if (cmd == TextCmgs) {
        // "<da>"[,<toda>]: a message needs somewhere to go.
        if (form != Parsed::Set || args.size() > 2 || unquote(args[0]).empty() || !optIntParam(args, 1, 0, 255, &number))
            return smsParamError();
    } else if (cmd == TextCmgc) {
        // <fo>,<ct>[,<pid>[,<mn>[,<da>[,<toda>]]]]
        if (form != Parsed::Set || args.size() > 6 || !intParam(args[0], 0, 255, &number)) return smsParamError();
    } else if (form == Parsed::Set && args.size() > 3) {  // +CMGW[=<oa/da>[,<tooa/toda>[,<stat>]]]
        return smsParamError();
    }
    textCmd_ = cmd;
    textPdu_ = pdu;
    textAddress_ = pdu ? std::to_string(length) : (cmd == TextCmgc || args.empty() ? std::string() : unquote(args[0]));
    textBody_.clear();
    return Result{Result::StartsText, 0};
}

ModemSim::Result ModemSim::runExtended(const std::string &cmd, std::string *info) {
    Parsed p = parseExtended(cmd);
    const std::string &n = p.name;
    std::vector<std::string> args = p.form == Parsed::Set ? splitParams(p.params) : std::vector<std::string>();
    const Result ok{}, bad{Result::CmeError, kCmeBadParameters};
    const bool exec = p.form == Parsed::Exec, read = p.form == Parsed::Read, test = p.form == Parsed::Test,
               set = p.form == Parsed::Set;
    auto line = [&](const std::string &text) { *info += frame(text); };
    // A command that only reports something: its action form answers, its test
    // form is accepted, anything else is a parameter error.
    auto report = [&](const std::string &text) {
        if (test) return ok;
        if (!exec) return bad;
        line(text);
        return ok;
    };

    if (n == "+CGMI" || n == "+GMI") return report("TOLK-SIM");
    if (n == "+CGMM" || n == "+GMM") return report("TSM-100");
    if (n == "+CGMR" || n == "+GMR") return report("TSM-100 V1.0." + std::to_string(slot_));
    if (n == "+CGSN" || n == "+GSN") return report(imei());
    if (n == "+CIMI") return report(imsi());
    if (n == "+CCID" || n == "+ICCID") return report(n + ": " + iccid());
    if (n == "+GCAP") return report("+GCAP: +CGSM,+FCLASS");
    if (n == "+CBC") return report("+CBC: 0,80");  // powered by the battery, 80 %
    if (n == "+CHUP") return test || exec ? ok : bad;  // no call to hang up
    if (n == "+CPIN") {
        if (read) line("+CPIN: READY");
        if (exec || (set && unquote(args[0]).empty())) return bad;
        return ok;
    }
    if (n == "+CSQ") {
        if (test) line("+CSQ: (0-31,99),(0-7,99)");
        else if (exec) line("+CSQ: 20,99");
        else return bad;
        return ok;
    }
    if (n == "+CREG" || n == "+CGREG") {
        int &mode = n == "+CREG" ? creg_ : cgreg_;
        if (read) {
            // Registered at home; with <n>=2 the cell too.
            line(n + ": " + std::to_string(mode) + ",1" + (mode == 2 ? ",\"0001\",\"00000101\",7" : ""));
        } else if (test) {
            line(n + ": (0-2)");
        } else if (set) {
            return args.size() == 1 && intParam(args[0], 0, 2, &mode) ? ok : bad;
        } else {
            mode = 0;
        }
        return ok;
    }
    if (n == "+CGATT") {
        // Attached to the packet service; detaching is not simulated.
        int state = 0;
        if (read) line("+CGATT: 1");
        else if (test) line("+CGATT: (0,1)");
        else if (set) return args.size() == 1 && intParam(args[0], 1, 1, &state) ? ok : Result{Result::CmeError, kCmeNotAllowed};
        else return bad;
        return ok;
    }
    if (n == "+COPS") {
        static const char *const kNames[] = {"\"TOLK SIM\"", "\"TOLK\"", "\"00101\""};
        if (read) {
            line("+COPS: 0," + std::to_string(copsFormat_) + "," + kNames[copsFormat_] + ",7");
        } else if (test) {
            line("+COPS: (2,\"TOLK SIM\",\"TOLK\",\"00101\",7),,(0-4),(0-2)");
        } else if (set) {
            int mode = 0, format = copsFormat_;
            if (args.size() > 4 || !intParam(args[0], 0, 4, &mode) || !optIntParam(args, 1, 0, 2, &format))
                return bad;
            if (mode == 1 || mode == 4) {
                // Manual selection names the one network there is.
                if (args.size() < 3 || (unquote(args[2]) != "00101" && unquote(args[2]) != "TOLK SIM" &&
                                        unquote(args[2]) != "TOLK"))
                    return Result{Result::CmeError, kCmeNotAllowed};
            }
            copsFormat_ = format;
        } else {
            return bad;
        }
        return ok;
    }
    if (n == "+CFUN") {
        if (read) line("+CFUN: " + std::to_string(cfun_));
        else if (test) line("+CFUN: (0,1,4),(0,1)");
        else if (set) {
            int fun = 0, rst = 0;
            if (args.size() > 2 || !intParam(args[0], 0, 4, &fun) || fun == 2 || fun == 3 ||
                !optIntParam(args, 1, 0, 1, &rst))
                return bad;
            cfun_ = fun;
        } else {
            return bad;
        }
        return ok;
    }
    if (n == "+CMEE") {
        if (read) line("+CMEE: " + std::to_string(cmee_));
        else if (test) line("+CMEE: (0-2)");
        else if (set) return args.size() == 1 && intParam(args[0], 0, 2, &cmee_) ? ok : bad;
        else cmee_ = 0;
        return ok;
    }
    if (n == "+CSCS") {
        if (read) line("+CSCS: \"" + cscs_ + "\"");
        else if (test) line("+CSCS: (\"IRA\",\"GSM\",\"UCS2\")");
        else if (set) {
            std::string charset = upper(unquote(args[0]));
            if (args.size() != 1 || (charset != "IRA" && charset != "GSM" && charset != "UCS2")) return bad;
            cscs_ = charset;
        } else {
            return bad;
        }
        return ok;
    }
    if (n == "+FCLASS") {
        // Data only: no fax or voice class.
        if (read) line("0");
        else if (test) line("(0)");
        else if (set) {
            int cls = 0;
            return args.size() == 1 && intParam(args[0], 0, 0, &cls) ? ok : bad;
        } else {
            return bad;
        }
        return ok;
    }

    // SMS commands (27.005): their failures are +CMS ERROR, whatever +CMEE says;
    // a form the command does not have is a syntax error, a plain ERROR.
    const Result smsBad = smsParamError(), syntax{Result::Error, 0};
    if (n == "+CMGF") {
        if (read) line("+CMGF: " + std::to_string(cmgf_));
        else if (test) line("+CMGF: (0,1)");
        else if (set) return args.size() == 1 && intParam(args[0], 0, 1, &cmgf_) ? ok : smsBad;
        else cmgf_ = 0;
        return ok;
    }
    if (n == "+CSMS") {
        // Phase 2 (0) or phase 2+ (1) service; both offer every message type.
        if (read) line("+CSMS: " + std::to_string(csms_) + ",1,1,1");
        else if (test) line("+CSMS: (0,1)");
        else if (set) {
            if (args.size() != 1 || !intParam(args[0], 0, 1, &csms_)) return smsBad;
            line("+CSMS: 1,1,1");
        } else {
            return smsBad;
        }
        return ok;
    }
    if (n == "+CSCA") {
        int type = 0;
        if (read) line("+CSCA: \"" + csca_ + "\"," + (csca_[0] == '+' ? "145" : "129"));
        else if (test) return ok;
        else if (set) {
            if (args.size() > 2 || unquote(args[0]).empty() || !optIntParam(args, 1, 0, 255, &type)) return smsBad;
            csca_ = unquote(args[0]);
        } else {
            return smsBad;
        }
        return ok;
    }
    if (n == "+CNMI") {
        static const int kMax[5] = {2, 3, 2, 2, 1};
        if (read) {
            std::string s = "+CNMI: ";
            for (int k = 0; k < 5; k++) s += std::to_string(cnmi_[k]) + (k < 4 ? "," : "");
            line(s);
        } else if (test) {
            line("+CNMI: (0-2),(0-3),(0-2),(0-2),(0,1)");
        } else if (set) {
            int v[5];
            std::copy(std::begin(cnmi_), std::end(cnmi_), v);
            if (args.size() > 5) return smsBad;
            for (size_t k = 0; k < args.size(); k++)
                if (!optIntParam(args, k, 0, kMax[k], &v[k])) return smsBad;
            std::copy(v, v + 5, cnmi_);
        } else {
            return smsBad;
        }
        return ok;
    }
    if (n == "+CSMP") {
        if (read) line("+CSMP: 17,167,0,0");
        else if (test) return ok;
        else if (set) {
            int v = 0;
            if (args.size() > 4) return smsBad;
            for (size_t k = 0; k < args.size(); k++)
                if (!optIntParam(args, k, 0, 255, &v)) return smsBad;
        } else {
            return smsBad;
        }
        return ok;
    }
    if (n == "+CPMS") {
        std::string used = std::to_string(store_.size()) + "," + std::to_string(kStoreSize);
        if (read) {
            line("+CPMS: \"SM\"," + used + ",\"SM\"," + used + ",\"SM\"," + used);
        } else if (test) {
            line("+CPMS: (\"SM\"),(\"SM\"),(\"SM\")");
        } else if (set) {
            if (args.size() > 3) return smsBad;
            for (const std::string &a : args)
                if (upper(unquote(a)) != "SM") return Result{Result::CmsError, 302};  // operation not allowed
            line("+CPMS: " + used + "," + used + "," + used);
        } else {
            return smsBad;
        }
        return ok;
    }
    if (n == "+CMGL") {
        if (test) {
            line(cmgf_ ? "+CMGL: (\"REC UNREAD\",\"REC READ\",\"STO UNSENT\",\"STO SENT\",\"ALL\")"
                       : "+CMGL: (0-4)");
            return ok;
        }
        if (read) return syntax;
        for (const StoredSms &s : store_) {
            if (s.pdu)
                line("+CMGL: " + std::to_string(s.index) + ",2,," + s.address + "\r\n" + s.body);
            else
                line("+CMGL: " + std::to_string(s.index) + ",\"STO UNSENT\",\"" + s.address + "\",,\r\n" + s.body);
        }
        return ok;
    }
    if (n == "+CMGR" || n == "+CMGD") {
        if (test) return ok;
        int index;
        if (!set) return syntax;
        if (!intParam(args[0], 0, 9999, &index)) return smsBad;
        auto it = std::find_if(store_.begin(), store_.end(), [&](const StoredSms &s) { return s.index == index; });
        if (n == "+CMGD") {
            if (it != store_.end()) store_.erase(it);
            return ok;
        }
        if (it == store_.end()) return Result{Result::CmsError, kCmsBadIndex};
        if (it->pdu)
            line("+CMGR: 2,," + it->address + "\r\n" + it->body);
        else
            line("+CMGR: \"STO UNSENT\",\"" + it->address + "\",\r\n" + it->body);
        return ok;
    }
    if (n == "+CMGS" || n == "+CMGW" || n == "+CMGC" || n == "+CNMA") {
        if (test) return ok;
        if (read) return syntax;
        return openText(n, p.form, args);
    }
    for (const char *merged : kMergedNames) {
        // Only whole lines of their own, ended like their text (see handle()).
        if (n == merged) return smsBad;
    }
    return Result{Result::CmeError, kCmeNotSupported};
}

}  // namespace tolksim
