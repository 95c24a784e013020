// The modem link. The bridge writes each HAL callback into the modem pair as one
// record (hal/tolkd_adaptation.h); a read of the pair may bring several records,
// or part of one, so the records are put back together here. An answer belongs to
// the oldest command outstanding on its slot: it goes to the host link that sent
// that command and counts once for the MMI command sequence queue. An indication
// goes to the link of the current line and counts for nothing. A record longer
// than one buffer is relayed in pieces, framed once as a whole.
//
// An answer is normally one callback. A modem that hands its answer over in
// several (a real AT channel delivers what it has) keeps them together: an answer
// is complete at its final result line or its SMS prompt, or when its slot has
// said nothing more for the piece wait, so that its callbacks go to one link and
// count once. Each callback is framed on its own, as it always was.
#include "targets/modem_link.h"

#include <errno.h>
#include <string.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "dispatch/command_type.h"
#include "hal/tolkd_adaptation.h"
#include "serial/response_writer.h"
#include "targets/answer_queue.h"
#include "targets/mmi_queue.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

namespace {

const char kNoModem[] = "ERROR:No Modem";

// How much of an answer's end is kept to judge its final result line.
#define ANSWER_TAIL_KEEP 256

// The answers each slot still owes, and to whom.
AnswerQueue answersDue[MODEM_SLOT_COUNT];

// The answer a slot is giving: where it goes and what it is so far.
struct SlotAnswer {
    bool open;             // part of it has gone out; its end has not come
    HostLink to;
    unsigned textPhase;    // the text phase of the command it answers
    bool mmi;              // the answer of a customer MMI command
    AnswerPieces pieces;
    char tail[ANSWER_TAIL_KEEP];
    int tailLen;           // its last bytes so far
    long long quietAt;     // when it is taken as complete without a final result
};
SlotAnswer answers[MODEM_SLOT_COUNT];

// What the MMI client gets of an answer (its text, up to one buffer).
char mmiText[DATA_BUF_SIZE];
int mmiTextLen = 0;

// The record being read from the pair.
struct RecordReader {
    unsigned char headerBytes[sizeof(ModemRecordHeader)];
    int headerLen;
    bool inRecord;         // the header is read; data bytes follow
    ModemRecordHeader header;
    uint32_t left;         // data bytes of the record still to come
    char text[DATA_BUF_SIZE];
    int textLen;           // data received and not yet relayed
    bool textEnded;        // a NUL ended the record's text: the rest is no text
    AnswerPieces pieces;   // an indication's framing
    HostLink to;           // an indication's link
};
RecordReader rx;

long long nowMs(void) {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return (long long)ts.tv_sec * 1000 + ts.tv_nsec / 1000000;
}

int validSlot(int slot) { return slot >= 0 && slot < MODEM_SLOT_COUNT ? slot : -1; }

void keepTail(SlotAnswer *a, const char *data, int len) {
    if (len >= ANSWER_TAIL_KEEP) {
        memcpy(a->tail, data + len - ANSWER_TAIL_KEEP, ANSWER_TAIL_KEEP);
        a->tailLen = ANSWER_TAIL_KEEP;
        return;
    }
    int keep = ANSWER_TAIL_KEEP - len < a->tailLen ? ANSWER_TAIL_KEEP - len : a->tailLen;
    memmove(a->tail, a->tail + a->tailLen - keep, (size_t)keep);
    memcpy(a->tail + keep, data, (size_t)len);
    a->tailLen = keep + len;
}

// An answer is complete at its final result line, or at the prompt of an SMS
// command waiting for its text. (An SMS command's own result line, +CMGS: and the
// like, is followed by its OK: the OK ends the answer, or the slot's quiet does.)
bool answerComplete(const SlotAnswer *a) {
    if (endsWithResultCode(a->tail, a->tailLen)) return true;
    return a->tailLen >= 2 && a->tail[a->tailLen - 2] == '>' && a->tail[a->tailLen - 1] == ' ';
}

// The start of an answer: it takes the oldest command outstanding on its slot
// and counts as that command's answer.
void openAnswer(int slot) {
    SlotAnswer *a = &answers[slot];
    memset(a, 0, sizeof(*a));
    a->open = true;
    a->quietAt = -1;  // set when a record of it ends without ending it
    a->to = currentHostLink();
    AnswerDue due;
    if (answerQueuePop(&answersDue[slot], &due)) {
        a->to = due.origin;
        a->textPhase = due.textPhase;
    }
    LOGD("Receive RIL rsp = [%d]", gMmiCmdSeq.idx);
    gMmiCmdSeq.idx--;
    a->mmi = mmiCmdSeqDeQueue();
    mmiTextLen = 0;
}

// Relays a piece of a record of slot's answer (text only, no NUL); last: the record
// ends with it.
void answerPiece(int slot, const char *data, int len, bool last) {
    SlotAnswer *a = &answers[slot];
    keepTail(a, data, len);
    if (a->mmi && len > 0) {
        int room = MAX_DATA_LEN - mmiTextLen;
        int take = len < room ? len : room;
        memcpy(mmiText + mmiTextLen, data, (size_t)take);
        mmiTextLen += take;
    }
    LOGD("data receive from %d is %.*s", RIL_TYPE, len, data);
    LOGD("data receive data length is %d", len);
    // A record without any text (empty HAL data) has nothing to show.
    if (last && len == 0 && !a->pieces.started && a->pieces.heldLen == 0) return;
    writeAnswerPiece(&a->to, &a->pieces, data, len, last);
}

// The answer of slot is complete: judged, and fed back when it is an MMI answer.
// Returns the text phase it ends (0: none).
unsigned closeAnswer(int slot) {
    SlotAnswer *a = &answers[slot];
    if (!a->open) return 0;
    a->open = false;
    a->quietAt = -1;
    if (a->mmi) {
        mmiText[mmiTextLen] = '\0';
        sendCusMMICmdRspToMMI(mmiText);
    }
    return a->textPhase != 0 && endsWithFinalResult(a->tail, a->tailLen) ? a->textPhase : 0;
}

// The answers of a slot whose service died (or whose proxy was dropped) will not
// come: the commands that waited for them are forgotten, and so are their counts
// in the MMI queue. Returns the text phase they belonged to (0: none).
unsigned forgetSlot(int slot) {
    unsigned phase = 0;
    if (answers[slot].open) {
        phase = answers[slot].textPhase;
        closeAnswer(slot);
    }
    AnswerQueue *q = &answersDue[slot];
    unsigned queued = answerQueueTextPhase(q);
    if (queued > phase) phase = queued;
    if (q->count > 0) LOGW("slot %d gone with %d answers outstanding", slot, q->count);
    mmiCmdSeqForget(q->count);
    answerQueueClear(q);
    return phase;
}

void beginRecord(void) {
    memcpy(&rx.header, rx.headerBytes, sizeof(rx.header));
    rx.inRecord = true;
    rx.left = rx.header.length;
    rx.textLen = 0;
    rx.textEnded = false;
    const int slot = validSlot(rx.header.slot);
    if (rx.header.kind == MODEM_RECORD_ANSWER && slot >= 0) {
        if (!answers[slot].open) openAnswer(slot);
        // While a record of it is being read the answer is not quiet.
        answers[slot].quietAt = -1;
        answerPiecesReset(&answers[slot].pieces);  // each record is framed on its own
        return;
    }
    answerPiecesReset(&rx.pieces);
    rx.to = currentHostLink();
}

bool isAnswerRecord(void) { return rx.header.kind == MODEM_RECORD_ANSWER && validSlot(rx.header.slot) >= 0; }

// Relays the data held so far of the current record; last: the record is complete.
// Returns the text phase an answer ended (0: none).
unsigned relayRecordData(bool last) {
    if (isAnswerRecord()) {
        const int slot = rx.header.slot;
        SlotAnswer *a = &answers[slot];
        // HAL data is text: a NUL ends the record's text (a HAL that terminates
        // its strings sends one), not the answer, whose next callback may follow.
        const int text = rx.textEnded ? 0 : (int)strnlen(rx.text, (size_t)rx.textLen);
        if (text < rx.textLen) rx.textEnded = true;
        if (!last) {
            answerPiece(slot, rx.text, text, false);
        } else {
            // Whether this record ends the answer is known once its end is seen.
            SlotAnswer probe = *a;
            keepTail(&probe, rx.text, text);
            const bool complete = answerComplete(&probe);
            answerPiece(slot, rx.text, text, true);
            rx.textLen = 0;
            if (complete) return closeAnswer(slot);
            a->quietAt = nowMs() + ANSWER_PIECE_WAIT_MS;
            return 0;
        }
    } else if (rx.header.kind != MODEM_RECORD_SLOT_LOST) {
        // Unsolicited output without any text has nothing to show.
        const bool nothing = rx.textLen == 0 && !rx.pieces.started && rx.pieces.heldLen == 0;
        if (!nothing) {
            LOGD("data receive from %d is %.*s", RIL_TYPE, rx.textLen, rx.text);
            writeAnswerPiece(&rx.to, &rx.pieces, rx.text, rx.textLen, last);
        }
    }
    rx.textLen = 0;
    return 0;
}

// A complete record: its last piece goes out, and a lost slot is forgotten.
unsigned endRecord(void) {
    rx.inRecord = false;
    rx.headerLen = 0;
    if (rx.header.kind == MODEM_RECORD_SLOT_LOST) {
        return validSlot(rx.header.slot) >= 0 ? forgetSlot(rx.header.slot) : 0;
    }
    return relayRecordData(true);
}

}  // namespace

void modemLinkReset(void) {
    rx.inRecord = false;
    rx.headerLen = 0;
    rx.textLen = 0;
}

int sendToModem(const char *line, const HostLink *origin, unsigned textPhase) {
    LOGD("Enter");
    if (line == NULL) return -1;
    HostLink from = origin != NULL ? *origin : currentHostLink();
    int slot = -1;
    bool sent = sendRequestOnSlot(line, (int)strlen(line) + 1, &slot);
    // A refused request is still a command sent towards the modem.
    isATCmdInject = true;
    LOGD(" send data over");
    if (!sent || validSlot(slot) < 0) {
        // No answer will come: nothing is counted, and a customer MMI command
        // gives its text back.
        mmiCmdSeqCancelPending();
        writeDataToLink(&from, kNoModem, (int)sizeof(kNoModem));
        return -1;
    }
    AnswerDue due;
    due.origin = from;
    due.textPhase = textPhase;
    if (!answerQueuePush(&answersDue[slot], &due)) LOGW("too many commands outstanding on slot %d", slot);
    mmiCmdSeqEnQueue();
    return 0;
}

int sendDataToRild(const char *line) { return sendToModem(line, NULL, 0); }

unsigned serveModemLink(void) {
    char buf[MAX_DATA_LEN];
    LOGD("Read data from target:%d with fd:%d", RIL_TYPE, s_fdRild_command);
    ssize_t n;
    do {
        n = recv(s_fdRild_command, buf, sizeof(buf), 0);
    } while (n < 0 && (errno == EINTR || errno == EAGAIN));
    if (n < 0) {
        LOGE("fail to receive data from target socket. errno = %d", errno);
        close(s_fdRild_command);
        s_fdRild_command = -1;
        modemLinkReset();
        return 0;
    }
    if (n == 0) {
        LOGD("The peer has performed an orderly shutdown, isATCmdInject %d", isATCmdInject);
        close(s_fdRild_command);
        s_fdRild_command = -1;
        modemLinkReset();
        return reportUeNotReady() ? TEXT_PHASE_ANY : 0;
    }
    isATCmdInject = false;

    unsigned ended = 0;
    for (ssize_t i = 0; i < n;) {
        if (!rx.inRecord) {
            rx.headerBytes[rx.headerLen++] = (unsigned char)buf[i++];
            if (rx.headerLen < (int)sizeof(ModemRecordHeader)) continue;
            beginRecord();
        } else {
            size_t room = MAX_DATA_LEN - (size_t)rx.textLen;
            size_t take = (size_t)(n - i);
            if (take > rx.left) take = rx.left;
            if (take > room) take = room;
            memcpy(rx.text + rx.textLen, buf + i, take);
            rx.textLen += (int)take;
            rx.left -= (uint32_t)take;
            i += (ssize_t)take;
            // A full buffer goes out as a piece while more of the record follows.
            if (rx.left > 0 && rx.textLen == MAX_DATA_LEN) relayRecordData(false);
        }
        if (rx.inRecord && rx.left == 0) {
            unsigned phase = endRecord();
            if (phase > ended) ended = phase;
        }
    }
    return ended;
}

int modemLinkQuietMs(void) {
    long long soonest = -1;
    for (int slot = 0; slot < MODEM_SLOT_COUNT; slot++) {
        const SlotAnswer *a = &answers[slot];
        if (a->open && a->quietAt >= 0 && (soonest < 0 || a->quietAt < soonest)) soonest = a->quietAt;
    }
    if (soonest < 0) return -1;
    long long left = soonest - nowMs();
    return left > 0 ? (int)left : 0;
}

unsigned modemLinkQuiet(void) {
    unsigned ended = 0;
    const long long now = nowMs();
    for (int slot = 0; slot < MODEM_SLOT_COUNT; slot++) {
        SlotAnswer *a = &answers[slot];
        if (!a->open || a->quietAt < 0 || a->quietAt > now) continue;
        // The slot said no more: what came is the whole answer.
        unsigned phase = closeAnswer(slot);
        if (phase > ended) ended = phase;
    }
    return ended;
}
