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
#include "host_capture.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"
#include "test_root.h"

inline void closeIfOpen(int &fd) {
    if (fd >= 0) close(fd);
    fd = -1;
}

class TargetLinks : public ::testing::Test {
protected:
    void SetUp() override {
        ASSERT_TRUE(host_.ok());
        isATCmdInject = false;
        isMsgCmdInput = false;
        mmiCmdSeqReset();
        s_fdRild_command = s_fdService_command = s_fdAudio_command = s_fdAudioExt_command = -1;
    }
    void TearDown() override {
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
    std::string hostOutput(int waitMs = 300) { return host_.drain(waitMs); }

    TestRoot root_;
    HostCapture host_;
    std::vector<int> extra_;
};

#endif
