// The radio HAL bridge: modem commands go out as HAL requests on the main thread;
// the HAL's answers and unsolicited output arrive on HIDL runtime threads and are
// written into the bridge's end of the modem socket pair, where the main loop reads
// them like any other target link. The callbacks touch nothing else.
#include "hal/tolkd_adaptation.h"
#include "hal/tolkd_adaptation_impl.h"

#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <unistd.h>

#include <cutils/properties.h>

#include "core/prop_number.h"
#include "core/reader.h"
#include "core/tolkd_log.h"
#include "serial/response_writer.h"
#include "targets/target_relay.h"

using android::sp;
using android::wp;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::radio::V1_0::RadioIndicationType;
using android::hardware::radio::V1_0::RadioResponseInfo;
using vendor::orvane::hardware::radio::V2_0::IRadio;

TolkdAdaptation *gTolkdAdaptation = NULL;

static const char *const kSlotInstances[TOLKD_SIM_SLOT_COUNT] = {"slot1", "slot2", "slot3", "slot4"};

static const char kNoModem[] = "ERROR:No Modem";

TolkdAdaptation::TolkdAdaptation() : mSocketFd(-1) {
    pthread_mutex_init(&mMutex, NULL);
    mResponse = new TolkResponse(this);
    mIndication = new TolkIndication(this);
    mDeathRecipient = new RadioDeathRecipient(this);
}

int TolkdAdaptation::getSlotId() {
    char simNo[PROPERTY_VALUE_MAX] = {0};
    property_get("persist.service.tolk.sim", simNo, "0");
    LOGD("simNo: %s", simNo);
    int slotId = propertyNumber(simNo);
    LOGD("slotId: %d", slotId);
    if ((unsigned int)slotId < TOLKD_SIM_SLOT_COUNT) return slotId;
    if (slotId == 9) {
        char cdmaSlot[PROPERTY_VALUE_MAX] = {0};
        property_get("persist.radio.cdma_slot", cdmaSlot, "1");
        // Only a slot number 1..N names a slot.
        int cdma = propertyNumber(cdmaSlot);
        if (cdma >= 1 && cdma <= TOLKD_SIM_SLOT_COUNT) return cdma - 1;
        LOGE("unsupported cdma slot number.");
        return -1;
    }
    LOGE("unsupported slot number.");
    return -1;
}

// Runs with mMutex held (from sendRequest).
void TolkdAdaptation::setUp(int slot) {
    if ((unsigned int)slot >= TOLKD_SIM_SLOT_COUNT) return;
    mRadio[slot] = IRadio::getService(kSlotInstances[slot], false);
    if (mRadio[slot] == nullptr) {
        LOGE("getService %s failed", kSlotInstances[slot]);
        return;
    }
    mRadio[slot]->registerTolkCallbacks(mResponse, mIndication);
    mRadio[slot]->linkToDeath(mDeathRecipient, 0);
}

bool TolkdAdaptation::sendRequest(const char *data, int length) {
    if (data == NULL || length < 0) return false;
    LOGD("%.*s", length, data);
    pthread_mutex_lock(&mMutex);
    int slot = getSlotId();
    if ((unsigned int)slot >= TOLKD_SIM_SLOT_COUNT) {
        pthread_mutex_unlock(&mMutex);
        return false;
    }
    if (mRadio[slot] == nullptr) {
        setUp(slot);
        if (mRadio[slot] == nullptr) {
            pthread_mutex_unlock(&mMutex);
            return false;
        }
    }
    // The HAL only reads the request during the call, so the caller's bytes are
    // wrapped rather than copied.
    hidl_vec<uint8_t> request;
    request.setToExternal(reinterpret_cast<uint8_t *>(const_cast<char *>(data)), (size_t)length);
    Return<void> status = mRadio[slot]->sendTolkRequest(-1, request);
    bool ok = status.isOk();
    if (!ok) {
        // Drop the broken proxy so the next request connects afresh.
        mRadio[slot].clear();
    }
    pthread_mutex_unlock(&mMutex);
    return ok;
}

void TolkdAdaptation::sendResponse(const char *data, int length) {
    if (data == NULL || length <= 0) return;
    LOGD("%.*s", length, data);
    pthread_mutex_lock(&mMutex);
    // A short send would leave half an answer in the pair, so the rest follows;
    // MSG_NOSIGNAL turns a closed main-loop end into a plain failure.
    int sent = 0;
    while (sent < length) {
        ssize_t n = send(mSocketFd, data + sent, (size_t)(length - sent), MSG_NOSIGNAL);
        if (n < 0) {
            if (errno == EINTR) continue;
            if (sent == 0) sent = -1;
            break;
        }
        sent += (int)n;
    }
    LOGD("sendLen = %d", sent);
    pthread_mutex_unlock(&mMutex);
}

void TolkdAdaptation::serviceDied(const android::hidl::base::V1_0::IBase *who) {
    LOGD("enter");
    pthread_mutex_lock(&mMutex);
    // Only the proxy that died goes. A notice can come late, from a proxy that a
    // failed send already replaced; the fresh proxy and the answers on it stay.
    for (int i = 0; i < TOLKD_SIM_SLOT_COUNT; i++) {
        if (mRadio[i] != nullptr && static_cast<android::hidl::base::V1_0::IBase *>(mRadio[i].get()) == who) {
            mRadio[i].clear();
        }
    }
    pthread_mutex_unlock(&mMutex);
}

void TolkdAdaptation::setSocketFd(int fd) {
    // Callbacks write into mSocketFd under the mutex; swapping under it and closing
    // the old end only afterwards means no callback writes into a closed (or
    // meanwhile reused) descriptor.
    pthread_mutex_lock(&mMutex);
    int old = mSocketFd;
    mSocketFd = fd;
    pthread_mutex_unlock(&mMutex);
    if (old >= 0 && old != fd) close(old);
}

Return<void> TolkResponse::sendTolkResponse(const RadioResponseInfo &, const hidl_vec<uint8_t> &data) {
    LOGD("%.*s, %lu", (int)data.size(), (const char *)data.data(), (unsigned long)data.size());
    mAdaptation->sendResponse((const char *)data.data(), (int)data.size());
    return Void();
}

Return<void> TolkIndication::tolkInd(RadioIndicationType, const hidl_vec<uint8_t> &data) {
    LOGD("%.*s, %lu", (int)data.size(), (const char *)data.data(), (unsigned long)data.size());
    mAdaptation->sendResponse((const char *)data.data(), (int)data.size());
    return Void();
}

void RadioDeathRecipient::serviceDied(uint64_t, const wp<android::hidl::base::V1_0::IBase> &who) {
    LOGE("enter");
    // A proxy that no longer exists was dropped already, and its old address may
    // now hold a fresh proxy: only a living one is looked for.
    sp<android::hidl::base::V1_0::IBase> dead = who.promote();
    if (dead != nullptr) mAdaptation->serviceDied(dead.get());
}

static TolkdAdaptation *getAdaptation(void) {
    if (gTolkdAdaptation == NULL) gTolkdAdaptation = new TolkdAdaptation();
    return gTolkdAdaptation;
}

void setSocketFdForAdaptation(int fd) { getAdaptation()->setSocketFd(fd); }

bool sendRequest(const char *data, int length) { return getAdaptation()->sendRequest(data, length); }

int sendDataToRild(const char *line) {
    LOGD("Enter");
    if (line == NULL) return 0;
    if (!sendRequest(line, (int)strlen(line) + 1)) writeDataToSerial(kNoModem, (int)sizeof(kNoModem));
    isATCmdInject = true;
    LOGD(" send data over");
    for (const char *p = line; *p != '\0'; p++) {
        if (*p == 0x1A || *p == 0x1B) {
            LOGD(" SUB or ESC in line, clear isMsgCmdInput");
            isMsgCmdInput = false;
            break;
        }
    }
    return 0;
}

void sigpipe_handler(int) { LOGE("Caught SIGPIPE\n"); }
