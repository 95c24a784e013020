// The radio HAL bridge: modem commands go out as HAL requests on the main thread;
// the HAL's answers and unsolicited output arrive on HIDL runtime threads and are
// written, one record per callback, into the bridge's end of the modem socket pair,
// where the main loop reads them. The callbacks touch nothing else. The bridge is
// the lowest layer of the modem path: it answers nobody and judges nothing.
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
#include "core/tolkd_log.h"

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

TolkdAdaptation::TolkdAdaptation() : mSocketFd(-1) {
    pthread_mutex_init(&mMutex, NULL);
    for (int slot = 0; slot < TOLKD_SIM_SLOT_COUNT; slot++) {
        mResponse[slot] = new TolkResponse(this, slot);
        mIndication[slot] = new TolkIndication(this, slot);
    }
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
    mRadio[slot]->registerTolkCallbacks(mResponse[slot], mIndication[slot]);
    mRadio[slot]->linkToDeath(mDeathRecipient, 0);
}

bool TolkdAdaptation::sendRequest(const char *data, int length, int *slotOut) {
    if (data == NULL || length < 0) return false;
    LOGD("%.*s", length, data);
    pthread_mutex_lock(&mMutex);
    int slot = getSlotId();
    if (slotOut != NULL) *slotOut = slot;
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
        dropProxy(slot);
    }
    pthread_mutex_unlock(&mMutex);
    return ok;
}

// Sends all of len bytes into fd; false when the pair failed.
static bool sendWhole(int fd, const char *data, size_t len) {
    size_t sent = 0;
    while (sent < len) {
        ssize_t n = send(fd, data + sent, len - sent, MSG_NOSIGNAL);
        if (n < 0) {
            if (errno == EINTR) continue;
            return false;
        }
        sent += (size_t)n;
    }
    return true;
}

void TolkdAdaptation::sendResponse(int kind, int slot, const char *data, int length) {
    if (length < 0 || (length > 0 && data == NULL)) return;
    LOGD("%.*s", length, data != NULL ? data : "");
    ModemRecordHeader header;
    memset(&header, 0, sizeof(header));
    header.kind = (uint8_t)kind;
    header.slot = (uint8_t)slot;
    header.length = (uint32_t)length;
    pthread_mutex_lock(&mMutex);
    // Header and data under one lock hold, partial sends completed: a record is
    // never cut by another thread's record. MSG_NOSIGNAL turns a closed main-loop
    // end into a plain failure.
    bool ok = sendWhole(mSocketFd, (const char *)&header, sizeof(header)) &&
              (length == 0 || sendWhole(mSocketFd, data, (size_t)length));
    LOGD("sendLen = %d", ok ? length : -1);
    pthread_mutex_unlock(&mMutex);
}

void TolkdAdaptation::dropProxy(int slot) {
    mRadio[slot].clear();
    // The answers still due from this proxy will not come; the main loop learns it
    // behind the answers that did come, which are already in the pair.
    ModemRecordHeader header;
    memset(&header, 0, sizeof(header));
    header.kind = MODEM_RECORD_SLOT_LOST;
    header.slot = (uint8_t)slot;
    if (!sendWhole(mSocketFd, (const char *)&header, sizeof(header))) LOGE("slot %d lost, not reported", slot);
}

void TolkdAdaptation::serviceDied(const android::hidl::base::V1_0::IBase *who) {
    LOGD("enter");
    pthread_mutex_lock(&mMutex);
    // Only the proxy that died goes. A notice can come late, from a proxy that a
    // failed send already replaced; the fresh proxy and the answers on it stay.
    for (int i = 0; i < TOLKD_SIM_SLOT_COUNT; i++) {
        if (mRadio[i] != nullptr && static_cast<android::hidl::base::V1_0::IBase *>(mRadio[i].get()) == who) {
            dropProxy(i);
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
    mAdaptation->sendResponse(MODEM_RECORD_ANSWER, mSlot, (const char *)data.data(), (int)data.size());
    return Void();
}

Return<void> TolkIndication::tolkInd(RadioIndicationType, const hidl_vec<uint8_t> &data) {
    LOGD("%.*s, %lu", (int)data.size(), (const char *)data.data(), (unsigned long)data.size());
    mAdaptation->sendResponse(MODEM_RECORD_INDICATION, mSlot, (const char *)data.data(), (int)data.size());
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

bool sendRequestOnSlot(const char *data, int length, int *slot) {
    return getAdaptation()->sendRequest(data, length, slot);
}

void sigpipe_handler(int) { LOGE("Caught SIGPIPE\n"); }
