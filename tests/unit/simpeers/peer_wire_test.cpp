// The radio and generic services as the daemon meets them: real processes on
// real sockets under a throw-away root.
#include "../../../sim/modem_script.h"
#include "../../../sim/peers.h"

#include <tolk_platform/radio_wire.h>

#include <gtest/gtest.h>

#include <fcntl.h>
#include <ftw.h>
#include <poll.h>
#include <signal.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/wait.h>
#include <unistd.h>

#include <fstream>
#include <sstream>

using namespace tolksim;

namespace {

int removeEntry(const char *path, const struct stat *, int, struct FTW *) { return remove(path); }

bool waitFor(const std::string &path, int ms = 3000) {
    for (int i = 0; i < ms / 10; i++) {
        int fd = connectUnix(path);
        if (fd >= 0) {
            close(fd);
            return true;
        }
        usleep(10000);
    }
    return false;
}

void spit(const std::string &path, const std::string &text) {
    size_t slash = path.rfind('/');
    makeDirs(path.substr(0, slash));
    std::ofstream(path) << text;
}

// A peer running in a child process, stopped with SIGTERM like tolk-sim does.
class Peer {
public:
    Peer(const char *kind, std::vector<std::string> args = {}) {
        char dir[] = "/tmp/simpeerXXXXXX";
        root_ = mkdtemp(dir);
        pid_ = fork();
        if (pid_ == 0) {
            int rc = std::string(kind) == "radio" ? run_radio_peer(root_, args) : run_generic_peer(root_, args);
            _exit(rc);
        }
    }
    ~Peer() {
        if (pid_ > 0) stop();
        // Not system("rm -rf"): the daemon's libraries linked here journal shell
        // commands instead of running them.
        nftw(root_.c_str(), removeEntry, 16, FTW_DEPTH | FTW_PHYS);
    }
    int stop() {
        kill(pid_, SIGTERM);
        int status = 0;
        waitpid(pid_, &status, 0);
        pid_ = -1;
        return WIFEXITED(status) ? WEXITSTATUS(status) : -1;
    }
    const std::string &root() const { return root_; }

private:
    std::string root_;
    pid_t pid_ = -1;
};

struct Frame {
    uint32_t type = 0;
    int32_t serial = 0;
    std::string payload;
};

bool readable(int fd, int ms) {
    struct pollfd p = {fd, POLLIN, 0};
    return poll(&p, 1, ms) > 0;
}

bool recvFrame(int fd, Frame *f, int ms = 2000) {
    if (!readable(fd, ms)) return false;
    RadioWireHeader h;
    if (recv(fd, &h, sizeof h, MSG_WAITALL) != static_cast<ssize_t>(sizeof h)) return false;
    f->type = h.type;
    f->serial = h.serial;
    f->payload.assign(h.length, '\0');
    return h.length == 0 || recv(fd, &f->payload[0], h.length, MSG_WAITALL) == static_cast<ssize_t>(h.length);
}

void sendFrame(int fd, uint32_t type, const std::string &payload = "") {
    RadioWireHeader h = {type, -1, 0, static_cast<uint32_t>(payload.size())};
    std::string bytes(reinterpret_cast<char *>(&h), sizeof h);
    ASSERT_TRUE(sendAll(fd, (bytes + payload).data(), sizeof h + payload.size()));
}

std::string request(const std::string &line) { return line + std::string(1, '\0'); }

int connectSlot(const Peer &p, int slot) {
    std::string path = p.root() + "/dev/hwbinder/radio.slot" + std::to_string(slot);
    EXPECT_TRUE(waitFor(path)) << path;
    return connectUnix(path);
}

}  // namespace

TEST(RadioPeer, AnswersOnlyAfterRegisterAndJournalsEveryRequest) {
    Peer peer("radio");
    int fd = connectSlot(peer, 2);
    ASSERT_GE(fd, 0);
    // Before REGISTER nothing comes back, although the request is recorded.
    sendFrame(fd, RADIO_WIRE_REQUEST, request("AT+CGSN"));
    Frame f;
    EXPECT_FALSE(recvFrame(fd, &f, 300));
    sendFrame(fd, RADIO_WIRE_REGISTER);
    sendFrame(fd, RADIO_WIRE_REQUEST, request("AT+CGSN"));
    ASSERT_TRUE(recvFrame(fd, &f));
    EXPECT_EQ(f.type, static_cast<uint32_t>(RADIO_WIRE_RESPONSE));
    EXPECT_EQ(f.serial, -1);
    EXPECT_EQ(f.payload, "\r\n350000000000002\r\n\r\nOK\r\n");
    sendFrame(fd, RADIO_WIRE_REQUEST, request("AT+CMGS=\"1\""));
    ASSERT_TRUE(recvFrame(fd, &f));
    EXPECT_EQ(f.payload, "\r\n> ");
    sendFrame(fd, RADIO_WIRE_REQUEST, request("hi\x1a"));
    ASSERT_TRUE(recvFrame(fd, &f));
    EXPECT_EQ(f.payload, "\r\n+CMGS: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(sim::readFileOr(peer.root() + "/journal/radio.slot2.log"),
              "AT+CGSN\\x00\nAT+CGSN\\x00\nAT+CMGS=\"1\"\\x00\nhi\\x1a\\x00\n");
    EXPECT_EQ(sim::readFileOr(peer.root() + "/journal/radio.slot1.log"), "");

    // The daemon reconnects after it saw the service die: a new connection is
    // served the same way, and the slot's modem has forgotten nothing but an
    // unfinished message.
    close(fd);
    fd = connectSlot(peer, 2);
    sendFrame(fd, RADIO_WIRE_REGISTER);
    sendFrame(fd, RADIO_WIRE_REQUEST, request("AT"));
    ASSERT_TRUE(recvFrame(fd, &f));
    EXPECT_EQ(f.payload, "\r\nOK\r\n");
    close(fd);
    EXPECT_EQ(peer.stop(), 0);
    // Stopped means absent, not refusing.
    struct stat st;
    EXPECT_NE(stat((peer.root() + "/dev/hwbinder/radio.slot2").c_str(), &st), 0);
}

TEST(RadioPeer, ScriptsOverrideSplitDelayAndSilence) {
    Peer peer("radio");
    spit(peer.root() + "/sim/radio/script",
         "AT+CSQ => \\r\\n+CSQ: 5,99\\r\\n\\r\\nOK\\r\\n\n"
         "AT+FOO => (none)\n"
         "AT+BAR => (gap 150) (split) \\r\\n+BAR: 1\\r\\n || \\r\\nOK\\r\\n\n"
         "AT+SLOW => (delay 400) \\r\\nOK\\r\\n\n");
    spit(peer.root() + "/sim/radio/slot3.script",
         "AT+CSQ => \\r\\n+CSQ: 3,99\\r\\n\\r\\nOK\\r\\n\n"
         "AT+DIE => (close)\n");
    int fd1 = connectSlot(peer, 1), fd3 = connectSlot(peer, 3);
    sendFrame(fd1, RADIO_WIRE_REGISTER);
    sendFrame(fd3, RADIO_WIRE_REGISTER);
    Frame f;
    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT+CSQ"));
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_EQ(f.payload, "\r\n+CSQ: 5,99\r\n\r\nOK\r\n");
    sendFrame(fd3, RADIO_WIRE_REQUEST, request("at+csq"));
    ASSERT_TRUE(recvFrame(fd3, &f));
    EXPECT_EQ(f.payload, "\r\n+CSQ: 3,99\r\n\r\nOK\r\n");

    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT+FOO"));
    EXPECT_FALSE(recvFrame(fd1, &f, 300));

    // A delayed answer does not hold up the other slots.
    long long t0 = nowMs();
    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT+SLOW"));
    sendFrame(fd3, RADIO_WIRE_REQUEST, request("AT"));
    ASSERT_TRUE(recvFrame(fd3, &f));
    EXPECT_LT(nowMs() - t0, 300);
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_GE(nowMs() - t0, 390);
    EXPECT_EQ(f.payload, "\r\nOK\r\n");

    // Split answers arrive as separate frames, apart in time.
    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT+BAR"));
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_EQ(f.payload, "\r\n+BAR: 1\r\n");
    EXPECT_FALSE(readable(fd1, 80));
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_EQ(f.payload, "\r\nOK\r\n");

    // Editing the script takes effect with the next request.
    spit(peer.root() + "/sim/radio/script", "# nothing\n");
    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT+CSQ"));
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_EQ(f.payload, "\r\n+CSQ: 20,99\r\n\r\nOK\r\n");
    // (close) looks like the death of the service to that client only.
    sendFrame(fd3, RADIO_WIRE_REQUEST, request("AT+DIE"));
    ASSERT_TRUE(readable(fd3, 1000));
    char c;
    EXPECT_EQ(read(fd3, &c, 1), 0);
    sendFrame(fd1, RADIO_WIRE_REQUEST, request("AT"));
    ASSERT_TRUE(recvFrame(fd1, &f));
    EXPECT_EQ(f.payload, "\r\nOK\r\n");
    close(fd1);
    close(fd3);
}

TEST(RadioPeer, UnsolicitedOutputReachesOnlyARegisteredClient) {
    Peer peer("radio");
    int fd = connectSlot(peer, 1);
    ASSERT_TRUE(waitFor(peer.root() + "/run/radio.ctl"));
    // Connected but not registered: nothing to deliver to.
    EXPECT_NE(send_radio_urc(peer.root(), 1, "\r\nRING\r\n"), 0);
    sendFrame(fd, RADIO_WIRE_REGISTER);
    usleep(50000);
    EXPECT_EQ(send_radio_urc(peer.root(), 1, "\r\nRING\r\n"), 0);
    Frame f;
    ASSERT_TRUE(recvFrame(fd, &f));
    EXPECT_EQ(f.type, static_cast<uint32_t>(RADIO_WIRE_INDICATION));
    EXPECT_EQ(f.payload, "\r\nRING\r\n");
    EXPECT_NE(send_radio_urc(peer.root(), 4, "x"), 0);
    EXPECT_NE(send_radio_urc(peer.root(), 7, "x"), 0);
    close(fd);
    peer.stop();
    EXPECT_NE(send_radio_urc(peer.root(), 1, "x"), 0);
}

TEST(GenericPeer, AnswersHoldsAndRecordsMessages) {
    Peer peer("generic");
    std::string sock = peer.root() + "/dev/socket/tolk-service";
    ASSERT_TRUE(waitFor(sock));
    spit(peer.root() + "/sim/generic/script",
         "AT+POWERKEY => (hold) \\r\\n+POWERKEY: 1\\r\\n\\r\\nOK\\r\\n\n"
         "AT+WITOF=2 => \\r\\nERROR\\r\\n\n"
         "AT+BYE => (close)\n");
    int fd = connectUnix(sock);
    ASSERT_GE(fd, 0);
    auto say = [&](const std::string &m) { ASSERT_TRUE(sendAll(fd, m.data(), m.size())); };
    auto hear = [&](int ms) {
        std::string got;
        while (readable(fd, ms)) {
            char buf[256];
            ssize_t n = read(fd, buf, sizeof buf);
            if (n <= 0) break;
            got.append(buf, n);
            ms = 100;
        }
        return got;
    };
    say("AT+FOO");
    EXPECT_EQ(hear(1000), "\r\nOK\r\n");
    say("AT+WITOF=1");
    EXPECT_EQ(hear(1000), "\r\nOK\r\n");
    say("AT+WITOF=2");
    EXPECT_EQ(hear(1000), "\r\nERROR\r\n");
    // MMI feedback is taken in silently.
    say("AT+CPIN=+ORVTOLKJ\r\nOK\r\n;");
    EXPECT_EQ(hear(300), "");
    // A held answer waits for the release file while other commands are served.
    say("AT+POWERKEY");
    EXPECT_EQ(hear(300), "");
    say("AT+OTHER");
    EXPECT_EQ(hear(1000), "\r\nOK\r\n");
    spit(peer.root() + "/sim/generic/release", "");
    EXPECT_EQ(hear(1000), "\r\n+POWERKEY: 1\r\n\r\nOK\r\n");
    struct stat st;
    EXPECT_NE(stat((peer.root() + "/sim/generic/release").c_str(), &st), 0);
    EXPECT_EQ(sim::readFileOr(peer.root() + "/journal/generic.log"),
              "AT+FOO\nAT+WITOF=1\nAT+WITOF=2\nAT+CPIN=+ORVTOLKJ\\r\\nOK\\r\\n;\nAT+POWERKEY\nAT+OTHER\n");
    // (close) ends the link, and the next connection is served.
    say("AT+BYE");
    char c;
    ASSERT_TRUE(readable(fd, 1000));
    EXPECT_EQ(read(fd, &c, 1), 0);
    close(fd);
    fd = connectUnix(sock);
    say("AT");
    EXPECT_EQ(hear(1000), "\r\nOK\r\n");
    close(fd);
    EXPECT_EQ(peer.stop(), 0);
    EXPECT_LT(connectUnix(sock), 0);
}
