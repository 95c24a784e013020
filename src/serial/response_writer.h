// Everything written back to the host: framed AT answers, final result codes,
// numeric result codes after ATV0, and the raw writer of device-maker audio answers.
#ifndef TOLKD_SERIAL_RESPONSE_WRITER_H
#define TOLKD_SERIAL_RESPONSE_WRITER_H

#include <stdbool.h>

#include "serial/serial_device.h"

#define RESPONSE_OK 0
#define RESPONSE_DONE 1
#define RESPONSE_ERROR 4
#define RESPONSE_NOT_IMPLEMENTED 101
#define RESPONSE_INVALID (-1)

extern bool gNumericMode;

// Writes data (len bytes, a counted NUL allowed) framed as "\r\n" body "\r\n" to
// the link of the current line.
int writeDataToSerial(const char *data, int len);
// The same to the link a command came from; nothing when that link is gone.
int writeDataToLink(const HostLink *to, const char *data, int len);
// Writes len bytes as they are, like an answer that begins with an audio prefix.
int writeRawDataToLink(const HostLink *to, const char *data, int len);

// An answer that reaches the daemon in several pieces (longer than one buffer, or
// cut by its link) must reach the host exactly as if it had come whole: one CR LF
// stripped from its head and its tail, "\r\n" before and after, or every byte as
// it is for an audio-prefixed answer. The state of one such answer:
typedef struct AnswerPieces {
    bool started;  // the head has gone out
    bool raw;      // an audio-prefixed answer: every byte as it is
    bool ended;    // a NUL ended the text: the rest of the answer is dropped
    char held[2];  // a possible tail CR LF, kept until it is known to end the answer
    int heldLen;
} AnswerPieces;

void answerPiecesReset(AnswerPieces *pieces);
// Writes the next piece of an answer (last: no more pieces follow). A first piece
// that is also the last is written exactly as writeDataToLink writes it.
int writeAnswerPiece(const HostLink *to, AnswerPieces *pieces, const char *data, int len, bool last);
// True when data begins with one of the audio prefixes ("AUD", "aud", "MM", "mm"),
// whose answers the text writer passes through raw.
bool isAudioResponse(const char *data, int len);
// Writes the final result line for a handler's ResponseType.
int writeDataToserialByResponseType(int type);
// Replaces a body that is exactly a verbose final result by its V.250 digit.
void Response2Numeric(const char *in, char *out);
// When data holds a complete answer, the length of the first one: everything up to
// and including the CR LF that ends its final result line (OK, ERROR, +CME ERROR:,
// +CMS ERROR:, or another V.250 final result code); 0 when none has come yet.
int finalResultEnd(const char *data, int len);
// True when the last line of data is a final result line (OK, ERROR, +CME ERROR:,
// +CMS ERROR:, another V.250 final result code), one that ends at the end of data
// included: such a line ends an answer.
bool endsWithResultCode(const char *data, int len);
// The same, or an SMS command's own result (+CMGS: and the like), which the modem
// may send without a final result line of its own: such an answer ends the text
// phase of an SMS command.
bool endsWithFinalResult(const char *data, int len);

// Writes device-maker audio answers byte for byte, waiting, retrying and reopening.
void writeDataToSerialByAudioType(const char *buf, int len);
void writeDataToLinkByAudioType(const HostLink *to, const char *buf, int len);

#endif
