// The radio service as the daemon meets it: a real process on real sockets under
// a throw-away root, in what the end-to-end tests cannot make it do: stay silent
// before REGISTER, refuse a request with its own serial, and keep answers in
// request order behind a slow or held one. Its journal, scripts and unsolicited
// output are checked by the transcripts.
#include "../../../sim/modem_script.h"
#include "../../../sim/peers.h"

#include <tolk_platform/radio_wire.h>

#include <gtest/gtest.h>

#include "eventually.h"
#include "test_root.h"

#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

using namespace tolksim;

namespace {

// The radio service in a child process, stopped with SIGTERM like tolk-sim does.
class Peer {
public:
    Peer() : pid_(fork()) {
        if (pid_ == 0) _exit(run_radio_peer(root_.path(), {}));
    }
    ~Peer() {
        kill(pid_, SIGTERM);
        int status = 0;
        waitpid(pid_, &status, 0);
        EXPECT_TRUE(WIFEXITED(status) && WEXITSTATUS(status) == 0) << "the service ends cleanly at SIGTERM";
    }
    TestRoot root_;  // removed with the peer; declared first, made before the fork

private:
    pid_t pid_;
};

// Sends a frame with exactly these bytes and serial.
void sendFrame(int fd, uint32_t type, int32_t serial = -1, const std::string &payload = "") {
    ASSERT_EQ(radio_wire_send(fd, type, serial, 0, payload.data(), static_cast<uint32_t>(payload.size())), 0);
}

// The payload of the next frame; "<none>" when nothing comes within ms.
std::string recvFrame(int fd, RadioWireHeader *h, int ms = 2000) {
    struct pollfd p = {fd, POLLIN, 0};
    char buf[4096];
    if (poll(&p, 1, ms) <= 0 || radio_wire_recv(fd, h, buf, sizeof buf) != 0) return "<none>";
    return std::string(buf, h->length);
}

}  // namespace

TEST(RadioPeer, SilentBeforeRegisterRefusesWithTheSerialAndAnswersInRequestOrder) {
    Peer peer;
    peer.root_.write("/sim/radio/script",
                     "AT+SLOW => (delay 300) \\r\\n+SLOW: 1\\r\\n\\r\\nOK\\r\\n\n"
                     "AT+HELD => (hold) \\r\\n+HELD: 1\\r\\n\\r\\nOK\\r\\n\n");
    const std::string socket = peer.root_.at("/dev/hwbinder/radio.slot1");
    int fd = -1;
    ASSERT_TRUE(eventually([&] { return (fd = connectUnix(socket)) >= 0; }));
    const std::string nul(1, '\0');
    RadioWireHeader h;
    sendFrame(fd, RADIO_WIRE_REQUEST, -1, "AT+CGSN" + nul);
    EXPECT_EQ(recvFrame(fd, &h, 300), "<none>");
    sendFrame(fd, RADIO_WIRE_REGISTER);
    // A request that is no line plus its NUL is answered like a line the modem
    // cannot take, with the request's own serial.
    sendFrame(fd, RADIO_WIRE_REQUEST, 7, "AT+CSQ");
    EXPECT_EQ(recvFrame(fd, &h), "\r\nERROR\r\n");
    EXPECT_EQ(h.type, static_cast<uint32_t>(RADIO_WIRE_RESPONSE));
    EXPECT_EQ(h.serial, 7);

    // One channel: a slow answer holds back the answers of later requests; a
    // held one released meanwhile follows it.
    for (const char *request : {"AT+SLOW", "AT+HELD", "AT+CGSN"}) {
        sendFrame(fd, RADIO_WIRE_REQUEST, -1, request + nul);
    }
    ASSERT_TRUE(eventually([&] {
        return peer.root_.read("/journal/radio.slot1.log") ==
               "-1\tAT+CGSN\\x00\n7\tAT+CSQ\trefused: no NUL at the end\n"
               "-1\tAT+SLOW\\x00\n-1\tAT+HELD\\x00\n-1\tAT+CGSN\\x00\n";
    })) << peer.root_.read("/journal/radio.slot1.log");
    peer.root_.write("/sim/radio/release", "");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n+SLOW: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n+HELD: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n350000000000001\r\n\r\nOK\r\n");
    close(fd);
}
