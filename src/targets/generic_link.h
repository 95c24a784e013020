// The generic service link carries bytes without any framing: one read may bring
// several answers, or part of one. Its bytes are put together into answers here;
// an answer is complete at its final result line, and each goes to the host link
// that sent the command it answers.
#ifndef TOLKD_TARGETS_GENERIC_LINK_H
#define TOLKD_TARGETS_GENERIC_LINK_H

#include <stdbool.h>

#include "serial/serial_device.h"
#include "targets/answer_queue.h"

// A command from origin went out on the link; the next answer due is its.
void genericCommandSent(const HostLink *origin);
// Reads the link (select found it readable) and relays every complete answer.
// Returns true when the link ended while a modem command was outstanding (the host
// has been told "ERROR:UE is not ready").
bool serveGenericLink(void);
// Milliseconds until an incomplete answer goes out anyway; -1 when none waits.
int genericLinkQuietMs(void);
// Relays an incomplete answer whose link has been quiet for the piece wait.
void genericLinkQuiet(void);
// Relays the complete answers already waiting on the link, without blocking.
void genericLinkDrain(void);
// Waits for the answer to the command just sent (from the current line's link):
// the answers still owed to earlier commands come first and go to their links;
// the one after them, complete at its final result line or when the link goes
// quiet, is this one. It is relayed to the current link when relay is set and
// copied into buf (size bytes, at least 1, NUL-terminated; buf may be NULL). Returns its
// length, or -1 when none came (the link failed or ended first).
int genericLinkAwaitAnswer(char *buf, int size, bool relay);
// The link was closed: what is pending goes out, the answers due are forgotten.
void genericLinkClosed(void);

#endif
