// Host stand-in for the HIDL transport status: every call on an interface returns a
// Return<T>, which carries either the value or the transport failure.
#ifndef TOLK_PLATFORM_HIDL_STATUS_H
#define TOLK_PLATFORM_HIDL_STATUS_H

#include <stdint.h>

#include <string>

namespace android {
namespace hardware {

class Status {
public:
    enum Exception : int32_t {
        EX_NONE = 0,
        EX_ILLEGAL_ARGUMENT = -3,
        EX_ILLEGAL_STATE = -5,
        EX_UNSUPPORTED_OPERATION = -7,
        EX_TRANSACTION_FAILED = -129,
    };

    Status() = default;
    static Status ok() { return Status(); }
    static Status fromExceptionCode(int32_t exceptionCode, const char *message = nullptr) {
        Status s;
        s.mException = exceptionCode;
        if (message) s.mMessage = message;
        return s;
    }

    bool isOk() const { return mException == EX_NONE; }
    int32_t exceptionCode() const { return mException; }
    const std::string &exceptionMessage() const { return mMessage; }
    std::string description() const {
        if (isOk()) return "No error";
        return "Status(" + std::to_string(mException) + "): '" + mMessage + "'";
    }

private:
    int32_t mException = EX_NONE;
    std::string mMessage;
};

namespace details {
class return_status {
public:
    return_status() = default;
    return_status(const Status &s) : mStatus(s) {}
    bool isOk() const { return mStatus.isOk(); }
    // On the device a dead object is one failure kind among several; here every
    // transport failure means the peer is gone.
    bool isDeadObject() const { return !mStatus.isOk(); }
    std::string description() const { return mStatus.description(); }

protected:
    Status mStatus;
};
}  // namespace details

template <typename T>
class Return : public details::return_status {
public:
    Return(T v) : mVal(v) {}
    Return(const Status &s) : details::return_status(s), mVal() {}
    operator T() const { return mVal; }
    T withDefault(T t) const { return isOk() ? mVal : t; }

private:
    T mVal;
};

template <>
class Return<void> : public details::return_status {
public:
    Return() = default;
    Return(const Status &s) : details::return_status(s) {}
};

inline Return<void> Void() { return Return<void>(); }

}  // namespace hardware
}  // namespace android

#endif
