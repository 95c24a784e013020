// The IRadio proxy of the HIDL stand-in. One proxy is one AF_UNIX connection to the
// simulated radio service, read by one runtime thread of its own: that thread
// delivers the callbacks, one at a time and in the order the service sent them, and
// the death notification when the service ends the connection.
//
// The reader thread is detached and shares the connection state with the proxy.
// Releasing the proxy (possibly on that very thread, possibly while the thread waits
// for a lock its releaser holds) only marks the connection released and shuts the
// socket down; it never waits for the thread. The thread sees the end of the stream,
// stops, and the last of the two to let go closes the descriptor, so it is never
// closed under a read in progress.
#include <vendor/orvane/hardware/radio/2.0/IRadio.h>

#include <errno.h>
#include <limits.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <memory>
#include <mutex>
#include <system_error>
#include <thread>
#include <vector>

#include <tolk_platform/device_root.h>
#include <tolk_platform/radio_wire.h>

namespace vendor {
namespace orvane {
namespace hardware {
namespace radio {
namespace V2_0 {

using ::android::sp;
using ::android::wp;
using ::android::hardware::hidl_death_recipient;
using ::android::hardware::hidl_vec;
using ::android::hardware::Return;
using ::android::hardware::Status;
using ::android::hardware::Void;
using ::android::hardware::radio::V1_0::RadioError;
using ::android::hardware::radio::V1_0::RadioIndicationType;
using ::android::hardware::radio::V1_0::RadioResponseInfo;
using ::android::hardware::radio::V1_0::RadioResponseType;
using ::android::hidl::base::V1_0::IBase;

namespace {

struct DeathLink {
    wp<hidl_death_recipient> recipient;
    uint64_t cookie;
};

struct Connection {
    explicit Connection(int socketFd) : fd(socketFd) {}
    ~Connection() { close(fd); }
    Connection(const Connection &) = delete;
    Connection &operator=(const Connection &) = delete;

    const int fd;
    std::mutex sendMutex;  // one frame at a time on the socket

    std::mutex mutex;  // guards the fields below
    sp<ITolkResponse> response;
    sp<ITolkIndication> indication;
    std::vector<DeathLink> deathLinks;
    bool released = false;  // the proxy is gone: deliver nothing more
    bool dead = false;      // the service ended the connection
};

Status transportFailure(const char *what) { return Status::fromExceptionCode(Status::EX_TRANSACTION_FAILED, what); }

void readerLoop(std::shared_ptr<Connection> conn, wp<IBase> who) {
    std::vector<uint8_t> buf(RADIO_WIRE_MAX_PAYLOAD);
    for (;;) {
        RadioWireHeader hdr;
        if (radio_wire_recv(conn->fd, &hdr, buf.data(), buf.size()) != 0) break;
        sp<ITolkResponse> response;
        sp<ITolkIndication> indication;
        {
            std::lock_guard<std::mutex> lock(conn->mutex);
            if (conn->released) break;
            response = conn->response;
            indication = conn->indication;
        }
        // The payload stays valid for the whole callback: the next frame is read
        // into the buffer only after the callback has returned.
        hidl_vec<uint8_t> data;
        data.setToExternal(buf.data(), hdr.length);
        if (hdr.type == RADIO_WIRE_RESPONSE && response != nullptr) {
            RadioResponseInfo info;
            info.type = RadioResponseType::SOLICITED;
            info.serial = hdr.serial;
            info.error = static_cast<RadioError>(hdr.extra);
            response->sendTolkResponse(info, data);
        } else if (hdr.type == RADIO_WIRE_INDICATION && indication != nullptr) {
            indication->tolkInd(static_cast<RadioIndicationType>(hdr.extra), data);
        }
    }

    std::vector<DeathLink> links;
    {
        std::lock_guard<std::mutex> lock(conn->mutex);
        conn->dead = true;
        if (!conn->released) links = conn->deathLinks;
    }
    // No lock is held here: a recipient typically drops the proxy, whose
    // destructor takes conn->mutex.
    for (const DeathLink &link : links) {
        sp<hidl_death_recipient> recipient = link.recipient.promote();
        if (recipient != nullptr) recipient->serviceDied(link.cookie, who);
    }
}

class BpHwRadio : public IRadio {
public:
    explicit BpHwRadio(std::shared_ptr<Connection> conn) : mConn(std::move(conn)) {}

    ~BpHwRadio() override {
        sp<ITolkResponse> response;
        sp<ITolkIndication> indication;
        std::vector<DeathLink> links;
        {
            std::lock_guard<std::mutex> lock(mConn->mutex);
            mConn->released = true;
            response = std::move(mConn->response);
            indication = std::move(mConn->indication);
            links.swap(mConn->deathLinks);
        }
        // Wakes the reader thread, which then ends without notifying anyone.
        shutdown(mConn->fd, SHUT_RDWR);
        // The callback objects are dropped here, outside the lock.
    }

    bool isRemote() const override { return true; }

    Return<bool> linkToDeath(const sp<hidl_death_recipient> &recipient, uint64_t cookie) override {
        if (recipient == nullptr) return false;
        std::lock_guard<std::mutex> lock(mConn->mutex);
        if (mConn->dead) return transportFailure("linkToDeath: service is dead");
        mConn->deathLinks.push_back(DeathLink{wp<hidl_death_recipient>(recipient), cookie});
        return true;
    }

    Return<bool> unlinkToDeath(const sp<hidl_death_recipient> &recipient) override {
        std::lock_guard<std::mutex> lock(mConn->mutex);
        for (auto it = mConn->deathLinks.begin(); it != mConn->deathLinks.end(); ++it) {
            if (it->recipient.unsafe_get() == recipient.get()) {
                mConn->deathLinks.erase(it);
                return true;
            }
        }
        return false;
    }

    Return<void> ping() override {
        std::lock_guard<std::mutex> lock(mConn->mutex);
        if (mConn->dead) return transportFailure("ping: service is dead");
        return Void();
    }

    Return<void> registerTolkCallbacks(const sp<ITolkResponse> &response,
                                       const sp<ITolkIndication> &indication) override {
        {
            std::lock_guard<std::mutex> lock(mConn->mutex);
            if (mConn->dead) return transportFailure("registerTolkCallbacks: service is dead");
            // Stored before the service hears of them, so no early answer is missed.
            mConn->response = response;
            mConn->indication = indication;
        }
        return sendFrame(RADIO_WIRE_REGISTER, 0, nullptr, 0);
    }

    Return<void> sendTolkRequest(int32_t serial, const hidl_vec<uint8_t> &data) override {
        if (data.size() > RADIO_WIRE_MAX_PAYLOAD) {
            return Status::fromExceptionCode(Status::EX_ILLEGAL_ARGUMENT, "sendTolkRequest: request too long");
        }
        {
            std::lock_guard<std::mutex> lock(mConn->mutex);
            if (mConn->dead) return transportFailure("sendTolkRequest: service is dead");
        }
        return sendFrame(RADIO_WIRE_REQUEST, serial, data.data(), static_cast<uint32_t>(data.size()));
    }

private:
    Return<void> sendFrame(uint32_t type, int32_t serial, const void *payload, uint32_t length) {
        std::lock_guard<std::mutex> lock(mConn->sendMutex);
        if (radio_wire_send(mConn->fd, type, serial, 0, payload, length) != 0) {
            return transportFailure(strerror(errno));
        }
        return Void();
    }

    std::shared_ptr<Connection> mConn;
};

bool validInstanceName(const std::string &name) {
    if (name.empty() || name.size() > 64) return false;
    for (char c : name) {
        bool ok = (c >= 'a' && c <= 'z') || (c >= 'A' && c <= 'Z') || (c >= '0' && c <= '9') || c == '_' ||
                  c == '-' || c == '.';
        if (!ok) return false;
    }
    return name != "." && name != "..";
}

int connectInstance(const std::string &instance) {
    std::string devicePath = std::string(RADIO_WIRE_PATH_PREFIX) + instance;
    char path[PATH_MAX];
    if (tolk_device_path(devicePath.c_str(), path, sizeof(path)) == nullptr) return -1;
    struct sockaddr_un addr;
    memset(&addr, 0, sizeof(addr));
    addr.sun_family = AF_UNIX;
    if (strlen(path) >= sizeof(addr.sun_path)) return -1;
    strncpy(addr.sun_path, path, sizeof(addr.sun_path) - 1);

    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    if (fd < 0) return -1;
    int rc;
    do {
        rc = connect(fd, reinterpret_cast<struct sockaddr *>(&addr), sizeof(addr));
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) {
        close(fd);
        return -1;
    }
    return fd;
}

}  // namespace

sp<IRadio> IRadio::getService(const std::string &serviceName, bool getStub) {
    // There is no in-process (passthrough) implementation on the host.
    if (getStub || !validInstanceName(serviceName)) return nullptr;
    int fd = connectInstance(serviceName);
    if (fd < 0) return nullptr;

    auto conn = std::make_shared<Connection>(fd);
    sp<IRadio> proxy = new BpHwRadio(conn);
    try {
        std::thread(readerLoop, conn, wp<IBase>(proxy)).detach();
    } catch (const std::system_error &) {
        return nullptr;
    }
    return proxy;
}

}  // namespace V2_0
}  // namespace radio
}  // namespace hardware
}  // namespace orvane
}  // namespace vendor
