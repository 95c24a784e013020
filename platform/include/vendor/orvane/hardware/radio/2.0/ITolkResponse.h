// Host stand-in for the vendor radio HAL's answer callback: the service calls
// sendTolkResponse once for every modem answer.
#ifndef TOLK_PLATFORM_VENDOR_RADIO_V2_0_ITOLKRESPONSE_H
#define TOLK_PLATFORM_VENDOR_RADIO_V2_0_ITOLKRESPONSE_H

#include <stdint.h>

#include <android/hardware/radio/1.0/types.h>
#include <android/hidl/base/1.0/IBase.h>
#include <hidl/HidlSupport.h>
#include <hidl/Status.h>

namespace vendor {
namespace orvane {
namespace hardware {
namespace radio {
namespace V2_0 {

struct ITolkResponse : public ::android::hidl::base::V1_0::IBase {
    static constexpr const char *descriptor = "vendor.orvane.hardware.radio@2.0::ITolkResponse";

    ::android::hardware::Return<void> interfaceChain(interfaceChain_cb _hidl_cb) override {
        hidl_vec<hidl_string> chain(2);
        chain[0] = descriptor;
        chain[1] = ::android::hidl::base::V1_0::IBase::descriptor;
        _hidl_cb(chain);
        return ::android::hardware::Void();
    }
    ::android::hardware::Return<void> interfaceDescriptor(interfaceDescriptor_cb _hidl_cb) override {
        _hidl_cb(descriptor);
        return ::android::hardware::Void();
    }

    virtual ::android::hardware::Return<void> sendTolkResponse(
        const ::android::hardware::radio::V1_0::RadioResponseInfo &info,
        const ::android::hardware::hidl_vec<uint8_t> &data) = 0;
};

}  // namespace V2_0
}  // namespace radio
}  // namespace hardware
}  // namespace orvane
}  // namespace vendor

#endif
