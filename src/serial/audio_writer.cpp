// The raw writer of the device maker's audio answers: the MMI audio test exchanges
// byte frames, so every byte must reach the host unchanged and complete. The writer
// waits for the link, repeats interrupted and partial writes, and restores a serial
// port that failed.
#include <errno.h>
#include <poll.h>
#include <stdlib.h>
#include <sys/select.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"

#define AUDIO_WAIT_USEC 300000
#define AUDIO_RETRY_SLEEP_USEC 10000
#define AUDIO_REOPEN_TRIES 3

enum WaitResult { WAIT_WRITABLE, WAIT_NOT_YET, WAIT_BAD_FD };

// One wait for writability. The timeout record belongs to the whole attempt: select
// leaves the remaining time in it, so once the budget is spent later waits return at
// once. *stillMarked tells whether the set still holds the descriptor (select failed
// and left it untouched).
static WaitResult waitWritable(int fd, struct timeval *timeout, bool *stillMarked) {
    *stillMarked = false;
    if (fd >= FD_SETSIZE) {
        // select cannot watch this descriptor; poll can, within the same budget.
        struct pollfd p;
        p.fd = fd;
        p.events = POLLOUT;
        p.revents = 0;
        const int ms = (int)(timeout->tv_sec * 1000 + timeout->tv_usec / 1000);
        const int rc = poll(&p, 1, ms);
        if (rc == 0) {
            timeout->tv_sec = 0;
            timeout->tv_usec = 0;
        }
        if (rc > 0 && (p.revents & POLLNVAL)) return WAIT_BAD_FD;
        return rc > 0 ? WAIT_WRITABLE : WAIT_NOT_YET;
    }
    fd_set writeSet;
    FD_ZERO(&writeSet);
    FD_SET(fd, &writeSet);
    const int rc = select(fd + 1, NULL, &writeSet, NULL, timeout);
    if (rc > 0 && FD_ISSET(fd, &writeSet)) return WAIT_WRITABLE;
    // A descriptor that is not open can never become writable; waiting on it would
    // hang the daemon, so it is handled like a failed write.
    if (rc < 0 && errno == EBADF) return WAIT_BAD_FD;
    *stillMarked = FD_ISSET(fd, &writeSet);
    return WAIT_NOT_YET;
}

// Reopens the serial port after a fatal write error; the open puts it into the
// settings of the mode it was in (MMI test or line settings). Ends the process
// when the port cannot be restored.
static int reopenSerialPort(void) {
    for (int i = 0; i < AUDIO_REOPEN_TRIES; i++) {
        const int fd = open_serial_device(&gSerialDevice, gSerialDevice.devName[DEVICE_SERIAL]);
        gSerialDevice.fd[DEVICE_SERIAL] = fd;
        if (fd >= 0) {
            LOGD("The FD is reopen successfully");
            return fd;
        }
    }
    LOGE("The process is terminated due to fatal error");
    exit(1);
}

void writeDataToSerialByAudioType(const char *buf, int len) {
    HostLink current = currentHostLink();
    writeDataToLinkByAudioType(&current, buf, len);
}

void writeDataToLinkByAudioType(const HostLink *to, const char *buf, int len) {
    if (buf == NULL || len <= 0) return;
    for (int i = 0; i < len; i++) {
        LOGD("input[%d]=%x", i, (unsigned)(unsigned char)buf[i]);
    }

    const int device = to != NULL ? to->device : currentOutputDevice();
    int fd = hostLinkFd(to);
    if (fd < 0) return;

    int done = 0;
    for (;;) {
        // A new attempt: a fresh 300 ms budget for the waits.
        struct timeval timeout;
        timeout.tv_sec = 0;
        timeout.tv_usec = AUDIO_WAIT_USEC;

        WaitResult waited;
        for (;;) {
            bool stillMarked = false;
            waited = waitWritable(fd, &timeout, &stillMarked);
            if (waited != WAIT_NOT_YET) break;
            usleep(AUDIO_RETRY_SLEEP_USEC);
            if (stillMarked) usleep(AUDIO_RETRY_SLEEP_USEC);
        }

        int err = EBADF;
        if (waited == WAIT_WRITABLE) {
            const int want = len - done;
            const ssize_t n = write(fd, buf + done, (size_t)want);
            if (n == want) {
                LOGW("write data to serial %d bytes successfully", len);
                return;
            }
            if (n > 0) {
                LOGW("Couldn't write all data to the serial port. Wrote only %d bytes with %d", (int)n, errno);
                done += (int)n;
                continue;
            }
            // A write of nothing without an error is no failure of the link.
            if (n == 0 || errno == EINTR || errno == EAGAIN || errno == EWOULDBLOCK) continue;
            err = errno;
        }

        LOGE("FATAL Error in serail fd %d  write:%d currDevice = %d", fd, err, device);
        close(fd);
        gSerialDevice.fd[device] = -1;
        if (device == DEVICE_ADB) return;
        fd = reopenSerialPort();
    }
}
