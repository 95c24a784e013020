// Host stand-in for libutils' reference counting: objects derived (virtually) from
// android::RefBase live as long as a strong reference (sp) holds them; weak
// references (wp) outlive them and can be promoted while the object still lives.
// Counts are atomic, so references may be taken and dropped on any thread.
#ifndef TOLK_PLATFORM_UTILS_REFBASE_H
#define TOLK_PLATFORM_UTILS_REFBASE_H

#include <stdint.h>

#include <utils/StrongPointer.h>

namespace android {

class RefBase {
public:
    void incStrong(const void *id) const;
    void decStrong(const void *id) const;
    // For tests and debugging only: the count can change at any moment.
    int32_t getStrongCount() const;

    class weakref_type {
    public:
        RefBase *refBase() const;
        void incWeak(const void *id);
        void decWeak(const void *id);
        // Takes a strong reference if the object still lives; false otherwise.
        bool attemptIncStrong(const void *id);
        int32_t getWeakCount() const;
    };

    weakref_type *createWeak(const void *id) const;
    weakref_type *getWeakRefs() const;

protected:
    RefBase();
    virtual ~RefBase();

    virtual void onFirstRef();
    virtual void onLastStrongRef(const void *id);

private:
    class weakref_impl;
    friend class weakref_type;

    RefBase(const RefBase &) = delete;
    RefBase &operator=(const RefBase &) = delete;

    weakref_impl *const mRefs;
};

template <typename T>
class wp {
public:
    typedef typename RefBase::weakref_type weakref_type;

    wp() : m_ptr(nullptr), m_refs(nullptr) {}
    wp(T *other) : m_ptr(other), m_refs(other ? other->createWeak(this) : nullptr) {}
    wp(const wp<T> &other) : m_ptr(other.m_ptr), m_refs(other.m_refs) {
        if (m_ptr) m_refs->incWeak(this);
    }
    wp(const sp<T> &other) : m_ptr(other.get()), m_refs(m_ptr ? m_ptr->createWeak(this) : nullptr) {}
    template <typename U>
    wp(const sp<U> &other) : m_ptr(other.get()), m_refs(m_ptr ? m_ptr->createWeak(this) : nullptr) {}
    template <typename U>
    wp(const wp<U> &other) : m_ptr(other.m_ptr), m_refs(other.m_refs) {
        if (m_ptr) m_refs->incWeak(this);
    }
    ~wp() {
        if (m_ptr) m_refs->decWeak(this);
    }

    wp &operator=(const wp<T> &other) {
        weakref_type *refs = other.m_refs;
        T *ptr = other.m_ptr;
        if (ptr) refs->incWeak(this);
        if (m_ptr) m_refs->decWeak(this);
        m_ptr = ptr;
        m_refs = refs;
        return *this;
    }
    wp &operator=(const sp<T> &other) {
        wp<T> tmp(other);
        return *this = tmp;
    }

    // A strong reference to the object, or an empty one when it has died.
    sp<T> promote() const {
        sp<T> result;
        if (m_ptr && m_refs->attemptIncStrong(&result)) result.m_ptr = m_ptr;
        return result;
    }

    void clear() {
        if (m_ptr) {
            m_refs->decWeak(this);
            m_ptr = nullptr;
            m_refs = nullptr;
        }
    }

    // The raw pointer, which may dangle; only for comparisons.
    T *unsafe_get() const { return m_ptr; }

    bool operator==(const wp<T> &o) const { return m_ptr == o.m_ptr; }
    bool operator!=(const wp<T> &o) const { return m_ptr != o.m_ptr; }
    bool operator==(std::nullptr_t) const { return m_ptr == nullptr; }
    bool operator!=(std::nullptr_t) const { return m_ptr != nullptr; }

private:
    template <typename Y>
    friend class wp;

    T *m_ptr;
    weakref_type *m_refs;
};

}  // namespace android

#endif
