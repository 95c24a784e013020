// The radio HAL bridge against an in-test radio service, and the modem link that
// reads what the bridge writes into the modem pair.
#include <sys/ioctl.h>

#include <cutils/properties.h>

#include "dispatch/dispatcher.h"
#include "fake_radio_service.h"
#include "hal/tolkd_adaptation.h"
#include "hal/tolkd_adaptation_impl.h"
#include "targets/modem_link.h"
#include "host_capture.h"

namespace {

// Bytes waiting at the main loop's end of the modem pair.
int pendingInPair() {
    int n = 0;
    return ioctl(s_fdRild_command, FIONREAD, &n) == 0 ? n : -1;
}

bool slotEmpty(int slot) {
    pthread_mutex_lock(&gTolkdAdaptation->mMutex);
    bool empty = gTolkdAdaptation->mRadio[slot] == nullptr;
    pthread_mutex_unlock(&gTolkdAdaptation->mMutex);
    return empty;
}

// A fresh device root, a host link to capture answers, and a bridge with no proxy
// and a fresh modem pair.
class HalBridge : public LinkTest {
protected:
    void SetUp() override {
        LinkTest::SetUp();
        connectTarget(RIL_TYPE);
        ASSERT_GE(s_fdRild_command, 0);
        ASSERT_NE(nullptr, gTolkdAdaptation);
    }
    void TearDown() override {
        // Proxies point at this test's services; the next test starts without them.
        pthread_mutex_lock(&gTolkdAdaptation->mMutex);
        for (auto &radio : gTolkdAdaptation->mRadio) radio.clear();
        pthread_mutex_unlock(&gTolkdAdaptation->mMutex);
        LinkTest::TearDown();
    }
    std::string slotPath(const char *instance) { return root.at(std::string(RADIO_WIRE_PATH_PREFIX) + instance); }
    // A request went out and the service took it as frame n (counting from 1).
    void expectFrame(FakeRadioService &s, size_t n, uint32_t type, int connection, const std::string &payload) {
        ASSERT_TRUE(s.waitFrames(n));
        FakeRadioFrame f = s.frames()[n - 1];
        EXPECT_EQ(type, f.type) << "frame " << n;
        EXPECT_EQ(connection, f.connection) << "frame " << n;
        EXPECT_EQ(payload, f.payload) << "frame " << n;
    }
};

}  // namespace

// The other values of the SIM choice and the CDMA slot, each against the modem
// that answers: modem.tx and fault_root.cpp.
TEST_F(HalBridge, SlotComesFromTheSimSelection) {
    EXPECT_EQ(0, TolkdAdaptation::getSlotId());  // unset: slot 0
    const struct {
        const char *sim, *cdma;
        int slot;
    } cases[] = {
        {"2", nullptr, 2},         {"8", nullptr, -1}, {"10", nullptr, -1},
        {"9", nullptr, 0},         // the CDMA slot defaults to the first
        {"9", "-2147483648", -1},  // regression: atoi minus one overflowed here (seen under UBSan)
        {"4294967297", nullptr, -1}, {"9", "4294967298", -1},  // 2^32 + 1 and + 2 do not wrap onto a slot
    };
    for (const auto &c : cases) {
        TestRoot root;  // fresh properties for each case
        ASSERT_EQ(0, property_set("persist.service.tolk.sim", c.sim));
        if (c.cdma) property_set("persist.radio.cdma_slot", c.cdma);
        EXPECT_EQ(c.slot, TolkdAdaptation::getSlotId()) << "sim " << c.sim << " cdma " << (c.cdma ? c.cdma : "-");
    }
}

// Callbacks that reach the main loop in one read are still relayed and judged one
// by one: an indication in front of the answer neither hides its final result nor
// is glued to it, and text cut at a NUL (as some HALs send it) is framed like text
// without one.
TEST_F(HalBridge, CommandGoesToTheSelectedSlotAndEachCallbackIsRelayedOnItsOwn) {
    FakeRadioService slot1(slotPath("slot1")), slot2(slotPath("slot2"));
    ASSERT_EQ(0, property_set("persist.service.tolk.sim", "9"));
    ASSERT_EQ(0, property_set("persist.radio.cdma_slot", "2"));

    const unsigned kTextPhase = 5;
    EXPECT_EQ(0, sendToModem("AT+CMGS=\"1\"", nullptr, kTextPhase));
    EXPECT_TRUE(isATCmdInject);
    expectFrame(slot2, 1, RADIO_WIRE_REGISTER, 0, "");
    expectFrame(slot2, 2, RADIO_WIRE_REQUEST, 0, std::string("AT+CMGS=\"1\"\0", 12));
    EXPECT_EQ(-1, slot2.frames()[1].serial);
    EXPECT_EQ(0, slot1.connections());
    EXPECT_EQ(0, sendDataToRild("AT+CSQ"));

    const std::string creg("\r\n+CREG: 1\r\n\0", 13), cms("\r\n+CMS ERROR: 330\r\n\0tail", 24),
        csq("\r\n+CSQ: 20,99\r\n\r\nOK\r\n\0", 23);
    ASSERT_TRUE(slot2.send(RADIO_WIRE_INDICATION, creg));
    ASSERT_TRUE(slot2.send(RADIO_WIRE_RESPONSE, cms));
    ASSERT_TRUE(slot2.send(RADIO_WIRE_RESPONSE, csq));
    const int all = 3 * (int)sizeof(ModemRecordHeader) + (int)(creg.size() + cms.size() + csq.size());
    ASSERT_TRUE(eventually([&] { return pendingInPair() == all; }));
    EXPECT_EQ(kTextPhase, serveModemLink()) << "the final result of the SMS command ends its text phase";
    EXPECT_EQ("\r\n+CREG: 1\r\n\r\n+CMS ERROR: 330\r\n\r\n+CSQ: 20,99\r\n\r\nOK\r\n", host.drain());
    EXPECT_EQ(0, gMmiCmdSeq.idx) << "two commands, two answers; the indication answers nothing";

    // The same proxy serves the next command: no new connection, no new registration.
    EXPECT_TRUE(sendRequest("AT", 3));
    expectFrame(slot2, 4, RADIO_WIRE_REQUEST, 0, std::string("AT\0", 3));
    EXPECT_EQ(1, slot2.connections());
}

TEST_F(HalBridge, TransportFailureDropsTheProxyAndTheNextRequestSetsUpAgain) {
    FakeRadioService slot1(slotPath("slot1"));
    ASSERT_TRUE(sendRequest("AT", 3));
    ASSERT_TRUE(slot1.waitFrames(2));
    // Without the death link only the failing request can find out.
    gTolkdAdaptation->mRadio[0]->unlinkToDeath(gTolkdAdaptation->mDeathRecipient);
    slot1.dropConnections();
    ASSERT_TRUE(eventually([] { return !gTolkdAdaptation->mRadio[0]->ping().isOk(); }));
    EXPECT_FALSE(sendRequest("AT+CSQ", 7));
    EXPECT_TRUE(slotEmpty(0));
    EXPECT_TRUE(sendRequest("AT+CSQ", 7));
    expectFrame(slot1, 3, RADIO_WIRE_REGISTER, 1, "");
    expectFrame(slot1, 4, RADIO_WIRE_REQUEST, 1, std::string("AT+CSQ\0", 7));
}

TEST_F(HalBridge, ServiceDeathDropsItsOwnProxyOnlyAndTheNextCommandRegistersAgain) {
    FakeRadioService slot1(slotPath("slot1")), slot3(slotPath("slot3"));
    ASSERT_TRUE(sendRequest("AT", 3));
    ASSERT_EQ(0, property_set("persist.service.tolk.sim", "2"));
    ASSERT_TRUE(sendRequest("AT", 3));
    ASSERT_TRUE(slot3.waitFrames(2));
    ASSERT_FALSE(slotEmpty(0));

    // A command of a text phase waits on slot 3 when its service dies: the main
    // loop learns that its answer will not come, and the phase ends.
    EXPECT_EQ(0, sendToModem("AT+CMGW", nullptr, 9));
    ASSERT_TRUE(slot3.waitFrames(3));
    slot3.dropConnections();
    ASSERT_TRUE(eventually([] { return slotEmpty(2); }));
    EXPECT_FALSE(slotEmpty(0)) << "slot 1's service lives on";
    ASSERT_TRUE(eventually([] { return pendingInPair() == (int)sizeof(ModemRecordHeader); }));
    EXPECT_EQ(9u, serveModemLink());
    EXPECT_EQ(0, gMmiCmdSeq.idx) << "the lost answer is no longer outstanding";
    ASSERT_TRUE(sendRequest("AT+CGSN", 8));
    expectFrame(slot3, 4, RADIO_WIRE_REGISTER, 1, "");
    expectFrame(slot3, 5, RADIO_WIRE_REQUEST, 1, std::string("AT+CGSN\0", 8));

    // A late notice about a proxy that was replaced meanwhile leaves the fresh one.
    pthread_mutex_lock(&gTolkdAdaptation->mMutex);
    android::sp<android::hidl::base::V1_0::IBase> old = gTolkdAdaptation->mRadio[2];
    gTolkdAdaptation->mRadio[2].clear();
    pthread_mutex_unlock(&gTolkdAdaptation->mMutex);
    ASSERT_TRUE(sendRequest("AT", 3));
    gTolkdAdaptation->mDeathRecipient->serviceDied(0, old);
    EXPECT_FALSE(slotEmpty(2));
}

TEST_F(HalBridge, NewModemPairReplacesAndClosesTheOldBridgeEnd) {
    FakeRadioService slot1(slotPath("slot1"));
    ASSERT_TRUE(sendRequest("AT", 3));
    ASSERT_TRUE(slot1.waitFrames(2));
    int oldMainEnd = s_fdRild_command;

    // The main loop gave up its end; the next pass makes a new pair, and the
    // bridge's old end is closed: the old main-loop end sees the end of stream.
    s_fdRild_command = -1;
    connectTarget(RIL_TYPE);
    ASSERT_GE(s_fdRild_command, 0);
    char c;
    EXPECT_EQ(0, recv(oldMainEnd, &c, 1, 0));
    close(oldMainEnd);
    ASSERT_TRUE(slot1.send(RADIO_WIRE_INDICATION, "\r\nRING\r\n"));
    ASSERT_TRUE(eventually([] { return pendingInPair() > 0; }));
    serveModemLink();
    EXPECT_EQ("\r\nRING\r\n", host.drain());
}
