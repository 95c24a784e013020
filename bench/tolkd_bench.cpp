// tolkd-bench: what tolkd costs, each figure next to the floor it can never beat,
// measured the same way in the same run.
//
// Every group of measurements runs on a fresh simulated device (`tolk-sim up` on a
// new root, `down` and removal afterwards). The floors run on a device of their
// own, where tolk-sim starts the reference responder (tolk-bench-ref) in tolkd's
// place: same supervisor, same serial relay, same adb control socket, a program
// that only answers "\r\nOK\r\n". The modem floor sends the same request straight
// to the simulated radio service through the HAL stand-in, as tolkd's bridge does.
//
// Traffic goes only to the local sockets and pseudo-terminals of the simulated
// devices; every loop is bounded in count and in time.
#include <vendor/orvane/hardware/radio/2.0/IRadio.h>

#include <dirent.h>
#include <errno.h>
#include <fcntl.h>
#include <ftw.h>
#include <poll.h>
#include <pthread.h>
#include <sched.h>
#include <signal.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <sys/un.h>
#include <sys/wait.h>
#include <termios.h>
#include <time.h>
#include <unistd.h>

#include <algorithm>
#include <atomic>
#include <condition_variable>
#include <fstream>
#include <functional>
#include <mutex>
#include <sstream>
#include <string>
#include <thread>
#include <vector>

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::radio::V1_0::RadioIndicationType;
using android::hardware::radio::V1_0::RadioResponseInfo;
using vendor::orvane::hardware::radio::V2_0::IRadio;
using vendor::orvane::hardware::radio::V2_0::ITolkIndication;
using vendor::orvane::hardware::radio::V2_0::ITolkResponse;

namespace {

// ---------------------------------------------------------------- settings

struct Config {
    std::string sim = TOLK_SIM_BINARY;
    std::string tolkd = TOLKD_BINARY;
    std::string ref = TOLK_BENCH_REF_BINARY;
    int adbSamples = 2000;     // per adb round-trip figure
    int serialSamples = 200;   // per serial round-trip figure (each one >= 10 ms)
    int throughputPairs = 5000;
    int urcCount = 5000;
    int restCommands = 100000;
    int idleSeconds = 10;
    int startRuns = 15;
    bool quick = false;
};
Config gCfg;

// ---------------------------------------------------------------- small tools

long long nowNs() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000000000LL + ts.tv_nsec;
}

void sleepMs(int ms) {
    struct timespec ts = {ms / 1000, (ms % 1000) * 1000000L};
    while (nanosleep(&ts, &ts) != 0 && errno == EINTR) {
    }
}

std::string readFile(const std::string &path) {
    std::ifstream in(path, std::ios::binary);
    std::stringstream ss;
    ss << in.rdbuf();
    return ss.str();
}

int removeEntry(const char *path, const struct stat *, int, struct FTW *) { return remove(path); }

// Runs a program, stdout into *out (when given), stderr into *err (when given).
int runProgram(const std::vector<std::string> &args, std::string *out = nullptr, std::string *err = nullptr) {
    int po[2], pe[2];
    if (pipe2(po, O_CLOEXEC) != 0 || pipe2(pe, O_CLOEXEC) != 0) return -1;
    pid_t pid = fork();
    if (pid < 0) return -1;
    if (pid == 0) {
        dup2(po[1], 1);
        dup2(pe[1], 2);
        std::vector<char *> argv;
        for (const auto &a : args) argv.push_back(const_cast<char *>(a.c_str()));
        argv.push_back(nullptr);
        execvp(argv[0], argv.data());
        _exit(127);
    }
    close(po[1]);
    close(pe[1]);
    std::string o, e;
    struct pollfd fds[2] = {{po[0], POLLIN, 0}, {pe[0], POLLIN, 0}};
    int open = 2;
    char buf[4096];
    while (open > 0) {
        if (poll(fds, 2, -1) < 0 && errno != EINTR) break;
        for (int i = 0; i < 2; i++) {
            if (fds[i].fd < 0 || !(fds[i].revents & (POLLIN | POLLHUP))) continue;
            ssize_t n = read(fds[i].fd, buf, sizeof buf);
            if (n > 0) {
                (i == 0 ? o : e).append(buf, static_cast<size_t>(n));
            } else if (n == 0 || errno != EINTR) {
                close(fds[i].fd);
                fds[i].fd = -1;
                open--;
            }
        }
    }
    int status = 0;
    while (waitpid(pid, &status, 0) < 0 && errno == EINTR) {
    }
    if (out) *out = o;
    if (err) *err = e;
    return WIFEXITED(status) ? WEXITSTATUS(status) : 128 + WTERMSIG(status);
}

struct Stats {
    size_t n = 0;
    double median = 0, p99 = 0, mean = 0, min = 0;
};

// Microseconds from nanosecond samples.
Stats stats(std::vector<long long> v) {
    Stats s;
    if (v.empty()) return s;
    std::sort(v.begin(), v.end());
    s.n = v.size();
    s.median = v[v.size() / 2] / 1000.0;
    size_t i99 = (v.size() * 99 + 99) / 100;
    if (i99 >= v.size()) i99 = v.size() - 1;
    s.p99 = v[i99] / 1000.0;
    long long sum = 0;
    for (long long x : v) sum += x;
    s.mean = static_cast<double>(sum) / v.size() / 1000.0;
    s.min = v.front() / 1000.0;
    return s;
}

// ---------------------------------------------------------------- the device

class Device {
public:
    // `tolk-sim up` on a fresh root; the daemon is tolkd unless program says otherwise.
    Device(const std::string &what, const std::vector<std::string> &upArgs, const std::string &program = "")
        : what_(what) {
        char tmpl[] = "/tmp/tbXXXXXX";  // short: socket paths under it must fit 108 bytes
        if (!mkdtemp(tmpl)) {
            fprintf(stderr, "mkdtemp: %s\n", strerror(errno));
            return;
        }
        root_ = tmpl;
        std::vector<std::string> args = {gCfg.sim, "up", "--root", root_, "--quiet", "--tolkd",
                                         program.empty() ? gCfg.tolkd : program,
                                         "--prop", "persist.service.tolk.usermode=1"};
        args.insert(args.end(), upArgs.begin(), upArgs.end());
        std::string err;
        int rc = runProgram(args, nullptr, &err);
        if (rc != 0) {
            fprintf(stderr, "tolk-sim up failed for %s (%d): %s\n", what.c_str(), rc, err.c_str());
            return;
        }
        ok_ = true;
        pid_ = atoi(env("TOLKD_PID").c_str());
    }
    ~Device() {
        if (root_.empty()) return;
        runProgram({gCfg.sim, "down", "--root", root_});
        if (getenv("TOLK_BENCH_KEEP")) {
            fprintf(stderr, "kept device root %s (%s)\n", root_.c_str(), what_.c_str());
            return;
        }
        nftw(root_.c_str(), removeEntry, 16, FTW_DEPTH | FTW_PHYS);
    }
    Device(const Device &) = delete;
    Device &operator=(const Device &) = delete;

    bool ok() const { return ok_ && pid_ > 0; }
    pid_t pid() const { return pid_; }
    const std::string &root() const { return root_; }

    std::string env(const std::string &key) const {
        std::istringstream in(readFile(root_ + "/sim.env"));
        std::string line;
        while (std::getline(in, line)) {
            if (line.compare(0, key.size() + 1, key + "=") != 0) continue;
            std::string v = line.substr(key.size() + 1);
            if (v.size() >= 2 && v.front() == '\'' && v.back() == '\'') v = v.substr(1, v.size() - 2);
            return v;
        }
        return "";
    }

    int connectAdb() const {
        std::string path = root_ + "/dev/socket/adb_tolk_socket";
        int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        struct sockaddr_un a;
        memset(&a, 0, sizeof a);
        a.sun_family = AF_UNIX;
        snprintf(a.sun_path, sizeof a.sun_path, "%s", path.c_str());
        if (connect(fd, reinterpret_cast<struct sockaddr *>(&a), sizeof a) != 0) {
            close(fd);
            return -1;
        }
        return fd;
    }

    int openSerial() const {
        int fd = open((root_ + "/host/ttyACM0").c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
        if (fd < 0) return -1;
        struct termios t;
        if (tcgetattr(fd, &t) == 0) {
            cfmakeraw(&t);
            tcsetattr(fd, TCSANOW, &t);
        }
        tcflush(fd, TCIOFLUSH);
        return fd;
    }

private:
    std::string what_;
    std::string root_;
    bool ok_ = false;
    pid_t pid_ = -1;
};

// ---------------------------------------------------------------- one exchange

bool endsWith(const std::string &s, const char *tail) {
    size_t n = strlen(tail);
    return s.size() >= n && s.compare(s.size() - n, n, tail) == 0;
}

bool isFinal(const std::string &s) { return endsWith(s, "OK\r\n") || endsWith(s, "ERROR\r\n"); }

// Writes line and reads until the bytes received end in a final result. Returns
// the nanoseconds from just before the write to the last byte, or -1 on failure or
// after timeoutMs.
// A device that stops answering must end the exchange, not the benchmark; but a
// poll() before every read would add a system call to each sample. So reads block,
// and a watchdog thread interrupts the exchanging thread with SIGUSR1 (installed
// without SA_RESTART) once an exchange has run past its deadline.
std::atomic<long long> gExchangeDeadline{0};
pthread_t gExchanger;

void onWatchdog(int) {}

void startWatchdog() {
    struct sigaction sa;
    memset(&sa, 0, sizeof sa);
    sa.sa_handler = onWatchdog;
    sigaction(SIGUSR1, &sa, nullptr);
    gExchanger = pthread_self();
    std::thread([] {
        for (;;) {
            sleepMs(100);
            long long d = gExchangeDeadline.load();
            if (d != 0 && nowNs() > d) pthread_kill(gExchanger, SIGUSR1);
        }
    }).detach();
}

// Writes line and reads until the bytes received end in a final result. Returns
// the nanoseconds from just before the write to the last byte, or -1 on failure or
// after timeoutMs.
long long exchangeLine(int fd, const std::string &line, std::string *got = nullptr, int timeoutMs = 3000) {
    std::string in;
    char buf[4096];
    long long t0 = nowNs();
    long long deadline = t0 + timeoutMs * 1000000LL;
    gExchangeDeadline = deadline;
    long long result = -1;
    if (write(fd, line.data(), line.size()) == static_cast<ssize_t>(line.size())) {
        for (;;) {
            ssize_t n = read(fd, buf, sizeof buf);
            if (n > 0) {
                in.append(buf, static_cast<size_t>(n));
                if (isFinal(in)) {
                    result = nowNs() - t0;
                    break;
                }
                continue;
            }
            if (n < 0 && errno == EINTR && nowNs() < deadline) continue;
            break;
        }
    }
    gExchangeDeadline = 0;
    if (got) *got = in;
    return result;
}

void setNonBlocking(int fd) { fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK); }

// Samples of one command's round trip on an open link, after a few warm-up rounds.
std::vector<long long> roundTrips(int fd, const std::string &cmd, int samples, std::string *answer = nullptr) {
    std::vector<long long> v;
    for (int i = 0; i < 20; i++)
        if (exchangeLine(fd, cmd + "\r", answer) < 0) return v;
    v.reserve(static_cast<size_t>(samples));
    for (int i = 0; i < samples; i++) {
        long long t = exchangeLine(fd, cmd + "\r");
        if (t < 0) {
            fprintf(stderr, "round trip of %s failed after %d samples\n", cmd.c_str(), i);
            break;
        }
        v.push_back(t);
    }
    return v;
}

// Sequential request-answer pairs per second over count exchanges.
double pairsPerSecond(int fd, const std::string &cmd, int count) {
    for (int i = 0; i < 20; i++)
        if (exchangeLine(fd, cmd + "\r") < 0) return 0;
    long long t0 = nowNs();
    int done = 0;
    for (; done < count; done++)
        if (exchangeLine(fd, cmd + "\r") < 0) break;
    double secs = (nowNs() - t0) / 1e9;
    return secs > 0 ? done / secs : 0;
}

// ---------------------------------------------------------------- the HAL floor

struct HalClient {
    struct Response : public ITolkResponse {
        HalClient *owner;
        explicit Response(HalClient *o) : owner(o) {}
        Return<void> sendTolkResponse(const RadioResponseInfo &, const hidl_vec<uint8_t> &data) override {
            long long t = nowNs();
            std::lock_guard<std::mutex> lock(owner->mutex);
            owner->answer.append(reinterpret_cast<const char *>(data.data()), data.size());
            if (isFinal(owner->answer)) {
                owner->doneAt = t;
                owner->cv.notify_all();
            }
            return Void();
        }
    };
    struct Indication : public ITolkIndication {
        Return<void> tolkInd(RadioIndicationType, const hidl_vec<uint8_t> &) override { return Void(); }
    };

    std::mutex mutex;
    std::condition_variable cv;
    std::string answer;
    long long doneAt = 0;
    sp<IRadio> radio;
    sp<Response> response;
    sp<Indication> indication;

    bool connect(const std::string &root) {
        setenv("TOLKD_ROOT", root.c_str(), 1);
        radio = IRadio::getService("slot1", false);
        if (radio == nullptr) return false;
        response = new Response(this);
        indication = new Indication();
        radio->registerTolkCallbacks(response, indication);
        return true;
    }

    // The daemon sends the line with its NUL, as one request.
    long long exchange(const std::string &cmd) {
        std::vector<uint8_t> bytes(cmd.begin(), cmd.end());
        bytes.push_back(0);
        hidl_vec<uint8_t> req;
        req.setToExternal(bytes.data(), bytes.size());
        std::unique_lock<std::mutex> lock(mutex);
        answer.clear();
        doneAt = 0;
        long long t0 = nowNs();
        lock.unlock();
        if (!radio->sendTolkRequest(-1, req).isOk()) return -1;
        lock.lock();
        if (!cv.wait_for(lock, std::chrono::seconds(3), [this] { return doneAt != 0; })) return -1;
        return doneAt - t0;
    }
};

// ---------------------------------------------------------------- process figures

struct ProcFigures {
    long rssKb = 0;
    long privateKb = 0;  // pages no other process shares (USS)
    long pssKb = 0;      // shared pages split among their users
    long long cpuTicks = 0;     // utime + stime of all threads
    long long ctxSwitches = 0;  // voluntary + involuntary, all threads
};

long statusField(const std::string &status, const char *key) {
    size_t p = status.find(key);
    if (p == std::string::npos) return -1;
    return atol(status.c_str() + p + strlen(key));
}

ProcFigures procFigures(pid_t pid) {
    ProcFigures f;
    std::string base = "/proc/" + std::to_string(pid);
    f.rssKb = statusField(readFile(base + "/status"), "VmRSS:");
    std::string rollup = readFile(base + "/smaps_rollup");
    f.privateKb = statusField(rollup, "Private_Clean:") + statusField(rollup, "Private_Dirty:");
    f.pssKb = statusField(rollup, "\nPss:");
    std::string stat = readFile(base + "/stat");
    size_t close = stat.rfind(')');
    if (close != std::string::npos) {
        std::istringstream in(stat.substr(close + 2));
        std::string tok;
        // Fields after the name start at field 3 (state); utime is 14, stime 15.
        for (int field = 3; field <= 15 && in >> tok; field++) {
            if (field == 14 || field == 15) f.cpuTicks += atoll(tok.c_str());
        }
    }
    if (DIR *d = opendir((base + "/task").c_str())) {
        while (struct dirent *e = readdir(d)) {
            if (e->d_name[0] == '.') continue;
            std::string st = readFile(base + "/task/" + e->d_name + "/status");
            f.ctxSwitches += statusField(st, "voluntary_ctxt_switches:");
            f.ctxSwitches += statusField(st, "nonvoluntary_ctxt_switches:");
        }
        closedir(d);
    }
    return f;
}

// System calls of pid (all threads) over seconds, by strace -c; -1 when strace is
// missing or may not attach.
long straceCalls(pid_t pid, int seconds, std::string *table) {
    std::string out, err;
    int rc = runProgram({"timeout", "-s", "INT", std::to_string(seconds), "strace", "-c", "-f", "-p",
                         std::to_string(pid)},
                        &out, &err);
    if (table) *table = err;
    if (rc == 127 || err.find("attached") == std::string::npos) return -1;
    // strace prints no table at all when it saw no call.
    if (err.find("% time") == std::string::npos) return 0;
    if (table) *table = err;
    // The "total" row: "100.00  0.000000  0  N  [errors] total".
    size_t p = err.find(" total");
    if (p == std::string::npos) return 0;
    size_t lineStart = err.rfind('\n', p);
    std::istringstream in(err.substr(lineStart + 1, p - lineStart));
    std::vector<std::string> toks;
    std::string tok;
    while (in >> tok) toks.push_back(tok);
    // percent, seconds, usecs/call, calls[, errors]
    return toks.size() >= 4 ? atol(toks[3].c_str()) : 0;
}

bool inMainWait(pid_t pid) {
    std::string s = readFile("/proc/" + std::to_string(pid) + "/syscall");
    if (s.empty() || !isdigit(static_cast<unsigned char>(s[0]))) {
        std::string w = readFile("/proc/" + std::to_string(pid) + "/wchan");
        return w.find("select") != std::string::npos;
    }
    long nr = atol(s.c_str());
    return nr == SYS_select || nr == SYS_pselect6;
}

// ---------------------------------------------------------------- the table

struct Row {
    std::string what;
    std::string tolkd;
    std::string floor;
    std::string compare;
    std::string target;
    std::string verdict;
};
std::vector<Row> gRows;
std::vector<std::string> gNotes;

std::string fmt(const char *f, ...) __attribute__((format(printf, 1, 2)));
std::string fmt(const char *f, ...) {
    char buf[512];
    va_list ap;
    va_start(ap, f);
    vsnprintf(buf, sizeof buf, f, ap);
    va_end(ap);
    return buf;
}

std::string us(double v) { return v >= 1000 ? fmt("%.2f ms", v / 1000) : fmt("%.0f us", v); }

void addRatioRow(const std::string &what, const Stats &d, const Stats &f, double limit) {
    if (d.n == 0 || f.n == 0) {
        gRows.push_back({what, "failed", "", "", fmt("<= %.1fx", limit), "NOT MEASURED"});
        return;
    }
    double r = d.median / f.median;
    gRows.push_back({what + " median", us(d.median), us(f.median), fmt("%.2fx", r), fmt("<= %.1fx", limit),
                     r <= limit ? "met" : "MISSED"});
    gRows.push_back({what + " p99", us(d.p99), us(f.p99), fmt("%.2fx", d.p99 / f.p99), "", ""});
}

void printTable() {
    size_t w[6] = {11, 5, 5, 7, 6, 7};
    const char *head[6] = {"Measurement", "tolkd", "floor", "tolkd/floor", "target", "verdict"};
    for (int i = 0; i < 6; i++) w[i] = std::max(w[i], strlen(head[i]));
    for (const Row &r : gRows) {
        const std::string *c[6] = {&r.what, &r.tolkd, &r.floor, &r.compare, &r.target, &r.verdict};
        for (int i = 0; i < 6; i++) w[i] = std::max(w[i], c[i]->size());
    }
    auto line = [&](const std::string *c[6]) {
        printf("|");
        for (int i = 0; i < 6; i++) printf(" %-*s |", static_cast<int>(w[i]), c[i]->c_str());
        printf("\n");
    };
    std::string h[6];
    for (int i = 0; i < 6; i++) h[i] = head[i];
    const std::string *hp[6] = {&h[0], &h[1], &h[2], &h[3], &h[4], &h[5]};
    line(hp);
    std::string d[6];
    for (int i = 0; i < 6; i++) d[i] = std::string(w[i], '-');
    const std::string *dp[6] = {&d[0], &d[1], &d[2], &d[3], &d[4], &d[5]};
    line(dp);
    for (const Row &r : gRows) {
        const std::string *c[6] = {&r.what, &r.tolkd, &r.floor, &r.compare, &r.target, &r.verdict};
        line(c);
    }
    for (const std::string &n : gNotes) printf("\n%s", n.c_str());
    printf("\n");
}

void progress(const char *f, ...) __attribute__((format(printf, 1, 2)));
void progress(const char *f, ...) {
    va_list ap;
    va_start(ap, f);
    fprintf(stderr, "[bench] ");
    vfprintf(stderr, f, ap);
    fprintf(stderr, "\n");
    va_end(ap);
}

// ---------------------------------------------------------------- the measurements

// One exchange of a figure: nanoseconds, or -1 on failure.
using Probe = std::function<long long()>;

// Samples of several probes taken in alternating batches, so that a change of
// load on the (shared) machine falls on the floor and on tolkd alike.
std::vector<std::vector<long long>> interleave(const std::vector<Probe> &probes, int samples, int batch = 25) {
    std::vector<std::vector<long long>> out(probes.size());
    std::vector<bool> broken(probes.size(), false);
    for (size_t p = 0; p < probes.size(); p++)
        for (int i = 0; i < 20 && !broken[p]; i++)
            if (probes[p]() < 0) broken[p] = true;
    for (int done = 0; done < samples; done += batch) {
        for (size_t p = 0; p < probes.size(); p++) {
            for (int i = 0; i < batch && done + i < samples && !broken[p]; i++) {
                long long t = probes[p]();
                if (t < 0) {
                    fprintf(stderr, "probe %zu failed after %zu samples\n", p, out[p].size());
                    broken[p] = true;
                    break;
                }
                out[p].push_back(t);
            }
        }
    }
    return out;
}

Probe lineProbe(int fd, const std::string &cmd) {
    return [fd, cmd] { return fd < 0 ? -1 : exchangeLine(fd, cmd + "\r"); };
}

struct Figures {
    Stats refAdb, refSerial, refSerialPaused, hal;
    Stats refSplit, refSplitLog;  // the floor answering in two writes, and after two log lines
    Stats adbCsdf, adbAte1, adbCsq, serCsdf, serAte1, serCsq;
    double refPairs = 0, halPairs = 0, localPairs = 0, modemPairs = 0;
};

// tolkd (log filter at info, the default) and its floors, side by side: the
// reference responder on a device of its own, and the radio service of tolkd's
// device reached straight through the HAL stand-in (its answers go to the client
// that asked, so tolkd's own link is undisturbed).
Figures measureRoundTrips() {
    Figures f;
    progress("round trips: tolkd and the reference responder, each on a fresh device");
    Device ref("reference responder", {}, gCfg.ref);
    Device dev("tolkd", {});
    if (!ref.ok() || !dev.ok()) return f;
    HalClient hal;
    if (!hal.connect(dev.root())) fprintf(stderr, "no radio service through the HAL stand-in\n");
    Probe halProbe = [&hal] { return hal.radio == nullptr ? -1 : hal.exchange("AT+CSQ"); };

    int refAdb = ref.connectAdb(), adb = dev.connectAdb();
    auto a = interleave({lineProbe(refAdb, "AT+CSDF?"), lineProbe(adb, "AT+CSDF?"), lineProbe(adb, "ATE1"), halProbe,
                         lineProbe(adb, "AT+CSQ"), lineProbe(refAdb, "AT+SPLIT"), lineProbe(refAdb, "AT+SPLITLOG")},
                        gCfg.adbSamples);
    f.refAdb = stats(a[0]);
    f.adbCsdf = stats(a[1]);
    f.adbAte1 = stats(a[2]);
    f.hal = stats(a[3]);
    f.adbCsq = stats(a[4]);
    f.refSplit = stats(a[5]);
    f.refSplitLog = stats(a[6]);

    progress("throughput: sequential pairs");
    if (refAdb >= 0) f.refPairs = pairsPerSecond(refAdb, "AT+CSDF?", gCfg.throughputPairs);
    if (adb >= 0) f.localPairs = pairsPerSecond(adb, "AT+CSDF?", gCfg.throughputPairs);
    if (hal.radio != nullptr) {
        long long t0 = nowNs();
        int done = 0;
        for (; done < gCfg.throughputPairs; done++)
            if (hal.exchange("AT+CSQ") < 0) break;
        f.halPairs = done / ((nowNs() - t0) / 1e9);
    }
    if (adb >= 0) f.modemPairs = pairsPerSecond(adb, "AT+CSQ", gCfg.throughputPairs);
    if (refAdb >= 0) close(refAdb);
    if (adb >= 0) close(adb);

    progress("serial round trips");
    int refSer = ref.openSerial(), ser = dev.openSerial();
    auto s = interleave({lineProbe(refSer, "AT+CSDF?"), lineProbe(ser, "AT+CSDF?"), lineProbe(ser, "ATE1"),
                         lineProbe(ser, "AT+CSQ")},
                        gCfg.serialSamples, 10);
    f.refSerial = stats(s[0]);
    f.serCsdf = stats(s[1]);
    f.serAte1 = stats(s[2]);
    f.serCsq = stats(s[3]);
    if (refSer >= 0) close(refSer);
    if (ser >= 0) close(ser);

    // The same responder with tolkd's pause after every serial read: what the
    // pause alone costs through the relay.
    progress("serial: reference responder with the 10 ms pause");
    setenv("TOLK_BENCH_REF_PAUSE_MS", "10", 1);
    Device paused("reference responder, paused", {}, gCfg.ref);
    unsetenv("TOLK_BENCH_REF_PAUSE_MS");
    if (paused.ok()) {
        int fd = paused.openSerial();
        f.refSerialPaused = stats(roundTrips(fd, "AT+CSDF?", gCfg.serialSamples));
        if (fd >= 0) close(fd);
    }
    return f;
}

// The cost of logging: the same round trips on three fresh devices whose log
// filters are silent, info and debug, sampled in alternation.
struct LogFigures {
    Stats adb[3][3];  // [command][filter]
    Stats serial[3];  // AT+CSDF? per filter
};

LogFigures measureLogging() {
    LogFigures l;
    progress("logging: filters *:s, *:i, *:d on three fresh devices");
    Device s("tolkd *:s", {"--log-tags", "*:s"});
    Device i("tolkd *:i", {"--log-tags", "*:i"});
    Device d("tolkd *:d", {"--log-tags", "*:d"});
    Device *devs[3] = {&s, &i, &d};
    const char *cmds[3] = {"AT+CSDF?", "ATE1", "AT+CSQ"};
    int adb[3], ser[3];
    for (int k = 0; k < 3; k++) {
        adb[k] = devs[k]->ok() ? devs[k]->connectAdb() : -1;
        ser[k] = devs[k]->ok() ? devs[k]->openSerial() : -1;
    }
    for (int c = 0; c < 3; c++) {
        auto v = interleave({lineProbe(adb[0], cmds[c]), lineProbe(adb[1], cmds[c]), lineProbe(adb[2], cmds[c])},
                            gCfg.adbSamples);
        for (int k = 0; k < 3; k++) l.adb[c][k] = stats(v[k]);
    }
    auto v = interleave({lineProbe(ser[0], "AT+CSDF?"), lineProbe(ser[1], "AT+CSDF?"), lineProbe(ser[2], "AT+CSDF?")},
                        gCfg.serialSamples, 10);
    for (int k = 0; k < 3; k++) l.serial[k] = stats(v[k]);
    for (int k = 0; k < 3; k++) {
        if (adb[k] >= 0) close(adb[k]);
        if (ser[k] >= 0) close(ser[k]);
    }
    return l;
}

// Unsolicited output: a burst of numbered lines offered to the radio service's
// control socket as fast as it takes them; counts what the host receives on adb.
void measureUrc() {
    progress("unsolicited output burst of %d lines", gCfg.urcCount);
    Device dev("tolkd urc", {});
    if (!dev.ok()) return;
    int adb = dev.connectAdb();
    if (adb < 0) return;
    // A modem command first: the bridge registers with the radio service, and the
    // adb link becomes the one answers and unsolicited lines go to.
    if (exchangeLine(adb, "AT+CSQ\r") < 0) {
        close(adb);
        return;
    }
    setNonBlocking(adb);
    std::string ctl = dev.root() + "/run/radio.ctl";
    std::atomic<int> sent{0}, refused{0};
    std::atomic<long long> sendEnd{0};
    long long t0 = nowNs();
    std::thread sender([&] {
        for (int i = 0; i < gCfg.urcCount; i++) {
            int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
            struct sockaddr_un a;
            memset(&a, 0, sizeof a);
            a.sun_family = AF_UNIX;
            snprintf(a.sun_path, sizeof a.sun_path, "%s", ctl.c_str());
            if (connect(fd, reinterpret_cast<struct sockaddr *>(&a), sizeof a) != 0) {
                close(fd);
                refused++;
                continue;
            }
            std::string msg = fmt("1\r\n+BURST: %06d\r\n", i);
            if (write(fd, msg.data(), msg.size()) != static_cast<ssize_t>(msg.size())) refused++;
            shutdown(fd, SHUT_WR);
            char st = '1';
            if (read(fd, &st, 1) != 1 || st != '0') refused++;
            else sent++;
            close(fd);
        }
        sendEnd = nowNs();
    });
    std::string in;
    char buf[65536];
    long long lastByte = t0;
    long long quietLimit = 2000000000LL;  // 2 s without a byte after the sender ends
    for (;;) {
        struct pollfd p = {adb, POLLIN, 0};
        poll(&p, 1, 100);
        ssize_t n = read(adb, buf, sizeof buf);
        if (n > 0) {
            in.append(buf, static_cast<size_t>(n));
            lastByte = nowNs();
            continue;
        }
        long long end = sendEnd.load();
        if (end != 0 && nowNs() - std::max(end, lastByte) > quietLimit) break;
        if (nowNs() - t0 > 120000000000LL) break;
    }
    sender.join();
    close(adb);

    // Every line must arrive whole, once, in order.
    int received = 0, inOrder = 0, next = 0;
    size_t pos = 0;
    while ((pos = in.find("+BURST: ", pos)) != std::string::npos) {
        int v = atoi(in.c_str() + pos + 8);
        bool whole = pos >= 2 && in.compare(pos - 2, 2, "\r\n") == 0 && pos + 16 <= in.size() &&
                     in.compare(pos + 14, 2, "\r\n") == 0;
        received++;
        if (whole && v == next) {
            inOrder++;
            next++;
        }
        pos += 8;
    }
    double secs = (lastByte - t0) / 1e9;
    double offered = sent.load() / ((sendEnd.load() - t0) / 1e9);
    gRows.push_back({"unsolicited lines relayed (adb)", fmt("%.0f lines/s", received / secs),
                     fmt("%.0f lines/s offered", offered), fmt("%d/%d whole, in order", inOrder, sent.load()),
                     "no loss", inOrder == sent.load() && sent.load() == gCfg.urcCount ? "met" : "MISSED"});
    if (refused.load() > 0) gNotes.push_back(fmt("urc: %d lines were not taken by the radio service", refused.load()));
}

std::string kb(long v) { return fmt("%ld KiB", v); }

// Cost at rest and over many commands, on one device.
void measureRest() {
    progress("cost at rest: idle %d s, %d commands, idle again", gCfg.idleSeconds, gCfg.restCommands);
    Device dev("tolkd at rest", {});
    if (!dev.ok()) return;
    pid_t pid = dev.pid();
    sleepMs(200);
    ProcFigures start = procFigures(pid);

    // Idle: CPU ticks and context switches over the idle period, then the system
    // calls strace sees over a second idle period of the same length.
    ProcFigures a = procFigures(pid);
    sleepMs(gCfg.idleSeconds * 1000);
    ProcFigures b = procFigures(pid);
    std::string straceTable;
    long calls = straceCalls(pid, gCfg.idleSeconds, &straceTable);

    int adb = dev.connectAdb();
    int done = 0;
    long long t0 = nowNs();
    ProcFigures before = procFigures(pid);
    if (adb >= 0) {
        const char *cmds[] = {"AT+CSDF?\r", "ATE1\r", "AT+CSQ\r"};
        for (; done < gCfg.restCommands; done++) {
            if (exchangeLine(adb, cmds[done % 3]) < 0) break;
            if (done == gCfg.restCommands / 10) before = procFigures(pid);  // after warm-up
        }
        close(adb);
    }
    double secs = (nowNs() - t0) / 1e9;
    ProcFigures after = procFigures(pid);
    sleepMs(500);
    ProcFigures c = procFigures(pid);
    sleepMs(gCfg.idleSeconds * 1000);
    ProcFigures d = procFigures(pid);

    gRows.push_back({"resident memory after start", kb(start.rssKb), "", "", "< 3072 KiB",
                     start.rssKb < 3072 ? "met" : "MISSED"});
    gRows.push_back({"  of it private (USS) / proportional (PSS)", kb(start.privateKb) + " / " + kb(start.pssKb), "",
                     fmt("%ld KiB are shared library pages", start.rssKb - start.privateKb), "", ""});
    long growth = after.rssKb - before.rssKb;
    gRows.push_back({fmt("resident memory after %d commands", done), kb(after.rssKb), "",
                     fmt("%+ld KiB after the first 10%%", growth), "< 3072 KiB, no growth",
                     after.rssKb < 3072 && growth <= 0 && done == gCfg.restCommands ? "met" : "MISSED"});
    gRows.push_back({fmt("CPU time over %d idle s (after start)", gCfg.idleSeconds),
                     fmt("%lld ticks", b.cpuTicks - a.cpuTicks), "", fmt("%lld context switches", b.ctxSwitches - a.ctxSwitches),
                     "0", b.cpuTicks == a.cpuTicks && b.ctxSwitches == a.ctxSwitches ? "met" : "MISSED"});
    gRows.push_back({fmt("CPU time over %d idle s (after the commands)", gCfg.idleSeconds),
                     fmt("%lld ticks", d.cpuTicks - c.cpuTicks), "", fmt("%lld context switches", d.ctxSwitches - c.ctxSwitches),
                     "0", d.cpuTicks == c.cpuTicks && d.ctxSwitches == c.ctxSwitches ? "met" : "MISSED"});
    gRows.push_back({fmt("system calls over %d idle s (strace -c -f)", gCfg.idleSeconds),
                     calls < 0 ? "strace unavailable" : fmt("%ld", calls), "", "", "0",
                     calls < 0 ? "NOT MEASURED" : calls == 0 ? "met" : "MISSED"});
    if (calls != 0) gNotes.push_back("strace -c -f over the idle period:\n" + straceTable);
    gRows.push_back({"  private (USS) / proportional (PSS) after the commands", kb(after.privateKb) + " / " + kb(after.pssKb),
                     "", fmt("%+ld KiB private after the first 10%%", after.privateKb - before.privateKb), "", ""});
    gNotes.push_back(fmt("%d mixed commands (AT+CSDF?, ATE1, AT+CSQ) on adb took %.1f s (%.0f per second); tolkd "
                         "used %.2f s of CPU for the last 90%% of them.",
                         done, secs, done / secs,
                         static_cast<double>(after.cpuTicks - before.cpuTicks) / sysconf(_SC_CLK_TCK)));
}

// Start to serving: tolkd started again and again on a running device (beside the
// supervisor's own tolkd, with its own adb socket), timed from fork to the moment
// its main thread is seen blocked in select.
void measureStart() {
    progress("start to serving, %d launches", gCfg.startRuns);
    Device dev("tolkd start", {});
    if (!dev.ok()) return;
    std::string sockPath = dev.root() + "/run/bench_adb";
    std::vector<long long> v;
    for (int run = 0; run < gCfg.startRuns; run++) {
        unlink(sockPath.c_str());
        int s = socket(AF_UNIX, SOCK_STREAM, 0);
        struct sockaddr_un a;
        memset(&a, 0, sizeof a);
        a.sun_family = AF_UNIX;
        snprintf(a.sun_path, sizeof a.sun_path, "%s", sockPath.c_str());
        if (bind(s, reinterpret_cast<struct sockaddr *>(&a), sizeof a) != 0) {
            close(s);
            break;
        }
        long long t0 = nowNs();
        pid_t pid = fork();
        if (pid == 0) {
            setenv("TOLKD_ROOT", dev.root().c_str(), 1);
            setenv("TOLKD_LOG", (dev.root() + "/log/bench-start.log").c_str(), 1);
            setenv("ANDROID_LOG_TAGS", "*:i", 1);
            setenv("ANDROID_SOCKET_adb_tolk_socket", std::to_string(s).c_str(), 1);
            int null = open("/dev/null", O_RDWR);
            dup2(null, 0);
            dup2(null, 1);
            dup2(null, 2);
            execl(gCfg.tolkd.c_str(), "tolkd", static_cast<char *>(nullptr));
            _exit(127);
        }
        close(s);
        long long limit = t0 + 5000000000LL;
        bool served = false;
        while (nowNs() < limit) {
            if (inMainWait(pid)) {
                served = true;
                break;
            }
            int status;
            if (waitpid(pid, &status, WNOHANG) == pid) {
                pid = -1;
                break;
            }
            struct timespec ts = {0, 50000};
            nanosleep(&ts, nullptr);
        }
        long long t1 = nowNs();
        if (pid > 0) {
            kill(pid, SIGKILL);
            waitpid(pid, nullptr, 0);
        }
        if (!served) break;
        v.push_back(t1 - t0);
    }
    unlink(sockPath.c_str());
    Stats s = stats(v);
    gRows.push_back({"start to serving (fork to main wait)", s.n ? us(s.median) + " median" : "failed", "",
                     s.n ? fmt("max %s over %zu starts", us(stats(v).p99).c_str(), s.n) : "", "", ""});
}

// ---------------------------------------------------------------- one local command

// Every thread of pid (and so the HAL threads too) onto one CPU.
bool pinProcess(pid_t pid, int cpu) {
    cpu_set_t set;
    CPU_ZERO(&set);
    CPU_SET(cpu, &set);
    DIR *d = opendir(("/proc/" + std::to_string(pid) + "/task").c_str());
    if (d == nullptr) return false;
    bool ok = true;
    while (struct dirent *e = readdir(d)) {
        if (e->d_name[0] == '.') continue;
        if (sched_setaffinity(atoi(e->d_name), sizeof set, &set) != 0) ok = false;
    }
    closedir(d);
    return ok;
}

// The cost of one local adb command, AT+CSDF?, as two figures that the load of
// other work on the machine moves little: the instructions the daemon executes
// per command (callgrind, counters zeroed after a warm-up and dumped after
// `count` commands), and the round trip with the client and the daemon pinned
// to the same CPU, next to the reference responder pinned the same way, so that
// every cycle of the exchange is spent on one CPU in turn.
int measureOneCommand(int count) {
    const int cpu = 0;
    cpu_set_t mine;
    CPU_ZERO(&mine);
    CPU_SET(cpu, &mine);
    if (sched_setaffinity(0, sizeof mine, &mine) != 0) perror("sched_setaffinity");

    auto pinnedRoundTrips = [&](Device &dev) {
        Stats s;
        if (!dev.ok() || !pinProcess(dev.pid(), cpu)) return s;
        int fd = dev.connectAdb();
        if (fd < 0) return s;
        s = stats(roundTrips(fd, "AT+CSDF?", count));
        close(fd);
        return s;
    };
    Stats tolkd, ref;
    {
        Device dev("tolkd pinned", {});
        tolkd = pinnedRoundTrips(dev);
    }
    {
        Device dev("reference pinned", {}, gCfg.ref);
        ref = pinnedRoundTrips(dev);
    }

    // tolkd under callgrind: tolk-sim starts the wrapper in tolkd's place.
    double perCommand = -1;
    char tmpl[] = "/tmp/tbcgXXXXXX";
    if (mkdtemp(tmpl) != nullptr) {
        std::string dir = tmpl, wrapper = dir + "/tolkd-callgrind", out = dir + "/callgrind.out";
        {
            std::ofstream w(wrapper);
            w << "#!/bin/sh\nexec valgrind --tool=callgrind --callgrind-out-file=" << out << " " << gCfg.tolkd
              << "\n";
        }
        chmod(wrapper.c_str(), 0755);
        Device dev("tolkd under callgrind", {}, wrapper);
        int fd = dev.ok() ? dev.connectAdb() : -1;
        bool warm = fd >= 0;
        for (int i = 0; warm && i < 50; i++) warm = exchangeLine(fd, "AT+CSDF?\r", nullptr, 10000) >= 0;
        std::string pid = std::to_string(dev.pid());
        if (warm && runProgram({"callgrind_control", "-z", pid}) == 0) {
            int done = 0;
            while (done < count && exchangeLine(fd, "AT+CSDF?\r", nullptr, 10000) >= 0) done++;
            runProgram({"callgrind_control", "-d", pid});
            // The dump of -d is the output file with a counter appended.
            long long total = -1;
            DIR *d = opendir(dir.c_str());
            while (d != nullptr) {
                struct dirent *e = readdir(d);
                if (e == nullptr) break;
                if (strncmp(e->d_name, "callgrind.out.", 14) != 0) continue;
                std::istringstream in(readFile(dir + "/" + e->d_name));
                std::string line;
                while (std::getline(in, line))
                    if (line.compare(0, 8, "summary:") == 0 || line.compare(0, 7, "totals:") == 0)
                        total = atoll(line.c_str() + line.find(':') + 1);
            }
            if (d != nullptr) closedir(d);
            if (total >= 0 && done > 0) perCommand = static_cast<double>(total) / done;
            printf("callgrind: %lld instructions over %d commands\n", total, done);
        }
        if (fd >= 0) close(fd);
    }
    if (!getenv("TOLK_BENCH_KEEP")) nftw(tmpl, removeEntry, 16, FTW_DEPTH | FTW_PHYS);

    printf("tolkd: %s\n", gCfg.tolkd.c_str());
    printf("instructions per adb AT+CSDF? (callgrind, info filter): %.0f\n", perCommand);
    printf("pinned round trip median / p99: tolkd %s / %s, reference %s / %s (%.2fx at the median)\n",
           us(tolkd.median).c_str(), us(tolkd.p99).c_str(), us(ref.median).c_str(), us(ref.p99).c_str(),
           ref.median > 0 ? tolkd.median / ref.median : 0);
    return perCommand > 0 && tolkd.n > 0 ? 0 : 1;
}

void usage() {
    printf("usage: tolkd-bench [--quick] [--one-command] [--sim PATH] [--tolkd PATH] [--ref PATH]\n"
           "  Runs every measurement on fresh simulated devices and prints one table.\n"
           "  --quick   fewer samples and 2 idle seconds (a smoke run, not for figures)\n"
           "  --one-command  only the cost of one local adb command: instructions per\n"
           "            AT+CSDF? under callgrind, and its round trip pinned to one CPU\n"
           "  TOLK_BENCH_KEEP=1 keeps the device roots.\n");
}

}  // namespace

int main(int argc, char **argv) {
    bool oneCommand = false;
    for (int i = 1; i < argc; i++) {
        std::string a = argv[i];
        if (a == "--quick") {
            gCfg.quick = true;
        } else if (a == "--one-command") {
            oneCommand = true;
        } else if ((a == "--sim" || a == "--tolkd" || a == "--ref") && i + 1 < argc) {
            (a == "--sim" ? gCfg.sim : a == "--tolkd" ? gCfg.tolkd : gCfg.ref) = argv[++i];
        } else {
            usage();
            return a == "--help" || a == "-h" ? 0 : 2;
        }
    }
    if (gCfg.quick) {
        gCfg.adbSamples = 300;
        gCfg.serialSamples = 40;
        gCfg.throughputPairs = 500;
        gCfg.urcCount = 500;
        gCfg.restCommands = 3000;
        gCfg.idleSeconds = 2;
        gCfg.startRuns = 3;
    }
    signal(SIGPIPE, SIG_IGN);
    startWatchdog();
    if (oneCommand) return measureOneCommand(gCfg.quick ? 200 : 1000);

    Figures f = measureRoundTrips();
    LogFigures lg = measureLogging();
    measureUrc();
    measureRest();
    measureStart();

    std::vector<Row> tail;
    tail.swap(gRows);

    addRatioRow("adb AT+CSDF? round trip", f.adbCsdf, f.refAdb, 1.5);
    addRatioRow("adb ATE1 round trip", f.adbAte1, f.refAdb, 1.5);
    addRatioRow("adb AT+CSQ round trip (modem)", f.adbCsq, f.hal, 1.5);
    // What tolkd's answer pattern costs without tolkd: the floor answering with a
    // body and a final result in two writes, and after two log lines as well; and
    // the modem path's two links, each at its floor.
    if (f.refAdb.n && f.refSplit.n && f.refSplitLog.n) {
        gRows.push_back({"  floor answering in two writes, median", us(f.refSplit.median), us(f.refAdb.median),
                         fmt("%.2fx", f.refSplit.median / f.refAdb.median), "", "context"});
        gRows.push_back({"  ... and logging two lines first, median", us(f.refSplitLog.median), us(f.refAdb.median),
                         fmt("%.2fx", f.refSplitLog.median / f.refAdb.median), "", "context"});
    }
    if (f.refAdb.n && f.hal.n)
        gRows.push_back({"  adb floor + HAL floor, median", us(f.refAdb.median + f.hal.median), us(f.hal.median),
                         fmt("%.2fx", (f.refAdb.median + f.hal.median) / f.hal.median), "", "context"});
    auto serialRow = [&](const std::string &what, const Stats &d) {
        if (d.n == 0 || f.refSerial.n == 0) {
            gRows.push_back({what, "failed", "", "", "", "NOT MEASURED"});
            return;
        }
        double over = d.median - f.refSerial.median;
        gRows.push_back({what + " median", us(d.median), us(f.refSerial.median), "+" + us(over), "<= +11.00 ms",
                         over <= 11000 ? "met" : "MISSED"});
        gRows.push_back({what + " p99", us(d.p99), us(f.refSerial.p99), "+" + us(d.p99 - f.refSerial.p99), "", ""});
    };
    serialRow("serial AT+CSDF? round trip", f.serCsdf);
    serialRow("serial ATE1 round trip", f.serAte1);
    if (f.serCsq.n && f.refSerial.n && f.hal.n) {
        double over = f.serCsq.median - f.refSerial.median - f.hal.median;
        gRows.push_back({"serial AT+CSQ round trip median", us(f.serCsq.median),
                         us(f.refSerial.median) + " + " + us(f.hal.median), "+" + us(over), "<= +11.00 ms",
                         over <= 11000 ? "met" : "MISSED"});
    }
    if (f.refSerialPaused.n)
        gNotes.push_back(fmt("Reference responder with the 10 ms pause after each serial read: median %s, p99 %s.",
                             us(f.refSerialPaused.median).c_str(), us(f.refSerialPaused.p99).c_str()));
    gRows.push_back({"adb local pairs per second", fmt("%.0f/s", f.localPairs), fmt("%.0f/s", f.refPairs),
                     fmt("%.2fx", f.refPairs > 0 ? f.localPairs / f.refPairs : 0), "", ""});
    gRows.push_back({"adb modem pairs per second", fmt("%.0f/s", f.modemPairs), fmt("%.0f/s", f.halPairs),
                     fmt("%.2fx", f.halPairs > 0 ? f.modemPairs / f.halPairs : 0), "", ""});
    gRows.insert(gRows.end(), tail.begin(), tail.end());

    // Logging cost: the same round trips with the filter at silent, info and debug.
    auto logRow = [&](const std::string &what, const Stats *v) {
        gRows.push_back({"log " + what + " median *:s / *:i / *:d",
                         us(v[0].median) + " / " + us(v[1].median) + " / " + us(v[2].median), "",
                         fmt("info %.2fx, debug %.2fx silent", v[0].median > 0 ? v[1].median / v[0].median : 0,
                             v[0].median > 0 ? v[2].median / v[0].median : 0),
                         "", ""});
    };
    logRow("adb AT+CSDF?", lg.adb[0]);
    logRow("adb ATE1", lg.adb[1]);
    logRow("adb AT+CSQ", lg.adb[2]);
    logRow("serial AT+CSDF?", lg.serial);

    printTable();
    return 0;
}
