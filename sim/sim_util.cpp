#include "sim_util.h"

#include <errno.h>
#include <fcntl.h>
#include <ftw.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>
#include <fstream>
#include <sstream>

#include <tolk_platform/file_util.h>

namespace sim {

const std::vector<std::string> &peerNames() {
    static const std::vector<std::string> names = {"radio", "generic", "audio", "cit"};
    return names;
}

bool isPeerName(const std::string &name) {
    for (const auto &n : peerNames())
        if (n == name) return true;
    return false;
}

std::string absolutePath(const std::string &path) {
    if (!path.empty() && path[0] == '/') return path;
    char cwd[4096];
    if (!getcwd(cwd, sizeof cwd)) return path;
    std::string base(cwd);
    if (path.empty() || path == ".") return base;
    std::string rel = path;
    if (rel.compare(0, 2, "./") == 0) rel = rel.substr(2);
    return base + "/" + rel;
}

bool makeDirs(const std::string &path, mode_t mode) {
    if (path.empty()) return false;
    std::string cur;
    size_t pos = 0;
    while (pos != std::string::npos) {
        size_t next = path.find('/', pos + 1);
        cur = path.substr(0, next);
        if (!cur.empty() && mkdir(cur.c_str(), mode) != 0 && errno != EEXIST) return false;
        pos = next;
    }
    struct stat st;
    return stat(path.c_str(), &st) == 0 && S_ISDIR(st.st_mode);
}

bool writeFile(const std::string &path, const std::string &content) {
    // Replace atomically: a reader (the daemon, a test) never sees half a file.
    std::string tmp = path + ".tmp." + std::to_string(getpid());
    int fd = open(tmp.c_str(), O_WRONLY | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (fd < 0) return false;
    size_t done = 0;
    while (done < content.size()) {
        ssize_t n = write(fd, content.data() + done, content.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            close(fd);
            unlink(tmp.c_str());
            return false;
        }
        done += static_cast<size_t>(n);
    }
    close(fd);
    if (rename(tmp.c_str(), path.c_str()) != 0) {
        unlink(tmp.c_str());
        return false;
    }
    return true;
}

bool readFile(const std::string &path, std::string *content) {
    std::ifstream in(path, std::ios::binary);
    if (!in) return false;
    std::ostringstream ss;
    ss << in.rdbuf();
    *content = ss.str();
    return true;
}

std::string readFileOr(const std::string &path, const std::string &fallback) {
    std::string s;
    return readFile(path, &s) ? s : fallback;
}

bool fileExists(const std::string &path) {
    struct stat st;
    return lstat(path.c_str(), &st) == 0;
}

static int removeEntry(const char *path, const struct stat *, int, struct FTW *) { return remove(path); }

bool removeTree(const std::string &path) {
    nftw(path.c_str(), removeEntry, 16, FTW_DEPTH | FTW_PHYS);
    return !fileExists(path);
}

std::string tailLines(const std::string &path, int n) {
    std::string s;
    if (!readFile(path, &s) || s.empty()) return "";
    size_t end = s.size();
    if (s[end - 1] == '\n') end--;
    size_t pos = end;
    int lines = 0;
    while (pos > 0) {
        if (s[pos - 1] == '\n' && ++lines == n) break;
        pos--;
    }
    return s.substr(pos);
}

void journalLine(const std::string &path, const std::string &line) {
    std::string text = line + "\n";
    tolk_append_file(path.c_str(), text.data(), text.size());
}

bool fitsSocketPath(const std::string &path) {
    return path.size() < sizeof(((struct sockaddr_un *)nullptr)->sun_path);
}

static bool unixAddress(const std::string &path, struct sockaddr_un *addr) {
    memset(addr, 0, sizeof *addr);
    addr->sun_family = AF_UNIX;
    if (!fitsSocketPath(path)) {
        errno = ENAMETOOLONG;
        return false;
    }
    memcpy(addr->sun_path, path.c_str(), path.size());
    return true;
}

int bindUnix(const std::string &path, int backlog, bool cloexec) {
    struct sockaddr_un addr;
    if (!unixAddress(path, &addr)) return -1;
    int fd = socket(AF_UNIX, SOCK_STREAM | (cloexec ? SOCK_CLOEXEC : 0), 0);
    if (fd < 0) return -1;
    unlink(path.c_str());
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0 ||
        (backlog >= 0 && listen(fd, backlog) != 0)) {
        int e = errno;
        close(fd);
        errno = e;
        return -1;
    }
    return fd;
}

int connectUnix(const std::string &path, int socketFlags) {
    struct sockaddr_un addr;
    if (!unixAddress(path, &addr)) return -1;
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC | socketFlags, 0);
    if (fd < 0) return -1;
    if (connect(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof addr) != 0) {
        int e = errno;
        close(fd);
        errno = e;
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

int openRawTty(const std::string &path, int flags) {
    int fd = open(path.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC | flags);
    if (fd < 0) return -1;
    struct termios t;
    if (tcgetattr(fd, &t) == 0) {
        cfmakeraw(&t);
        tcsetattr(fd, TCSANOW, &t);
    }
    tcflush(fd, TCIFLUSH);
    return fd;
}

static volatile sig_atomic_t gStopRequested = 0;

static void onStopSignal(int) { gStopRequested = 1; }

void watchStopSignals() {
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = onStopSignal;
    sigaction(SIGTERM, &sa, nullptr);
    sigaction(SIGINT, &sa, nullptr);
    signal(SIGPIPE, SIG_IGN);
}

bool stopRequested() { return gStopRequested != 0; }

bool processBelongsToRoot(pid_t pid, const std::string &root) {
    if (pid <= 1) return false;
    std::string env;
    if (!readFile("/proc/" + std::to_string(pid) + "/environ", &env)) return false;
    std::string want = "TOLKD_ROOT=" + root;
    size_t pos = 0;
    while (pos < env.size()) {
        size_t end = env.find('\0', pos);
        if (end == std::string::npos) end = env.size();
        if (env.compare(pos, end - pos, want) == 0) {
            // A zombie keeps no environment; treat it as gone.
            std::string stat = readFileOr("/proc/" + std::to_string(pid) + "/stat");
            size_t close = stat.rfind(')');
            return !(close != std::string::npos && close + 2 < stat.size() && stat[close + 2] == 'Z');
        }
        pos = end + 1;
    }
    return false;
}

pid_t readPidFile(const std::string &path) {
    std::string s = readFileOr(path);
    return static_cast<pid_t>(atol(s.c_str()));
}

bool controlRequest(const std::string &root, const std::string &command, std::string *answer,
                    int timeoutMs) {
    int fd = connectUnix(RootLayout{root}.ctlSocket());
    if (fd < 0) return false;
    std::string line = command + "\n";
    if (write(fd, line.data(), line.size()) != static_cast<ssize_t>(line.size())) {
        close(fd);
        return false;
    }
    answer->clear();
    long long deadline = nowMs() + timeoutMs;
    char buf[4096];
    for (;;) {
        long long left = deadline - nowMs();
        if (left <= 0) break;
        struct pollfd p = {fd, POLLIN, 0};
        int r = poll(&p, 1, static_cast<int>(left));
        if (r < 0 && errno == EINTR) continue;
        if (r <= 0) break;
        ssize_t n = read(fd, buf, sizeof buf);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            close(fd);
            return !answer->empty();
        }
        answer->append(buf, static_cast<size_t>(n));
    }
    close(fd);
    return false;
}

long long nowMs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000 + ts.tv_nsec / 1000000;
}

void sleepMs(int ms) {
    struct timespec ts = {ms / 1000, (ms % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

}  // namespace sim
