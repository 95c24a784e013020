// The answers a link still owes, oldest first: for each command that went out on
// an asynchronous link (the modem, the generic service), the host link that sent
// it, so that its answer goes back there and not to whichever link spoke last.
#ifndef TOLKD_TARGETS_ANSWER_QUEUE_H
#define TOLKD_TARGETS_ANSWER_QUEUE_H

#include <stdbool.h>

#include "serial/serial_device.h"

// How long the pieces of one answer may lie apart. An answer without a final
// result line still reaches the host once its link has been quiet this long.
#define ANSWER_PIECE_WAIT_MS 50

// More commands outstanding on one link than any station pipelines; when it is
// exceeded the oldest is forgotten (its answer then goes to the current link).
#define ANSWER_QUEUE_SIZE 64

typedef struct AnswerDue {
    HostLink origin;
    // The SMS text phase the command belongs to (0: none): its final result ends
    // that phase, and only that one.
    unsigned textPhase;
} AnswerDue;

typedef struct AnswerQueue {
    AnswerDue due[ANSWER_QUEUE_SIZE];
    int head;
    int count;
} AnswerQueue;

// Returns false when the oldest entry had to make room.
static inline bool answerQueuePush(AnswerQueue *q, const AnswerDue *d) {
    bool room = q->count < ANSWER_QUEUE_SIZE;
    if (!room) {
        q->head = (q->head + 1) % ANSWER_QUEUE_SIZE;
        q->count--;
    }
    q->due[(q->head + q->count) % ANSWER_QUEUE_SIZE] = *d;
    q->count++;
    return room;
}

static inline bool answerQueuePop(AnswerQueue *q, AnswerDue *out) {
    if (q->count == 0) return false;
    *out = q->due[q->head];
    q->head = (q->head + 1) % ANSWER_QUEUE_SIZE;
    q->count--;
    return true;
}

// The newest text phase among the entries, 0 when none belongs to one.
static inline unsigned answerQueueTextPhase(const AnswerQueue *q) {
    unsigned phase = 0;
    for (int i = 0; i < q->count; i++) {
        unsigned p = q->due[(q->head + i) % ANSWER_QUEUE_SIZE].textPhase;
        if (p > phase) phase = p;
    }
    return phase;
}

static inline void answerQueueClear(AnswerQueue *q) {
    q->head = 0;
    q->count = 0;
}

#endif
