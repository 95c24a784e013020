// Host stand-in for libutils' strong pointer: sp<T> holds one strong reference of
// a reference-counted object (anything with incStrong/decStrong).
#ifndef TOLK_PLATFORM_UTILS_STRONGPOINTER_H
#define TOLK_PLATFORM_UTILS_STRONGPOINTER_H

#include <cstddef>

namespace android {

template <typename T>
class wp;

template <typename T>
class sp {
public:
    sp() : m_ptr(nullptr) {}
    sp(std::nullptr_t) : m_ptr(nullptr) {}
    sp(T *other) : m_ptr(other) {
        if (m_ptr) m_ptr->incStrong(this);
    }
    sp(const sp<T> &other) : m_ptr(other.m_ptr) {
        if (m_ptr) m_ptr->incStrong(this);
    }
    sp(sp<T> &&other) noexcept : m_ptr(other.m_ptr) { other.m_ptr = nullptr; }
    template <typename U>
    sp(U *other) : m_ptr(other) {
        if (m_ptr) m_ptr->incStrong(this);
    }
    template <typename U>
    sp(const sp<U> &other) : m_ptr(other.get()) {
        if (m_ptr) m_ptr->incStrong(this);
    }
    template <typename U>
    sp(sp<U> &&other) : m_ptr(other.m_ptr) {
        other.m_ptr = nullptr;
    }
    ~sp() {
        if (m_ptr) m_ptr->decStrong(this);
    }

    sp &operator=(const sp<T> &other) {
        // Take the new reference before dropping the old one: both may be the same.
        T *ptr = other.m_ptr;
        if (ptr) ptr->incStrong(this);
        T *old = m_ptr;
        m_ptr = ptr;
        if (old) old->decStrong(this);
        return *this;
    }
    sp &operator=(sp<T> &&other) noexcept {
        if (this != &other) {
            T *old = m_ptr;
            m_ptr = other.m_ptr;
            other.m_ptr = nullptr;
            if (old) old->decStrong(this);
        }
        return *this;
    }
    sp &operator=(T *other) {
        if (other) other->incStrong(this);
        T *old = m_ptr;
        m_ptr = other;
        if (old) old->decStrong(this);
        return *this;
    }
    sp &operator=(std::nullptr_t) {
        clear();
        return *this;
    }
    template <typename U>
    sp &operator=(const sp<U> &other) {
        return *this = sp<T>(other);
    }

    // Drops the reference. The object may be destroyed here, on this thread.
    void clear() {
        T *old = m_ptr;
        if (old) {
            m_ptr = nullptr;
            old->decStrong(this);
        }
    }

    T &operator*() const { return *m_ptr; }
    T *operator->() const { return m_ptr; }
    T *get() const { return m_ptr; }

    bool operator==(std::nullptr_t) const { return m_ptr == nullptr; }
    bool operator!=(std::nullptr_t) const { return m_ptr != nullptr; }
    template <typename U>
    bool operator==(const sp<U> &o) const { return m_ptr == o.get(); }
    template <typename U>
    bool operator!=(const sp<U> &o) const { return m_ptr != o.get(); }

private:
    template <typename Y>
    friend class sp;
    template <typename Y>
    friend class wp;

    T *m_ptr;
};

template <typename T>
inline bool operator==(std::nullptr_t, const sp<T> &p) {
    return p == nullptr;
}
template <typename T>
inline bool operator!=(std::nullptr_t, const sp<T> &p) {
    return p != nullptr;
}

}  // namespace android

#endif
