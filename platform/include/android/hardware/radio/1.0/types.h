// Host stand-in for the android.hardware.radio@1.0 types the vendor radio HAL
// borrows: the header of a solicited answer and the kind of an indication.
#ifndef TOLK_PLATFORM_ANDROID_HARDWARE_RADIO_V1_0_TYPES_H
#define TOLK_PLATFORM_ANDROID_HARDWARE_RADIO_V1_0_TYPES_H

#include <stdint.h>

namespace android {
namespace hardware {
namespace radio {
namespace V1_0 {

enum class RadioResponseType : int32_t {
    SOLICITED = 0,
    SOLICITED_ACK = 1,
    SOLICITED_ACK_EXP = 2,
};

enum class RadioIndicationType : int32_t {
    UNSOLICITED = 0,
    UNSOLICITED_ACK_EXP = 1,
};

// Only the first values matter here; the service may report any int32 code.
enum class RadioError : int32_t {
    NONE = 0,
    RADIO_NOT_AVAILABLE = 1,
    GENERIC_FAILURE = 2,
    PASSWORD_INCORRECT = 3,
    SIM_PIN2 = 4,
    SIM_PUK2 = 5,
    REQUEST_NOT_SUPPORTED = 6,
    CANCELLED = 7,
    INTERNAL_ERR = 38,
    NO_MEMORY = 37,
    INVALID_ARGUMENTS = 44,
};

struct RadioResponseInfo {
    RadioResponseType type;
    int32_t serial;
    RadioError error;
};

}  // namespace V1_0
}  // namespace radio
}  // namespace hardware
}  // namespace android

#endif
