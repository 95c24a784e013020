// Host stand-in for the root of every HIDL interface. Local objects (callbacks the
// daemon hands to a service) keep the defaults; proxies of remote services override
// isRemote, ping and the death links.
#ifndef TOLK_PLATFORM_ANDROID_HIDL_BASE_V1_0_IBASE_H
#define TOLK_PLATFORM_ANDROID_HIDL_BASE_V1_0_IBASE_H

#include <stdint.h>

#include <functional>

#include <hidl/HidlSupport.h>
#include <hidl/Status.h>
#include <utils/RefBase.h>

namespace android {
namespace hidl {
namespace base {
namespace V1_0 {

struct DebugInfo {
    enum class Architecture : int32_t { UNKNOWN = 0, IS_64BIT = 1, IS_32BIT = 2 };
    int32_t pid = -1;
    uint64_t ptr = 0;
    Architecture arch = Architecture::UNKNOWN;
};

struct IBase : virtual public ::android::RefBase {
    using hidl_string = ::android::hardware::hidl_string;
    template <typename T>
    using hidl_vec = ::android::hardware::hidl_vec<T>;
    template <typename T>
    using Return = ::android::hardware::Return<T>;

    using interfaceChain_cb = std::function<void(const hidl_vec<hidl_string> &descriptors)>;
    using interfaceDescriptor_cb = std::function<void(const hidl_string &descriptor)>;
    using getHashChain_cb =
        std::function<void(const hidl_vec<::android::hardware::hidl_array<uint8_t, 32>> &hashchain)>;
    using getDebugInfo_cb = std::function<void(const DebugInfo &info)>;

    static constexpr const char *descriptor = "android.hidl.base@1.0::IBase";

    virtual bool isRemote() const { return false; }
    virtual Return<void> interfaceChain(interfaceChain_cb _hidl_cb);
    virtual Return<void> debug(const ::android::hardware::hidl_handle &fd,
                               const hidl_vec<hidl_string> &options);
    virtual Return<void> interfaceDescriptor(interfaceDescriptor_cb _hidl_cb);
    virtual Return<void> getHashChain(getHashChain_cb _hidl_cb);
    virtual Return<void> setHALInstrumentation();
    // Local objects cannot die apart from this process: linking does nothing.
    virtual Return<bool> linkToDeath(const ::android::sp<::android::hardware::hidl_death_recipient> &recipient,
                                     uint64_t cookie);
    virtual Return<void> ping();
    virtual Return<void> getDebugInfo(getDebugInfo_cb _hidl_cb);
    virtual Return<void> notifySyspropsChanged();
    virtual Return<bool> unlinkToDeath(const ::android::sp<::android::hardware::hidl_death_recipient> &recipient);
    virtual ~IBase() {}
};

}  // namespace V1_0
}  // namespace base
}  // namespace hidl
}  // namespace android

#endif
