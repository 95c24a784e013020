// The reading half of the main loop: wait on the host links and on the target links
// that answer asynchronously, let the targets relay their answers, and turn host
// input into one command line in cmdBuf. Every byte the host sends belongs to a
// line: an adb read may carry several lines, or part of one.
#include "core/reader.h"

#include <errno.h>
#include <poll.h>
#include <stdlib.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <unistd.h>

#include "core/line_edit.h"
#include "core/sms_merge.h"
#include "core/tolkd_log.h"
#include "dispatch/dispatcher.h"
#include "targets/generic_link.h"
#include "targets/modem_link.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

int tolk_conn_mode = 1;
bool lineKeptAsTyped = false;
bool msgCmdLfPending = false;

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
// How long each extra read of the repair waits for the next piece.
#define MMITEST_PIECE_WAIT_MS 50

// SMS text ends at Ctrl-Z (send) or ESC (cancel); on the serial port the line
// discipline ends a line there, on adb the reader does while text is typed.
#define CTRL_Z 0x1A
#define ESC 0x1B

#define SERIAL_REOPEN_ATTEMPTS 3
// Pause after a failed accept while nothing else is ready, so that a listener that
// keeps failing (descriptor table full) does not spin the main loop.
#define ACCEPT_RETRY_PAUSE_USEC (10 * 1000)

static char lineBuf[DATA_BUF_SIZE];
static char adbBuf[DATA_BUF_SIZE];

// The adb bytes not yet taken as lines: the line being assembled and any lines that
// came behind it in the same reads. They live apart from lineBuf so that a serial
// line read meanwhile neither overwrites nor steals them; they survive reading
// cycles until they are taken or their connection goes away.
static char adbLine[DATA_BUF_SIZE];
static int adbLineLen = 0;
// The last adb line ended at CR: an LF right behind it is the rest of a CR LF.
static bool adbLineEndedAtCr = false;

void discardAdbLine(void) {
    memset(adbLine, 0, sizeof(adbLine));
    adbLineLen = 0;
    adbLineEndedAtCr = false;
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

// Reads at most want bytes from a host slot into buf (DATA_BUF_SIZE bytes) and
// terminates them.
// Returns the byte count, or -1 when the adb connection is gone. A dead serial port
// is reopened in place; if that is impossible the daemon has no reason to live.
static int readFromHost(SerialDevice *dev, int slot, char *buf, int want) {
    for (;;) {
        int fd = dev->fd[slot];
        LOGD("Wait for read data from USB :%d", fd);
        ssize_t n = read(fd, buf, (size_t)want);
        if (n > 0) {
            buf[n] = '\0';  // want is at most MAX_DATA_LEN
            return (int)n;
        }
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
    }
}

// Waits at most MMITEST_PIECE_WAIT_MS for more bytes on fd. The pieces of a frame the
// link split arrive within a millisecond or two of each other; a frame whose rest
// never comes must not hold up the other links.
static bool pieceArrives(int fd) {
    struct pollfd p;
    p.fd = fd;
    p.events = POLLIN;
    p.revents = 0;
    int rc;
    do {
        rc = poll(&p, 1, MMITEST_PIECE_WAIT_MS);
    } while (rc < 0 && errno == EINTR);
    return rc > 0 && (p.revents & POLLIN) != 0;
}

// Puts back the pieces of a damaged "at^mmitest=" frame. Only a frame shorter than
// 51 bytes is repaired: a longer line cannot be a frame that lost bytes, and waiting
// for more would swallow the host's next command line. Extra reads ask only for the
// bytes still missing, so the frame never grows past 51 bytes, and each waits a
// bounded time. On adb whatever the read holds behind the frame's line end stays
// as the next lines.
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
            if (!pieceArrives(fd)) break;
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

// The length of the first complete line among the adb bytes, or 0. A line ends at
// CR, during SMS text input also at Ctrl-Z and ESC (the host ends a message body
// without a CR), or at 6144 bytes.
static int adbLineEnd(void) {
    for (int i = 0; i < adbLineLen; i++) {
        const char c = adbLine[i];
        if (c == '\r' || (isMsgCmdInput && (c == CTRL_Z || c == ESC))) return i + 1;
    }
    return adbLineLen >= MAX_DATA_LEN ? MAX_DATA_LEN : 0;
}

// Moves the first complete adb line to lineBuf; the bytes behind it stay for the
// next lines. Returns its length, or 0 when no line is complete yet.
static void dropAdbBytes(int len) {
    const int rest = adbLineLen - len;
    memmove(adbLine, adbLine + len, (size_t)rest);
    memset(adbLine + rest, 0, (size_t)len);
    adbLineLen = rest;
}

static int takeAdbLine(void) {
    // A station that ends its lines with CR LF: the LF belongs to the line before,
    // also when it comes in the next read, and must not head the next command.
    if (adbLineEndedAtCr && adbLineLen > 0) {
        adbLineEndedAtCr = false;
        if (adbLine[0] == '\n') dropAdbBytes(1);
    }
    const int len = adbLineEnd();
    if (len == 0) return 0;
    LOGD(".AT command read done.");
    memcpy(lineBuf, adbLine, (size_t)len);
    lineBuf[len] = '\0';
    dropAdbBytes(len);
    adbLineEndedAtCr = lineBuf[len - 1] == '\r';
    return len;
}

// Adds n bytes read from the adb connection; returns the length of a completed
// line (now in lineBuf), or 0 when it needs more bytes.
static int assembleAdbLine(const char *bytes, int n) {
    const int room = MAX_DATA_LEN - adbLineLen;
    if (n > room) n = room;  // the read asked for no more than there is room for
    memcpy(adbLine + adbLineLen, bytes, (size_t)n);
    adbLineLen += n;
    const int len = takeAdbLine();
    if (len == 0) {
        LOGD(".AT command read more.");
        LOGD(".go on read.");
    }
    return len;
}

static bool beginsWithAt(const char *line, int n) {
    return n >= 3 && (line[0] == 'A' || line[0] == 'a') && (line[1] == 'T' || line[1] == 't');
}

// One adb connection at a time: a new one replaces the old, which is closed so that
// its descriptor does not leak. Only a successful accept replaces it: a client that
// went away before it was accepted, or a full descriptor table, must not cost the
// connected station its connection and its half-typed line. Returns 0 or -1.
static int acceptAdbConnection(SerialDevice *dev) {
    int fd = adb_socket_accept(dev->fd[DEVICE_ADB_LISTEN]);
    if (fd < 0) return -1;
    if (fd >= FD_SETSIZE) {
        LOGE("accepted fd %d is beyond select range, dropped", fd);
        close(fd);
        return -1;
    }
    closeAdbConnection(dev);
    dev->fd[DEVICE_ADB] = fd;
    // Answers still due to the connection just replaced must not reach this one.
    gAdbConnection++;
    // The new connection is read once select reports it readable: a host that
    // connects and says nothing must not hold up the serial port and the modem.
    return 0;
}

// Turns a complete host line of n bytes in lineBuf, read from slot, into the
// command line in cmdBuf. Returns cmdBuf, or NULL when the line is no command and
// is dropped. Only a line taken on makes its link the current one.
static char *acceptLine(SerialDevice *dev, int slot, int n) {
    LOGD("state %d with %d:%d", dev->state, 0, (unsigned char)lineBuf[0]);
    const bool lfAfterCommand = msgCmdLfPending;
    msgCmdLfPending = false;

    if (isMsgCmdInput) {
        // A lone LF right after the SMS command line is the rest of its CR LF;
        // inside the body it is an empty line of the message.
        if (n == 1 && lineBuf[0] == '\n' && lfAfterCommand) return NULL;
        dev->currDevice = slot;
        return handleMsgTextLine(dev, lineBuf, n);
    }

    int readCurr = audio_command_hdlr(lineBuf);
    if (readCurr <= 0) {
        n = applyBackspaces(lineBuf, n);
        if (!beginsWithAt(lineBuf, n)) return NULL;
        readCurr = 2;
    }

    dev->currDevice = slot;
    dev->state = 3;
    dev->cmdLen = n;
    LOGD("the readCurr is %d & the total size is %d", readCurr, n);
    memcpy(dev->cmdBuf, lineBuf, n);
    dev->cmdBuf[n] = '\0';
    // Device-maker audio commands go out byte for byte, delimiter included, and
    // routing leaves their case alone.
    lineKeptAsTyped = belvo_audio_command_hdlr(lineBuf) != 0;
    if (!lineKeptAsTyped) dev->cmdBuf[n - 1] = '\0';
    return dev->cmdBuf;
}

// How long select may sleep: until an answer without its final result must be
// taken as complete.
static struct timeval *selectTimeout(struct timeval *tv) {
    const int generic = genericLinkQuietMs(), modem = modemLinkQuietMs();
    const int ms = generic < 0 ? modem : modem < 0 ? generic : (generic < modem ? generic : modem);
    if (ms < 0) return NULL;
    tv->tv_sec = ms / 1000;
    tv->tv_usec = (ms % 1000) * 1000;
    return tv;
}

char *readline(SerialDevice *dev) {
    LOGD("Enter");
    tolk_conn_mode = CONN_MODE_VCOM;

    // Every line is terminated where it ends, so the buffers are emptied, not
    // cleared: clearing 6 KB three times was a fifth of what a command cost.
    for (;;) {
        // While SMS text is merged, cmdBuf holds the message collected so far.
        if (!isNeedMergeMsgCmdInput) {
            dev->cmdBuf[0] = '\0';
            dev->cmdLen = 0;
        }
        lineBuf[0] = '\0';
        dev->state = 0;

        // Lines that came in the reads before are served before the next wait.
        if (dev->fd[DEVICE_ADB] >= 0 && adbLineLen > 0) {
            int n = takeAdbLine();
            if (n > 0) {
                tolk_conn_mode = CONN_MODE_ADB;
                char *line = acceptLine(dev, DEVICE_ADB, n);
                if (line != NULL) return line;
                continue;
            }
        }

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
        struct timeval tv;
        const int ready = select(maxFd + 1, &readSet, NULL, NULL, selectTimeout(&tv));
        if (ready >= 0) {
            // An answer whose link has been quiet for the piece wait is complete,
            // whatever else woke the loop; a link with bytes waiting is read first.
            if (genericLinkQuietMs() == 0 && !(ready > 0 && isReady(s_fdService_command, &readSet))) genericLinkQuiet();
            if (modemLinkQuietMs() == 0 && !(ready > 0 && isReady(s_fdRild_command, &readSet))) {
                msgTextPhaseEndedBy(modemLinkQuiet());
            }
            if (ready == 0) continue;
        }
        if (ready < 0) {
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
            msgTextPhaseEndedBy(serveModemLink());
            continue;
        }
        if (s_fdService_command > 0 && isReady(s_fdService_command, &readSet)) {
            LOGD("readline: Prepare read the data from generic service");
            if (serveGenericLink()) msgTextPhaseEndedBy(TEXT_PHASE_ANY);
            continue;
        }
        int slot = DEVICE_SERIAL;
        while (slot < DEVICE_COUNT && !isReady(dev->fd[slot], &readSet)) slot++;
        if (slot == DEVICE_COUNT) continue;

        if (slot == DEVICE_ADB_LISTEN) {
            if (acceptAdbConnection(dev) == 0) continue;
            // The listener failed; a live connection that is ready is still served,
            // and a listener that keeps failing does not spin the loop.
            if (!isReady(dev->fd[DEVICE_ADB], &readSet)) {
                usleep(ACCEPT_RETRY_PAUSE_USEC);
                continue;
            }
            slot = DEVICE_ADB;
        }

        LOGD("Read data from USB:%d:%d", slot, dev->fd[slot]);
        char *buf;
        int want = MAX_DATA_LEN;
        if (slot == DEVICE_SERIAL) {
            buf = lineBuf;
            tolk_conn_mode = CONN_MODE_VCOM;
        } else {
            buf = adbBuf;
            tolk_conn_mode = CONN_MODE_ADB;
            // No more than the adb bytes still waiting leave room for.
            want = MAX_DATA_LEN - adbLineLen;
        }

        int n = readFromHost(dev, slot, buf, want);
        if (n < 0) return NULL;
        LOGD("the readCount is %d with %s:%d", n, buf, (unsigned char)buf[0]);
        if (tolk_conn_mode == CONN_MODE_VCOM) {
            LOGD("VCOM mode, sleep 0.01s");
            usleep(10 * 1000);
        }
        // A frame begins a line; on adb only a read that starts one can hold it.
        if (slot == DEVICE_SERIAL || adbLineLen == 0) {
            n = repairMmitestFrame(dev->fd[slot], buf, n);
            buf[n] = '\0';
        }

        LOGD("tolk_conn_mode = [%d], [%x]", tolk_conn_mode, (unsigned char)buf[0]);

        if (tolk_conn_mode == CONN_MODE_ADB) {
            n = assembleAdbLine(adbBuf, n);
            if (n == 0) continue;
        }
        char *line = acceptLine(dev, slot, n);
        if (line != NULL) return line;
    }
}
