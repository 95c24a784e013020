#include "modem_script.h"

#include <errno.h>
#include <string.h>
#include <sys/stat.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>

namespace tolksim {

namespace {

// Consumes one leading "(word [arg])" directive; false when the text does not
// start with a known one.
bool takeDirective(std::string *text, ScriptAnswer *ans, bool *split, bool *none, std::string *err) {
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
    std::string derr;
    while (takeDirective(&text, &r.answer, &split, &none, &derr)) {
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
