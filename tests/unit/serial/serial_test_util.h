// Helpers of the serial-link tests: a pseudo-terminal standing in for the gadget
// serial port, a clean host-link record per test, and readers of what was written.
#ifndef TOLK_TESTS_UNIT_SERIAL_TEST_UTIL_H
#define TOLK_TESTS_UNIT_SERIAL_TEST_UTIL_H

#include <gtest/gtest.h>

#include <errno.h>
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

// A pseudo-terminal pair; the slave path plays the serial port.
class Pty {
public:
    Pty() {
        master_ = posix_openpt(O_RDWR | O_NOCTTY);
        if (master_ < 0 || grantpt(master_) != 0 || unlockpt(master_) != 0) return;
        const char *name = ptsname(master_);
        if (name != nullptr) slavePath_ = name;
    }
    ~Pty() {
        if (master_ >= 0) close(master_);
    }
    Pty(const Pty &) = delete;
    Pty &operator=(const Pty &) = delete;

    bool ok() const { return master_ >= 0 && !slavePath_.empty(); }
    int master() const { return master_; }
    const std::string &slavePath() const { return slavePath_; }

private:
    int master_ = -1;
    std::string slavePath_;
};

// Reads what is available on fd within timeoutMs, until want bytes have come
// (want 0: until the link stays quiet for timeoutMs).
inline std::string readFor(int fd, size_t want, int timeoutMs = 500) {
    std::string got;
    char buf[4096];
    for (;;) {
        if (want != 0 && got.size() >= want) break;
        struct pollfd p = {fd, POLLIN, 0};
        if (poll(&p, 1, timeoutMs) <= 0) break;
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n <= 0) break;
        got.append(buf, static_cast<size_t>(n));
    }
    return got;
}

inline std::string bytes(const char *data, size_t len) { return std::string(data, len); }

// Every test starts from a freshly reset record, with descriptors it owns closed at
// the end, and no device root, so pseudo-terminal paths are opened as they are.
class SerialFixture : public ::testing::Test {
protected:
    void SetUp() override {
        const char *root = getenv("TOLKD_ROOT");
        if (root != nullptr) {
            hadRoot_ = true;
            savedRoot_ = root;
            unsetenv("TOLKD_ROOT");
        }
        initSerialDevice(&gSerialDevice);
        memset(&last_deviceOptions, 0, sizeof(last_deviceOptions));
        gNumericMode = false;
    }
    void TearDown() override {
        for (int &fd : gSerialDevice.fd) {
            if (fd >= 0) close(fd);
            fd = -1;
        }
        for (int fd : owned_) close(fd);
        initSerialDevice(&gSerialDevice);
        memset(&last_deviceOptions, 0, sizeof(last_deviceOptions));
        gNumericMode = false;
        if (hadRoot_) setenv("TOLKD_ROOT", savedRoot_.c_str(), 1);
    }
    // Descriptors the test keeps and the fixture closes (not those in gSerialDevice).
    int own(int fd) {
        owned_.push_back(fd);
        return fd;
    }

private:
    std::vector<int> owned_;
    bool hadRoot_ = false;
    std::string savedRoot_;
};

}  // namespace serial_test

#endif
