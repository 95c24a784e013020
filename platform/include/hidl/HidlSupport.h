// Host stand-in for the HIDL support types the radio bridge uses: byte vectors that
// can wrap a caller's buffer without copying, strings and handles for the IBase
// operations, and the death recipient of a remote service.
#ifndef TOLK_PLATFORM_HIDL_HIDLSUPPORT_H
#define TOLK_PLATFORM_HIDL_HIDLSUPPORT_H

#include <stddef.h>
#include <stdint.h>

#include <string>
#include <utility>

#include <hidl/Status.h>
#include <utils/RefBase.h>

namespace android {
namespace hidl {
namespace base {
namespace V1_0 {
struct IBase;
}
}  // namespace base
}  // namespace hidl

namespace hardware {

// A vector that either owns its elements or points at someone else's
// (setToExternal without ownership): then the caller keeps the buffer alive.
template <typename T>
class hidl_vec {
public:
    hidl_vec() = default;
    explicit hidl_vec(size_t size) { resize(size); }
    hidl_vec(const T *data, size_t size) { copyFrom(data, size); }
    hidl_vec(const hidl_vec<T> &other) { copyFrom(other.mBuffer, other.mSize); }
    hidl_vec(hidl_vec<T> &&other) noexcept { moveFrom(other); }
    ~hidl_vec() { release(); }

    hidl_vec &operator=(const hidl_vec<T> &other) {
        if (this != &other) {
            release();
            copyFrom(other.mBuffer, other.mSize);
        }
        return *this;
    }
    hidl_vec &operator=(hidl_vec<T> &&other) noexcept {
        if (this != &other) {
            release();
            moveFrom(other);
        }
        return *this;
    }

    // Points the vector at data without copying; with shouldOwn the vector frees
    // it later with delete[].
    void setToExternal(T *data, size_t size, bool shouldOwn = false) {
        release();
        mBuffer = data;
        mSize = size;
        mOwnsBuffer = shouldOwn;
    }

    void resize(size_t size) {
        T *buf = size ? new T[size]() : nullptr;
        size_t keep = size < mSize ? size : mSize;
        for (size_t i = 0; i < keep; i++) buf[i] = mBuffer[i];
        release();
        mBuffer = buf;
        mSize = size;
        mOwnsBuffer = true;
    }

    size_t size() const { return mSize; }
    T *data() { return mBuffer; }
    const T *data() const { return mBuffer; }
    T &operator[](size_t i) { return mBuffer[i]; }
    const T &operator[](size_t i) const { return mBuffer[i]; }

private:
    void copyFrom(const T *data, size_t size) {
        mBuffer = size ? new T[size] : nullptr;
        for (size_t i = 0; i < size; i++) mBuffer[i] = data[i];
        mSize = size;
        mOwnsBuffer = true;
    }
    void moveFrom(hidl_vec<T> &other) {
        mBuffer = other.mBuffer;
        mSize = other.mSize;
        mOwnsBuffer = other.mOwnsBuffer;
        other.mBuffer = nullptr;
        other.mSize = 0;
        other.mOwnsBuffer = false;
    }
    void release() {
        if (mOwnsBuffer) delete[] mBuffer;
        mBuffer = nullptr;
        mSize = 0;
        mOwnsBuffer = false;
    }

    T *mBuffer = nullptr;
    size_t mSize = 0;
    bool mOwnsBuffer = false;
};

class hidl_string {
public:
    hidl_string() = default;
    hidl_string(const char *s) : mStr(s ? s : "") {}
    hidl_string(const std::string &s) : mStr(s) {}
    const char *c_str() const { return mStr.c_str(); }
    size_t size() const { return mStr.size(); }
    operator std::string() const { return mStr; }
    bool operator==(const hidl_string &o) const { return mStr == o.mStr; }

private:
    std::string mStr;
};

// Only a placeholder for IBase::debug; the stand-in carries no descriptors.
struct hidl_handle {
    int fd = -1;
};

template <typename T, size_t N>
struct hidl_array {
    T elems[N];
};

// Told when a linked remote service dies; serviceDied runs on a runtime thread.
struct hidl_death_recipient : virtual public RefBase {
    virtual void serviceDied(uint64_t cookie, const wp<hidl::base::V1_0::IBase> &who) = 0;
    virtual ~hidl_death_recipient() {}
};

}  // namespace hardware
}  // namespace android

#endif
