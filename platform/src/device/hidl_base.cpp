// Defaults of IBase for objects that live in this process (the callbacks a client
// hands to a service). Proxies of remote services override what differs.
#include <android/hidl/base/1.0/IBase.h>

#include <unistd.h>

namespace android {
namespace hidl {
namespace base {
namespace V1_0 {

using ::android::hardware::Return;
using ::android::hardware::Void;

Return<void> IBase::interfaceChain(interfaceChain_cb _hidl_cb) {
    hidl_vec<hidl_string> chain(1);
    chain[0] = descriptor;
    _hidl_cb(chain);
    return Void();
}

Return<void> IBase::debug(const ::android::hardware::hidl_handle &, const hidl_vec<hidl_string> &) {
    return Void();
}

Return<void> IBase::interfaceDescriptor(interfaceDescriptor_cb _hidl_cb) {
    _hidl_cb(descriptor);
    return Void();
}

Return<void> IBase::getHashChain(getHashChain_cb _hidl_cb) {
    _hidl_cb(hidl_vec<::android::hardware::hidl_array<uint8_t, 32>>());
    return Void();
}

Return<void> IBase::setHALInstrumentation() { return Void(); }

Return<bool> IBase::linkToDeath(const ::android::sp<::android::hardware::hidl_death_recipient> &, uint64_t) {
    return true;
}

Return<void> IBase::ping() { return Void(); }

Return<void> IBase::getDebugInfo(getDebugInfo_cb _hidl_cb) {
    DebugInfo info;
    info.pid = static_cast<int32_t>(getpid());
    info.ptr = 0;
    info.arch = sizeof(void *) == 8 ? DebugInfo::Architecture::IS_64BIT : DebugInfo::Architecture::IS_32BIT;
    _hidl_cb(info);
    return Void();
}

Return<void> IBase::notifySyspropsChanged() { return Void(); }

Return<bool> IBase::unlinkToDeath(const ::android::sp<::android::hardware::hidl_death_recipient> &) {
    return true;
}

}  // namespace V1_0
}  // namespace base
}  // namespace hidl
}  // namespace android
