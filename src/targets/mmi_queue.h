// Matching modem answers to customer MMI commands by counting: commands routed to
// the modem minus answers received, and per queued command the answers still due.
#ifndef TOLKD_TARGETS_MMI_QUEUE_H
#define TOLKD_TARGETS_MMI_QUEUE_H

#include <stdbool.h>

#define MMI_QUEUE_SIZE 10
#define MMI_CMD_TEXT_SIZE 512

typedef struct MmiCmdSeq {
    char cmd[MMI_QUEUE_SIZE][MMI_CMD_TEXT_SIZE];
    int SIdx;
    int EIdx;
    int idx;
    int deSeqIdx;
    int enSeqIdx;
    int seq[MMI_QUEUE_SIZE];
    int cusMmiCmdPending;
} MmiCmdSeq;

extern MmiCmdSeq gMmiCmdSeq;

// Zeroes the record and frees every queue entry (called at start-up).
void mmiCmdSeqReset(void);
// Counts one command that reached the modem, and queues it when it is a customer
// MMI command.
void mmiCmdSeqEnQueue(void);
// Takes back the text slot of a customer MMI line that was refused before it
// reached the modem, so that the next modem command is not paired with its text.
void mmiCmdSeqCancelPending(void);
// Counts one modem answer; true when it is the answer of the oldest queued command.
bool mmiCmdSeqDeQueue(void);
// Forgets count answers that will never come (their service died): they are
// no longer outstanding, and a queued command among them is dropped with its text.
void mmiCmdSeqForget(int count);
void sendCusMMICmdRspToMMI(const char *rsp);

#endif
