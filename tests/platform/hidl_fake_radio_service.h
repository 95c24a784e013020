// An in-test radio service: listens on the socket of one instance under the
// current device root, records the frames its clients send and lets the test
// answer, indicate or cut the connections.
#ifndef TOLK_TESTS_HIDL_FAKE_RADIO_SERVICE_H
#define TOLK_TESTS_HIDL_FAKE_RADIO_SERVICE_H

#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <condition_variable>
#include <cstring>
#include <filesystem>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <tolk_platform/radio_wire.h>

struct FakeRadioFrame {
    uint32_t type;
    int32_t serial;
    std::string payload;
    int connection;  // 0 for the first client connection, 1 for the next ...
};

class FakeRadioService {
public:
    // socketPath: host path of the instance's socket (TestRoot::at of the device path).
    explicit FakeRadioService(const std::string &socketPath) : path_(socketPath) {
        std::filesystem::create_directories(std::filesystem::path(path_).parent_path());
        listenFd_ = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
        sockaddr_un addr{};
        addr.sun_family = AF_UNIX;
        std::strncpy(addr.sun_path, path_.c_str(), sizeof(addr.sun_path) - 1);
        if (bind(listenFd_, reinterpret_cast<sockaddr *>(&addr), sizeof(addr)) != 0 || listen(listenFd_, 4) != 0) {
            close(listenFd_);
            listenFd_ = -1;
            return;
        }
        acceptThread_ = std::thread([this] { acceptLoop(); });
    }
    ~FakeRadioService() {
        stop();
        dropConnections();
        for (auto &t : readers_) t.join();
    }

    bool ok() const { return listenFd_ >= 0 || stopped_; }
    // Stops accepting: the instance is gone for new getService calls.
    void stop() {
        if (stopped_) return;
        stopped_ = true;
        unlink(path_.c_str());
        if (listenFd_ < 0) return;
        shutdown(listenFd_, SHUT_RDWR);
        acceptThread_.join();
        close(listenFd_);
    }
    // Ends every client connection, as a dying service would.
    void dropConnections() {
        std::lock_guard<std::mutex> lock(mutex_);
        for (int fd : clients_) {
            if (fd >= 0) shutdown(fd, SHUT_RDWR);
        }
    }
    bool waitFrames(size_t count) {
        std::unique_lock<std::mutex> lock(mutex_);
        return cv_.wait_for(lock, std::chrono::seconds(3), [&] { return frames_.size() >= count; });
    }
    std::vector<FakeRadioFrame> frames() {
        std::lock_guard<std::mutex> lock(mutex_);
        return frames_;
    }
    int connections() {
        std::lock_guard<std::mutex> lock(mutex_);
        return static_cast<int>(clients_.size());
    }
    // Sends to the newest client connection; false when there is none.
    bool send(uint32_t type, const std::string &payload) {
        std::lock_guard<std::mutex> lock(mutex_);
        if (clients_.empty() || clients_.back() < 0) return false;
        return radio_wire_send(clients_.back(), type, -1, 0, payload.data(), static_cast<uint32_t>(payload.size())) ==
               0;
    }
    bool respond(const std::string &payload) { return send(RADIO_WIRE_RESPONSE, payload); }
    bool indicate(const std::string &payload) { return send(RADIO_WIRE_INDICATION, payload); }

private:
    void acceptLoop() {
        for (;;) {
            int fd = accept4(listenFd_, nullptr, nullptr, SOCK_CLOEXEC);
            if (fd < 0 && errno == EINTR) continue;
            if (fd < 0) return;
            std::lock_guard<std::mutex> lock(mutex_);
            int index = static_cast<int>(clients_.size());
            clients_.push_back(fd);
            readers_.emplace_back([this, fd, index] { readLoop(fd, index); });
        }
    }
    void readLoop(int fd, int index) {
        std::vector<char> buf(RADIO_WIRE_MAX_PAYLOAD);
        RadioWireHeader hdr;
        while (radio_wire_recv(fd, &hdr, buf.data(), buf.size()) == 0) {
            std::lock_guard<std::mutex> lock(mutex_);
            frames_.push_back(FakeRadioFrame{hdr.type, hdr.serial, std::string(buf.data(), hdr.length), index});
            cv_.notify_all();
        }
        std::lock_guard<std::mutex> lock(mutex_);
        // Closed here only, so the number cannot be reused under a sender.
        close(fd);
        clients_[index] = -1;
    }

    std::string path_;
    int listenFd_ = -1;
    bool stopped_ = false;
    std::thread acceptThread_;
    std::vector<std::thread> readers_;
    std::mutex mutex_;
    std::condition_variable cv_;
    std::vector<int> clients_;
    std::vector<FakeRadioFrame> frames_;
};

#endif
