// Test helper: the host end of the serial link (currDevice 0). Everything the
// daemon writes to the host can be read back as bytes.
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
        if (socketpair(AF_UNIX, SOCK_STREAM, 0, fds_) != 0) return;
        fcntl(fds_[1], F_SETFL, O_NONBLOCK);
        gSerialDevice.fd[DEVICE_SERIAL] = fds_[0];
        gSerialDevice.currDevice = DEVICE_SERIAL;
        gNumericMode = false;
    }
    ~HostCapture() {
        gSerialDevice.fd[DEVICE_SERIAL] = -1;
        close(fds_[0]);
        close(fds_[1]);
    }

    // Everything written since the last call.
    std::string take() {
        std::string out;
        char buf[4096];
        ssize_t n;
        while ((n = read(fds_[1], buf, sizeof(buf))) > 0) out.append(buf, static_cast<size_t>(n));
        return out;
    }

private:
    int fds_[2] = {-1, -1};
};

#endif
