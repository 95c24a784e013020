// The host end of the serial link for unit tests: the serial slot of gSerialDevice
// becomes one end of a socket pair (and the current host link), so everything the
// daemon writes to the host can be read back from the other end as bytes.
#ifndef TOLK_TESTS_SUPPORT_HOST_CAPTURE_H
#define TOLK_TESTS_SUPPORT_HOST_CAPTURE_H

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "serial/response_writer.h"
#include "serial/serial_device.h"

// Everything fd holds right now, without waiting.
inline std::string readAvailable(int fd) {
    std::string out;
    char buf[4096];
    ssize_t n;
    while ((n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT)) > 0) out.append(buf, static_cast<size_t>(n));
    return out;
}

// Everything fd delivers: waits up to firstWaitMs for the first bytes, then reads
// until it stays quiet for 50 ms.
inline std::string drainFd(int fd, int firstWaitMs = 300) {
    std::string out;
    char buf[16384];
    int wait = firstWaitMs;
    for (;;) {
        pollfd p{fd, POLLIN, 0};
        if (poll(&p, 1, wait) <= 0) break;
        ssize_t n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT);
        if (n <= 0) break;
        out.append(buf, static_cast<size_t>(n));
        wait = 50;
    }
    return out;
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
    // The host's end.
    int fd() const { return fds_[1]; }
    // Everything written since the last call, without waiting.
    std::string take() { return readAvailable(fds_[1]); }
    // Everything written, waiting up to firstWaitMs for it to start.
    std::string drain(int firstWaitMs = 300) { return drainFd(fds_[1], firstWaitMs); }

private:
    int fds_[2] = {-1, -1};
};

#endif
