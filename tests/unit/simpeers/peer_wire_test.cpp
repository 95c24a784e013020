// The radio service as the daemon meets it: a real process on real sockets under
// a throw-away root, in what the end-to-end tests cannot make it do: stay silent
// before REGISTER and refuse a request with its own serial. Then the daemon's
// HIDL proxy against it: answers in request order behind a slow one, callbacks
// in the order the service sent them, all on one runtime thread that is not the
// caller's (called back on the caller's thread, the HAL bridge's locking would
// go untested), and one death notice. Its journal, scripts and unsolicited
// output are checked by the transcripts.
#include "../../../sim/modem_script.h"
#include "../../../sim/peers.h"

#include <tolk_platform/radio_wire.h>
#include <vendor/orvane/hardware/radio/2.0/IRadio.h>

#include <gtest/gtest.h>

#include "eventually.h"
#include "test_root.h"

#include <poll.h>
#include <signal.h>
#include <sys/wait.h>
#include <unistd.h>

#include <mutex>
#include <set>
#include <thread>

using namespace tolksim;
using namespace android;
using namespace android::hardware;
using android::hidl::base::V1_0::IBase;
using namespace android::hardware::radio::V1_0;
using namespace vendor::orvane::hardware::radio::V2_0;

namespace {

// The radio service in a child process, stopped with SIGTERM like tolk-sim does.
struct Peer {
    TestRoot root_;  // removed with the peer; declared first, made before the fork
    pid_t pid_ = fork();

    Peer() {
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
};

// Every callback of a proxy ("R:", "I:", "D:" and its text) with the thread it ran on.
struct Recorder : ITolkResponse, ITolkIndication, hidl_death_recipient {
    std::mutex mutex;
    std::vector<std::string> events;
    std::set<std::thread::id> threads;

    void add(const std::string &e) {
        std::lock_guard<std::mutex> lock(mutex);
        events.push_back(e);
        threads.insert(std::this_thread::get_id());
    }
    std::vector<std::string> seen() {
        std::lock_guard<std::mutex> lock(mutex);
        return events;
    }
    static std::string text(const hidl_vec<uint8_t> &v) { return std::string(v.data(), v.data() + v.size()); }
    Return<void> sendTolkResponse(const RadioResponseInfo &, const hidl_vec<uint8_t> &data) override {
        add("R:" + text(data));
        return Void();
    }
    Return<void> tolkInd(RadioIndicationType, const hidl_vec<uint8_t> &data) override {
        add("I:" + text(data));
        return Void();
    }
    void serviceDied(uint64_t cookie, const wp<IBase> &) override { add("D:" + std::to_string(cookie)); }
};

}  // namespace

TEST(RadioPeer, SilentBeforeRegisterThenRefusesWithTheRequestsSerial) {
    Peer peer;
    const std::string socket = peer.root_.at("/dev/hwbinder/radio.slot1");
    int fd = -1;
    ASSERT_TRUE(eventually([&] { return (fd = connectUnix(socket)) >= 0; }));
    struct pollfd p = {fd, POLLIN, 0};
    ASSERT_EQ(0, radio_wire_send(fd, RADIO_WIRE_REQUEST, -1, 0, "AT+CGSN", sizeof "AT+CGSN"));
    EXPECT_EQ(0, poll(&p, 1, 300)) << "an answer before REGISTER";
    ASSERT_EQ(0, radio_wire_send(fd, RADIO_WIRE_REGISTER, 0, 0, nullptr, 0));
    // A request that is no line plus its NUL is answered like a line the modem
    // cannot take, with the request's own serial.
    ASSERT_EQ(0, radio_wire_send(fd, RADIO_WIRE_REQUEST, 7, 0, "AT+CSQ", 6));
    RadioWireHeader h = {};
    char answer[64];
    ASSERT_EQ(1, poll(&p, 1, 2000));
    ASSERT_EQ(0, radio_wire_recv(fd, &h, answer, sizeof answer));
    EXPECT_EQ("\r\nERROR\r\n", std::string(answer, h.length));
    EXPECT_EQ(static_cast<uint32_t>(RADIO_WIRE_RESPONSE), h.type);
    EXPECT_EQ(7, h.serial);
    EXPECT_EQ(peer.root_.read("/journal/radio.slot1.log"),
              "-1\tAT+CGSN\\x00\n7\tAT+CSQ\trefused: no NUL at the end\n");
    close(fd);
}

TEST(RadioPeer, ProxyCallbacksInOrderOnOneRuntimeThreadThenOneDeathNotice) {
    Peer peer;
    std::string script;
    std::vector<std::string> expected = {"I:U"};
    for (int i = 0; i < 40; i++) {  // one channel: the slow first answer holds back the others
        script += "AT+L" + std::to_string(i) + (i ? " => L" : " => (delay 300) L") + std::to_string(i) + "\n";
        expected.push_back("R:L" + std::to_string(i));
    }
    peer.root_.write("/sim/radio/script", script);
    sp<IRadio> radio;
    ASSERT_TRUE(eventually([&] { return (radio = IRadio::getService("slot1", false)) != nullptr; }));
    auto request = [&](const std::string &line) {  // sent with its NUL
        hidl_vec<uint8_t> data(reinterpret_cast<const uint8_t *>(line.c_str()), line.size() + 1);
        return radio->sendTolkRequest(-1, data).isOk();
    };
    sp<Recorder> rec = new Recorder;
    ASSERT_TRUE(radio->registerTolkCallbacks(rec, rec).isOk());
    ASSERT_TRUE(radio->linkToDeath(rec, 7).isOk());
    ASSERT_TRUE(eventually([&] { return send_radio_urc(peer.root_.path(), 1, "U") == 0; }));
    for (int i = 0; i < 40; i++) ASSERT_TRUE(request("AT+L" + std::to_string(i)));
    ASSERT_TRUE(eventually([&] { return rec->seen().size() >= expected.size(); }));

    EXPECT_EQ(0, peer.stop()) << "the service ends cleanly at SIGTERM";
    expected.push_back("D:7");
    ASSERT_TRUE(eventually([&] { return rec->seen().size() >= expected.size(); }));
    // SIGPIPE keeps its default action here: a send that raised it would end the test.
    EXPECT_FALSE(request("AT"));
    EXPECT_EQ(expected, rec->seen()) << "one notice, after every callback";
    std::lock_guard<std::mutex> hold(rec->mutex);
    EXPECT_EQ(1u, rec->threads.size()) << "one runtime thread";
    EXPECT_EQ(0u, rec->threads.count(std::this_thread::get_id())) << "never the caller's";
}
