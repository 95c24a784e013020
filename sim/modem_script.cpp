#include "modem_script.h"

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

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

void makeDirs(const std::string &path) {
    for (size_t pos = 1; pos <= path.size(); pos++) {
        if (pos == path.size() || path[pos] == '/') mkdir(path.substr(0, pos).c_str(), 0755);
    }
}

void journalLine(const std::string &path, const std::string &line) {
    size_t slash = path.rfind('/');
    if (slash != std::string::npos) makeDirs(path.substr(0, slash));
    int fd = open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (fd < 0) return;
    std::string text = line + "\n";
    sendAll(fd, text.data(), text.size());
    close(fd);
}

int listenUnix(const std::string &path, int backlog) {
    struct sockaddr_un addr;
    memset(&addr, 0, sizeof addr);
    addr.sun_family = AF_UNIX;
    if (path.size() >= sizeof addr.sun_path) {
        fprintf(stderr, "socket path too long: %s\n", path.c_str());
        return -1;
    }
    memcpy(addr.sun_path, path.c_str(), path.size());
    size_t slash = path.rfind('/');
    if (slash != std::string::npos) makeDirs(path.substr(0, slash));
    unlink(path.c_str());
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return -1;
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0 || listen(fd, backlog) != 0) {
        fprintf(stderr, "cannot listen on %s: %s\n", path.c_str(), strerror(errno));
        close(fd);
        return -1;
    }
    return fd;
}

int connectUnix(const std::string &path) {
    struct sockaddr_un addr;
    memset(&addr, 0, sizeof addr);
    addr.sun_family = AF_UNIX;
    if (path.size() >= sizeof addr.sun_path) return -1;
    memcpy(addr.sun_path, path.c_str(), path.size());
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return -1;
    if (connect(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

bool sendAll(int fd, const void *data, size_t len) {
    const char *p = static_cast<const char *>(data);
    while (len > 0) {
        ssize_t n = send(fd, p, len, MSG_NOSIGNAL);
        if (n < 0 && errno == ENOTSOCK) n = write(fd, p, len);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        p += n;
        len -= static_cast<size_t>(n);
    }
    return true;
}

long long monoMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

std::string underRoot(const std::string &root, const std::string &devicePath) {
    if (root.empty()) return devicePath;
    if (!root.empty() && root.back() == '/') return root.substr(0, root.size() - 1) + devicePath;
    return root + devicePath;
}

}  // namespace tolksim
