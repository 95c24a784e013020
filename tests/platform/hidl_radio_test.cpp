// The IRadio proxy of the HIDL stand-in against an in-test radio service. Request
// and answer bytes go through the radio HAL bridge's tests; here what the bridge
// relies on and cannot see itself: callbacks in the order the service sent them,
// on one runtime thread, and a death notice exactly once.
#include <gtest/gtest.h>

#include <condition_variable>
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
using android::hardware::hidl_death_recipient;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::radio::V1_0::RadioIndicationType;
using android::hardware::radio::V1_0::RadioResponseInfo;
using android::hidl::base::V1_0::IBase;
using vendor::orvane::hardware::radio::V2_0::IRadio;
using vendor::orvane::hardware::radio::V2_0::ITolkIndication;
using vendor::orvane::hardware::radio::V2_0::ITolkResponse;

namespace {

// Every callback with the thread it ran on. Going away takes the lock, so a
// callback still recording finishes first.
struct Recorder {
    std::mutex mutex;
    std::condition_variable cv;
    std::vector<std::string> events;
    std::vector<std::thread::id> threads;

    ~Recorder() { std::lock_guard<std::mutex> lock(mutex); }
    void add(const std::string &e) {
        std::lock_guard<std::mutex> lock(mutex);
        events.push_back(e);
        threads.push_back(std::this_thread::get_id());
        cv.notify_all();
    }
    bool wait(size_t n) {
        std::unique_lock<std::mutex> lock(mutex);
        return cv.wait_for(lock, std::chrono::seconds(3), [&] { return events.size() >= n; });
    }
    std::vector<std::string> seen() {
        std::lock_guard<std::mutex> lock(mutex);
        return events;
    }
};

std::string bytes(const hidl_vec<uint8_t> &v) { return std::string(reinterpret_cast<const char *>(v.data()), v.size()); }

struct Response : ITolkResponse {
    explicit Response(Recorder *r) : rec(r) {}
    Return<void> sendTolkResponse(const RadioResponseInfo &, const hidl_vec<uint8_t> &data) override {
        rec->add("R:" + bytes(data));
        return Void();
    }
    Recorder *rec;
};

struct Indication : ITolkIndication {
    explicit Indication(Recorder *r) : rec(r) {}
    Return<void> tolkInd(RadioIndicationType, const hidl_vec<uint8_t> &data) override {
        rec->add("I:" + bytes(data));
        return Void();
    }
    Recorder *rec;
};

struct Death : hidl_death_recipient {
    explicit Death(Recorder *r) : rec(r) {}
    void serviceDied(uint64_t cookie, const wp<IBase> &w) override {
        who = w;
        rec->add("D:" + std::to_string(cookie));
    }
    Recorder *rec;
    wp<IBase> who;
};

// A fresh root with one running instance and a proxy to it; the proxy goes first,
// the recorder last.
struct HidlRadio : ::testing::Test {
    void SetUp() override {
        ASSERT_TRUE(service.ok());
        radio = IRadio::getService("slot1", false);
        ASSERT_NE(nullptr, radio);
    }
    Recorder rec;
    TestRoot root;
    FakeRadioService service{root.at(std::string(RADIO_WIRE_PATH_PREFIX) + "slot1")};
    sp<IRadio> radio;
};

}  // namespace

TEST_F(HidlRadio, CallbacksArriveInOrderOnOneRuntimeThread) {
    EXPECT_EQ(nullptr, IRadio::getService("../radio.slot1", false));  // names stay in the folder
    EXPECT_TRUE(radio->registerTolkCallbacks(new Response(&rec), new Indication(&rec)).isOk());
    ASSERT_TRUE(service.waitFrames(1));
    std::vector<std::string> expected;
    for (int i = 0; i < 40; i++) {
        std::string text = "line" + std::to_string(i);
        bool ind = i % 3 == 0;
        ASSERT_TRUE(ind ? service.indicate(text) : service.respond(text));
        expected.push_back((ind ? "I:" : "R:") + text);
    }
    ASSERT_TRUE(rec.wait(expected.size()));
    EXPECT_EQ(expected, rec.seen());
    std::lock_guard<std::mutex> hold(rec.mutex);
    for (const auto &id : rec.threads) {
        EXPECT_NE(std::this_thread::get_id(), id);
        EXPECT_EQ(rec.threads[0], id);
    }
}

TEST_F(HidlRadio, DeathIsNotifiedOnceAndLaterSendsFailWithoutSigpipe) {
    sp<Death> death = new Death(&rec);
    sp<Death> unlinked = new Death(&rec);
    EXPECT_TRUE(radio->linkToDeath(death, 7).isOk());
    EXPECT_TRUE(radio->linkToDeath(unlinked, 8).isOk());
    EXPECT_TRUE(radio->unlinkToDeath(unlinked));
    ASSERT_TRUE(eventually([&] { return service.connections() == 1; }));

    service.stop();
    service.dropConnections();
    ASSERT_TRUE(rec.wait(1));
    EXPECT_EQ(radio.get(), death->who.promote().get());
    // SIGPIPE keeps its default action here: a send that raised it would end the test.
    uint8_t b[] = {'A', 'T', 0};
    hidl_vec<uint8_t> request;
    request.setToExternal(b, sizeof(b));
    EXPECT_FALSE(radio->sendTolkRequest(-1, request).isOk());
    EXPECT_FALSE(radio->ping().isOk());
    EXPECT_EQ(std::vector<std::string>{"D:7"}, rec.seen()) << "one notice, to the linked recipient only";
}
