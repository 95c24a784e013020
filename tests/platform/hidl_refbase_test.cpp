// Reference counting of the HIDL stand-in and its value types.
#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include <hidl/HidlSupport.h>
#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

using android::RefBase;
using android::sp;
using android::wp;
using android::hardware::hidl_vec;

namespace {

struct Counted : virtual public RefBase {
    explicit Counted(std::atomic<int> *deaths) : deaths_(deaths) {}
    ~Counted() override { deaths_->fetch_add(1); }
    std::atomic<int> *deaths_;
};

}  // namespace

TEST(HidlRefBase, LastStrongReferenceDestroysOnceAndWeakOnesOutliveIt) {
    std::atomic<int> deaths{0};
    wp<Counted> weak;
    {
        sp<Counted> a = new Counted(&deaths);
        EXPECT_EQ(1, a->getStrongCount());
        sp<Counted> b = a;
        sp<Counted> c;
        c = b;
        c = c;  // self-assignment must not drop the object
        EXPECT_EQ(3, a->getStrongCount());
        weak = a;
        b.clear();
        c = nullptr;
        EXPECT_EQ(1, a->getStrongCount());

        sp<Counted> promoted = weak.promote();
        ASSERT_NE(nullptr, promoted);
        EXPECT_EQ(a.get(), promoted.get());
        EXPECT_EQ(2, a->getStrongCount());
        EXPECT_EQ(0, deaths.load());
    }
    EXPECT_EQ(1, deaths.load());
    // The object is gone; the weak reference must say so instead of resurrecting it.
    EXPECT_EQ(nullptr, weak.promote());
    wp<Counted> copy = weak;
    EXPECT_EQ(nullptr, copy.promote());
    EXPECT_EQ(1, deaths.load());
}

TEST(HidlRefBase, CountsStayExactUnderConcurrentUse) {
    std::atomic<int> deaths{0};
    sp<Counted> shared = new Counted(&deaths);
    wp<Counted> weak = shared;
    std::vector<std::thread> threads;
    for (int t = 0; t < 8; t++) {
        threads.emplace_back([&] {
            for (int i = 0; i < 20000; i++) {
                sp<Counted> local = shared;
                sp<Counted> promoted = weak.promote();
                EXPECT_NE(nullptr, promoted);
            }
        });
    }
    for (auto &t : threads) t.join();
    EXPECT_EQ(1, shared->getStrongCount());
    EXPECT_EQ(0, deaths.load());

    // Promotion racing with the last release: each promote either wins a live
    // object or gets nothing, and the object dies exactly once.
    std::atomic<bool> go{false};
    std::thread racer([&] {
        while (!go.load()) {
        }
        for (int i = 0; i < 100000; i++) {
            sp<Counted> p = weak.promote();
            if (p == nullptr) break;
        }
    });
    go = true;
    shared.clear();
    racer.join();
    EXPECT_EQ(1, deaths.load());
    EXPECT_EQ(nullptr, weak.promote());
}

TEST(HidlVec, WrapsExternalBytesWithoutCopyingAndCopiesOwnTheirBytes) {
    uint8_t bytes[] = {'A', 'T', 0};
    hidl_vec<uint8_t> v;
    v.setToExternal(bytes, sizeof(bytes));
    EXPECT_EQ(bytes, v.data());
    EXPECT_EQ(3u, v.size());
    bytes[0] = 'B';
    EXPECT_EQ('B', v[0]);

    hidl_vec<uint8_t> copy = v;
    EXPECT_NE(bytes, copy.data());
    bytes[1] = 'X';
    EXPECT_EQ('T', copy[1]);

    hidl_vec<uint8_t> moved = std::move(copy);
    EXPECT_EQ(0u, copy.size());
    EXPECT_EQ(3u, moved.size());
    EXPECT_EQ('B', moved[0]);
}
