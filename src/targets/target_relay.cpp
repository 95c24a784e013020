// Sends forwarded commands to the generic service and the audio links, and relays
// what the audio links answer. The modem pair and the generic service link, which
// answer asynchronously, have readers of their own (modem_link.cpp,
// generic_link.cpp); readDataFromTarget serves any of them.
#include "targets/target_relay.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <sys/types.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "dispatch/command_type.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/answer_queue.h"
#include "targets/generic_link.h"
#include "targets/modem_link.h"
#include "targets/target_conn.h"

bool isATCmdInject = false;

static const char kUeNotReady[] = "ERROR:UE is not ready";

// How an audio answer goes to the host: the device maker's answers through the
// raw writer that waits and retries, "AUD"/"MM" answers as they are, any other
// answer as framed text.
enum RelayForm { RELAY_DEVICE_MAKER, RELAY_RAW, RELAY_TEXT };

// The last answer of each audio link: its link and its form, so that bytes of it
// that come after its piece wait follow it there.
struct AudioAnswer {
    bool valid;
    HostLink to;
    RelayForm form;
};
static AudioAnswer lastAudio[2];  // tolk-audio, rild-tolk-md2

static void closeLink(int *fd) {
    int rc = close(*fd);
    *fd = -1;
    (void)rc;
}

bool reportUeNotReady(void) {
    if (!isATCmdInject) return false;
    isATCmdInject = false;
    writeDataToSerial(kUeNotReady, (int)sizeof(kUeNotReady));
    return true;
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

// Waits at most the piece wait for more bytes of an answer on fd.
static bool pieceArrives(int fd) {
    struct pollfd p = {fd, POLLIN, 0};
    int rc;
    do {
        rc = poll(&p, 1, ANSWER_PIECE_WAIT_MS);
    } while (rc < 0 && errno == EINTR);
    return rc > 0 && (p.revents & (POLLIN | POLLHUP | POLLERR)) != 0;
}

int readDataFromTarget(int target, int *fd) {
    if (fd == NULL) return -1;
    switch (target) {
    case RIL_TYPE:
        serveModemLink();
        return 0;
    case GENERIC_TYPE:
        serveGenericLink();
        return 0;
    default:
        // The audio links are read only while their answer is awaited.
        audioReaderLoop(target);
        return 0;
    }
}

void serviceReaderLoop(void) {
    if (s_fdService_command == -1) return;
    genericLinkAwaitAnswer(NULL, 0, true);
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

static AudioAnswer *lastAnswerOf(int target) { return &lastAudio[target == AUDIO_EXT_TYPE ? 1 : 0]; }

static void relayRawPiece(RelayForm form, const HostLink *to, const char *data, int len) {
    if (form == RELAY_DEVICE_MAKER) {
        writeDataToLinkByAudioType(to, data, len);
    } else {
        writeRawDataToLink(to, data, len);
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

    // An answer may reach the daemon in several pieces. Raw answers go out piece
    // by piece as they come; a text answer is put together up to its final result
    // line and framed once. The answer is over at its final result line, or when
    // no further piece comes within the piece wait.
    HostLink to = currentHostLink();
    AnswerPieces pieces;
    answerPiecesReset(&pieces);
    char buf[DATA_BUF_SIZE];
    int len = 0;
    bool first = true;
    RelayForm form = RELAY_TEXT;
    for (;;) {
        ssize_t n = receiveFromTarget(*fd, buf + len, (size_t)(MAX_DATA_LEN - len));
        if (n < 0) {
            LOGE("fail to receive data from target socket. errno = %d", errno);
            closeLink(fd);
            break;
        }
        if (n == 0) {
            LOGD("The peer has performed an orderly shutdown, isATCmdInject %d", isATCmdInject);
            closeLink(fd);
            reportUeNotReady();
            break;
        }
        isATCmdInject = false;
        LOGD("data receive from %d is %.*s", target, (int)n, buf + len);
        LOGD("data receive data length is %d", (int)n);
        if (first) {
            form = target == BELVO_AUDIO_TYPE ? RELAY_DEVICE_MAKER
                   : isAudioResponse(buf, (int)n) ? RELAY_RAW
                                                   : RELAY_TEXT;
            first = false;
        }
        if (form != RELAY_TEXT) {
            relayRawPiece(form, &to, buf, (int)n);
        } else {
            len += (int)n;
            if (finalResultEnd(buf, len) > 0) break;
            if (len == MAX_DATA_LEN) {
                writeAnswerPiece(&to, &pieces, buf, len, false);
                len = 0;
            }
        }
        if (!pieceArrives(*fd)) break;
    }
    if (first) return;
    if (form == RELAY_TEXT) writeAnswerPiece(&to, &pieces, buf, len, true);
    AudioAnswer *last = lastAnswerOf(target);
    last->valid = true;
    last->to = to;
    last->form = form;
}

int sendDataToGenericService(const char *data) {
    if (data == NULL) return 0;
    // Answers that have come meanwhile go out first, to the links that asked.
    genericLinkDrain();
    size_t len = strlen(data);
    // MSG_NOSIGNAL: a vanished service is a lost send, not a signal.
    ssize_t n = s_fdService_command >= 0 ? send(s_fdService_command, data, len, MSG_NOSIGNAL) : -1;
    if (n < 0 || (size_t)n < len) {
        LOGE("lose data when send to generic service. errno = %d", errno);
        // A link that takes no command is broken; the next command connects anew.
        if (s_fdService_command >= 0) {
            genericLinkClosed();
            closeLink(&s_fdService_command);
        }
        return -1;
    }
    return 0;
}

// Bytes on an audio link before a command goes out came after the piece wait of
// the previous answer ended: they are its late rest and follow it, in its form,
// to its link. Returns false when the link has ended (the service restarted): a
// command sent into it would never be answered.
static bool relayLateAudioBytes(int fd, int target) {
    char buf[MAX_DATA_LEN];
    const AudioAnswer *last = lastAnswerOf(target);
    bool alive = true;
    for (;;) {
        ssize_t n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT);
        if (n < 0 && errno == EINTR) continue;
        if (n > 0) {
            LOGW("%d bytes of the previous audio answer came late", (int)n);
            if (!last->valid) continue;
            if (last->form == RELAY_TEXT) {
                writeDataToLink(&last->to, buf, (int)n);
            } else {
                relayRawPiece(last->form, &last->to, buf, (int)n);
            }
            continue;
        }
        alive = n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK);
        break;
    }
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
    if (!relayLateAudioBytes(*fd, target)) {
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

// The last line of an answer (trailing line ends dropped): its start and length.
static int lastLine(const char *text, int len, int *lineLen) {
    int end = len;
    while (end > 0 && (text[end - 1] == '\r' || text[end - 1] == '\n')) end--;
    int start = end;
    while (start > 0 && text[start - 1] != '\r' && text[start - 1] != '\n') start--;
    *lineLen = end - start;
    return start;
}

// A command the daemon puts to the framework on its own behalf (AT^WIENABLE): the
// answer comes in its place among the answers owed on the link (see
// genericLinkAwaitAnswer). Its information text is shown to the host, its final
// result line goes to the caller, so that the host command ends with one final
// result, its own.
int exchangeWithGenericService(const char *cmd, char *finalLine, int size) {
    if (finalLine == NULL || size < 1) return -1;
    finalLine[0] = '\0';
    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    if (s_fdService_command < 0 || sendDataToGenericService(cmd) < 0) return -1;

    char answer[DATA_BUF_SIZE];
    const int len = genericLinkAwaitAnswer(answer, (int)sizeof(answer), false);
    if (len <= 0) {
        LOGE("generic service link ended while answering %s", cmd);
        return 0;
    }
    int lineLen = 0;
    int lineAt = lastLine(answer, len, &lineLen);
    if (!endsWithFinalResult(answer, len)) lineAt = len;  // no final line: all of it is text
    int infoStart = 0, infoEnd = lineAt;
    while (infoStart < infoEnd && (answer[infoStart] == '\r' || answer[infoStart] == '\n')) infoStart++;
    while (infoEnd > infoStart && (answer[infoEnd - 1] == '\r' || answer[infoEnd - 1] == '\n')) infoEnd--;
    if (infoEnd > infoStart) writeDataToSerial(answer + infoStart, infoEnd - infoStart);
    if (lineAt < len) {
        if (lineLen >= size) lineLen = size - 1;
        memcpy(finalLine, answer + lineAt, (size_t)lineLen);
        finalLine[lineLen] = '\0';
    }
    LOGD("generic service answered %s with %s", cmd, finalLine);
    return 0;
}
