// The libc calls of the daemon that reach the device, replaced at link time
// (-Wl,--wrap=NAME routes the daemon's NAME to __wrap_NAME; __real_NAME is libc's):
//   open, fopen   device paths resolve under the device root
//   system        commands are journalled, never run
//   sync          nothing to flush on the host
//   time, gettimeofday, settimeofday   a simulated clock: host clock + stored offset
//   ioctl         the PMIC ADC calibration device is answered from a text file
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdarg.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <mutex>

extern "C" {
int __real_open(const char *path, int flags, ...);
FILE *__real_fopen(const char *path, const char *mode);
int __real_ioctl(int fd, unsigned long request, ...);

int __wrap_open(const char *path, int flags, ...);
FILE *__wrap_fopen(const char *path, const char *mode);
int __wrap_system(const char *command);
void __wrap_sync(void);
time_t __wrap_time(time_t *t);
int __wrap_gettimeofday(struct timeval *tv, void *tz);
int __wrap_settimeofday(const struct timeval *tv, const struct timezone *tz);
int __wrap_ioctl(int fd, unsigned long request, ...);
}

namespace {

constexpr unsigned long kAdcReadRequest = 0x40046B04UL;
constexpr unsigned long kAdcSetRequest = 0x40046B06UL;
constexpr const char *kAdcDevice = "/dev/OV_pmic_adc_cali";
// The kernel refuses times whose nanoseconds would not fit into 64 bits.
constexpr long long kMaxClockSeconds = 9223372036LL;

// Host path of a device path, or NULL (errno ENAMETOOLONG) when it does not fit.
const char *resolve(const char *path, char *buf, size_t size) {
    if (path == nullptr) return nullptr;
    return tolk_device_path(path, buf, size);
}

// Host path of a file kept by the stand-ins under the root, e.g. "/journal/shell.log";
// NULL without a root.
bool root_file(const char *devicePath, char *buf, size_t size) {
    if (tolk_device_root() == nullptr) return false;
    return tolk_device_path(devicePath, buf, size) != nullptr;
}

void journal(const char *devicePath, const char *text) {
    char path[PATH_MAX];
    if (!root_file(devicePath, path, sizeof(path))) return;
    tolk_append_file(path, text, strlen(text));
}

// ---- clock ----

std::mutex gClockMutex;
long long gMemOffsetUs = 0;  // the offset when there is no root

long long host_now_us() {
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    return static_cast<long long>(ts.tv_sec) * 1000000LL + ts.tv_nsec / 1000;
}

long long read_offset_us() {
    char path[PATH_MAX];
    if (!root_file("/clock/offset", path, sizeof(path))) {
        std::lock_guard<std::mutex> lock(gClockMutex);
        return gMemOffsetUs;
    }
    char text[64];
    if (tolk_read_file(path, text, sizeof(text)) <= 0) return 0;
    long long sec = 0;
    long usec = 0;
    int n = sscanf(text, "%lld %ld", &sec, &usec);
    if (n < 1 || sec > kMaxClockSeconds || sec < -kMaxClockSeconds) return 0;
    if (n < 2 || usec < 0 || usec > 999999) usec = 0;
    return sec * 1000000LL + usec;
}

int write_offset_us(long long off) {
    char path[PATH_MAX];
    if (!root_file("/clock/offset", path, sizeof(path))) {
        std::lock_guard<std::mutex> lock(gClockMutex);
        gMemOffsetUs = off;
        return 0;
    }
    // Seconds rounded down, so the microseconds are never negative.
    long long sec = off / 1000000LL;
    long long usec = off % 1000000LL;
    if (usec < 0) {
        usec += 1000000LL;
        sec -= 1;
    }
    char text[64];
    int n = snprintf(text, sizeof(text), "%lld %06lld\n", sec, usec);
    return tolk_write_file_atomic(path, text, static_cast<size_t>(n), true);
}

long long sim_now_us() { return host_now_us() + read_offset_us(); }

// Splits microseconds since the epoch into a timeval (floor for times before 1970).
struct timeval to_timeval(long long us) {
    struct timeval tv;
    long long sec = us / 1000000LL;
    long long rem = us % 1000000LL;
    if (rem < 0) {
        rem += 1000000LL;
        sec -= 1;
    }
    tv.tv_sec = static_cast<time_t>(sec);
    tv.tv_usec = static_cast<suseconds_t>(rem);
    return tv;
}

// ---- PMIC ADC ----

// True when fd is open on the simulated ADC device.
bool is_adc_device(int fd) {
    char want[PATH_MAX];
    if (resolve(kAdcDevice, want, sizeof(want)) == nullptr) return false;
    char link[64];
    snprintf(link, sizeof(link), "/proc/self/fd/%d", fd);
    char have[PATH_MAX];
    ssize_t n = readlink(link, have, sizeof(have) - 1);
    if (n < 0) return false;
    have[n] = '\0';
    if (strcmp(have, want) == 0) return true;
    // /proc shows the resolved path; the root may be spelt through a symlink.
    char real[PATH_MAX];
    return realpath(want, real) != nullptr && strcmp(have, real) == 0;
}

// Answers a read request {channel, count} -> {value, status} from the device
// file's "CHANNEL VALUE [STATUS]" lines; a channel not listed reads status -1.
int adc_read(int *io) {
    char path[PATH_MAX];
    if (resolve(kAdcDevice, path, sizeof(path)) == nullptr) return -1;
    char text[8192];
    if (tolk_read_file(path, text, sizeof(text)) < 0) return -1;
    int channel = io[0];
    int value = 0;
    int status = -1;
    char *save = nullptr;
    for (char *line = strtok_r(text, "\n", &save); line != nullptr; line = strtok_r(nullptr, "\n", &save)) {
        int ch = 0, v = 0, st = 0;
        int n = sscanf(line, "%d %d %d", &ch, &v, &st);
        if (n < 2 || ch != channel) continue;
        value = v;
        status = n >= 3 ? st : 0;
        break;
    }
    io[0] = value;
    io[1] = status;
    return 0;
}

}  // namespace

extern "C" int __wrap_open(const char *path, int flags, ...) {
    mode_t mode = 0;
    // The mode argument is there only when the flags ask for a new file.
    if ((flags & O_CREAT) != 0 || (flags & O_TMPFILE) == O_TMPFILE) {
        va_list ap;
        va_start(ap, flags);
        mode = static_cast<mode_t>(va_arg(ap, int));
        va_end(ap);
    }
    char buf[PATH_MAX];
    const char *host = resolve(path, buf, sizeof(buf));
    if (host == nullptr) {
        if (path == nullptr) errno = EFAULT;
        return -1;
    }
    return __real_open(host, flags, mode);
}

extern "C" FILE *__wrap_fopen(const char *path, const char *mode) {
    char buf[PATH_MAX];
    const char *host = resolve(path, buf, sizeof(buf));
    if (host == nullptr) {
        if (path == nullptr) errno = EFAULT;
        return nullptr;
    }
    return __real_fopen(host, mode);
}

extern "C" int __wrap_system(const char *command) {
    // system(NULL) asks whether a shell exists; there is one, it just never runs.
    if (command == nullptr) return 1;
    // One journal line per call: host time, then the command with line breaks and
    // backslashes escaped so that a command can never start a line of its own.
    char line[4096];
    struct timespec ts;
    clock_gettime(CLOCK_REALTIME, &ts);
    int n = snprintf(line, sizeof(line), "%lld.%03ld ", static_cast<long long>(ts.tv_sec), ts.tv_nsec / 1000000L);
    size_t len = n > 0 ? static_cast<size_t>(n) : 0;
    for (const char *p = command; *p != '\0' && len + 3 < sizeof(line); p++) {
        if (*p == '\n' || *p == '\r' || *p == '\\') {
            line[len++] = '\\';
            line[len++] = *p == '\n' ? 'n' : *p == '\r' ? 'r' : '\\';
        } else {
            line[len++] = *p;
        }
    }
    line[len++] = '\n';
    line[len] = '\0';
    journal("/journal/shell.log", line);
    return 0;
}

extern "C" void __wrap_sync(void) {}

extern "C" time_t __wrap_time(time_t *t) {
    time_t now = to_timeval(sim_now_us()).tv_sec;
    if (t != nullptr) *t = now;
    return now;
}

extern "C" int __wrap_gettimeofday(struct timeval *tv, void *tz) {
    if (tv != nullptr) *tv = to_timeval(sim_now_us());
    if (tz != nullptr) {
        struct timezone *z = static_cast<struct timezone *>(tz);
        z->tz_minuteswest = 0;
        z->tz_dsttime = 0;
        char path[PATH_MAX];
        char text[32];
        if (root_file("/clock/tz_minuteswest", path, sizeof(path)) && tolk_read_file(path, text, sizeof(text)) > 0)
            z->tz_minuteswest = atoi(text);
    }
    return 0;
}

extern "C" int __wrap_settimeofday(const struct timeval *tv, const struct timezone *tz) {
    if (tv != nullptr) {
        // The checks the kernel makes: a clock before 1970, beyond its range, or with
        // out-of-range microseconds is refused rather than stored.
        if (tv->tv_usec < 0 || tv->tv_usec > 999999 || tv->tv_sec < 0 ||
            static_cast<long long>(tv->tv_sec) > kMaxClockSeconds) {
            errno = EINVAL;
            return -1;
        }
        long long want = static_cast<long long>(tv->tv_sec) * 1000000LL + tv->tv_usec;
        if (write_offset_us(want - host_now_us()) != 0) return -1;
    }
    if (tz != nullptr) {
        char path[PATH_MAX];
        if (root_file("/clock/tz_minuteswest", path, sizeof(path))) {
            char text[32];
            int n = snprintf(text, sizeof(text), "%d\n", tz->tz_minuteswest);
            if (tolk_write_file_atomic(path, text, static_cast<size_t>(n), true) != 0) return -1;
        }
    }
    return 0;
}

extern "C" int __wrap_ioctl(int fd, unsigned long request, ...) {
    va_list ap;
    va_start(ap, request);
    void *arg = va_arg(ap, void *);
    va_end(ap);
    if ((request == kAdcReadRequest || request == kAdcSetRequest) && is_adc_device(fd)) {
        if (arg == nullptr) {
            errno = EFAULT;
            return -1;
        }
        int *io = static_cast<int *>(arg);
        if (request == kAdcReadRequest) return adc_read(io);
        char line[32];
        snprintf(line, sizeof(line), "%d\n", io[0]);
        journal("/journal/adc_set.log", line);
        return 0;
    }
    return __real_ioctl(fd, request, arg);
}
