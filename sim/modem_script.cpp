#include "modem_script.h"

#include <errno.h>
#include <fcntl.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

#include <cctype>
#include <fstream>

namespace tolksim {

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

bool equalNoCase(const std::string &a, const std::string &b, size_t n) {
    if (a.size() < n || b.size() < n) return false;
    for (size_t i = 0; i < n; i++) {
        if (std::toupper(static_cast<unsigned char>(a[i])) != std::toupper(static_cast<unsigned char>(b[i])))
            return false;
    }
    return true;
}

// Consumes one leading "(word [arg])" directive; false when the text does not
// start with a known one.
bool takeDirective(std::string *text, ScriptAnswer *ans, bool *split, bool *none, std::string *err) {
    if (text->empty() || (*text)[0] != '(') return false;
    size_t close = text->find(')');
    if (close == std::string::npos) return false;
    std::string inner = trim(text->substr(1, close - 1));
    std::string word = inner.substr(0, inner.find(' '));
    std::string arg = inner.size() > word.size() ? trim(inner.substr(word.size())) : std::string();
    if (word == "none" && arg.empty()) {
        *none = true;
    } else if (word == "split" && arg.empty()) {
        *split = true;
    } else if (word == "hold" && arg.empty()) {
        ans->hold = true;
    } else if (word == "close" && arg.empty()) {
        ans->close = true;
    } else if (word == "delay" || word == "gap") {
        char *end = nullptr;
        long v = strtol(arg.c_str(), &end, 10);
        if (arg.empty() || *end != '\0' || v < 0 || v > 600000) {
            *err = "bad milliseconds in (" + inner + ")";
            return false;
        }
        (word == "delay" ? ans->delayMs : ans->gapMs) = static_cast<int>(v);
    } else {
        return false;
    }
    *text = trim(text->substr(close + 1));
    return true;
}

}  // namespace

std::string cUnescape(const std::string &text) {
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
        case 'a': out += '\a'; break;
        case 'e': out += '\x1b'; break;
        case 'x': {
            int v = 0, digits = 0;
            while (digits < 2 && i + 1 < text.size() && hexValue(text[i + 1]) >= 0) {
                v = v * 16 + hexValue(text[++i]);
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

std::string matchKey(const std::string &request) {
    std::string s = request;
    if (!s.empty() && s.back() == '\0') s.pop_back();
    while (!s.empty() && (s.back() == '\r' || s.back() == '\n')) s.pop_back();
    size_t b = 0, e = s.size();
    while (b < e && s[b] == ' ') b++;
    while (e > b && s[e - 1] == ' ') e--;
    return s.substr(b, e - b);
}

int parseScriptLine(const std::string &raw, ScriptRule *rule, std::string *err) {
    std::string line = trim(raw);
    if (line.empty() || line[0] == '#') return 0;
    size_t arrow = line.find("=>");
    if (arrow == std::string::npos) {
        *err = "no \"=>\" in line";
        return -1;
    }
    std::string key = trim(line.substr(0, arrow));
    std::string text = trim(line.substr(arrow + 2));
    if (key.empty()) {
        *err = "empty command";
        return -1;
    }
    ScriptRule r;
    if (key.size() > 1 && key.back() == '*' && key[key.size() - 2] != '\\') {
        r.prefix = true;
        key.pop_back();
    }
    r.key = matchKey(cUnescape(key));
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
                std::string part = trim(text.substr(pos, bar == std::string::npos ? std::string::npos : bar - pos));
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
        bool hit = r.prefix ? equalNoCase(key, r.key, r.key.size())
                            : key.size() == r.key.size() && equalNoCase(key, r.key, key.size());
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
