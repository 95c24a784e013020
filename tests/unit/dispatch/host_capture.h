// Test helper: stands in for the host end of the serial link. Everything the
// daemon writes to the current link (currDevice 0) can be read back as bytes.
#ifndef TOLK_TESTS_DISPATCH_HOST_CAPTURE_H
#define TOLK_TESTS_DISPATCH_HOST_CAPTURE_H

#include <fcntl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "serial/response_writer.h"
#include "serial/serial_device.h"

class HostCapture {
public:
    HostCapture() {
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds_) != 0) {
            fds_[0] = fds_[1] = -1;
            return;
        }
        fcntl(fds_[1], F_SETFL, O_NONBLOCK);
        savedFd_ = gSerialDevice.fd[DEVICE_SERIAL];
        savedDevice_ = gSerialDevice.currDevice;
        savedNumeric_ = gNumericMode;
        gSerialDevice.fd[DEVICE_SERIAL] = fds_[0];
        gSerialDevice.currDevice = DEVICE_SERIAL;
        gNumericMode = false;
    }
    ~HostCapture() {
        gSerialDevice.fd[DEVICE_SERIAL] = savedFd_;
        gSerialDevice.currDevice = savedDevice_;
        gNumericMode = savedNumeric_;
        if (fds_[0] >= 0) close(fds_[0]);
        if (fds_[1] >= 0) close(fds_[1]);
    }
    HostCapture(const HostCapture &) = delete;
    HostCapture &operator=(const HostCapture &) = delete;

    // Everything written since the last call.
    std::string take() {
        std::string out;
        char buf[4096];
        for (;;) {
            ssize_t n = read(fds_[1], buf, sizeof(buf));
            if (n <= 0) break;
            out.append(buf, static_cast<size_t>(n));
        }
        return out;
    }

private:
    int fds_[2] = {-1, -1};
    int savedFd_ = -1;
    int savedDevice_ = 0;
    bool savedNumeric_ = false;
};

#endif
