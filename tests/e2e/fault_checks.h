// Checks shared by the fault and soak tests: a host link held open across
// commands, and, after whatever was done to the device, a daemon that still
// runs, answers a local command on both host links and holds as many
// descriptors as before.
#ifndef TOLK_TESTS_E2E_FAULT_CHECKS_H
#define TOLK_TESTS_E2E_FAULT_CHECKS_H

#include <poll.h>
#include <unistd.h>

#include <string>
#include <vector>

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
    // result line ("OK", "ERROR", "ERROR:No Modem"...), or when ms passed quietly.
    std::string ask(const std::string &line, int ms = 3000) {
        writeAll(fd_, line + "\r");
        return answer(ms);
    }
    std::string answer(int ms = 3000) {
        std::string got;
        char buf[4096];
        for (struct pollfd p = {fd_, POLLIN, 0}; !finished(got) && poll(&p, 1, ms) == 1;) {
            ssize_t n = read(fd_, buf, sizeof buf);
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
        size_t n = got.size(), cut = n > 2 ? got.rfind("\r\n", n - 3) : std::string::npos;
        if (cut == std::string::npos || got.compare(n - 2, 2, "\r\n") != 0) return false;
        std::string last = got.substr(cut + 2, n - cut - 4);
        return last == "OK" || last.compare(0, 5, "ERROR") == 0;
    }
    int fd_;
};

// How often needle occurs in text (requests in a peer's journal).
inline int countOf(const std::string &text, const std::string &needle) {
    int n = 0;
    for (size_t pos = 0; (pos = text.find(needle, pos)) != std::string::npos; pos += needle.size()) n++;
    return n;
}

// A tolk-sim subcommand on the device that must succeed (stop, start, replug...).
inline void simOk(SimDevice &d, const std::vector<std::string> &args) {
    int status = -1;
    std::string out = d.sim(args, &status);
    ASSERT_EQ(0, status) << args[0] << ": " << out;
}

// The daemon's descriptor count once it is want, or (want < 0) once it has
// stopped changing: a connection the host dropped is closed when the daemon
// next reads it.
inline int settledFds(const SimDevice &d, int want = -1) {
    int n = d.tolkdFdCount(), prev = -2;
    for (int i = 0; i < 100 && n != want && (want >= 0 || n != prev); i++) {
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
    return settledFds(d);
}

// The daemon is alive, serves a local command on the serial port and on adb, and
// has as many descriptors open as it had at fdsBefore.
inline void expectServing(SimDevice &d, int fdsBefore, const char *when) {
    SCOPED_TRACE(when);
    ASSERT_EQ(-1, d.tolkdExitStatus(0)) << "tolkd ended";
    std::string serial = d.at("AT+CSDF?");
    EXPECT_NE(std::string::npos, serial.find(kCsdfAnswer)) << "serial: " << visible(serial);
    EXPECT_EQ(visible(kCsdfAnswer), visible(d.at("AT+CSDF?", true)));
    EXPECT_EQ(fdsBefore, settledFds(d, fdsBefore)) << "descriptors leaked or lost";
}

}  // namespace fault_checks

#endif
