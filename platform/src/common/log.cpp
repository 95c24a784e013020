// The Android log on the host: logcat "threadtime" lines written to a file or stderr.
//
// The filter is checked before anything else, because debug lines are frequent
// and normally filtered out: a suppressed line costs two comparisons. Callers come
// from the main thread and from radio HAL callback threads alike; the filter is
// read once and never changes, the destination sits behind one mutex, and every
// written line ends in a single write() per destination, which keeps lines whole.
#include <android/log.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>

#include <ctype.h>
#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <pthread.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/syscall.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <mutex>
#include <string>
#include <vector>

namespace {

constexpr size_t kMaxMessage = 8192;  // longer messages are cut
constexpr size_t kMaxOutput = 16384;  // all lines of one message, headers included
constexpr int kDefaultLevel = ANDROID_LOG_INFO;

struct TagRule {
    std::string tag;
    int level;
};

// The filter of ANDROID_LOG_TAGS, read once: a process sets its log filter before
// it starts (init, or tolk-sim for the daemon), never while it runs.
struct Filter {
    int defaultLevel = kDefaultLevel;
    std::vector<TagRule> rules;
    int lowest = kDefaultLevel;  // below this level no tag is written
};

struct LogState {
    // Recursive: a signal handler that logs while this thread is inside a write
    // (SIGPIPE from a stderr pipe whose reader is gone) must not deadlock.
    std::recursive_mutex mutex;
    int fd = -1;            // the file destination; -1 for stderr
    std::string destPath;   // what fd was opened for ("" = stderr)
};

LogState &state() {
    static LogState *s = new LogState;  // never destroyed: threads may log during exit
    return *s;
}

int level_of(char c) {
    switch (tolower(static_cast<unsigned char>(c))) {
    case 'v': return ANDROID_LOG_VERBOSE;
    case 'd': return ANDROID_LOG_DEBUG;
    case 'i': return ANDROID_LOG_INFO;
    case 'w': return ANDROID_LOG_WARN;
    case 'e': return ANDROID_LOG_ERROR;
    case 'f': return ANDROID_LOG_FATAL;
    case 's': return ANDROID_LOG_SILENT;
    default: return -1;
    }
}

// logcat filter syntax: blank-separated "TAG:LEVEL" items, "*" for every other tag,
// a TAG without ":LEVEL" meaning verbose. Items with an unknown level are ignored.
Filter *parse_filter(const char *env) {
    Filter *f = new Filter;  // never destroyed: threads may log during exit
    std::string text = env != nullptr ? env : "";
    const char *p = text.c_str();
    while (*p != '\0') {
        while (*p != '\0' && isspace(static_cast<unsigned char>(*p))) p++;
        const char *start = p;
        while (*p != '\0' && !isspace(static_cast<unsigned char>(*p))) p++;
        if (p == start) break;
        std::string item(start, p);
        std::string tag = item;
        int level = ANDROID_LOG_VERBOSE;
        size_t colon = item.rfind(':');
        if (colon != std::string::npos) {
            tag = item.substr(0, colon);
            std::string lv = item.substr(colon + 1);
            level = lv.size() == 1 ? level_of(lv[0]) : -1;
            if (level < 0) continue;
        }
        if (tag.empty()) continue;
        if (tag == "*") f->defaultLevel = level;
        else f->rules.push_back({tag, level});
    }
    f->lowest = f->defaultLevel;
    for (const TagRule &r : f->rules) f->lowest = std::min(f->lowest, r.level);
    return f;
}

// The daemon calls the logger dozens of times per command, nearly all of them
// below the filter; such a call must cost a comparison, not a getenv() (a string
// compare per environment variable) and a lock. The filter never changes after
// the first call, so it is read then and only read afterwards.
const Filter &filter() {
    static const Filter *f = parse_filter(getenv("ANDROID_LOG_TAGS"));
    return *f;
}

int min_level(const Filter &f, const char *tag) {
    // The last rule for a tag wins, as when logcat applies them in order.
    for (auto it = f.rules.rbegin(); it != f.rules.rend(); ++it)
        if (strcmp(it->tag.c_str(), tag) == 0) return it->level;
    return f.defaultLevel;
}

char prio_char(int prio) {
    switch (prio) {
    case ANDROID_LOG_VERBOSE: return 'V';
    case ANDROID_LOG_DEBUG: return 'D';
    case ANDROID_LOG_INFO: return 'I';
    case ANDROID_LOG_WARN: return 'W';
    case ANDROID_LOG_ERROR: return 'E';
    case ANDROID_LOG_FATAL: return 'F';
    default: return 'I';
    }
}

// Where the lines go, set by the process's starter (tolk-sim for the daemon) and
// read once, like the filter: two getenv() calls per written line were a quarter
// of what a command cost.
struct Destination {
    const char *file;  // TOLKD_LOG, or NULL: the device root decides
    bool alsoStderr;   // TOLKD_LOG_STDERR=1
};

const Destination &configured() {
    static const Destination d = [] {
        const char *file = getenv("TOLKD_LOG");
        const char *toStderr = getenv("TOLKD_LOG_STDERR");
        Destination r;
        r.file = file != nullptr && file[0] != '\0' ? strdup(file) : nullptr;  // kept for the process
        r.alsoStderr = toStderr != nullptr && strcmp(toStderr, "1") == 0;
        return r;
    }();
    return d;
}

// Where lines go now; "" means stderr. Without TOLKD_LOG they follow the device
// root, which tests move between cases.
std::string destination() {
    const Destination &d = configured();
    if (d.file != nullptr) return d.file;
    const char *root = tolk_device_root();
    if (root != nullptr) return std::string(root) + "/log/tolkd.log";
    return "";
}

// The descriptor for dest, reopened when the destination changed; -1 means stderr.
int dest_fd(LogState &s, const std::string &dest) {
    if (s.fd >= 0 && dest == s.destPath) return s.fd;
    if (s.fd >= 0) close(s.fd);
    s.fd = -1;
    s.destPath = dest;
    if (dest.empty()) return -1;
    tolk_mkdirs_for(dest.c_str());
    // openat, not open: inside the daemon open() is redirected under the root.
    s.fd = openat(AT_FDCWD, dest.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (s.fd < 0) s.destPath.clear();
    return s.fd;
}

// The descriptor lines go to now (-1: stderr). With TOLKD_LOG set the file is
// opened once and no path is built per line.
int current_fd(LogState &s) {
    const Destination &d = configured();
    if (d.file != nullptr && s.fd >= 0 && s.destPath.size() != 0) return s.fd;
    return dest_fd(s, destination());
}

// The ids in every line's header. Each getpid()/gettid() is a system call on the
// host, two per line, while on the phone liblog reads both from libc's cache; so
// they are cached here too: the pid per process, the tid per thread, both dropped
// in a forked child, whose ids differ from its parent's.
std::atomic<pid_t> gPid{0};
thread_local pid_t tTid = 0;

void forget_ids_in_child() {
    gPid.store(0);
    tTid = 0;
}

pid_t cached_pid() {
    static std::once_flag atforkOnce;
    std::call_once(atforkOnce, [] { pthread_atfork(nullptr, nullptr, forget_ids_in_child); });
    pid_t pid = gPid.load(std::memory_order_relaxed);
    if (pid == 0) {
        pid = getpid();
        gPid.store(pid, std::memory_order_relaxed);
    }
    return pid;
}

pid_t cached_tid() {
    if (tTid == 0) tTid = static_cast<pid_t>(syscall(SYS_gettid));
    return tTid;
}

// The line header "MM-DD HH:MM:SS.mmm  PID   TID P TAG: ". Formatting it whole with
// snprintf for every line cost more than the rest of the line; the parts that
// change at most once a second (the date and time) or never (the ids) are kept
// per thread and only the milliseconds, the priority and the tag are put in.
struct HeadCache {
    time_t sec = -1;
    char stamp[32] = "";  // "MM-DD HH:MM:SS"
    size_t stampLen = 0;
    pid_t idsPid = 0, idsTid = 0;
    char ids[32] = "";    // "%5d %5ld"
    size_t idsLen = 0;
};
thread_local HeadCache tHead;

size_t put(char *dst, size_t at, size_t cap, const char *src, size_t n) {
    if (at >= cap) return at;
    if (n > cap - at) n = cap - at;
    memcpy(dst + at, src, n);
    return at + n;
}

// Writes the header into out (size bytes, NUL-terminated); its length, at most size - 1.
int format_head(char *out, size_t size, const struct timespec &ts, char prio, const char *tag) {
    HeadCache &c = tHead;
    if (c.sec != ts.tv_sec) {
        struct tm tm;
        gmtime_r(&ts.tv_sec, &tm);
        int n = snprintf(c.stamp, sizeof(c.stamp), "%02d-%02d %02d:%02d:%02d", tm.tm_mon + 1, tm.tm_mday, tm.tm_hour,
                         tm.tm_min, tm.tm_sec);
        c.stampLen = n > 0 ? static_cast<size_t>(n) < sizeof(c.stamp) ? static_cast<size_t>(n) : sizeof(c.stamp) - 1 : 0;
        c.sec = ts.tv_sec;
    }
    pid_t pid = cached_pid(), tid = cached_tid();
    if (c.idsPid != pid || c.idsTid != tid) {
        int n = snprintf(c.ids, sizeof(c.ids), "%5d %5ld", static_cast<int>(pid), static_cast<long>(tid));
        c.idsLen = n > 0 ? static_cast<size_t>(n) < sizeof(c.ids) ? static_cast<size_t>(n) : sizeof(c.ids) - 1 : 0;
        c.idsPid = pid;
        c.idsTid = tid;
    }
    long ms = ts.tv_nsec / 1000000L;
    char mid[6] = {'.', static_cast<char>('0' + ms / 100), static_cast<char>('0' + ms / 10 % 10),
                   static_cast<char>('0' + ms % 10), ' ', 0};
    char prioPart[4] = {' ', prio, ' ', 0};
    size_t cap = size - 1;
    size_t at = put(out, 0, cap, c.stamp, c.stampLen);
    at = put(out, at, cap, mid, 5);
    at = put(out, at, cap, c.ids, c.idsLen);
    at = put(out, at, cap, prioPart, 3);
    at = put(out, at, cap, tag, strlen(tag));
    at = put(out, at, cap, ": ", 2);
    out[at] = '\0';
    return static_cast<int>(at);
}

void write_all(int fd, const char *p, size_t len) {
    while (len > 0) {
        ssize_t n = write(fd, p, len);
        if (n < 0) {
            if (errno == EINTR) continue;
            return;
        }
        p += n;
        len -= static_cast<size_t>(n);
    }
}

}  // namespace

extern "C" int __android_log_print(int prio, const char *tag, const char *fmt, ...) {
    if (prio >= ANDROID_LOG_SILENT) return 0;
    if (prio < ANDROID_LOG_VERBOSE) prio = ANDROID_LOG_INFO;
    if (tag == nullptr) tag = "";
    if (fmt == nullptr) fmt = "";
    const Filter &f = filter();
    if (prio < f.lowest || prio < min_level(f, tag)) return 0;
    LogState &s = state();

    int savedErrno = errno;  // callers log errno after the fact; keep it intact
    char msg[kMaxMessage];
    va_list ap;
    va_start(ap, fmt);
    int mlen = vsnprintf(msg, sizeof(msg), fmt, ap);
    va_end(ap);
    if (mlen < 0) mlen = 0;
    size_t len = static_cast<size_t>(mlen) < sizeof(msg) ? static_cast<size_t>(mlen) : sizeof(msg) - 1;
    while (len > 0 && (msg[len - 1] == '\n' || msg[len - 1] == '\r')) len--;
    msg[len] = '\0';

    // Host clock, read directly: time() and gettimeofday() are the simulated clock.
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    char head[128];
    int hlen = format_head(head, sizeof(head), ts, prio_char(prio), tag);

    // Like logcat, every line of a multi-line message gets its own header.
    static thread_local char out[kMaxOutput];
    size_t olen = 0;
    const char *line = msg;
    for (;;) {
        const char *nl = strchr(line, '\n');
        size_t llen = nl != nullptr ? static_cast<size_t>(nl - line) : strlen(line);
        if (olen + static_cast<size_t>(hlen) + 1 >= sizeof(out)) break;
        memcpy(out + olen, head, static_cast<size_t>(hlen));
        olen += static_cast<size_t>(hlen);
        size_t room = sizeof(out) - olen - 1;
        if (llen > room) llen = room;
        memcpy(out + olen, line, llen);
        olen += llen;
        out[olen++] = '\n';
        if (nl == nullptr) break;
        line = nl + 1;
    }

    const bool alsoStderr = configured().alsoStderr;
    {
        std::lock_guard<std::recursive_mutex> lock(s.mutex);
        int fd = current_fd(s);
        if (fd >= 0) write_all(fd, out, olen);
        if (fd < 0 || alsoStderr) write_all(STDERR_FILENO, out, olen);
    }
    errno = savedErrno;
    return static_cast<int>(olen);
}
