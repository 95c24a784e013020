// Unit-test links: reading what arrived on a descriptor, and the host end of the
// serial link, whose serial slot in gSerialDevice becomes one end of a socket pair
// (and the current host link) so that everything the daemon writes to the host
// can be read back as bytes.
#ifndef TOLK_TESTS_SUPPORT_HOST_CAPTURE_H
#define TOLK_TESTS_SUPPORT_HOST_CAPTURE_H

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "serial/response_writer.h"
#include "serial/serial_device.h"

// Everything fd delivers: waits up to firstWaitMs for the first bytes, then reads
// until it stays quiet for quietMs (0 and 0: what is there right now).
inline std::string drainFd(int fd, int firstWaitMs = 300, int quietMs = 50) {
    std::string out;
    char buf[16384];
    pollfd p{fd, POLLIN, 0};
    for (int wait = firstWaitMs; poll(&p, 1, wait) > 0; wait = quietMs) {
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n <= 0) break;
        out.append(buf, static_cast<size_t>(n));
    }
    return out;
}

inline void writeAll(int fd, const std::string &s) {
    ASSERT_EQ(static_cast<ssize_t>(s.size()), write(fd, s.data(), s.size()));
}

class HostCapture {
public:
    // Text answers start in verbose mode, as after the daemon's start.
    HostCapture() {
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds_) != 0) return;
        gSerialDevice.fd[DEVICE_SERIAL] = fds_[0];
        gSerialDevice.currDevice = DEVICE_SERIAL;
        gNumericMode = false;
    }
    // The daemon closes the serial slot itself after a fatal error on it; only an
    // end it still holds is ours to close.
    ~HostCapture() {
        int &slot = gSerialDevice.fd[DEVICE_SERIAL];
        if (slot >= 0 && slot == fds_[0]) close(slot);
        slot = -1;
        if (fds_[1] >= 0) close(fds_[1]);
    }
    HostCapture(const HostCapture &) = delete;
    HostCapture &operator=(const HostCapture &) = delete;

    bool ok() const { return fds_[1] >= 0; }
    // Everything written so far, without waiting.
    std::string take() { return drainFd(fds_[1], 0, 0); }
    // Everything written, waiting up to firstWaitMs for it to start.
    std::string drain(int firstWaitMs = 300) { return drainFd(fds_[1], firstWaitMs); }

private:
    int fds_[2] = {-1, -1};
};

#endif
