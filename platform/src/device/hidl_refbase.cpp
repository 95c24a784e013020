// Reference counting of android::RefBase.
//
// Every strong reference also holds a weak one, so the count block (weakref_impl)
// outlives the object until the last reference of either kind is gone: the object
// is deleted when the strong count falls to zero, the block when the weak count does.
#include <utils/RefBase.h>

#include <atomic>

namespace android {

namespace {
// The strong count of an object that no sp has held yet.
constexpr int32_t INITIAL_STRONG_VALUE = 1 << 28;
}  // namespace

class RefBase::weakref_impl : public RefBase::weakref_type {
public:
    explicit weakref_impl(RefBase *base) : mStrong(INITIAL_STRONG_VALUE), mWeak(0), mBase(base) {}

    std::atomic<int32_t> mStrong;
    std::atomic<int32_t> mWeak;
    RefBase *const mBase;
};

RefBase::RefBase() : mRefs(new weakref_impl(this)) {}

RefBase::~RefBase() {
    // An object that was never held by an sp was deleted by its owner directly.
    // With no weak reference left nobody else will free the block; otherwise mark
    // the object dead so that promote fails and the last weak reference frees it.
    if (mRefs->mStrong.load(std::memory_order_relaxed) == INITIAL_STRONG_VALUE) {
        if (mRefs->mWeak.load(std::memory_order_acquire) == 0) {
            delete mRefs;
        } else {
            mRefs->mStrong.store(0, std::memory_order_release);
        }
    }
}

void RefBase::onFirstRef() {}
void RefBase::onLastStrongRef(const void *) {}

void RefBase::incStrong(const void *id) const {
    mRefs->incWeak(id);
    int32_t cur = mRefs->mStrong.load(std::memory_order_relaxed);
    for (;;) {
        int32_t next = cur == INITIAL_STRONG_VALUE ? 1 : cur + 1;
        if (mRefs->mStrong.compare_exchange_weak(cur, next, std::memory_order_relaxed)) break;
    }
    if (cur == INITIAL_STRONG_VALUE) const_cast<RefBase *>(this)->onFirstRef();
}

void RefBase::decStrong(const void *id) const {
    weakref_impl *const refs = mRefs;
    const int32_t prev = refs->mStrong.fetch_sub(1, std::memory_order_release);
    if (prev == 1) {
        std::atomic_thread_fence(std::memory_order_acquire);
        const_cast<RefBase *>(this)->onLastStrongRef(id);
        delete this;
    }
    // The block may go with this, so nothing of the object is touched after it.
    refs->decWeak(id);
}

int32_t RefBase::getStrongCount() const {
    int32_t c = mRefs->mStrong.load(std::memory_order_relaxed);
    return c == INITIAL_STRONG_VALUE ? 0 : c;
}

RefBase::weakref_type *RefBase::createWeak(const void *id) const {
    mRefs->incWeak(id);
    return mRefs;
}

RefBase::weakref_type *RefBase::getWeakRefs() const { return mRefs; }

RefBase *RefBase::weakref_type::refBase() const { return static_cast<const weakref_impl *>(this)->mBase; }

void RefBase::weakref_type::incWeak(const void *) {
    static_cast<weakref_impl *>(this)->mWeak.fetch_add(1, std::memory_order_relaxed);
}

void RefBase::weakref_type::decWeak(const void *) {
    weakref_impl *const impl = static_cast<weakref_impl *>(this);
    const int32_t prev = impl->mWeak.fetch_sub(1, std::memory_order_release);
    if (prev != 1) return;
    std::atomic_thread_fence(std::memory_order_acquire);
    // Last reference of any kind. If the object was ever strongly held it is gone
    // already and the block is ours to free; otherwise its owner deletes the object,
    // and ~RefBase frees the block then.
    if (impl->mStrong.load(std::memory_order_relaxed) != INITIAL_STRONG_VALUE) delete impl;
}

bool RefBase::weakref_type::attemptIncStrong(const void *id) {
    incWeak(id);
    weakref_impl *const impl = static_cast<weakref_impl *>(this);
    int32_t cur = impl->mStrong.load(std::memory_order_relaxed);
    for (;;) {
        if (cur <= 0) {
            // Dead, or dying on another thread: never resurrect it.
            decWeak(id);
            return false;
        }
        int32_t next = cur == INITIAL_STRONG_VALUE ? 1 : cur + 1;
        if (impl->mStrong.compare_exchange_weak(cur, next, std::memory_order_relaxed)) break;
    }
    if (cur == INITIAL_STRONG_VALUE) impl->mBase->onFirstRef();
    return true;
}

int32_t RefBase::weakref_type::getWeakCount() const {
    return static_cast<const weakref_impl *>(this)->mWeak.load(std::memory_order_relaxed);
}

}  // namespace android
