// The IRadio proxy of the HIDL stand-in against an in-test radio service.
#include <gtest/gtest.h>

#include <atomic>
#include <chrono>
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

std::string instancePath(const TestRoot &root, const std::string &instance) {
    return root.at(std::string(RADIO_WIRE_PATH_PREFIX) + instance);
}

// Records every callback with the thread it ran on.
struct Recorder {
    std::mutex mutex;
    std::condition_variable cv;
    std::vector<std::string> events;
    std::vector<std::thread::id> threads;
    std::function<void()> hook;  // runs inside the callback, after recording
    int inFlight = 0;

    // Callbacks may still be running when a test ends; they must be done before
    // the recorder they use goes away.
    ~Recorder() {
        std::unique_lock<std::mutex> lock(mutex);
        cv.wait(lock, [&] { return inFlight == 0; });
    }

    void add(const std::string &e) {
        {
            std::lock_guard<std::mutex> lock(mutex);
            events.push_back(e);
            threads.push_back(std::this_thread::get_id());
            inFlight++;
        }
        cv.notify_all();
        if (hook) hook();
        std::lock_guard<std::mutex> lock(mutex);
        inFlight--;
        cv.notify_all();
    }
    bool wait(size_t n, int ms = 3000) {
        std::unique_lock<std::mutex> lock(mutex);
        return cv.wait_for(lock, std::chrono::milliseconds(ms), [&] { return events.size() >= n; });
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

// A fresh root with one running instance and a proxy to it. Members go in reverse:
// the proxy first, the recorder (which waits for running callbacks) after the
// service, the lock that callbacks take last.
struct HidlRadio : ::testing::Test {
    void SetUp() override {
        ASSERT_TRUE(service.ok());
        radio = IRadio::getService("slot1", false);
        ASSERT_NE(nullptr, radio);
    }
    std::mutex lock;
    Recorder rec;
    TestRoot root;
    FakeRadioService service{instancePath(root, "slot1")};
    sp<IRadio> radio;
};

}  // namespace

// Request and answer bytes go through the radio HAL bridge's tests, an absent or
// restarted service through the end-to-end modem tests; here the runtime's threads.
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
    std::lock_guard<std::mutex> hold(rec.mutex);
    EXPECT_EQ(expected, rec.events);
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
    ASSERT_TRUE(service.waitConnections(1));

    service.stop();
    service.dropConnections();
    ASSERT_TRUE(rec.wait(1));
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    {
        std::lock_guard<std::mutex> hold(rec.mutex);
        EXPECT_EQ(std::vector<std::string>{"D:7"}, rec.events);
    }
    EXPECT_EQ(radio.get(), death->who.promote().get());

    // SIGPIPE keeps its default action here: a send that raised it would end the test.
    uint8_t b[] = {'A', 'T', 0};
    hidl_vec<uint8_t> request;
    request.setToExternal(b, sizeof(b));
    EXPECT_FALSE(radio->sendTolkRequest(-1, request).isOk());
    EXPECT_FALSE(radio->ping().isOk());
}

TEST_F(HidlRadio, ProxyCanBeReleasedFromItsOwnCallbackThread) {
    // The callback drops the last reference: the destructor runs on the reader
    // thread itself and must neither join it nor crash.
    rec.hook = [&] {
        std::lock_guard<std::mutex> hold(lock);
        radio.clear();
    };
    radio->registerTolkCallbacks(new Response(&rec), nullptr);
    ASSERT_TRUE(service.waitFrames(1));
    ASSERT_TRUE(service.respond("x"));
    ASSERT_TRUE(rec.wait(1));
    ASSERT_TRUE(eventually([&] {
        std::lock_guard<std::mutex> hold(lock);
        return radio == nullptr;
    }));
    EXPECT_TRUE(eventually([&] { return !service.respond("y"); }));
}

TEST_F(HidlRadio, ReleasingWhileTheCallbackWaitsForTheReleasersLockDoesNotDeadlockNorReportDeath) {
    std::atomic<bool> callbackDone{false};
    rec.hook = [&] {
        std::lock_guard<std::mutex> hold(lock);
        callbackDone = true;
    };
    sp<Death> death = new Death(&rec);  // kept: the proxy holds recipients weakly
    radio->linkToDeath(death, 1);
    radio->registerTolkCallbacks(new Response(&rec), nullptr);
    ASSERT_TRUE(service.waitFrames(1));

    std::unique_lock<std::mutex> held(lock);
    ASSERT_TRUE(service.respond("answer"));
    ASSERT_TRUE(rec.wait(1));  // the callback now waits for the lock
    radio.clear();             // with the lock held: must return at once
    EXPECT_FALSE(callbackDone.load());
    held.unlock();
    EXPECT_TRUE(eventually([&] { return callbackDone.load(); }));
    // The service sees the connection end; a released proxy never reports a death.
    ASSERT_TRUE(eventually([&] { return !service.respond("late"); }));
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    std::lock_guard<std::mutex> hold(rec.mutex);
    EXPECT_EQ(std::vector<std::string>{"R:answer"}, rec.events);
}
