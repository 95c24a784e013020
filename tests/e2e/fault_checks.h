// Checks shared by the fault and soak tests: after whatever was done to it, the
// daemon still runs, answers a local command on both host links and holds no
// more descriptors than before.
#ifndef TOLK_TESTS_E2E_FAULT_CHECKS_H
#define TOLK_TESTS_E2E_FAULT_CHECKS_H

#include <dirent.h>
#include <unistd.h>

#include <fstream>
#include <string>

#include <gtest/gtest.h>

#include "sim_device.h"

namespace fault_checks {

// What a local query answers on a link whose echo is off (adb always).
const char kCsdfAnswer[] = "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n";

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
