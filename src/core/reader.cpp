// The reading half of the main loop: wait on the host links and on the target links
// that answer asynchronously, relay target answers, and turn host input into one
// command line in cmdBuf.
#include "core/reader.h"

#include <errno.h>
#include <stdlib.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <unistd.h>

#include "core/sms_merge.h"
#include "core/tolkd_log.h"
#include "dispatch/dispatcher.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

int tolk_conn_mode = 1;

#define CONN_MODE_VCOM 1
#define CONN_MODE_ADB 2

// A raw factory-test frame that the USB link is known to damage: 51 bytes whose
// 0x00 0xA8 pair at offset 12 can get lost, or whose tail arrives in later reads.
#define MMITEST_FRAME_PREFIX "at^mmitest="
#define MMITEST_FRAME_PREFIX_LEN 11
#define MMITEST_FRAME_LEN 51
#define MMITEST_FIX_OFFSET 12
#define MMITEST_MAX_EXTRA_READS 5
#define MMITEST_SCRATCH_SIZE 101

#define SERIAL_REOPEN_ATTEMPTS 3

static char lineBuf[DATA_BUF_SIZE];
static char adbBuf[DATA_BUF_SIZE];

// The adb line being assembled. It lives apart from lineBuf so that a serial line
// read while an adb line is half complete neither overwrites nor steals its bytes;
// it survives reading cycles until its CR arrives or its connection goes away.
static char adbLine[DATA_BUF_SIZE];
static int adbLineLen = 0;

void discardAdbLine(void) {
    memset(adbLine, 0, sizeof(adbLine));
    adbLineLen = 0;
}

// select() can only watch descriptors below FD_SETSIZE; anything else is unusable.
static bool selectable(int fd) { return fd >= 0 && fd < FD_SETSIZE; }

static void watch(int fd, fd_set *set, int *maxFd) {
    FD_SET(fd, set);
    if (fd > *maxFd) *maxFd = fd;
}

static bool isReady(int fd, fd_set *set) { return selectable(fd) && FD_ISSET(fd, set); }

static void closeAdbConnection(SerialDevice *dev) {
    if (dev->fd[DEVICE_ADB] >= 0) close(dev->fd[DEVICE_ADB]);
    dev->fd[DEVICE_ADB] = -1;
    discardAdbLine();
}

int adb_socket_accept(int listenFd) {
    LOGD("accept socket on fd :%d", listenFd);
    struct sockaddr addr;
    socklen_t addrLen = sizeof(addr);
    int fd = accept(listenFd, &addr, &addrLen);
    if (fd < 0) LOGD("Fail to accept socket port err:%d", errno);
    return fd;
}

// Reads from a host slot into buf (DATA_BUF_SIZE bytes, zeroed by the caller).
// Returns the byte count, or -1 when the adb connection is gone. A dead serial port
// is reopened in place; if that is impossible the daemon has no reason to live.
static int readFromHost(SerialDevice *dev, int slot, char *buf) {
    for (;;) {
        int fd = dev->fd[slot];
        LOGD("Wait for read data from USB :%d", fd);
        ssize_t n = read(fd, buf, MAX_DATA_LEN);
        if (n > 0) return (int)n;
        if (n < 0 && (errno == EINTR || errno == EAGAIN)) continue;

        LOGE("FATAL Error in serail read:%d", errno);
        if (slot == DEVICE_ADB) {
            closeAdbConnection(dev);
            LOGD("currDevice[%d]", slot);
            return -1;
        }
        if (fd >= 0) close(fd);
        dev->fd[slot] = -1;
        for (int i = 0; i < SERIAL_REOPEN_ATTEMPTS && dev->fd[slot] < 0; i++) {
            dev->fd[slot] = open_serial_device(dev, dev->devName[DEVICE_SERIAL]);
        }
        if (dev->fd[slot] < 0) {
            LOGE("The process is terminated due to fatal error");
            exit(1);
        }
        LOGD("The FD is FATAL Error reopen successfully");
        memset(buf, 0, DATA_BUF_SIZE);
    }
}

// Puts back the pieces of a damaged "at^mmitest=" frame. Only a frame shorter than
// 51 bytes is repaired: a longer line cannot be a frame that lost bytes, and waiting
// for more would swallow the host's next command line. Extra reads ask only for the
// bytes still missing, so the frame never grows past 51 bytes.
static int repairMmitestFrame(int fd, char *buf, int n) {
    if (n == MMITEST_FRAME_LEN || strncmp(buf, MMITEST_FRAME_PREFIX, MMITEST_FRAME_PREFIX_LEN) != 0) return n;

    for (int i = 0; i < 16; i++) LOGE("p_buffer[%d]=0x%x", i, (unsigned char)buf[i]);

    if (n < MMITEST_FRAME_LEN) {
        char scratch[MMITEST_SCRATCH_SIZE];
        if (n >= MMITEST_FIX_OFFSET && buf[MMITEST_FIX_OFFSET] != 0) {
            LOGD("to fix 0x00 0xa8 lost");
            int tail = n - MMITEST_FIX_OFFSET;  // below 39, fits the scratch buffer
            memcpy(scratch, buf + MMITEST_FIX_OFFSET, tail);
            buf[MMITEST_FIX_OFFSET] = 0x00;
            buf[MMITEST_FIX_OFFSET + 1] = (char)0xA8;
            memcpy(buf + MMITEST_FIX_OFFSET + 2, scratch, tail);
            n += 2;
        }
        for (int tries = 0; n < MMITEST_FRAME_LEN && tries < MMITEST_MAX_EXTRA_READS; tries++) {
            LOGD("to read the data for ffa8 & ff99");
            memset(scratch, 0, sizeof(scratch));
            ssize_t got = read(fd, scratch, MMITEST_FRAME_LEN - n);
            LOGD("read %d bytes  for ffa8 & ff99", n);
            if (got > 0) {
                memcpy(buf + n, scratch, got);
                n += (int)got;
            }
        }
    }
    if (n != MMITEST_FRAME_LEN) {
        LOGE("do not get all data !!!");
        LOGD("p_buffer[%d]=%x,%x,%x,%x", 11, (unsigned char)buf[11], (unsigned char)buf[12],
             (unsigned char)buf[13], (unsigned char)buf[14]);
    }
    return n;
}

// Adds the new adb bytes to the line being assembled. Returns the length of the
// completed line (now in lineBuf), or 0 when the line needs more bytes. A line ends
// at CR or at 6144 bytes; whatever follows in the same packet is dropped.
static int assembleAdbLine(const char *bytes, int n) {
    for (int i = 0; i < n; i++) {
        int off = adbLineLen + i;
        adbLine[off] = bytes[i];
        if (bytes[i] == '\r' || off > MAX_DATA_LEN - 2) {
            int len = off + 1;
            LOGD(".AT command read done.");
            memcpy(lineBuf, adbLine, len);
            lineBuf[len] = '\0';
            discardAdbLine();
            return len;
        }
    }
    LOGD(".AT command read more.");
    adbLineLen += n;
    LOGD(".go on read.");
    return 0;
}

static bool beginsWithAt(const char *line, int n) {
    return n >= 3 && (line[0] == 'A' || line[0] == 'a') && (line[1] == 'T' || line[1] == 't');
}

char *readline(SerialDevice *dev) {
    LOGD("Enter");
    memset(lineBuf, 0, sizeof(lineBuf));
    memset(adbBuf, 0, sizeof(adbBuf));
    tolk_conn_mode = CONN_MODE_VCOM;

    for (;;) {
        // While SMS text is merged, cmdBuf holds the message collected so far.
        if (!isNeedMergeMsgCmdInput) {
            memset(dev->cmdBuf, 0, sizeof(dev->cmdBuf));
            dev->cmdLen = 0;
        }
        memset(lineBuf, 0, sizeof(lineBuf));
        dev->state = 0;

        fd_set readSet;
        FD_ZERO(&readSet);
        int maxFd = -1;
        for (int slot = DEVICE_SERIAL; slot < DEVICE_COUNT; slot++) {
            if (!selectable(dev->fd[slot])) {
                LOGD("invalide fd set [%d].", slot);
            } else {
                watch(dev->fd[slot], &readSet, &maxFd);
            }
        }
        // The modem link must always exist: modem answers can only arrive through it.
        if (s_fdRild_command < 0) connectTarget(RIL_TYPE);
        if (s_fdRild_command < 1) {
            usleep(100 * 1000);
            return NULL;
        }
        if (selectable(s_fdRild_command)) watch(s_fdRild_command, &readSet, &maxFd);
        if (s_fdService_command >= 1 && selectable(s_fdService_command)) watch(s_fdService_command, &readSet, &maxFd);

        LOGD("Wait for select data from USB");
        if (select(maxFd + 1, &readSet, NULL, NULL, NULL) < 0) {
            if (errno == EINTR || errno == EAGAIN) continue;
            LOGE("Fail to select in readline. error: %d", errno);
            for (int slot = DEVICE_SERIAL; slot < DEVICE_COUNT; slot++) {
                if (dev->fd[slot] >= 0) close(dev->fd[slot]);
                dev->fd[slot] = -1;
            }
            discardAdbLine();
            if (s_fdRild_command >= 0) close(s_fdRild_command);
            s_fdRild_command = -1;
            return NULL;
        }

        if (s_fdRild_command >= 1 && isReady(s_fdRild_command, &readSet)) {
            readDataFromTarget(RIL_TYPE, &s_fdRild_command);
            continue;
        }
        if (s_fdService_command > 0 && isReady(s_fdService_command, &readSet)) {
            LOGD("readline: Prepare read the data from generic service");
            readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
            continue;
        }
        int slot = DEVICE_SERIAL;
        while (slot < DEVICE_COUNT && !isReady(dev->fd[slot], &readSet)) slot++;
        if (slot == DEVICE_COUNT) continue;

        LOGD("Read data from USB:%d:%d", slot, dev->fd[slot]);
        char *buf;
        if (slot == DEVICE_SERIAL) {
            buf = lineBuf;
            tolk_conn_mode = CONN_MODE_VCOM;
        } else {
            if (slot == DEVICE_ADB_LISTEN) {
                // One adb connection at a time: a new one replaces the old, which is
                // closed so that its descriptor does not leak.
                closeAdbConnection(dev);
                int fd = adb_socket_accept(dev->fd[DEVICE_ADB_LISTEN]);
                if (fd >= FD_SETSIZE) {
                    LOGE("accepted fd %d is beyond select range, dropped", fd);
                    close(fd);
                    fd = -1;
                }
                dev->fd[DEVICE_ADB] = fd;
                // The new connection is read once select reports it readable: a
                // host that connects and says nothing must not hold up the serial
                // port and the modem answers.
                continue;
            }
            buf = adbBuf;
            tolk_conn_mode = CONN_MODE_ADB;
        }
        memset(buf, 0, DATA_BUF_SIZE);

        int n = readFromHost(dev, slot, buf);
        if (n < 0) return NULL;
        LOGD("the readCount is %d with %s:%d", n, buf, buf[0]);
        if (tolk_conn_mode == CONN_MODE_VCOM) {
            LOGD("VCOM mode, sleep 0.01s");
            usleep(10 * 1000);
        }
        n = repairMmitestFrame(dev->fd[slot], buf, n);

        dev->currDevice = slot;
        LOGD("tolk_conn_mode = [%d], [%x]", tolk_conn_mode, (unsigned char)buf[0]);

        if (tolk_conn_mode == CONN_MODE_ADB) {
            n = assembleAdbLine(adbBuf, n);
            if (n == 0) continue;
        }

        LOGD("state %d with %d:%d", dev->state, 0, lineBuf[0]);

        // SMS body text; a lone LF is only the tail of the command line's CR LF.
        if (isMsgCmdInput && !(n == 1 && lineBuf[0] == '\n')) return handleMsgTextLine(dev, lineBuf, n);

        int readCurr = audio_command_hdlr(lineBuf);
        if (readCurr <= 0) {
            n = applyBackspacesCounted(lineBuf, n);
            if (!beginsWithAt(lineBuf, n)) continue;
            readCurr = 2;
        }

        dev->state = 3;
        dev->cmdLen = n;
        LOGD("the readCurr is %d & the total size is %d", readCurr, n);
        memcpy(dev->cmdBuf, lineBuf, n);
        dev->cmdBuf[n] = '\0';
        // Device-maker audio commands go out byte for byte, delimiter included.
        if (belvo_audio_command_hdlr(lineBuf) == 0) dev->cmdBuf[n - 1] = '\0';
        return dev->cmdBuf;
    }
}
