// The modem link. The bridge writes each HAL callback into the modem pair as one
// record (hal/tolkd_adaptation.h); a read of the pair may bring several records,
// or part of one, so the records are put back together here. Each answer record
// is the answer to the oldest command outstanding on its slot: it goes to the host
// link that sent that command and counts once for the MMI command sequence queue.
// An indication goes to the link of the current line and counts for nothing. A
// record longer than one buffer is relayed in pieces, framed once as a whole.
#include "targets/modem_link.h"

#include <errno.h>
#include <string.h>
#include <sys/socket.h>
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

// The record being read from the pair.
struct RecordReader {
    unsigned char headerBytes[sizeof(ModemRecordHeader)];
    int headerLen;
    bool inRecord;          // the header is read; data bytes follow
    ModemRecordHeader header;
    uint32_t left;          // data bytes of the record still to come
    char text[DATA_BUF_SIZE];
    int textLen;            // data received and not yet relayed
    bool relayed;           // a piece of the record has gone out
    AnswerPieces pieces;
    HostLink to;            // where the record goes
    unsigned textPhase;     // the text phase of the command it answers
    bool mmiAnswer;         // the answer of a customer MMI command
    char tail[ANSWER_TAIL_KEEP];
    int tailLen;            // the end of the text relayed so far
};
RecordReader rx;

void keepTail(const char *data, int len) {
    if (len >= ANSWER_TAIL_KEEP) {
        memcpy(rx.tail, data + len - ANSWER_TAIL_KEEP, ANSWER_TAIL_KEEP);
        rx.tailLen = ANSWER_TAIL_KEEP;
        return;
    }
    int keep = ANSWER_TAIL_KEEP - len < rx.tailLen ? ANSWER_TAIL_KEEP - len : rx.tailLen;
    memmove(rx.tail, rx.tail + rx.tailLen - keep, (size_t)keep);
    memcpy(rx.tail + keep, data, (size_t)len);
    rx.tailLen = keep + len;
}

// The answers of a slot whose service died (or whose proxy was dropped) will not
// come: the commands that waited for them are forgotten, and so are their counts
// in the MMI queue. Returns the text phase they belonged to (0: none).
unsigned forgetSlot(int slot) {
    AnswerQueue *q = &answersDue[slot];
    unsigned phase = answerQueueTextPhase(q);
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
    rx.relayed = false;
    rx.tailLen = 0;
    rx.mmiAnswer = false;
    rx.textPhase = 0;
    answerPiecesReset(&rx.pieces);
    rx.to = currentHostLink();
    const int slot = rx.header.slot < MODEM_SLOT_COUNT ? rx.header.slot : -1;
    if (rx.header.kind != MODEM_RECORD_ANSWER) return;

    AnswerDue due;
    if (slot >= 0 && answerQueuePop(&answersDue[slot], &due)) {
        rx.to = due.origin;
        rx.textPhase = due.textPhase;
    }
    // Only answers count; unsolicited output answers nothing.
    LOGD("Receive RIL rsp = [%d]", gMmiCmdSeq.idx);
    gMmiCmdSeq.idx--;
    rx.mmiAnswer = mmiCmdSeqDeQueue();
}

// Relays the data held so far; last: the record is complete.
void relayPiece(bool last) {
    rx.text[rx.textLen] = '\0';
    if (!rx.relayed && rx.mmiAnswer) sendCusMMICmdRspToMMI(rx.text);
    LOGD("data receive from %d is %s", RIL_TYPE, rx.text);
    LOGD("data receive data length is %d", rx.textLen);
    // Empty HAL data answers a command but has nothing to show.
    const bool textEnded = rx.pieces.ended;
    if (rx.textLen > 0 || rx.relayed) writeAnswerPiece(&rx.to, &rx.pieces, rx.text, rx.textLen, last);
    // The text ends at its first NUL; what follows it is no part of the answer.
    if (!textEnded) keepTail(rx.text, (int)strnlen(rx.text, (size_t)rx.textLen));
    rx.relayed = true;
    rx.textLen = 0;
}

// A complete record: the last piece goes out and the answer is judged.
unsigned endRecord(void) {
    rx.inRecord = false;
    rx.headerLen = 0;
    if (rx.header.kind == MODEM_RECORD_SLOT_LOST) {
        return rx.header.slot < MODEM_SLOT_COUNT ? forgetSlot(rx.header.slot) : 0;
    }
    relayPiece(true);
    if (rx.header.kind == MODEM_RECORD_ANSWER && rx.textPhase != 0 && endsWithFinalResult(rx.tail, rx.tailLen)) {
        return rx.textPhase;
    }
    return 0;
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
    if (!sent || slot < 0 || slot >= MODEM_SLOT_COUNT) {
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
            if (rx.left > 0 && rx.textLen == MAX_DATA_LEN) relayPiece(false);
        }
        if (rx.inRecord && rx.left == 0) {
            unsigned phase = endRecord();
            if (phase > ended) ended = phase;
        }
    }
    return ended;
}
