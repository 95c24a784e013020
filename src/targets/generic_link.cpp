// Answers of the generic service, put together from a link without framing. The
// service ends each answer with a final result line (OK, ERROR, +CME ERROR: ...);
// what lies before the first one is one answer, and it belongs to the oldest
// command still waiting for one. Bytes without a final result line reach the host
// too, once the link has been quiet for the piece wait, so a service that answers
// only an information line is not held back for ever.
#include "targets/generic_link.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "dispatch/command_type.h"
#include "serial/response_writer.h"
#include "targets/answer_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

namespace {

AnswerQueue answersDue;

// Bytes received and not yet relayed.
char rx[DATA_BUF_SIZE];
int rxLen = 0;
long long quietAt = -1;  // when rx goes out without a final result (ms)

// The answer in progress: part of it has gone out already.
bool inAnswer = false;
bool ownerQueued = false;  // its link was taken from answersDue
HostLink answerTo;
AnswerPieces pieces;

// A whole answer to link (NULL: the current line's link), framed as one.
void relayWhole(const HostLink *to, const char *data, int len) {
    AnswerPieces one;
    answerPiecesReset(&one);
    HostLink link = to != NULL ? *to : currentHostLink();
    writeAnswerPiece(&link, &one, data, len, true);
}

long long nowMs(void) {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return (long long)ts.tv_sec * 1000 + ts.tv_nsec / 1000000;
}

void consume(int n) {
    memmove(rx, rx + n, (size_t)(rxLen - n));
    rxLen -= n;
}

// Relays len bytes of the answer in progress (or of a new one); last: it ends here.
void relayAnswer(const char *data, int len, bool last) {
    if (!inAnswer) {
        ownerQueued = answersDue.count > 0;
        answerTo = ownerQueued ? answersDue.due[answersDue.head].origin : currentHostLink();
        answerPiecesReset(&pieces);
        inAnswer = true;
    }
    LOGD("data receive from %d is %.*s", GENERIC_TYPE, len, data);
    writeAnswerPiece(&answerTo, &pieces, data, len, last);
    if (!last) return;
    AnswerDue done;
    if (ownerQueued) answerQueuePop(&answersDue, &done);
    inAnswer = false;
}

// Relays every complete answer in rx, and a full buffer as a piece.
void relayComplete(void) {
    for (;;) {
        int end = finalResultEnd(rx, rxLen);
        if (end > 0) {
            relayAnswer(rx, end, true);
            consume(end);
            continue;
        }
        if (rxLen < MAX_DATA_LEN) break;
        relayAnswer(rx, rxLen, false);
        rxLen = 0;
    }
    quietAt = rxLen > 0 ? nowMs() + ANSWER_PIECE_WAIT_MS : -1;
}

// Relays what is pending as the end of the answer in progress.
void completePending(void) {
    if (rxLen > 0 || inAnswer) relayAnswer(rx, rxLen, true);
    rxLen = 0;
    quietAt = -1;
}

// Receives into rx; returns the count, 0 at the link's end, -1 on failure.
ssize_t receive(int flags) {
    ssize_t n;
    do {
        n = recv(s_fdService_command, rx + rxLen, (size_t)(MAX_DATA_LEN - rxLen), flags);
    } while (n < 0 && errno == EINTR);
    if (n > 0) {
        rxLen += (int)n;
        isATCmdInject = false;
    }
    return n;
}

void closeLink(void) {
    genericLinkClosed();
    close(s_fdService_command);
    s_fdService_command = -1;
}

}  // namespace

void genericCommandSent(const HostLink *origin) {
    AnswerDue due;
    due.origin = origin != NULL ? *origin : currentHostLink();
    due.textPhase = 0;
    if (!answerQueuePush(&answersDue, &due)) LOGW("too many commands outstanding on the generic service");
}

void genericLinkClosed(void) {
    completePending();
    if (answersDue.count > 0) LOGW("generic service link closed with %d answers outstanding", answersDue.count);
    answerQueueClear(&answersDue);
}

bool serveGenericLink(void) {
    LOGD("Read data from target:%d with fd:%d", GENERIC_TYPE, s_fdService_command);
    ssize_t n = receive(0);
    if (n < 0 && errno == EAGAIN) return false;
    if (n < 0) {
        LOGE("fail to receive data from target socket. errno = %d", errno);
        closeLink();
        return false;
    }
    if (n == 0) {
        LOGD("The peer has performed an orderly shutdown, isATCmdInject %d", isATCmdInject);
        closeLink();
        return reportUeNotReady();
    }
    LOGD("data receive data length is %d", (int)n);
    relayComplete();
    return false;
}

int genericLinkQuietMs(void) {
    if (quietAt < 0) return -1;
    long long left = quietAt - nowMs();
    return left > 0 ? (int)left : 0;
}

void genericLinkQuiet(void) {
    if (rxLen == 0) return;
    // Lines that are complete end the answer; a line cut short waits for its rest,
    // which goes to the same link.
    bool whole = (rxLen >= 2 && rx[rxLen - 2] == '\r' && rx[rxLen - 1] == '\n') || endsWithFinalResult(rx, rxLen);
    relayAnswer(rx, rxLen, whole);
    rxLen = 0;
    quietAt = -1;
}

void genericLinkDrain(void) {
    if (s_fdService_command < 0) return;
    for (;;) {
        ssize_t n = receive(MSG_DONTWAIT);
        if (n > 0) {
            relayComplete();
            continue;
        }
        // The end of the link, or a failure, is found by the next read.
        break;
    }
}

namespace {

// How long the waiting command's own answer may pause before what came is taken
// as all of it (an answer without a final result line).
#define OWN_ANSWER_WAIT_MS 500

// Hands the first len bytes of rx to the waiting command: copied into buf (when
// given; size at least 1), relayed to its link when relay is set, and taken from rx.
int takeOwnAnswer(const HostLink *to, int len, char *buf, int size, bool relay) {
    if (buf != NULL) {
        int copy = len < size - 1 ? len : size - 1;
        memcpy(buf, rx, (size_t)copy);
        buf[copy] = '\0';
    }
    LOGD("data receive from %d is %.*s, data length is %d", GENERIC_TYPE, len, rx, len);
    if (relay) relayWhole(to, rx, len);
    consume(len);
    relayComplete();  // what came behind it answers later commands
    return len;
}

}  // namespace

int genericLinkAwaitAnswer(char *buf, int size, bool relay) {
    if (buf != NULL) buf[0] = '\0';
    if (s_fdService_command < 0) return -1;
    // The service answers in the order the commands went out: the answers still
    // owed to earlier commands come first and go to their own links; this
    // command's answer is the one after them. An earlier command's slow answer
    // is never taken for this one's.
    const HostLink self = currentHostLink();
    int ahead = answersDue.count;
    if (inAnswer && !ownerQueued) ahead++;  // output nobody asked for, still open

    for (;;) {
        // Complete answers in what has come: the earlier commands' go out, the
        // next one is this command's.
        for (int end; (end = finalResultEnd(rx, rxLen)) > 0;) {
            if (ahead == 0) return takeOwnAnswer(&self, end, buf, size, relay);
            relayAnswer(rx, end, true);
            consume(end);
            ahead--;
        }
        if (rxLen == MAX_DATA_LEN) {
            if (ahead == 0) return takeOwnAnswer(&self, rxLen, buf, size, relay);
            relayAnswer(rx, rxLen, false);  // a long earlier answer goes on
            rxLen = 0;
        }

        // The waiting command is judged by its final result line, so the service
        // gets longer to finish its answer than the piece wait of the others.
        const int quietMs = rxLen == 0 ? -1 : ahead == 0 ? OWN_ANSWER_WAIT_MS : ANSWER_PIECE_WAIT_MS;
        struct pollfd p = {s_fdService_command, POLLIN, 0};
        int rc = poll(&p, 1, quietMs);
        if (rc < 0 && errno == EINTR) continue;
        if (rc < 0) {
            LOGE("Fail to select in serviceReaderLoop. error: %d", errno);
            closeLink();
            return -1;
        }
        if (rc == 0) {
            // Quiet with an answer unfinished: a service that answers without a
            // final result line has said all it will.
            if (ahead == 0) return takeOwnAnswer(&self, rxLen, buf, size, relay);
            bool whole = (rxLen >= 2 && rx[rxLen - 2] == '\r' && rx[rxLen - 1] == '\n');
            relayAnswer(rx, rxLen, whole);
            rxLen = 0;
            if (whole) ahead--;
            continue;
        }
        LOGD("Prepare read the data from generic service");
        ssize_t n = receive(0);
        if (n < 0 && errno == EAGAIN) continue;
        if (n <= 0) {
            if (n < 0) LOGE("fail to receive data from target socket. errno = %d", errno);
            else LOGD("The peer has performed an orderly shutdown");
            int got = -1;
            if (ahead == 0 && rxLen > 0) got = takeOwnAnswer(&self, rxLen, buf, size, relay);
            closeLink();
            return got;
        }
    }
}
