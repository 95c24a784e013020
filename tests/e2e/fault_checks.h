// Checks shared by the fault and soak tests: after whatever was done to the
// device, the daemon still runs, answers a local command on both host links and
// holds as many descriptors as before.
#ifndef TOLK_TESTS_E2E_FAULT_CHECKS_H
#define TOLK_TESTS_E2E_FAULT_CHECKS_H

#include <unistd.h>

#include <gtest/gtest.h>

#include "sim_device.h"

// What a local query answers on a link whose echo is off (adb always).
const char kCsdfAnswer[] = "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n";

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

#endif
