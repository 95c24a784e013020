// Host-only: the wire between the radio HAL stand-in (inside tolkd) and the
// simulated radio HAL service (tolk-sim's radio peer).
//
// Each instance "slot1".."slot4" is an AF_UNIX stream socket at the device path
// "/dev/hwbinder/radio.<instance>" (resolved under the device root). One client
// connection is one IRadio proxy. Both directions carry frames: a fixed header
// followed by `length` payload bytes.
//
//   client -> service  REGISTER   registerTolkCallbacks (no payload)
//   client -> service  REQUEST    sendTolkRequest(serial, payload)
//   service -> client  RESPONSE   ITolkResponse::sendTolkResponse(info, payload)
//   service -> client  INDICATION ITolkIndication::tolkInd(type, payload)
//
// The service sends RESPONSE and INDICATION frames only after REGISTER. The end
// of the connection is the death of the service as the client sees it.
#ifndef TOLK_PLATFORM_RADIO_WIRE_H
#define TOLK_PLATFORM_RADIO_WIRE_H

#include <stddef.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

#define RADIO_WIRE_PATH_PREFIX "/dev/hwbinder/radio."
#define RADIO_WIRE_MAX_PAYLOAD (64 * 1024)

enum RadioWireType {
    RADIO_WIRE_REGISTER = 1,
    RADIO_WIRE_REQUEST = 2,
    RADIO_WIRE_RESPONSE = 3,
    RADIO_WIRE_INDICATION = 4,
};

typedef struct RadioWireHeader {
    uint32_t type;    // RadioWireType
    int32_t serial;   // request serial; echoed in the response info
    int32_t extra;    // RESPONSE: RadioError (0 none); INDICATION: RadioIndicationType
    uint32_t length;  // payload bytes that follow (at most RADIO_WIRE_MAX_PAYLOAD)
} RadioWireHeader;

// Writes one whole frame (retrying partial writes and EINTR); 0 or -1.
int radio_wire_send(int fd, uint32_t type, int32_t serial, int32_t extra,
                    const void *payload, uint32_t length);
// Reads one whole frame into hdr and payload (capacity bytes; longer payloads are
// a protocol error); 0, or -1 on end of connection or error.
int radio_wire_recv(int fd, RadioWireHeader *hdr, void *payload, size_t capacity);

#ifdef __cplusplus
}
#endif

#endif
