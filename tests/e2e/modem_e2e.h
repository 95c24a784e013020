// Small helpers shared by the modem and generic end-to-end tests: a host link
// held open across commands (so unsolicited output can be watched), and access
// to the simulated services' scripts and journals.
#ifndef TOLK_TESTS_E2E_MODEM_E2E_H
#define TOLK_TESTS_E2E_MODEM_E2E_H

#include "sim_device.h"

#include <gtest/gtest.h>
#include <unistd.h>

#include <string>

namespace modem_e2e {

// One host link kept open. On the serial link the line discipline echoes what
// the host types, so the link is normally opened with ATE0 first and its answer
// drained; echoOff false keeps the echo (and the port settings of the open).
class HostLink {
public:
    HostLink(SimDevice &dev, bool adb, bool echoOff = true) : adb_(adb) {
        fd_ = adb ? dev.connectAdb() : dev.openSerial();
        EXPECT_GE(fd_, 0) << (adb ? "adb" : "serial") << " link";
        if (!adb && fd_ >= 0 && echoOff) {
            writeAll(fd_, "ATE0\r");
            readQuiet(fd_, 300);
        }
    }
    ~HostLink() {
        if (fd_ >= 0) close(fd_);
    }
    HostLink(const HostLink &) = delete;
    HostLink &operator=(const HostLink &) = delete;

    // Sends bytes as they are and returns what arrived until the link was quiet.
    std::string send(const std::string &bytes, int quietMs = 400) {
        writeAll(fd_, bytes);
        return readQuiet(fd_, quietMs, 8000);
    }
    // A command line with the link's own line end (CR; the serial port turns it
    // into the LF that ends a canonical line).
    std::string cmd(const std::string &line, int quietMs = 400) { return send(line + "\r", quietMs); }
    std::string until(const std::string &needle, int timeoutMs = 5000) { return readUntil(fd_, needle, timeoutMs); }
    std::string quiet(int quietMs = 400) { return readQuiet(fd_, quietMs, 8000); }
    int fd() const { return fd_; }
    bool adb() const { return adb_; }

private:
    int fd_ = -1;
    bool adb_;
};

// The requests a slot received, one rendered request per line as the daemon sent
// them. The journal's lines are "SERIAL<TAB>REQUEST[<TAB>refused: WHY]"; the
// daemon sends every request with serial -1, and a refused request keeps its
// reason here so that no comparison with well-formed requests can pass.
inline std::string radioJournal(const SimDevice &dev, int slot) {
    std::string raw = dev.readFile("/journal/radio.slot" + std::to_string(slot) + ".log"), out;
    size_t pos = 0;
    while (pos < raw.size()) {
        size_t end = raw.find('\n', pos);
        if (end == std::string::npos) end = raw.size();
        std::string line = raw.substr(pos, end - pos);
        pos = end + 1;
        const std::string serial = "-1\t";
        EXPECT_EQ(line.compare(0, serial.size(), serial), 0) << "journal line: " << line;
        out += (line.compare(0, serial.size(), serial) == 0 ? line.substr(serial.size()) : line) + "\n";
    }
    return out;
}
inline std::string genericJournal(const SimDevice &dev) { return dev.readFile("/journal/generic.log"); }
inline void radioScript(const SimDevice &dev, const std::string &text) { dev.writeFile("/sim/radio/script", text); }
inline void genericScript(const SimDevice &dev, const std::string &text) {
    dev.writeFile("/sim/generic/script", text);
}
inline void releaseGeneric(const SimDevice &dev) { dev.writeFile("/sim/generic/release", ""); }

// The device with the modem reachable: production build, user mode opened.
inline std::vector<std::string> openModem(std::vector<std::string> more = {}) {
    std::vector<std::string> args = {"--prop", "persist.service.tolk.usermode=1"};
    args.insert(args.end(), more.begin(), more.end());
    return args;
}

}  // namespace modem_e2e

#endif
