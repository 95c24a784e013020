// Checks shared by the fault, soak and host program tests: a host link held
// open across commands, and after whatever was done to the device, the daemon
// still runs, answers a local command on both host links and holds no more
// descriptors than before.
#ifndef TOLK_TESTS_E2E_FAULT_CHECKS_H
#define TOLK_TESTS_E2E_FAULT_CHECKS_H

#include <dirent.h>
#include <poll.h>
#include <unistd.h>

#include <chrono>
#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "sim_device.h"

namespace fault_checks {

// What a local query answers on a link whose echo is off (adb always).
const char kCsdfAnswer[] = "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n";

// One host link kept open; the serial one with its echo switched off.
class HostLink {
public:
    HostLink(SimDevice &d, bool adb) : fd_(adb ? d.connectAdb() : d.openSerial()) {
        EXPECT_GE(fd_, 0) << (adb ? "adb" : "serial") << " link";
        if (!adb && fd_ >= 0) writeAll(fd_, "ATE0\r"), readUntil(fd_, "OK\r\n", 3000);
    }
    ~HostLink() {
        if (fd_ >= 0) close(fd_);
    }
    HostLink(const HostLink &) = delete;
    HostLink &operator=(const HostLink &) = delete;
    int fd() const { return fd_; }
    // Sends the line with its CR; what arrived once the bytes end in a final
    // result line ("OK", "ERROR", "ERROR:No Modem"...), or after ms.
    std::string ask(const std::string &line, int ms = 3000) {
        writeAll(fd_, line + "\r");
        return answer(ms);
    }
    std::string answer(int ms = 3000) {
        using Clock = std::chrono::steady_clock;
        std::string got;
        for (auto end = Clock::now() + std::chrono::milliseconds(ms); !finished(got) && Clock::now() < end;) {
            struct pollfd p = {fd_, POLLIN, 0};
            char buf[4096];
            int left = static_cast<int>(std::chrono::duration_cast<std::chrono::milliseconds>(end - Clock::now()).count());
            ssize_t n = poll(&p, 1, left) == 1 ? read(fd_, buf, sizeof buf) : 0;
            if (n <= 0) break;
            got.append(buf, static_cast<size_t>(n));
        }
        return got;
    }
    // Sends the line; what arrived within ms (an answer that must not come).
    std::string silent(const std::string &line, int ms = 200) {
        writeAll(fd_, line + "\r");
        return readQuiet(fd_, ms, ms);
    }

private:
    static bool finished(const std::string &got) {
        size_t cut = got.size() > 2 ? got.rfind("\r\n", got.size() - 3) : std::string::npos;
        std::string last = cut == std::string::npos ? "" : got.substr(cut + 2);
        return last == "OK\r\n" || last == "ERROR\r\n" || last.compare(0, 6, "ERROR:") == 0;
    }
    int fd_;
};

// Requests a peer received: lines of its journal holding line.
inline int countOf(const std::string &text, const std::string &needle) {
    int n = 0;
    for (size_t pos = text.find(needle); pos != std::string::npos; pos = text.find(needle, pos + needle.size())) n++;
    return n;
}

// What the daemon's descriptors point to, for failure messages.
inline std::string tolkdFdList(const SimDevice &d) {
    std::string dir = "/proc/" + std::to_string(d.tolkdPid()) + "/fd", out;
    if (DIR *dp = opendir(dir.c_str())) {
        while (struct dirent *e = readdir(dp)) {
            if (e->d_name[0] == '.') continue;
            char target[512];
            ssize_t n = readlink((dir + "/" + e->d_name).c_str(), target, sizeof target - 1);
            out += std::string(e->d_name) + "->" + std::string(target, n > 0 ? static_cast<size_t>(n) : 0) + " ";
        }
        closedir(dp);
    }
    return out;
}

// A connection the host has just dropped is closed by the daemon only when it
// next reads it; give it a moment before counting.
inline int settledFdCount(const SimDevice &d, int expected) {
    int n = d.tolkdFdCount();
    for (int i = 0; i < 100 && n != expected; i++) {
        usleep(20 * 1000);
        n = d.tolkdFdCount();
    }
    return n;
}

// The descriptor count once it has stopped changing.
inline int stableFdCount(const SimDevice &d) {
    int n = d.tolkdFdCount(), prev = -2;
    for (int i = 0; i < 50 && n != prev; i++) {
        usleep(40 * 1000);
        prev = n;
        n = d.tolkdFdCount();
    }
    return n;
}

// The descriptor count with no adb connection open: a local command on a new
// connection replaces any held one, and the daemon closes it once the host has.
inline int baselineFds(SimDevice &d) {
    d.at("AT+CSDF?", true);
    return stableFdCount(d);
}

// Resident memory of the daemon in kB (VmRSS), -1 when unknown.
inline long tolkdRssKb(const SimDevice &d) {
    std::ifstream in("/proc/" + std::to_string(d.tolkdPid()) + "/status");
    std::string line;
    while (std::getline(in, line))
        if (line.compare(0, 6, "VmRSS:") == 0) return atol(line.c_str() + 6);
    return -1;
}

// The daemon is alive, serves a local command on the serial port and on adb, and
// has as many descriptors open as it had at fdsBefore.
inline void expectServing(SimDevice &d, int fdsBefore, const char *when) {
    SCOPED_TRACE(when);
    ASSERT_EQ(-1, d.tolkdExitStatus(0)) << "tolkd ended";
    std::string serial = d.at("AT+CSDF?");
    EXPECT_NE(std::string::npos, serial.find(kCsdfAnswer)) << "serial: " << visible(serial);
    EXPECT_EQ(visible(kCsdfAnswer), visible(d.at("AT+CSDF?", true)));
    EXPECT_EQ(fdsBefore, settledFdCount(d, fdsBefore)) << "descriptors leaked or lost: " << tolkdFdList(d);
}

}  // namespace fault_checks

#endif
