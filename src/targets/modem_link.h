// The modem link: commands go to the radio HAL bridge, and the records the bridge
// writes into the modem pair come back here, each relayed and judged on its own.
// An answer goes to the host link that sent its command; unsolicited output goes
// to the link of the current line.
#ifndef TOLKD_TARGETS_MODEM_LINK_H
#define TOLKD_TARGETS_MODEM_LINK_H

#include "serial/serial_device.h"

// What serveModemLink reports when a text phase ended in a way that is not the
// answer to one of its lines (the link's peer went away with a command outstanding).
#define TEXT_PHASE_ANY 0xFFFFFFFFu

// Sends a command line, or a line of SMS text, with its NUL as one HAL request.
// Its answer goes back to origin (NULL: the link of the current line); textPhase
// names the SMS text phase the line belongs to (0: none). Returns 0 when the HAL
// took the request; -1 when it could not, after answering "ERROR:No Modem".
int sendToModem(const char *line, const HostLink *origin, unsigned textPhase);
// The same for a command from the current line's link, outside any text phase.
int sendDataToRild(const char *line);

// Reads the modem pair (select found it readable), relays every record, or every
// piece of a record, that has arrived, and feeds the MMI command sequence queue.
// Returns the text phase that ended (the final result of one of its lines came,
// or its answers were lost with their service), TEXT_PHASE_ANY, or 0.
unsigned serveModemLink(void);
// Milliseconds until an answer without its final result is taken as complete;
// -1 when none waits.
int modemLinkQuietMs(void);
// Completes the answers whose slot has been quiet for the piece wait; returns the
// text phase one of them ended (0: none).
unsigned modemLinkQuiet(void);
// Forgets a record half read from a pair that has been replaced.
void modemLinkReset(void);

#endif
