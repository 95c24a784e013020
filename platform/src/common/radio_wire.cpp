// Frames on the wire between the radio HAL stand-in and the simulated radio service.
#include <tolk_platform/radio_wire.h>

#include <errno.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/uio.h>
#include <unistd.h>

namespace {

// Writes all iovecs. Sockets get MSG_NOSIGNAL so that a vanished peer is an EPIPE
// for the caller, never a SIGPIPE for the process.
int writeAll(int fd, struct iovec *iov, int iovcnt) {
    bool isSocket = true;
    while (iovcnt > 0) {
        if (iov->iov_len == 0) {
            iov++;
            iovcnt--;
            continue;
        }
        ssize_t n;
        if (isSocket) {
            struct msghdr msg;
            memset(&msg, 0, sizeof(msg));
            msg.msg_iov = iov;
            msg.msg_iovlen = static_cast<size_t>(iovcnt);
            n = sendmsg(fd, &msg, MSG_NOSIGNAL);
            if (n < 0 && errno == ENOTSOCK) {
                isSocket = false;
                continue;
            }
        } else {
            n = writev(fd, iov, iovcnt);
        }
        if (n < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        size_t done = static_cast<size_t>(n);
        while (iovcnt > 0 && done >= iov->iov_len) {
            done -= iov->iov_len;
            iov++;
            iovcnt--;
        }
        if (iovcnt > 0) {
            iov->iov_base = static_cast<char *>(iov->iov_base) + done;
            iov->iov_len -= done;
        }
    }
    return 0;
}

// Reads exactly size bytes; -1 on end of connection or error.
int readAll(int fd, void *buf, size_t size) {
    char *p = static_cast<char *>(buf);
    while (size > 0) {
        ssize_t n = read(fd, p, size);
        if (n < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        if (n == 0) return -1;
        p += n;
        size -= static_cast<size_t>(n);
    }
    return 0;
}

}  // namespace

extern "C" int radio_wire_send(int fd, uint32_t type, int32_t serial, int32_t extra, const void *payload,
                               uint32_t length) {
    if (fd < 0 || length > RADIO_WIRE_MAX_PAYLOAD || (length > 0 && payload == nullptr)) {
        errno = EINVAL;
        return -1;
    }
    RadioWireHeader hdr;
    hdr.type = type;
    hdr.serial = serial;
    hdr.extra = extra;
    hdr.length = length;
    struct iovec iov[2];
    iov[0].iov_base = &hdr;
    iov[0].iov_len = sizeof(hdr);
    iov[1].iov_base = const_cast<void *>(payload);
    iov[1].iov_len = length;
    return writeAll(fd, iov, 2);
}

extern "C" int radio_wire_recv(int fd, RadioWireHeader *hdr, void *payload, size_t capacity) {
    if (fd < 0 || hdr == nullptr) {
        errno = EINVAL;
        return -1;
    }
    if (readAll(fd, hdr, sizeof(*hdr)) != 0) return -1;
    if (hdr->length > RADIO_WIRE_MAX_PAYLOAD || hdr->length > capacity || (hdr->length > 0 && payload == nullptr)) {
        // The stream cannot be resynchronised after a bad header.
        errno = EPROTO;
        return -1;
    }
    if (hdr->length > 0 && readAll(fd, payload, hdr->length) != 0) return -1;
    return 0;
}
