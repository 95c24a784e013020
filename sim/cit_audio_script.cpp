#include "cit_audio_script.h"

#include <errno.h>
#include <fcntl.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include <cctype>
#include <fstream>

#include <tolk_platform/file_util.h>

namespace peerscript {

namespace {

int hexValue(char c) {
    if (c >= '0' && c <= '9') return c - '0';
    if (c >= 'a' && c <= 'f') return c - 'a' + 10;
    if (c >= 'A' && c <= 'F') return c - 'A' + 10;
    return -1;
}

std::string trim(const std::string &s) {
    size_t b = 0, e = s.size();
    while (b < e && (s[b] == ' ' || s[b] == '\t')) b++;
    while (e > b && (s[e - 1] == ' ' || s[e - 1] == '\t' || s[e - 1] == '\r' || s[e - 1] == '\n')) e--;
    return s.substr(b, e - b);
}

bool sameNoCase(const std::string &a, const std::string &b) {
    if (a.size() != b.size()) return false;
    for (size_t i = 0; i < a.size(); i++) {
        if (std::tolower(static_cast<unsigned char>(a[i])) != std::tolower(static_cast<unsigned char>(b[i])))
            return false;
    }
    return true;
}

bool parseMs(const std::string &arg, long max, long *out) {
    if (arg.empty()) return false;
    char *end = nullptr;
    long v = strtol(arg.c_str(), &end, 10);
    if (*end != '\0' || v < 0 || v > max) return false;
    *out = v;
    return true;
}

}  // namespace

std::string unescape(const std::string &text) {
    std::string out;
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
        case 'e': out += '\x1b'; break;
        case 'x': {
            int v = 0, digits = 0;
            while (digits < 2 && i + 1 < text.size() && hexValue(text[i + 1]) >= 0) {
                v = v * 16 + hexValue(text[++i]);
                digits++;
            }
            if (digits == 0) out += "\\x";
            else out += static_cast<char>(v);
            break;
        }
        default: out += n; break;
        }
    }
    return out;
}

std::string visible(const std::string &bytes) {
    static const char hex[] = "0123456789abcdef";
    std::string out;
    for (unsigned char c : bytes) {
        if (c == '\\') out += "\\\\";
        else if (c == '\r') out += "\\r";
        else if (c == '\n') out += "\\n";
        else if (c == '\t') out += "\\t";
        else if (c < 0x20 || c >= 0x7f) {
            out += "\\x";
            out += hex[c >> 4];
            out += hex[c & 15];
        } else out += static_cast<char>(c);
    }
    return out;
}

std::string longAnswer(const std::string &head, size_t n) {
    std::string s = head.substr(0, n);
    while (s.size() < n) s.push_back(static_cast<char>('a' + s.size() % 26));
    return s;
}

int parseRule(const std::string &raw, Rule *rule, std::string *err) {
    std::string line = trim(raw);
    if (line.empty() || line[0] == '#') return 0;
    size_t arrow = line.find("=>");
    if (arrow == std::string::npos) {
        *err = "no \"=>\" in line";
        return -1;
    }
    Rule r;
    std::string key = trim(line.substr(0, arrow));
    if (key.empty()) {
        *err = "empty key";
        return -1;
    }
    if (key.back() == '*' && (key.size() < 2 || key[key.size() - 2] != '\\')) {
        r.prefix = true;
        key.pop_back();
    }
    r.key = unescape(key);

    std::string text = trim(line.substr(arrow + 2));
    long longLen = -1;
    while (!text.empty() && text[0] == '(') {
        size_t close = text.find(')');
        if (close == std::string::npos) break;
        std::string inner = trim(text.substr(1, close - 1));
        std::string word = inner.substr(0, inner.find(' '));
        std::string arg = inner.size() > word.size() ? trim(inner.substr(word.size())) : std::string();
        long v = 0;
        if (word == "none" && arg.empty()) r.answer.none = true;
        else if (word == "close" && arg.empty()) r.answer.close = true;
        else if (word == "delay" && parseMs(arg, 600000, &v)) r.answer.delayMs = static_cast<int>(v);
        else if (word == "long" && parseMs(arg, 1 << 20, &v)) longLen = v;
        else if (word == "delay" || word == "long") {
            *err = "bad number in (" + inner + ")";
            return -1;
        } else break;  // not a directive: the answer text itself begins with '('
        text = trim(text.substr(close + 1));
    }
    r.answer.bytes = unescape(text);
    if (longLen >= 0) r.answer.bytes = longAnswer(r.answer.bytes, static_cast<size_t>(longLen));
    *rule = std::move(r);
    return 1;
}

bool Script::lookup(const std::string &key, Answer *out) const {
    std::ifstream in(path_);
    if (!in) return false;
    std::string line;
    while (std::getline(in, line)) {
        Rule rule;
        std::string err;
        if (parseRule(line, &rule, &err) != 1) continue;
        bool hit = rule.prefix ? key.size() >= rule.key.size() && sameNoCase(key.substr(0, rule.key.size()), rule.key)
                               : sameNoCase(key, rule.key);
        if (hit) {
            *out = rule.answer;
            return true;
        }
    }
    return false;
}

void journal(const std::string &path, const std::string &line) {
    std::string text = line + "\n";
    tolk_append_file(path.c_str(), text.data(), text.size());
}

bool sendAll(int fd, const std::string &bytes) {
    size_t off = 0;
    while (off < bytes.size()) {
        ssize_t n = send(fd, bytes.data() + off, bytes.size() - off, MSG_NOSIGNAL);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        off += static_cast<size_t>(n);
    }
    return true;
}

void sleepMs(int ms) {
    if (ms <= 0) return;
    struct timespec ts = {ms / 1000, (ms % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

}  // namespace peerscript
