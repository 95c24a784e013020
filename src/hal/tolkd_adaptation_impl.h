// The radio HAL bridge's object and callback classes. Private to the bridge and its
// tests; the rest of the daemon uses the plain entry points of tolkd_adaptation.h.
#ifndef TOLKD_HAL_TOLKD_ADAPTATION_IMPL_H
#define TOLKD_HAL_TOLKD_ADAPTATION_IMPL_H

#include <pthread.h>
#include <stdint.h>

#include <android/hardware/radio/1.0/types.h>
#include <android/hidl/base/1.0/IBase.h>
#include <hidl/HidlSupport.h>
#include <hidl/Status.h>
#include <utils/RefBase.h>
#include <vendor/orvane/hardware/radio/2.0/IRadio.h>
#include <vendor/orvane/hardware/radio/2.0/ITolkIndication.h>
#include <vendor/orvane/hardware/radio/2.0/ITolkResponse.h>

#include "hal/tolkd_adaptation.h"

#define TOLKD_SIM_SLOT_COUNT MODEM_SLOT_COUNT

class TolkdAdaptation;

// Receives the modem's answers on a HIDL runtime thread. One per slot, so that
// each answer is known to come from its slot.
class TolkResponse : public vendor::orvane::hardware::radio::V2_0::ITolkResponse {
public:
    TolkResponse(TolkdAdaptation *adaptation, int slot) : mAdaptation(adaptation), mSlot(slot) {}
    ~TolkResponse() override {}
    android::hardware::Return<void> sendTolkResponse(const android::hardware::radio::V1_0::RadioResponseInfo &info,
                                                     const android::hardware::hidl_vec<uint8_t> &data) override;

private:
    TolkdAdaptation *mAdaptation;
    int mSlot;
};

// Receives the modem's unsolicited output on a HIDL runtime thread, one per slot.
class TolkIndication : public vendor::orvane::hardware::radio::V2_0::ITolkIndication {
public:
    TolkIndication(TolkdAdaptation *adaptation, int slot) : mAdaptation(adaptation), mSlot(slot) {}
    ~TolkIndication() override {}
    android::hardware::Return<void> tolkInd(android::hardware::radio::V1_0::RadioIndicationType type,
                                            const android::hardware::hidl_vec<uint8_t> &data) override;

private:
    TolkdAdaptation *mAdaptation;
    int mSlot;
};

class RadioDeathRecipient : public android::hardware::hidl_death_recipient {
public:
    explicit RadioDeathRecipient(TolkdAdaptation *adaptation) : mAdaptation(adaptation) {}
    ~RadioDeathRecipient() override {}
    void serviceDied(uint64_t cookie, const android::wp<android::hidl::base::V1_0::IBase> &who) override;

private:
    TolkdAdaptation *mAdaptation;
};

class TolkdAdaptation {
public:
    TolkdAdaptation();

    void setUp(int slot);
    static int getSlotId();
    // Sends one request; *slotOut (when given) receives the slot it went to.
    bool sendRequest(const char *data, int length, int *slotOut = NULL);
    // Writes one record (a ModemRecordKind) of slot into the main loop's pair.
    void sendResponse(int kind, int slot, const char *data, int length);
    // Drops the proxy (of whichever slot) that is the service that died.
    void serviceDied(const android::hidl::base::V1_0::IBase *who);
    // Installs the bridge's end of a new modem pair and closes the previous end.
    void setSocketFd(int fd);

    android::sp<vendor::orvane::hardware::radio::V2_0::IRadio> mRadio[TOLKD_SIM_SLOT_COUNT];
    android::sp<TolkResponse> mResponse[TOLKD_SIM_SLOT_COUNT];
    android::sp<TolkIndication> mIndication[TOLKD_SIM_SLOT_COUNT];
    android::sp<RadioDeathRecipient> mDeathRecipient;
    int mSocketFd;
    pthread_mutex_t mMutex;

private:
    // Drops the proxy of slot and tells the main loop; runs with mMutex held.
    void dropProxy(int slot);
    TolkdAdaptation(const TolkdAdaptation &) = delete;
    TolkdAdaptation &operator=(const TolkdAdaptation &) = delete;
};

// Created on first use, never destroyed.
extern TolkdAdaptation *gTolkdAdaptation;

#endif
