// The radio service as the daemon meets it: a real process on real sockets under
// a throw-away root. Its scripts, unsolicited output and the generic service are
// driven end to end by the e2e tests.
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
        if (pid_ > 0) stop();
    }
    int stop() {
        kill(pid_, SIGTERM);
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    TestRoot root_;  // removed with the peer; declared first, made before the fork

private:
    pid_t pid_;
};

// Sends a frame; a non-empty text goes as the daemon sends it, with its NUL.
void sendFrame(int fd, uint32_t type, const std::string &text = "") {
    std::string payload = text.empty() ? text : text + std::string(1, '\0');
    ASSERT_EQ(radio_wire_send(fd, type, -1, 0, payload.data(), static_cast<uint32_t>(payload.size())), 0);
}

// A request with exactly these bytes and serial.
void sendRaw(int fd, int32_t serial, const std::string &payload) {
    ASSERT_EQ(radio_wire_send(fd, RADIO_WIRE_REQUEST, serial, 0, payload.data(), static_cast<uint32_t>(payload.size())),
              0);
}

// The payload of the next frame; "<none>" when nothing comes within ms.
std::string recvFrame(int fd, RadioWireHeader *h, int ms = 2000) {
    struct pollfd p = {fd, POLLIN, 0};
    char buf[4096];
    if (poll(&p, 1, ms) <= 0 || radio_wire_recv(fd, h, buf, sizeof buf) != 0) return "<none>";
    return std::string(buf, h->length);
}

int connectSlot(const Peer &p, int slot) {
    std::string path = p.root_.at("/dev/hwbinder/radio.slot" + std::to_string(slot));
    int fd = -1;
    EXPECT_TRUE(eventually([&] { return (fd = connectUnix(path)) >= 0; })) << path;
    return fd;
}

}  // namespace

TEST(RadioPeer, AnswersOnlyAfterRegisterAndJournalsEveryRequest) {
    Peer peer;
    int fd = connectSlot(peer, 2);
    ASSERT_GE(fd, 0);
    // Before REGISTER nothing comes back, although the request is recorded.
    RadioWireHeader h;
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+CGSN");
    EXPECT_EQ(recvFrame(fd, &h, 300), "<none>");
    sendFrame(fd, RADIO_WIRE_REGISTER);
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+CGSN");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n350000000000002\r\n\r\nOK\r\n");
    EXPECT_EQ(h.type, static_cast<uint32_t>(RADIO_WIRE_RESPONSE));
    EXPECT_EQ(h.serial, -1);
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+CMGS=\"1\"");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n> ");
    EXPECT_EQ(peer.root_.read("/journal/radio.slot2.log"),
              "-1\tAT+CGSN\\x00\n-1\tAT+CGSN\\x00\n-1\tAT+CMGS=\"1\"\\x00\n");
    EXPECT_EQ(peer.root_.read("/journal/radio.slot1.log"), "");

    // The daemon reconnects after it saw the service die: a new connection is
    // served the same way, and the slot's modem has forgotten the unfinished message.
    close(fd);
    fd = connectSlot(peer, 2);
    sendFrame(fd, RADIO_WIRE_REGISTER);
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT");
    EXPECT_EQ(recvFrame(fd, &h), "\r\nOK\r\n");
    close(fd);
    EXPECT_EQ(peer.stop(), 0);
}

TEST(RadioPeer, RefusesWhatIsNoLinePlusNulAndAnswersInRequestOrder) {
    Peer peer;
    peer.root_.write("/sim/radio/script",
                     "AT+SLOW => (delay 300) \\r\\n+SLOW: 1\\r\\n\\r\\nOK\\r\\n\n"
                     "AT+HELD => (hold) \\r\\n+HELD: 1\\r\\n\\r\\nOK\\r\\n\n");
    int fd = connectSlot(peer, 1);
    ASSERT_GE(fd, 0);
    sendFrame(fd, RADIO_WIRE_REGISTER);
    RadioWireHeader h;
    // Each refusal is answered like a line the modem cannot take, with the
    // request's own serial, and leaves the modem as it was.
    const std::string kError = "\r\nERROR\r\n";
    sendRaw(fd, 7, "AT+CSQ");
    EXPECT_EQ(recvFrame(fd, &h), kError);
    EXPECT_EQ(h.serial, 7);
    sendRaw(fd, -1, std::string("AT+CMGS=\"1\"\r\n\0", 14));
    EXPECT_EQ(recvFrame(fd, &h), kError);
    sendRaw(fd, -1, std::string("AT\0AT\0", 6));
    EXPECT_EQ(recvFrame(fd, &h), kError);
    sendRaw(fd, -1, std::string("AT+EMGS=\"1\",,\"hi\"\0", 18));
    EXPECT_EQ(recvFrame(fd, &h), kError);
    sendRaw(fd, -1, std::string("AT+CSQ\0", 7));
    EXPECT_EQ(recvFrame(fd, &h), "\r\n+CSQ: 20,99\r\n\r\nOK\r\n");
    EXPECT_EQ(peer.root_.read("/journal/radio.slot1.log"),
              "7\tAT+CSQ\trefused: no NUL at the end\n"
              "-1\tAT+CMGS=\"1\"\\r\\n\\x00\trefused: line end inside a command line\n"
              "-1\tAT\\x00AT\\x00\trefused: NUL inside the request\n"
              "-1\tAT+EMGS=\"1\",,\"hi\"\\x00\trefused: merged SMS line without its closing quote and CR LF\n"
              "-1\tAT+CSQ\\x00\n");

    // One channel: a slow answer holds back the answers of later requests; a
    // held one released meanwhile follows it.
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+SLOW");
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+HELD");
    sendFrame(fd, RADIO_WIRE_REQUEST, "AT+CGSN");
    ASSERT_TRUE(eventually(
        [&] { return peer.root_.read("/journal/radio.slot1.log").find("CGSN") != std::string::npos; }));
    peer.root_.write("/sim/radio/release", "");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n+SLOW: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n+HELD: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(recvFrame(fd, &h), "\r\n350000000000001\r\n\r\nOK\r\n");
    close(fd);
}
