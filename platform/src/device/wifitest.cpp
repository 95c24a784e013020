// The Wi-Fi RF test library on the host: a small fake test chip.
//
// Every call appends "NAME ARGS..." to <root>/journal/wifitest.log, so tests can see
// exactly what the daemon asked for. <root>/wifitest/control, read at each call,
// steers the answers:
//   fail NAME     NAME (with or without the WIFI_TEST_ prefix) returns false
//   mode N        what GetSupportedMode reports (default 0)
//   result A B    the two counters of a reception test; ClearResult zeroes them
//                 until the control file names different counts
#include <libwifitest.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>

#include <limits.h>
#include <stdarg.h>
#include <stdio.h>
#include <string.h>

#include <mutex>
#include <string>

namespace {

constexpr const char *kPrefix = "WIFI_TEST_";

struct Control {
    bool fail = false;
    bool haveMode = false;
    int32_t mode = 0;
    bool haveResult = false;
    int32_t result[2] = {0, 0};
};

// What the fake chip remembers between calls. It belongs to one device root: a
// process that moves to another root (tests do) meets a fresh chip there.
struct Chip {
    std::mutex mutex;
    std::string root;
    bool dutOpen = false;
    int32_t counters[2] = {0, 0};
    bool seenResult = false;
    int32_t seen[2] = {0, 0};  // the control counts last taken over
};

Chip &chip() {
    static Chip c;
    return c;
}

// Call with the chip's mutex held.
Chip &current_chip() {
    Chip &c = chip();
    const char *root = tolk_device_root();
    std::string now = root != nullptr ? root : "";
    if (now != c.root) {
        c.root = now;
        c.dutOpen = false;
        c.counters[0] = c.counters[1] = 0;
        c.seenResult = false;
        c.seen[0] = c.seen[1] = 0;
    }
    return c;
}

Control read_control(const char *fn) {
    Control c;
    char path[PATH_MAX];
    char text[4096];
    if (tolk_device_root() == nullptr || tolk_device_path("/wifitest/control", path, sizeof(path)) == nullptr ||
        tolk_read_file(path, text, sizeof(text)) < 0)
        return c;
    const char *shortName = fn + strlen(kPrefix);
    char *save = nullptr;
    for (char *line = strtok_r(text, "\n", &save); line != nullptr; line = strtok_r(nullptr, "\n", &save)) {
        char word[64] = "";
        char name[64] = "";
        int a = 0, b = 0;
        if (sscanf(line, "%63s", word) != 1) continue;
        if (strcmp(word, "fail") == 0 && sscanf(line, "%*s %63s", name) == 1) {
            if (strcmp(name, fn) == 0 || strcmp(name, shortName) == 0) c.fail = true;
        } else if (strcmp(word, "mode") == 0 && sscanf(line, "%*s %d", &a) == 1) {
            c.haveMode = true;
            c.mode = a;
        } else if (strcmp(word, "result") == 0 && sscanf(line, "%*s %d %d", &a, &b) == 2) {
            c.haveResult = true;
            c.result[0] = a;
            c.result[1] = b;
        }
    }
    return c;
}

void record(const char *fmt, ...) __attribute__((format(printf, 1, 2)));
void record(const char *fmt, ...) {
    char path[PATH_MAX];
    if (tolk_device_root() == nullptr || tolk_device_path("/journal/wifitest.log", path, sizeof(path)) == nullptr)
        return;
    char line[256];
    va_list ap;
    va_start(ap, fmt);
    int n = vsnprintf(line, sizeof(line) - 1, fmt, ap);
    va_end(ap);
    if (n < 0) return;
    size_t len = static_cast<size_t>(n) < sizeof(line) - 1 ? static_cast<size_t>(n) : sizeof(line) - 2;
    line[len++] = '\n';
    tolk_append_file(path, line, len);
}

// Journals the call and tells whether it succeeds.
#define WIFI_CALL(name, fmt, ...)                                   \
    Control ctl = read_control(name);                               \
    record("%s" fmt, name, ##__VA_ARGS__);                          \
    std::lock_guard<std::mutex> lock(chip().mutex);                 \
    Chip &c = current_chip();                                       \
    (void)c;                                                        \
    if (ctl.fail) return false

void hex_address(const unsigned char *addr, char *out) {
    if (addr == nullptr) {
        snprintf(out, 13, "%s", "------------");
        return;
    }
    for (int i = 0; i < 6; i++) snprintf(out + 2 * i, 3, "%02x", addr[i]);
}

}  // namespace

extern "C" bool WIFI_TEST_OpenDUT(void) {
    WIFI_CALL("WIFI_TEST_OpenDUT", "");
    c.dutOpen = true;
    return true;
}

extern "C" bool WIFI_TEST_CloseDUT(void) {
    WIFI_CALL("WIFI_TEST_CloseDUT", "");
    c.dutOpen = false;
    return true;
}

extern "C" bool WIFI_TEST_GetSupportedMode(int32_t *mode) {
    WIFI_CALL("WIFI_TEST_GetSupportedMode", "");
    if (mode == nullptr) return false;
    *mode = ctl.haveMode ? ctl.mode : 0;
    return true;
}

extern "C" bool WIFI_TEST_SetMode(int mode) {
    WIFI_CALL("WIFI_TEST_SetMode", " %d", mode);
    return true;
}

extern "C" bool WIFI_TEST_SetBandwidth(int bandwidth) {
    WIFI_CALL("WIFI_TEST_SetBandwidth", " %d", bandwidth);
    return true;
}

extern "C" bool WIFI_TEST_SetFrequency(int frequency, int offset) {
    WIFI_CALL("WIFI_TEST_SetFrequency", " %d %d", frequency, offset);
    return true;
}

extern "C" bool WIFI_TEST_SetRate(int rate) {
    WIFI_CALL("WIFI_TEST_SetRate", " %d", rate);
    return true;
}

extern "C" bool WIFI_TEST_SetTXPower(int power) {
    WIFI_CALL("WIFI_TEST_SetTXPower", " %d", power);
    return true;
}

extern "C" bool WIFI_TEST_SetTX(bool enable) {
    WIFI_CALL("WIFI_TEST_SetTX", " %d", enable ? 1 : 0);
    return true;
}

extern "C" bool WIFI_TEST_SetRX(bool enable, unsigned char *addr1, unsigned char *addr2) {
    char a1[13], a2[13];
    hex_address(addr1, a1);
    hex_address(addr2, a2);
    WIFI_CALL("WIFI_TEST_SetRX", " %d %s %s", enable ? 1 : 0, a1, a2);
    return true;
}

extern "C" bool WIFI_TEST_GetResult(int32_t *first, int32_t *second) {
    WIFI_CALL("WIFI_TEST_GetResult", "");
    // New counts in the control file are a new measurement; the same counts after
    // a ClearResult stay cleared.
    if (ctl.haveResult && (!c.seenResult || ctl.result[0] != c.seen[0] || ctl.result[1] != c.seen[1])) {
        c.seenResult = true;
        c.seen[0] = c.counters[0] = ctl.result[0];
        c.seen[1] = c.counters[1] = ctl.result[1];
    }
    if (first == nullptr || second == nullptr) return false;
    *first = c.counters[0];
    *second = c.counters[1];
    return true;
}

extern "C" bool WIFI_TEST_ClearResult(void) {
    WIFI_CALL("WIFI_TEST_ClearResult", "");
    // Take over pending control counts first, so that clearing really clears them.
    if (ctl.haveResult) {
        c.seenResult = true;
        c.seen[0] = ctl.result[0];
        c.seen[1] = ctl.result[1];
    }
    c.counters[0] = c.counters[1] = 0;
    return true;
}
