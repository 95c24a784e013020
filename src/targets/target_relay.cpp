// Sends forwarded commands to the generic service and the audio links, and relays
// whatever a target answers to the host unchanged: one receive is one relay.
#include "targets/target_relay.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <unistd.h>

#include "core/reader.h"
#include "core/tolkd_log.h"
#include "dispatch/dispatcher.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"

bool isATCmdInject = false;

static const char kUeNotReady[] = "ERROR:UE is not ready";

static void closeLink(int *fd) {
    int rc = close(*fd);
    *fd = -1;
    (void)rc;
}

// Receives into buf, retrying interrupted receives. Returns the byte count, 0 when
// the peer shut the link down, -1 on failure (errno kept).
static ssize_t receiveFromTarget(int fd, char *buf, size_t size) {
    for (;;) {
        ssize_t n = recv(fd, buf, size, 0);
        if (n >= 0) return n;
        if (errno != EINTR && errno != EAGAIN) return -1;
    }
}

// Waits without time limit until fd is readable. Returns 1 when readable, 0 when
// interrupted, -1 on failure. A descriptor select cannot watch counts as a failure.
static int waitReadable(int fd) {
    if (fd < 0 || fd >= FD_SETSIZE) {
        errno = EBADF;
        return -1;
    }
    fd_set rfds;
    FD_ZERO(&rfds);
    FD_SET(fd, &rfds);
    int rc = select(fd + 1, &rfds, NULL, NULL, NULL);
    if (rc > 0) return 1;
    if (rc < 0 && errno != EINTR && errno != EAGAIN) return -1;
    return 0;
}

// How one received piece goes to the host. The first piece of an answer is judged
// by its content (the text writer passes "AUD..."/"MM..." answers raw and frames the
// rest); the later pieces of an answer longer than one receive go out the way the
// first did, since a binary tail carries no prefix of its own.
enum RelayForm { RELAY_BY_CONTENT, RELAY_RAW, RELAY_TEXT };

// Receives one piece from a target and relays it. Returns the writer's result or the
// result of closing; *used, when given, tells how the piece went out.
static int relayFromTarget(int target, int *fd, RelayForm form, RelayForm *used) {
    if (fd == NULL) return -1;
    char buf[DATA_BUF_SIZE];
    LOGD("Read data from target:%d with fd:%d", target, *fd);
    memset(buf, 0, sizeof(buf));

    ssize_t n = receiveFromTarget(*fd, buf, MAX_DATA_LEN);
    if (n < 0) {
        LOGE("fail to receive data from target socket. errno = %d", errno);
        closeLink(fd);
        return -1;
    }
    if (n == 0) {
        LOGD("The peer has performed an orderly shutdown, isATCmdInject %d", isATCmdInject);
        closeLink(fd);
        if (isATCmdInject) {
            isATCmdInject = false;
            return writeDataToSerial(kUeNotReady, (int)sizeof(kUeNotReady));
        }
        return 0;
    }

    if (target == RIL_TYPE) {
        // Every receive counts as one modem answer, whatever it holds.
        LOGD("Receive RIL rsp = [%d]", gMmiCmdSeq.idx);
        gMmiCmdSeq.idx--;
        if (mmiCmdSeqDeQueue()) sendCusMMICmdRspToMMI(buf);
    }

    isATCmdInject = false;
    LOGD("data receive from %d is %s", target, buf);
    LOGD("data receive data length is %d", (int)n);

    int result = 0;
    if (target == BELVO_AUDIO_TYPE) {
        writeDataToSerialByAudioType(buf, (int)n);
        form = RELAY_RAW;
    } else if (form == RELAY_RAW) {
        result = writeRawDataToSerial(buf, (int)n);
    } else {
        result = writeDataToSerial(buf, (int)n);
        form = isAudioResponse(buf, (int)n) ? RELAY_RAW : RELAY_TEXT;
    }
    if (used != NULL) *used = form;

    if (isFinalResult(buf, (int)n)) isMsgCmdInput = false;
    return result;
}

int readDataFromTarget(int target, int *fd) { return relayFromTarget(target, fd, RELAY_BY_CONTENT, NULL); }

int readDataFromTargetWithResult(int target, int *fd, char *buf, int size) {
    if (fd == NULL || buf == NULL || size < 2) return -1;
    memset(buf, 0, (size_t)size);
    // Keep the last byte for the NUL the callers rely on.
    size_t want = (size_t)(size - 1) < (size_t)MAX_DATA_LEN ? (size_t)(size - 1) : (size_t)MAX_DATA_LEN;

    ssize_t n = receiveFromTarget(*fd, buf, want);
    if (n < 0) {
        LOGE("fail to receive data from target socket. errno = %d", errno);
        closeLink(fd);
        return -1;
    }
    if (n == 0) {
        LOGD("The peer has performed an orderly shutdown");
        closeLink(fd);
        return 0;
    }
    LOGD("data receive from %d is %s, data length is %d", target, buf, (int)n);
    return writeDataToSerial(buf, (int)n);
}

void serviceReaderLoop(void) {
    if (s_fdService_command == -1) return;
    int rc = waitReadable(s_fdService_command);
    if (rc < 0) {
        LOGE("Fail to select in serviceReaderLoop. error: %d", errno);
        closeLink(&s_fdService_command);
        return;
    }
    if (rc == 0) return;
    LOGD("Prepare read the data from generic service");
    readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
}

int serviceReaderLoopWithResult(const char *cmd) {
    (void)cmd;
    if (s_fdService_command == -1) return -1;
    int rc = waitReadable(s_fdService_command);
    if (rc < 0) {
        LOGE("Fail to select in serviceReaderLoop. error: %d", errno);
        closeLink(&s_fdService_command);
        return -1;
    }
    if (rc == 0) return -1;
    LOGD("Prepare read the data from generic service");
    char buf[DATA_BUF_SIZE];
    readDataFromTargetWithResult(GENERIC_TYPE, &s_fdService_command, buf, (int)sizeof(buf));
    return strstr(buf, "OK") != NULL ? 1 : -1;
}

// The descriptor global of an audio target, or NULL for any other target.
static int *audioLink(int target) {
    switch (target) {
    case AUDIO_TYPE:
    case BELVO_AUDIO_TYPE:
        return &s_fdAudio_command;
    case AUDIO_EXT_TYPE:
        return &s_fdAudioExt_command;
    default:
        return NULL;
    }
}

void audioReaderLoop(int target) {
    int *fd = audioLink(target);
    if (fd == NULL) {
        LOGD("invalid fd NULL");
        return;
    }
    if (*fd < 0) {
        LOGD("invalid fd [%d]", *fd);
        return;
    }
    LOGD("valid fd [%d]", *fd);
    int rc = waitReadable(*fd);
    if (rc < 0) {
        LOGE("Fail to select in audioReaderLoop. error: %d", errno);
        closeLink(fd);
        return;
    }
    if (rc == 0) return;
    LOGD("Prepare read the data from audio driver");
    RelayForm form = RELAY_BY_CONTENT;
    relayFromTarget(target, fd, RELAY_BY_CONTENT, &form);
    // An answer longer than one read is already waiting in full: relay the rest
    // now, piece by piece and in the first piece's form, rather than leave it to be
    // dropped before the next command.
    while (*fd >= 0) {
        struct pollfd p = {*fd, POLLIN, 0};
        if (poll(&p, 1, 0) != 1 || (p.revents & POLLIN) == 0) break;
        relayFromTarget(target, fd, form, &form);
    }
}

int sendDataToGenericService(const char *data) {
    if (data == NULL) return 0;
    size_t len = strlen(data);
    // MSG_NOSIGNAL: a vanished service is a lost send, not a signal.
    ssize_t n = send(s_fdService_command, data, len, MSG_NOSIGNAL);
    if (n < 0 || (size_t)n < len) LOGE("lose data when send to generic service. errno = %d", errno);
    return 0;
}

// An answer longer than one read leaves its tail on the link, where it would be
// taken for the answer to the next command, and the one after. Nothing else is
// ever waiting on an audio link before a command goes out (its answer is read
// before the main loop goes on), so whatever is there now is stale. Returns false
// when the link has ended (the service restarted): a command sent into it would
// never be answered.
static bool dropStaleAudioBytes(int fd) {
    char scratch[1024];
    unsigned long dropped = 0;
    bool alive = true;
    for (;;) {
        ssize_t n = recv(fd, scratch, sizeof(scratch), MSG_DONTWAIT);
        if (n < 0 && errno == EINTR) continue;
        if (n > 0) {
            dropped += (unsigned long)n;
            continue;
        }
        alive = n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK);
        break;
    }
    if (dropped > 0) LOGW("dropped %lu stale bytes from the audio link", dropped);
    return alive;
}

int sendDataToAudio(const char *data, int len, int target) {
    int *fd = audioLink(target);
    if (fd == NULL) {
        LOGE("invalid audio data type.");
        return 0;
    }
    if (*fd < 0) {
        LOGE("invalid fd [%d].", *fd);
        return 0;
    }
    if (data == NULL || len < 0) len = 0;
    if (!dropStaleAudioBytes(*fd)) {
        LOGW("audio link %d has ended, connecting again", *fd);
        closeLink(fd);
        connectTarget(target);
        if (*fd < 0) {
            LOGE("invalid fd [%d].", *fd);
            return 0;
        }
    }
    LOGD("sendDataToAudio - the data size of send to audio is: %d", len);
    ssize_t n = send(*fd, data, (size_t)len, MSG_NOSIGNAL);
    if (n < 0 || n < (ssize_t)len) LOGE("lose data when send to audio. errno = %d", errno);
    return 0;
}

// For a command that answers the host with its own final result (AT^WIENABLE).
// Bytes already waiting on the link belong to earlier commands and are relayed
// first. The answer ends at its first final result line: the text before it goes
// to the host as one answer, the line itself to the caller, and whatever came
// after it belongs to others and is relayed after. An answer that stops short of
// a final result is taken as it is once nothing more came for
// GENERIC_ANSWER_PIECE_WAIT_MS: the pieces of one answer follow each other within
// milliseconds.
#define GENERIC_ANSWER_PIECE_WAIT_MS 500
int exchangeWithGenericService(const char *cmd, char *finalLine, int size) {
    if (finalLine == NULL || size < 1) return -1;
    finalLine[0] = '\0';
    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    struct pollfd waiting = {s_fdService_command, POLLIN, 0};
    while (s_fdService_command >= 0 && poll(&waiting, 1, 0) == 1) {
        readDataFromTarget(GENERIC_TYPE, &s_fdService_command);
        waiting.fd = s_fdService_command;
    }
    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    if (s_fdService_command < 0) return -1;
    sendDataToGenericService(cmd);

    char buf[MAX_DATA_LEN];
    size_t len = 0;
    size_t lineStart = 0;
    size_t finalAt = 0, finalLen = 0, restAt = 0;  // restAt 0: no final line yet
    int waitMs = -1;  // the answer itself is waited for without limit
    while (len < MAX_DATA_LEN) {
        struct pollfd p = {s_fdService_command, POLLIN, 0};
        int rc = poll(&p, 1, waitMs);
        if (rc == 0) break;
        // A failed poll leaves its errno for the check below (EINTR: wait again).
        ssize_t n = rc > 0 ? recv(s_fdService_command, buf + len, MAX_DATA_LEN - len, 0) : -1;
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            LOGE("generic service link ended while answering %s. errno = %d", cmd, errno);
            closeLink(&s_fdService_command);
            break;
        }
        len += (size_t)n;
        waitMs = GENERIC_ANSWER_PIECE_WAIT_MS;
        for (char *nl; restAt == 0 && (nl = (char *)memchr(buf + lineStart, '\n', len - lineStart)) != NULL;) {
            const char *line = buf + lineStart;
            size_t lineLen = (size_t)(nl - line);
            if (lineLen > 0 && line[lineLen - 1] == '\r') lineLen--;
            restAt = (size_t)(nl - buf) + 1;
            if ((lineLen == 2 && strncmp(line, "OK", 2) == 0) || (lineLen == 5 && strncmp(line, "ERROR", 5) == 0) ||
                strncmp(line, "+CME ERROR:", 11) == 0) {
                finalAt = lineStart;
                finalLen = lineLen;
            } else {
                lineStart = restAt;
                restAt = 0;
            }
        }
        if (restAt != 0) break;
    }
    size_t infoStart = 0, infoEnd = restAt != 0 ? finalAt : len;
    while (infoStart < infoEnd && (buf[infoStart] == '\r' || buf[infoStart] == '\n')) infoStart++;
    while (infoEnd > infoStart && (buf[infoEnd - 1] == '\r' || buf[infoEnd - 1] == '\n')) infoEnd--;
    if (infoEnd > infoStart) writeDataToSerial(buf + infoStart, (int)(infoEnd - infoStart));
    if (restAt != 0) {
        if (finalLen >= (size_t)size) finalLen = (size_t)size - 1;
        memcpy(finalLine, buf + finalAt, finalLen);
        finalLine[finalLen] = '\0';
        if (restAt < len) writeDataToSerial(buf + restAt, (int)(len - restAt));
    }
    LOGD("generic service answered %s with %s", cmd, finalLine);
    return 0;
}
