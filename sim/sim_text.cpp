#include "sim_text.h"

#include <stdlib.h>

#include <cctype>
#include <cstdio>

namespace sim {

int hexDigitValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

std::string trimBlanks(const std::string &s) {
    size_t b = 0, e = s.size();
    while (b < e && (s[b] == ' ' || s[b] == '\t')) b++;
    while (e > b && (s[e - 1] == ' ' || s[e - 1] == '\t' || s[e - 1] == '\r' || s[e - 1] == '\n')) e--;
    return s.substr(b, e - b);
}

static bool sameCharNoCase(char a, char b) {
    return std::toupper(static_cast<unsigned char>(a)) == std::toupper(static_cast<unsigned char>(b));
}

bool equalsNoCase(const std::string &a, const std::string &b) {
    return a.size() == b.size() && startsWithNoCase(a, b);
}

bool startsWithNoCase(const std::string &s, const std::string &prefix) {
    if (s.size() < prefix.size()) return false;
    for (size_t i = 0; i < prefix.size(); i++) {
        if (!sameCharNoCase(s[i], prefix[i])) return false;
    }
    return true;
}

bool decodeEscapes(const std::string &in, std::string *out, std::string *err) {
    out->clear();
    for (size_t i = 0; i < in.size(); i++) {
        char c = in[i];
        if (c != '\\') {
            out->push_back(c);
            continue;
        }
        if (++i >= in.size()) {
            *err = "a lone backslash at the end of \"" + in + "\"";
            return false;
        }
        switch (in[i]) {
        case 'r': out->push_back('\r'); break;
        case 'n': out->push_back('\n'); break;
        case 't': out->push_back('\t'); break;
        case 'b': out->push_back('\b'); break;
        case 'e': out->push_back('\x1b'); break;
        case '0': out->push_back('\0'); break;
        case '\\': out->push_back('\\'); break;
        case 'x': {
            int hi = i + 1 < in.size() ? hexDigitValue(in[i + 1]) : -1;
            int lo = i + 2 < in.size() ? hexDigitValue(in[i + 2]) : -1;
            if (hi < 0 || lo < 0) {
                *err = "\\x needs two hex digits in \"" + in + "\"";
                return false;
            }
            out->push_back(static_cast<char>(hi * 16 + lo));
            i += 2;
            break;
        }
        default:
            *err = std::string("unknown escape \\") + in[i] + " in \"" + in + "\"";
            return false;
        }
    }
    return true;
}

std::string decodeScriptEscapes(const std::string &text, bool withBell) {
    std::string out;
    out.reserve(text.size());
    for (size_t i = 0; i < text.size(); i++) {
        char c = text[i];
        if (c != '\\' || i + 1 >= text.size()) {
            out += c;
            continue;
        }
        char n = text[++i];
        switch (n) {
        case 'r': out += '\r'; break;
        case 'n': out += '\n'; break;
        case 't': out += '\t'; break;
        case '0': out += '\0'; break;
        case 'a': out += withBell ? '\a' : 'a'; break;
        case 'e': out += '\x1b'; break;
        case 'x': {
            int v = 0, digits = 0;
            while (digits < 2 && i + 1 < text.size() && hexDigitValue(text[i + 1]) >= 0) {
                v = v * 16 + hexDigitValue(text[++i]);
                digits++;
            }
            if (digits == 0) {
                out += "\\x";
            } else {
                out += static_cast<char>(v);
            }
            break;
        }
        default: out += n; break;  // \\ \" \' and anything unknown
        }
    }
    return out;
}

std::string visibleBytes(const std::string &bytes) {
    static const char hex[] = "0123456789abcdef";
    std::string out;
    for (unsigned char c : bytes) {
        if (c == '\\') {
            out += "\\\\";
        } else if (c == '\r') {
            out += "\\r";
        } else if (c == '\n') {
            out += "\\n";
        } else if (c == '\t') {
            out += "\\t";
        } else if (c < 0x20 || c >= 0x7f) {
            out += "\\x";
            out += hex[c >> 4];
            out += hex[c & 15];
        } else {
            out += static_cast<char>(c);
        }
    }
    return out;
}

std::string stripRequestEnd(const std::string &request) {
    std::string s = request;
    if (!s.empty() && s.back() == '\0') s.pop_back();
    while (!s.empty() && (s.back() == '\r' || s.back() == '\n')) s.pop_back();
    return s;
}

int splitScriptLine(const std::string &raw, const char *keyName, bool loneStarIsPrefix, ScriptLine *out,
                    std::string *err) {
    std::string line = trimBlanks(raw);
    if (line.empty() || line[0] == '#') return 0;
    size_t arrow = line.find("=>");
    if (arrow == std::string::npos) {
        *err = "no \"=>\" in line";
        return -1;
    }
    ScriptLine s;
    s.key = trimBlanks(line.substr(0, arrow));
    if (s.key.empty()) {
        *err = std::string("empty ") + keyName;
        return -1;
    }
    size_t n = s.key.size();
    if (s.key.back() == '*' && (n < 2 ? loneStarIsPrefix : s.key[n - 2] != '\\')) {
        s.prefix = true;
        s.key.pop_back();
    }
    s.answer = trimBlanks(line.substr(arrow + 2));
    *out = std::move(s);
    return 1;
}

bool peekDirective(const std::string &text, std::string *inner, std::string *word, std::string *arg,
                   std::string *rest) {
    if (text.empty() || text[0] != '(') return false;
    size_t close = text.find(')');
    if (close == std::string::npos) return false;
    *inner = trimBlanks(text.substr(1, close - 1));
    *word = inner->substr(0, inner->find(' '));
    *arg = inner->size() > word->size() ? trimBlanks(inner->substr(word->size())) : std::string();
    *rest = trimBlanks(text.substr(close + 1));
    return true;
}

bool parseBoundedNumber(const std::string &arg, long max, long *out) {
    if (arg.empty()) return false;
    char *end = nullptr;
    long v = strtol(arg.c_str(), &end, 10);
    if (*end != '\0' || v < 0 || v > max) return false;
    *out = v;
    return true;
}

}  // namespace sim
