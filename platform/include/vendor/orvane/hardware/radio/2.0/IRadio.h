// Host stand-in for the vendor radio HAL interface, one service instance per SIM
// slot ("slot1".."slot4"). getService gives a proxy connected to the simulated
// service; its callbacks and death notifications arrive on a runtime thread that
// belongs to the proxy's connection.
#ifndef TOLK_PLATFORM_VENDOR_RADIO_V2_0_IRADIO_H
#define TOLK_PLATFORM_VENDOR_RADIO_V2_0_IRADIO_H

#include <stdint.h>

#include <string>

#include <android/hidl/base/1.0/IBase.h>
#include <hidl/HidlSupport.h>
#include <hidl/Status.h>
#include <utils/StrongPointer.h>
#include <vendor/orvane/hardware/radio/2.0/ITolkIndication.h>
#include <vendor/orvane/hardware/radio/2.0/ITolkResponse.h>

namespace vendor {
namespace orvane {
namespace hardware {
namespace radio {
namespace V2_0 {

struct IRadio : public ::android::hidl::base::V1_0::IBase {
    static constexpr const char *descriptor = "vendor.orvane.hardware.radio@2.0::IRadio";

    // The proxy of the named instance, or an empty sp when no such service runs.
    // There is no in-process implementation, so getStub finds nothing either.
    static ::android::sp<IRadio> getService(const std::string &serviceName = "default",
                                            bool getStub = false);
    static ::android::sp<IRadio> getService(const char *serviceName, bool getStub = false) {
        return getService(std::string(serviceName ? serviceName : ""), getStub);
    }

    // From now on the service delivers answers to response and unsolicited
    // output to indication.
    virtual ::android::hardware::Return<void> registerTolkCallbacks(
        const ::android::sp<ITolkResponse> &response, const ::android::sp<ITolkIndication> &indication) = 0;
    // Hands one request to the service and returns without waiting for its answer.
    virtual ::android::hardware::Return<void> sendTolkRequest(
        int32_t serial, const ::android::hardware::hidl_vec<uint8_t> &data) = 0;
};

}  // namespace V2_0
}  // namespace radio
}  // namespace hardware
}  // namespace orvane
}  // namespace vendor

#endif
