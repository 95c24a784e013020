// The radio HAL bridge tests' radio service: listens on the socket of one instance under the
// current device root, records the frames its clients send and lets the test
// answer, indicate or cut the connections. It has no thread of its own: every
// call first takes in the connections and frames that have arrived, so only the
// test's thread ever touches it.
#ifndef TOLK_TESTS_HAL_FAKE_RADIO_SERVICE_H
#define TOLK_TESTS_HAL_FAKE_RADIO_SERVICE_H

#include <cutils/sockets.h>
#include <gtest/gtest.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <vector>

#include <tolk_platform/local_socket.h>
#include <tolk_platform/radio_wire.h>

#include "eventually.h"

struct FakeRadioFrame {
    uint32_t type;
    int32_t serial;
    std::string payload;
    int connection;  // 0 for the first client connection, 1 for the next ...
};

class FakeRadioService {
public:
    // socketPath: host path of the instance's socket (TestRoot::at of the device path).
    explicit FakeRadioService(const std::string &socketPath)
        : listenFd_(tolk_local_server(socketPath.c_str(), ANDROID_SOCKET_NAMESPACE_FILESYSTEM, SOCK_STREAM,
                                      kBacklog)) {
        EXPECT_GE(listenFd_, 0) << socketPath;
    }
    ~FakeRadioService() {
        for (int fd : clients_)
            if (fd >= 0) close(fd);
        if (listenFd_ >= 0) close(listenFd_);
    }

    // Ends every client connection, as a dying service would.
    void dropConnections() {
        takeArrivals();
        for (int fd : clients_) shutdown(fd, SHUT_RDWR);  // a gone client's -1 is refused harmlessly
    }
    bool waitFrames(size_t n) { return eventually([&] { return takeArrivals(), frames_.size() >= n; }); }
    const std::vector<FakeRadioFrame> &frames() { return takeArrivals(), frames_; }
    int connections() { return takeArrivals(), static_cast<int>(clients_.size()); }
    // Sends to the newest client connection; false when there is none.
    bool send(uint32_t type, const std::string &payload) {
        takeArrivals();
        if (clients_.empty() || clients_.back() < 0) return false;
        uint32_t length = static_cast<uint32_t>(payload.size());
        return radio_wire_send(clients_.back(), type, -1, 0, payload.data(), length) == 0;
    }

private:
    // Accepts waiting clients and reads their frames, until nothing more is there.
    void takeArrivals() {
        for (bool more = true; more;) {
            std::vector<pollfd> fds = {{listenFd_, POLLIN, 0}};
            for (int fd : clients_) fds.push_back({fd, POLLIN, 0});  // poll skips the closed (-1)
            more = poll(fds.data(), fds.size(), 0) > 0;
            if (more && fds[0].revents != 0) {
                int fd = accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
                if (fd >= 0) clients_.push_back(fd);
                more = fd >= 0;
            }
            for (size_t i = 1; i < fds.size(); i++) {
                RadioWireHeader hdr;
                if (fds[i].revents == 0) continue;
                if (radio_wire_recv(fds[i].fd, &hdr, buf_.data(), buf_.size()) == 0) {
                    std::string payload(buf_.data(), hdr.length);
                    frames_.push_back({hdr.type, hdr.serial, payload, static_cast<int>(i) - 1});
                } else {
                    close(fds[i].fd);  // the client has gone
                    clients_[i - 1] = -1;
                }
            }
        }
    }

    static const int kBacklog = 4;
    int listenFd_;
    std::vector<int> clients_;
    std::vector<FakeRadioFrame> frames_;
    std::vector<char> buf_ = std::vector<char>(RADIO_WIRE_MAX_PAYLOAD);
};

#endif
