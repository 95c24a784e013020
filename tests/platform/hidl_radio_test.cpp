// The IRadio proxy of the HIDL stand-in against an in-test radio service. Request
// and answer bytes go through the radio HAL bridge's tests; here what the bridge
// relies on and cannot see itself: callbacks in the order the service sent them,
// all on one runtime thread that is not the caller's (called back on the caller's
// thread, the bridge's locking would go untested), and a death notice exactly once.
#include <gtest/gtest.h>

#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <vendor/orvane/hardware/radio/2.0/IRadio.h>

#include "eventually.h"
#include "hidl_fake_radio_service.h"
#include "test_root.h"

using android::sp;
using android::wp;
using android::hidl::base::V1_0::IBase;
using namespace android::hardware;
using namespace android::hardware::radio::V1_0;
using namespace vendor::orvane::hardware::radio::V2_0;

namespace {

// Every callback ("R:", "I:", "D:" and its text) with the thread it ran on.
struct Recorder : ITolkResponse, ITolkIndication, hidl_death_recipient {
    std::mutex mutex;
    std::vector<std::string> events;
    std::vector<std::thread::id> threads;
    wp<IBase> died;

    void add(const std::string &e) {
        std::lock_guard<std::mutex> lock(mutex);
        events.push_back(e);
        threads.push_back(std::this_thread::get_id());
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
    void serviceDied(uint64_t cookie, const wp<IBase> &who) override {
        died = who;
        add("D:" + std::to_string(cookie));
    }
};

}  // namespace

TEST(HidlRadio, CallbacksInOrderOnOneRuntimeThreadThenOneDeathNotice) {
    TestRoot root;
    FakeRadioService service(root.at(std::string(RADIO_WIRE_PATH_PREFIX) + "slot1"));
    ASSERT_TRUE(service.ok());
    sp<IRadio> radio = IRadio::getService("slot1", false);
    ASSERT_NE(nullptr, radio);
    sp<Recorder> rec = new Recorder;
    EXPECT_TRUE(radio->registerTolkCallbacks(rec, rec).isOk());
    EXPECT_TRUE(radio->linkToDeath(rec, 7).isOk());
    ASSERT_TRUE(service.waitFrames(1));

    std::vector<std::string> expected;
    for (int i = 0; i < 40; i++) {
        std::string text = "line" + std::to_string(i);
        bool ind = i % 3 == 0;
        ASSERT_TRUE(ind ? service.indicate(text) : service.respond(text));
        expected.push_back((ind ? "I:" : "R:") + text);
    }
    service.dropConnections();
    expected.push_back("D:7");
    ASSERT_TRUE(eventually([&] { return rec->seen().size() >= expected.size(); }));
    EXPECT_EQ(radio.get(), rec->died.promote().get());
    // SIGPIPE keeps its default action here: a send that raised it would end the test.
    const uint8_t at[] = {'A', 'T', 0};
    EXPECT_FALSE(radio->sendTolkRequest(-1, hidl_vec<uint8_t>(at, sizeof(at))).isOk());
    EXPECT_EQ(expected, rec->seen()) << "one notice, after every callback";
    std::lock_guard<std::mutex> hold(rec->mutex);
    for (const auto &id : rec->threads) {
        EXPECT_NE(std::this_thread::get_id(), id);
        EXPECT_EQ(rec->threads[0], id);
    }
}
