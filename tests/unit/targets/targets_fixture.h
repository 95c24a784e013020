// Shared set-up of the target-link tests: a fresh device root, a host link whose far
// end the test reads, and every link and counter of the subsystem back at rest.
#ifndef TOLK_TESTS_UNIT_TARGETS_FIXTURE_H
#define TOLK_TESTS_UNIT_TARGETS_FIXTURE_H

#include <gtest/gtest.h>

#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "core/reader.h"
#include "dispatch/dispatcher.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"
#include "test_root.h"

// Everything fd delivers until it stays quiet for a moment.
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

inline void closeIfOpen(int &fd) {
    if (fd >= 0) close(fd);
    fd = -1;
}

class TargetLinks : public ::testing::Test {
protected:
    void SetUp() override {
        int host[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, host));
        gSerialDevice.fd[DEVICE_SERIAL] = host[0];
        gSerialDevice.currDevice = DEVICE_SERIAL;
        host_ = host[1];
        gNumericMode = false;
        isATCmdInject = false;
        isMsgCmdInput = false;
        mmiCmdSeqReset();
        s_fdRild_command = s_fdService_command = s_fdAudio_command = s_fdAudioExt_command = -1;
    }
    void TearDown() override {
        closeIfOpen(gSerialDevice.fd[DEVICE_SERIAL]);
        closeIfOpen(host_);
        closeIfOpen(s_fdRild_command);
        closeIfOpen(s_fdService_command);
        closeIfOpen(s_fdAudio_command);
        closeIfOpen(s_fdAudioExt_command);
        for (int &fd : extra_) closeIfOpen(fd);
    }

    // A connected pair: *global gets the daemon's end, the peer end is returned.
    int link(int *global) {
        int fds[2];
        EXPECT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, fds));
        *global = fds[0];
        extra_.push_back(fds[1]);
        return fds[1];
    }
    // A service listening on a reserved-namespace name under the test root.
    int listenOn(const char *name) {
        int fd = tolk_local_server(name, ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 4);
        EXPECT_GE(fd, 0) << name;
        extra_.push_back(fd);
        return fd;
    }
    int acceptFrom(int listenFd) {
        pollfd p{listenFd, POLLIN, 0};
        if (poll(&p, 1, 2000) <= 0) return -1;
        int fd = accept(listenFd, nullptr, nullptr);
        extra_.push_back(fd);
        return fd;
    }
    void sendAll(int fd, const std::string &data) {
        ASSERT_EQ(static_cast<ssize_t>(data.size()), send(fd, data.data(), data.size(), MSG_NOSIGNAL));
    }
    std::string hostOutput(int waitMs = 300) { return drainFd(host_, waitMs); }

    TestRoot root_;
    int host_ = -1;
    std::vector<int> extra_;
};

#endif
