#include "cit_audio_script.h"

#include <fstream>

#include "sim_text.h"

namespace peerscript {

namespace {

// These scripts know no \a escape: "\a" stands for the letter.
std::string unescape(const std::string &text) { return sim::decodeScriptEscapes(text, false); }

}  // namespace

std::string longAnswer(const std::string &head, size_t n) {
    std::string s = head.substr(0, n);
    while (s.size() < n) s.push_back(static_cast<char>('a' + s.size() % 26));
    return s;
}

int parseRule(const std::string &raw, Rule *rule, std::string *err) {
    sim::ScriptLine line;
    int kind = sim::splitScriptLine(raw, "key", true, &line, err);
    if (kind <= 0) return kind;
    Rule r;
    r.prefix = line.prefix;
    r.key = unescape(line.key);

    std::string text = line.answer;
    long longLen = -1;
    std::string inner, word, arg, rest;
    while (sim::peekDirective(text, &inner, &word, &arg, &rest)) {
        long v = 0;
        if (word == "none" && arg.empty()) r.answer.none = true;
        else if (word == "close" && arg.empty()) r.answer.close = true;
        else if (word == "delay" && sim::parseBoundedNumber(arg, 600000, &v)) r.answer.delayMs = static_cast<int>(v);
        else if (word == "long" && sim::parseBoundedNumber(arg, 1 << 20, &v)) longLen = v;
        else if (word == "delay" || word == "long") {
            *err = "bad number in (" + inner + ")";
            return -1;
        } else break;  // not a directive: the answer text itself begins with '('
        text = rest;
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
        bool hit = rule.prefix ? sim::startsWithNoCase(key, rule.key) : sim::equalsNoCase(key, rule.key);
        if (hit) {
            *out = rule.answer;
            return true;
        }
    }
    return false;
}

}  // namespace peerscript
