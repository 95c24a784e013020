// Helpers of the serial-link tests: a pseudo-terminal standing in for the serial
// port, a clean host-link record per test, and a reader of what arrived.
#ifndef TOLK_TESTS_UNIT_SERIAL_TEST_UTIL_H
#define TOLK_TESTS_UNIT_SERIAL_TEST_UTIL_H

#include <gtest/gtest.h>

#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <string.h>
#include <termios.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "serial/response_writer.h"
#include "serial/serial_device.h"

namespace serial_test {

struct Pty {
    Pty() : master(posix_openpt(O_RDWR | O_NOCTTY)) {
        if (master >= 0 && grantpt(master) == 0 && unlockpt(master) == 0 && ptsname(master) != nullptr) {
            slavePath = ptsname(master);
        }
    }
    ~Pty() {
        if (master >= 0) close(master);
    }
    bool ok() const { return !slavePath.empty(); }
    int master;
    std::string slavePath;
};

// Reads from fd until want bytes came, or (want 0) until it is quiet for timeoutMs.
inline std::string readFor(int fd, size_t want, int timeoutMs = 500) {
    std::string got;
    char buf[4096];
    struct pollfd p = {fd, POLLIN, 0};
    while ((want == 0 || got.size() < want) && poll(&p, 1, timeoutMs) > 0) {
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n <= 0) break;
        got.append(buf, static_cast<size_t>(n));
    }
    return got;
}

// A freshly reset record per test, descriptors closed afterwards, and no device root
// so that pseudo-terminal paths open as they are.
class SerialFixture : public ::testing::Test {
protected:
    void SetUp() override {
        if (const char *root = getenv("TOLKD_ROOT")) savedRoot_ = root;
        unsetenv("TOLKD_ROOT");
        reset();
    }
    void TearDown() override {
        for (int fd : gSerialDevice.fd) {
            if (fd >= 0) close(fd);
        }
        for (int fd : owned_) close(fd);
        reset();
        if (!savedRoot_.empty()) setenv("TOLKD_ROOT", savedRoot_.c_str(), 1);
    }
    int own(int fd) {
        owned_.push_back(fd);
        return fd;
    }

private:
    static void reset() {
        initSerialDevice(&gSerialDevice);
        memset(&last_deviceOptions, 0, sizeof(last_deviceOptions));
        gNumericMode = false;
    }
    std::vector<int> owned_;
    std::string savedRoot_;
};

}  // namespace serial_test

#endif
