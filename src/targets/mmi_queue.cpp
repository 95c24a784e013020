// Matching modem answers to customer MMI commands. The modem path carries no request
// identifiers, so each queued command remembers how many modem answers are still due
// before its own; every answer counts all queued entries down by one, and the entry
// that reaches zero owns the answer just received.
#include "targets/mmi_queue.h"

#include <stdlib.h>
#include <string.h>

#include "core/tolkd_log.h"
#include "dispatch/command_type.h"
#include "targets/target_conn.h"
#include "targets/target_relay.h"

MmiCmdSeq gMmiCmdSeq;

static int nextIndex(int i) { return (i + 1) % MMI_QUEUE_SIZE; }

// Keeps an index usable even if the record was scribbled on.
static int validIndex(int i) { return (i >= 0 && i < MMI_QUEUE_SIZE) ? i : 0; }

void mmiCmdSeqReset(void) {
    memset(&gMmiCmdSeq, 0, sizeof(gMmiCmdSeq));
    for (int i = 0; i < MMI_QUEUE_SIZE; i++) gMmiCmdSeq.seq[i] = -1;
}

void mmiCmdSeqEnQueue(void) {
    // A negative count means the modem sent more than was asked (unsolicited lines,
    // answers in several pieces). Those surplus pieces cannot answer commands sent
    // later, so the count restarts from nothing outstanding; otherwise an entry
    // could be stored below 1, never count down, and block the queue for good.
    if (gMmiCmdSeq.idx < 0) gMmiCmdSeq.idx = 0;
    gMmiCmdSeq.idx++;
    if (gMmiCmdSeq.cusMmiCmdPending != 1) return;

    int e = validIndex(gMmiCmdSeq.enSeqIdx);
    gMmiCmdSeq.enSeqIdx = e;
    LOGD("mmiCmdSeqEnQueue, idx[%d],seqIdx[%d],seq[%d]", gMmiCmdSeq.idx, e, gMmiCmdSeq.seq[e]);
    if (gMmiCmdSeq.seq[e] != -1) {
        LOGE("MMI cmd seq queue is full.");
    } else {
        gMmiCmdSeq.seq[e] = gMmiCmdSeq.idx;
        gMmiCmdSeq.enSeqIdx = nextIndex(e);
    }
    gMmiCmdSeq.cusMmiCmdPending = 0;
}

void mmiCmdSeqCancelPending(void) {
    if (gMmiCmdSeq.cusMmiCmdPending != 1) return;
    gMmiCmdSeq.cusMmiCmdPending = 0;
    // With the queue full the dispatcher took no text slot, so there is none to give back.
    if (gMmiCmdSeq.seq[validIndex(gMmiCmdSeq.enSeqIdx)] != -1) return;
    gMmiCmdSeq.EIdx = (validIndex(gMmiCmdSeq.EIdx) + MMI_QUEUE_SIZE - 1) % MMI_QUEUE_SIZE;
    memset(gMmiCmdSeq.cmd[gMmiCmdSeq.EIdx], 0, MMI_CMD_TEXT_SIZE);
}

bool mmiCmdSeqDeQueue(void) {
    int i = validIndex(gMmiCmdSeq.deSeqIdx);
    gMmiCmdSeq.deSeqIdx = i;
    LOGD("mmiCmdSeqDeQueue, seqIdx[%d],seq[%d]", i, gMmiCmdSeq.seq[i]);
    bool matched = false;
    for (int visited = 0; visited < MMI_QUEUE_SIZE; visited++, i = nextIndex(i)) {
        if (gMmiCmdSeq.seq[i] < 1) break;
        LOGD("seqIdx[%d],seq[%d]", i, gMmiCmdSeq.seq[i]);
        gMmiCmdSeq.seq[i]--;
        if (gMmiCmdSeq.seq[i] == 0) {
            gMmiCmdSeq.seq[i] = -1;
            gMmiCmdSeq.deSeqIdx = nextIndex(gMmiCmdSeq.deSeqIdx);
            matched = true;
        }
    }
    return matched;
}

void mmiCmdSeqForget(int count) {
    if (count <= 0) return;
    gMmiCmdSeq.idx = gMmiCmdSeq.idx > count ? gMmiCmdSeq.idx - count : 0;
    // The answers lost are those of the oldest outstanding commands: a queued
    // command whose countdown lies within them will never be answered; the later
    // ones have that many fewer answers to wait for.
    int i = validIndex(gMmiCmdSeq.deSeqIdx);
    for (int visited = 0; visited < MMI_QUEUE_SIZE && gMmiCmdSeq.seq[i] >= 1; visited++, i = nextIndex(i)) {
        if (gMmiCmdSeq.seq[i] <= count) {
            LOGW("MMI command %s will get no answer", gMmiCmdSeq.cmd[validIndex(gMmiCmdSeq.SIdx)]);
            gMmiCmdSeq.seq[i] = -1;
            gMmiCmdSeq.deSeqIdx = nextIndex(gMmiCmdSeq.deSeqIdx);
            gMmiCmdSeq.SIdx = nextIndex(validIndex(gMmiCmdSeq.SIdx));
        } else {
            gMmiCmdSeq.seq[i] -= count;
        }
    }
}

void sendCusMMICmdRspToMMI(const char *rsp) {
    int s = validIndex(gMmiCmdSeq.SIdx);
    LOGD("sendCusMMICmdRspToMMI SIdx[%d]", s);
    if (rsp == NULL) return;

    const char *cmd = gMmiCmdSeq.cmd[s];
    size_t cmdLen = strnlen(cmd, MMI_CMD_TEXT_SIZE);
    size_t rspLen = strlen(rsp);
    size_t total = cmdLen + rspLen + 1;
    char *text = (char *)malloc(total + 1);
    gMmiCmdSeq.SIdx = nextIndex(s);
    if (text == NULL) {
        LOGE("no memory for the MMI answer");
        return;
    }
    memcpy(text, cmd, cmdLen);
    memcpy(text + cmdLen, rsp, rspLen);
    text[cmdLen + rspLen] = ';';
    text[total] = '\0';

    if (s_fdService_command < 0) connectTarget(GENERIC_TYPE);
    sendDataToGenericService(text);
    free(text);
}
