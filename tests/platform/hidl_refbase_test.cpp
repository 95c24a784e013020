// Reference counting of the HIDL stand-in and its value types.
#include <gtest/gtest.h>

#include <atomic>
#include <thread>
#include <vector>

#include <utils/RefBase.h>
#include <utils/StrongPointer.h>

using android::RefBase;
using android::sp;
using android::wp;

namespace {

struct Counted : virtual public RefBase {
    explicit Counted(std::atomic<int> *deaths) : deaths_(deaths) {}
    ~Counted() override { deaths_->fetch_add(1); }
    std::atomic<int> *deaths_;
};

}  // namespace

TEST(HidlRefBase, CountsStayExactUnderConcurrentUseAndTheObjectDiesOnce) {
    std::atomic<int> deaths{0};
    sp<Counted> shared = new Counted(&deaths);
    shared = shared;  // self-assignment must not drop the object
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
