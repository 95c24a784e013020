// Everything written back to the host: framed AT answers, final result codes,
// numeric result codes after ATV0, and the raw writer of device-maker audio answers.
#ifndef TOLKD_SERIAL_RESPONSE_WRITER_H
#define TOLKD_SERIAL_RESPONSE_WRITER_H

#include <stdbool.h>

#define RESPONSE_OK 0
#define RESPONSE_DONE 1
#define RESPONSE_ERROR 4
#define RESPONSE_NOT_IMPLEMENTED 101
#define RESPONSE_INVALID (-1)

#define FINAL_RESULT_PREFIX_COUNT 14
extern const char *const finalResultPrefixes[FINAL_RESULT_PREFIX_COUNT];

extern bool gNumericMode;

// Writes data (len bytes, a counted NUL allowed) framed as "\r\n" body "\r\n".
int writeDataToSerial(const char *data, int len);
// Writes len bytes as they are, like an answer that begins with an audio prefix:
// the later pieces of a raw audio answer go out the way its first piece did.
int writeRawDataToSerial(const char *data, int len);
// True when data begins with one of the audio prefixes ("AUD", "aud", "MM", "mm"),
// whose answers the text writer passes through raw.
bool isAudioResponse(const char *data, int len);
// Writes the final result line for a handler's ResponseType.
int writeDataToserialByResponseType(int type);
// Replaces a body that is exactly a verbose final result by its V.250 digit.
void Response2Numeric(const char *in, char *out);
// True when data begins with one of finalResultPrefixes (ends SMS text input).
bool isFinalResult(const char *data, int len);

// Writes device-maker audio answers byte for byte, waiting, retrying and reopening.
void writeDataToSerialByAudioType(const char *buf, int len);

#endif
