// Unit-test links: reading what arrived on a descriptor, socket pairs standing in
// for the daemon's links, the host end of the serial link (its serial slot in
// gSerialDevice becomes one end of a socket pair, and the current host link, so
// that everything the daemon writes to the host can be read back as bytes), and
// a fixture that gives each test a device root, the host link and resting links.
#ifndef TOLK_TESTS_SUPPORT_HOST_CAPTURE_H
#define TOLK_TESTS_SUPPORT_HOST_CAPTURE_H

#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <vector>

#include "core/reader.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"
#include "test_root.h"

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

inline void closeFd(int &fd) {
    if (fd >= 0) close(fd);
    fd = -1;
}

// A connected pair: *daemonEnd gets one end, the other is returned (-1 on failure).
inline int socketLink(int *daemonEnd, int type = SOCK_STREAM) {
    int fds[2] = {-1, -1};
    EXPECT_EQ(0, socketpair(AF_UNIX, type, 0, fds));
    *daemonEnd = fds[0];
    return fds[1];
}

class HostCapture {
public:
    // Text answers start in verbose mode, as after the daemon's start.
    HostCapture()
        : peer_(socketLink(&gSerialDevice.fd[DEVICE_SERIAL])), mine_(gSerialDevice.fd[DEVICE_SERIAL]) {
        gSerialDevice.currDevice = DEVICE_SERIAL;
        gNumericMode = false;
    }
    // The daemon closes the serial slot itself after a fatal error on it; only an
    // end it still holds is ours to close.
    ~HostCapture() {
        int &slot = gSerialDevice.fd[DEVICE_SERIAL];
        if (slot == mine_) closeFd(slot);
        slot = -1;
        closeFd(peer_);
    }
    HostCapture(const HostCapture &) = delete;
    HostCapture &operator=(const HostCapture &) = delete;

    // Everything written so far, without waiting.
    std::string take() { return drainFd(peer_, 0, 0); }
    // Everything written, waiting up to firstWaitMs for it to start.
    std::string drain(int firstWaitMs = 300) { return drainFd(peer_, firstWaitMs); }

private:
    int peer_, mine_;
};

// Each test starts with a fresh device root, the host link captured, no command
// outstanding, no SMS input and an empty MMI queue; the target links and the
// peers link() made are closed afterwards.
class LinkTest : public ::testing::Test {
protected:
    void SetUp() override {
        isATCmdInject = isMsgCmdInput = false;
        mmiCmdSeqReset();
    }
    void TearDown() override {
        for (int *fd : {&s_fdRild_command, &s_fdService_command, &s_fdAudio_command, &s_fdAudioExt_command}) {
            closeFd(*fd);
        }
        for (int &fd : peers) closeFd(fd);
    }
    // A connected pair: *daemonEnd gets one end, the peer end is returned.
    int link(int *daemonEnd) {
        peers.push_back(socketLink(daemonEnd));
        return peers.back();
    }

    TestRoot root;
    HostCapture host;
    std::vector<int> peers;
};

#endif
