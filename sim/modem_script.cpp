#include "modem_script.h"

#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cctype>
#include <cstdio>
#include <cstring>
#include <fstream>

namespace tolksim {

namespace {

// A (long N) answer fits one frame of the wire.
const long kMaxLongAnswer = 60000;

// (long N) HEAD...TAIL: N bytes, HEAD and TAIL around filler whose byte at
// offset i is 'a' + i % 26 (without "...", the filler follows HEAD).
std::string longFrame(const std::string &text, size_t n) {
    size_t dots = text.find("...");
    std::string head = text.substr(0, dots), tail = dots == std::string::npos ? "" : text.substr(dots + 3);
    std::string out = head.substr(0, n);
    while (out.size() + tail.size() < n) out.push_back(static_cast<char>('a' + out.size() % 26));
    return (out + tail).substr(0, n);
}

// Consumes one leading "(word [arg])" directive; false when the text does not
// start with a known one.
bool takeDirective(std::string *text, ScriptAnswer *ans, bool *split, bool *none, long *longLen, std::string *err) {
    std::string inner, word, arg, rest;
    if (!sim::peekDirective(*text, &inner, &word, &arg, &rest)) return false;
    if (word == "none" && arg.empty()) {
        *none = true;
    } else if (word == "split" && arg.empty()) {
        *split = true;
    } else if (word == "hold" && arg.empty()) {
        ans->hold = true;
    } else if (word == "close" && arg.empty()) {
        ans->close = true;
    } else if (word == "long") {
        if (!sim::parseBoundedNumber(arg, kMaxLongAnswer, longLen)) {
            *err = "bad length in (" + inner + ")";
            return false;
        }
    } else if (word == "delay" || word == "gap") {
        long v = 0;
        if (!sim::parseBoundedNumber(arg, 600000, &v)) {
            *err = "bad milliseconds in (" + inner + ")";
            return false;
        }
        (word == "delay" ? ans->delayMs : ans->gapMs) = static_cast<int>(v);
    } else {
        return false;
    }
    *text = rest;
    return true;
}

}  // namespace

std::string matchKey(const std::string &request) {
    std::string s = sim::stripRequestEnd(request);
    size_t b = 0, e = s.size();
    while (b < e && s[b] == ' ') b++;
    while (e > b && s[e - 1] == ' ') e--;
    return s.substr(b, e - b);
}

int parseScriptLine(const std::string &raw, ScriptRule *rule, std::string *err) {
    sim::ScriptLine line;
    int kind = sim::splitScriptLine(raw, "command", false, &line, err);
    if (kind <= 0) return kind;
    ScriptRule r;
    r.prefix = line.prefix;
    r.key = matchKey(cUnescape(line.key));
    std::string text = line.answer;
    bool split = false, none = false;
    long longLen = -1;
    std::string derr;
    while (takeDirective(&text, &r.answer, &split, &none, &longLen, &derr)) {
    }
    if (!derr.empty()) {
        *err = derr;
        return -1;
    }
    if (!none) {
        if (split) {
            size_t pos = 0;
            while (true) {
                size_t bar = text.find("||", pos);
                std::string part =
                    sim::trimBlanks(text.substr(pos, bar == std::string::npos ? std::string::npos : bar - pos));
                r.answer.frames.push_back(cUnescape(part));
                if (bar == std::string::npos) break;
                pos = bar + 2;
            }
        } else if (longLen >= 0) {
            r.answer.frames.push_back(longFrame(cUnescape(text), static_cast<size_t>(longLen)));
        } else {
            r.answer.frames.push_back(cUnescape(text));
        }
    }
    *rule = std::move(r);
    return 1;
}

void ScriptFile::refresh() {
    struct stat st;
    if (stat(path_.c_str(), &st) != 0) {
        present_ = false;
        rules_.clear();
        return;
    }
    if (present_ && st.st_mtim.tv_sec == mtime_.tv_sec && st.st_mtim.tv_nsec == mtime_.tv_nsec &&
        st.st_size == size_) {
        return;
    }
    present_ = true;
    mtime_ = st.st_mtim;
    size_ = st.st_size;
    rules_.clear();
    std::ifstream in(path_);
    std::string line;
    int number = 0;
    while (std::getline(in, line)) {
        number++;
        ScriptRule rule;
        std::string err;
        int r = parseScriptLine(line, &rule, &err);
        if (r > 0) {
            rules_.push_back(std::move(rule));
        } else if (r < 0) {
            fprintf(stderr, "%s:%d: ignored: %s\n", path_.c_str(), number, err.c_str());
        }
    }
}

bool ScriptFile::lookup(const std::string &request, ScriptAnswer *out) {
    refresh();
    if (!present_) return false;
    std::string key = matchKey(request);
    for (const ScriptRule &r : rules_) {
        bool hit = r.prefix ? sim::startsWithNoCase(key, r.key) : sim::equalsNoCase(key, r.key);
        if (hit) {
            *out = r.answer;
            return true;
        }
    }
    return false;
}

std::vector<AnswerStep> answerSteps(const ScriptAnswer &answer, long long now) {
    std::vector<AnswerStep> steps;
    if (answer.close) {
        steps.push_back(AnswerStep{now + answer.delayMs, answer.hold, true, ""});
        return steps;
    }
    for (size_t i = 0; i < answer.frames.size(); i++) {
        steps.push_back(AnswerStep{now + answer.delayMs + static_cast<long long>(i) * answer.gapMs, answer.hold,
                                   false, answer.frames[i]});
    }
    return steps;
}

bool takeReleaseFile(const std::string &path) {
    if (access(path.c_str(), F_OK) != 0) return false;
    unlink(path.c_str());
    return true;
}

namespace {

const char kMmiMark[] = "+ORVTOLKJ";
// An MMI answer is a modem answer with a short prefix; one that grows past this
// without its ";" is not going to get one.
const size_t kMaxKeptAnswer = 64 * 1024;

// Whether a framework command begins at i: the daemon upper-cases the name, and
// every one starts with "AT+" or "AT%".
bool commandStartsAt(const std::string &s, size_t i) {
    return s.compare(i, 3, "AT+") == 0 || s.compare(i, 3, "AT%") == 0;
}

void splitCommands(const std::string &text, std::vector<std::string> *out) {
    size_t start = 0;
    bool quoted = false;
    for (size_t i = 0; i < text.size(); i++) {
        if (text[i] == '"') quoted = !quoted;
        if (!quoted && i > start && commandStartsAt(text, i)) {
            out->push_back(text.substr(start, i - start));
            start = i;
        }
    }
    if (start < text.size()) out->push_back(text.substr(start));
}

// Where the stored text in front of the mark at mark begins: the "AT" of the
// command name, behind the operation mark. from when it cannot be found.
size_t mmiStart(const std::string &s, size_t from, size_t mark) {
    size_t j = mark;
    if (j >= from + 2 && s.compare(j - 2, 2, "=?") == 0) j -= 2;
    else if (j > from && (s[j - 1] == '=' || s[j - 1] == '?')) j--;
    while (j > from && std::isalnum(static_cast<unsigned char>(s[j - 1]))) j--;
    if (j > from && std::strchr("+%^$*#&", s[j - 1])) j--;
    if (j >= from + 2 && s.compare(j - 2, 2, "AT") == 0) return j - 2;
    return from;
}

// The ";" that ends an MMI answer whose text goes on at from, or npos.
size_t mmiEnd(const std::string &s, size_t from) {
    for (size_t i = s.find(';', from); i != std::string::npos; i = s.find(';', i + 1)) {
        if (i + 1 == s.size() || commandStartsAt(s, i + 1)) return i;
    }
    return std::string::npos;
}

}  // namespace

std::vector<std::string> GenericSplitter::feed(const std::string &bytes) {
    std::string buf = pending_ + bytes;
    pending_.clear();
    std::vector<std::string> out;
    size_t pos = 0;
    while (pos < buf.size()) {
        size_t mark = buf.find(kMmiMark, pos);
        if (mark == std::string::npos) {
            splitCommands(buf.substr(pos), &out);
            break;
        }
        size_t start = mmiStart(buf, pos, mark);
        if (start > pos) splitCommands(buf.substr(pos, start - pos), &out);
        size_t end = mmiEnd(buf, mark + strlen(kMmiMark));
        if (end == std::string::npos) {
            pending_ = buf.substr(start);
            if (pending_.size() > kMaxKeptAnswer) out.push_back(flush());
            break;
        }
        out.push_back(buf.substr(start, end + 1 - start));
        pos = end + 1;
    }
    return out;
}

std::string GenericSplitter::flush() {
    std::string kept;
    kept.swap(pending_);
    return kept;
}

int listenUnix(const std::string &path, int backlog) {
    if (!sim::fitsSocketPath(path)) {
        fprintf(stderr, "socket path too long: %s\n", path.c_str());
        return -1;
    }
    size_t slash = path.rfind('/');
    if (slash != std::string::npos) sim::makeDirs(path.substr(0, slash));
    int fd = sim::bindUnix(path, backlog);
    if (fd < 0) fprintf(stderr, "cannot listen on %s: %s\n", path.c_str(), strerror(errno));
    return fd;
}

std::string underRoot(const std::string &root, const std::string &devicePath) {
    if (root.empty()) return devicePath;
    if (!root.empty() && root.back() == '/') return root.substr(0, root.size() - 1) + devicePath;
    return root + devicePath;
}

}  // namespace tolksim
