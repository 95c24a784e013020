// Plain entry points of the radio HAL bridge, for the rest of the daemon. The bridge
// sends each modem command as one HAL request and writes every HAL callback, as one
// record, into its end of the modem socket pair, where the main loop reads it.
#ifndef TOLKD_HAL_TOLKD_ADAPTATION_H
#define TOLKD_HAL_TOLKD_ADAPTATION_H

#include <stdint.h>

// SIM slots, each served by its own radio HAL instance ("slot1".."slot4").
#define MODEM_SLOT_COUNT 4

// The modem pair is a byte stream; each callback goes into it as one record, a
// header and then `length` bytes of HAL data, written whole under the bridge's
// mutex so that records never interleave. The main loop relays and judges each
// record on its own, whatever its reads bring together or cut apart.
enum ModemRecordKind {
    MODEM_RECORD_ANSWER = 1,      // sendTolkResponse: the answer to a request
    MODEM_RECORD_INDICATION = 2,  // tolkInd: unsolicited modem output
    // The slot's service died, or its proxy was dropped after a transport failure:
    // the answers still due from it will never come. No data follows.
    MODEM_RECORD_SLOT_LOST = 3,
};

typedef struct ModemRecordHeader {
    uint8_t kind;     // a ModemRecordKind
    uint8_t slot;     // the SIM slot (0..3) the record came from
    uint8_t reserved[2];
    uint32_t length;  // HAL data bytes that follow
} ModemRecordHeader;

// Hands the bridge its end of a new modem pair.
void setSocketFdForAdaptation(int fd);
// Sends length bytes of data as one HAL request; true when the HAL accepted it.
bool sendRequest(const char *data, int length);
// The same, and *slot (when given) receives the slot the request went to.
bool sendRequestOnSlot(const char *data, int length, int *slot);
void sigpipe_handler(int sig);

#endif
