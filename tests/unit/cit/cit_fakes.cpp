#include "cit_fakes.h"

#include <errno.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <stdexcept>

#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include "cit/cit_cmd.h"
#include "serial/serial_device.h"

FakeTestApp::FakeTestApp() {
    listen_ = tolk_local_server(CIT_SOCKET_NAME, ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM, 4);
    if (listen_ < 0) throw std::runtime_error("cannot serve the test application socket");
    if (pipe(stop_) != 0) throw std::runtime_error("pipe");
    thread_ = std::thread([this] { serve(); });
}

FakeTestApp::~FakeTestApp() {
    char c = 'x';
    (void)!write(stop_[1], &c, 1);
    thread_.join();
    close(listen_);
    close(stop_[0]);
    close(stop_[1]);
}

void FakeTestApp::reply(const std::string &word, const std::string &text) {
    std::lock_guard<std::mutex> lock(mutex_);
    replies_[word] = text;
}

void FakeTestApp::serve() {
    for (;;) {
        pollfd fds[2] = {{listen_, POLLIN, 0}, {stop_[0], POLLIN, 0}};
        if (poll(fds, 2, -1) < 0) {
            if (errno == EINTR) continue;
            return;
        }
        if (fds[1].revents != 0) return;
        int conn = accept(listen_, nullptr, nullptr);
        if (conn < 0) continue;
        bool stop = serveConnection(conn);
        close(conn);
        if (stop) return;
    }
}

// Serves one connection until the daemon closes it; true when the test ends.
bool FakeTestApp::serveConnection(int conn) {
    std::string pending;
    for (;;) {
        pollfd fds[2] = {{conn, POLLIN, 0}, {stop_[0], POLLIN, 0}};
        if (poll(fds, 2, -1) < 0) {
            if (errno == EINTR) continue;
            return true;
        }
        if (fds[1].revents != 0) return true;
        char buf[256];
        ssize_t n = read(conn, buf, sizeof(buf));
        if (n <= 0) return false;
        pending.append(buf, static_cast<size_t>(n));
        size_t nul;
        while ((nul = pending.find('\0')) != std::string::npos) {
            std::string word = pending.substr(0, nul);
            pending.erase(0, nul + 1);
            std::string text = "OK";
            {
                std::lock_guard<std::mutex> lock(mutex_);
                if (replies_.count(word) != 0) text = replies_[word];
            }
            (void)!send(conn, text.data(), text.size(), MSG_NOSIGNAL);
        }
    }
}

std::string framedVerdict(const std::string &text, bool ok) {
    const std::string result = ok ? "OK" : "ERROR";
    if (text.empty()) return "\r\n" + result + "\r\n";
    return "\r\n" + text + "\r\n" + result + "\r\n";
}
