// The text writer: frames every answer as "\r\n" body "\r\n", applies numeric
// result codes after ATV0, and passes the device maker's audio answers through raw.
#include "serial/response_writer.h"

#include <errno.h>
#include <stdio.h>
#include <string.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "serial/serial_device.h"

bool gNumericMode = false;

// Answer beginnings that end the text phase of an SMS command; compared in order.
const char *const finalResultPrefixes[FINAL_RESULT_PREFIX_COUNT] = {
    "OK",         "ERROR",         "+CMS ERROR:",         "+CMGW:",     "+CMGS:",     "+CMGC:",     "+CNMA:",
    "\r\nOK",     "\r\nERROR",     "\r\n+CMS ERROR:",     "\r\n+CMGW:", "\r\n+CMGS:", "\r\n+CMGC:", "\r\n+CNMA:",
};

typedef struct NumericResult {
    char text[20];
    char digit;
} NumericResult;

// V.250 result codes; code 5 has no verbose text here, so from row 5 on the row
// index and the digit differ.
static const NumericResult numericResultTable[] = {
    {"OK", '0'},    {"CONNECT", '1'},     {"RING", '2'}, {"NO CARRIER", '3'},
    {"ERROR", '4'}, {"NO DIALTONE", '6'}, {"BUSY", '7'}, {"NO ANSWER", '8'},
};
#define NUMERIC_RESULT_COUNT (sizeof(numericResultTable) / sizeof(numericResultTable[0]))

// Largest answer the writer considers: one full data buffer, a counted NUL included.
#define WRITER_MAX_LEN DATA_BUF_SIZE

static bool startsWith(const char *data, int len, const char *prefix) {
    const size_t n = strlen(prefix);
    return len >= 0 && (size_t)len >= n && memcmp(data, prefix, n) == 0;
}

bool isFinalResult(const char *data, int len) {
    if (data == NULL) return false;
    for (int i = 0; i < FINAL_RESULT_PREFIX_COUNT; i++) {
        if (startsWith(data, len, finalResultPrefixes[i])) return true;
    }
    return false;
}

bool isAudioResponse(const char *data, int len) {
    return startsWith(data, len, "AUD") || startsWith(data, len, "aud") || startsWith(data, len, "MM") ||
           startsWith(data, len, "mm");
}

void Response2Numeric(const char *in, char *out) {
    if (!gNumericMode || in == NULL || out == NULL) return;
    for (size_t i = 0; i < NUMERIC_RESULT_COUNT; i++) {
        if (strcmp(in, numericResultTable[i].text) == 0) {
            LOGD("Response2Numeric, i=%lu", (unsigned long)i);
            out[0] = numericResultTable[i].digit;
            out[1] = '\0';
            return;
        }
    }
    const size_t n = strlen(in);
    memcpy(out, in, n);
    out[n] = '\0';
}

// One write of the finished answer; what does not go out is lost (the reader finds
// and reopens a broken serial link).
static int writeToHost(int fd, const char *out, int outLen) {
    LOGD("length=%d", outLen);
    const ssize_t written = write(fd, out, (size_t)outLen);
    if (written != outLen) {
        LOGW("Couldn't write all data to the serial port. Wrote only %d bytes with %d", (int)written, errno);
    }
    return (int)written;
}

int writeDataToSerial(const char *data, int len) {
    if (data == NULL) {
        data = "";
        len = 0;
    }
    // The data is logged as text, but it need not be NUL-terminated within len.
    const int logLen = len < 0 ? 0 : len;
    LOGD("Enter with data:%.*s", logLen, data);
    LOGD("Enter with length:%d", len);
    if (len < 0) len = 0;
    if (len > WRITER_MAX_LEN) len = WRITER_MAX_LEN;

    const int fd = gSerialDevice.fd[currentOutputDevice()];
    if (fd < 0) {
        LOGE("Wrong fd with %d, currDevice = %d", fd, gSerialDevice.currDevice);
        return -1;
    }

    if (isAudioResponse(data, len)) {
        LOGI("audio type response");
        return writeToHost(fd, data, len);
    }

    LOGD("Not audio");
    const bool head = len >= 2 && data[0] == '\r' && data[1] == '\n';
    const bool tail = len >= 2 && data[len - 2] == '\r' && data[len - 1] == '\n';
    const char *start = data;
    int bodyLen = len;
    if (head && tail) {
        start = data + 2;
        bodyLen = len >= 4 ? len - 4 : 0;
        LOGD("remove head and tail");
    } else if (head) {
        start = data + 2;
        bodyLen = len - 2;
        LOGD("remove head");
    } else if (tail) {
        bodyLen = len - 2;
        LOGD("remove tail");
    } else {
        LOGD("No remove");
    }
    char body[WRITER_MAX_LEN + 1];
    memcpy(body, start, (size_t)bodyLen);
    body[bodyLen] = '\0';

    const char *text = body;
    char converted[WRITER_MAX_LEN + 1];
    if (gNumericMode) {
        memset(converted, 0, sizeof(converted));
        Response2Numeric(body, converted);
        text = converted;
    }
    char framed[WRITER_MAX_LEN + 8];
    const int outLen = snprintf(framed, sizeof(framed), "\r\n%s\r\n", text);
    return writeToHost(fd, framed, outLen);
}

int writeRawDataToSerial(const char *data, int len) {
    if (data == NULL || len < 0) len = 0;
    if (len > WRITER_MAX_LEN) len = WRITER_MAX_LEN;
    const int fd = gSerialDevice.fd[currentOutputDevice()];
    if (fd < 0) {
        LOGE("Wrong fd with %d, currDevice = %d", fd, gSerialDevice.currDevice);
        return -1;
    }
    return writeToHost(fd, data != NULL ? data : "", len);
}

int writeDataToserialByResponseType(int type) {
    const char *text;
    switch (type) {
    case RESPONSE_OK:
        text = "OK";
        break;
    case RESPONSE_DONE:
        text = "";
        break;
    case RESPONSE_ERROR:
        text = "ERROR";
        break;
    case RESPONSE_NOT_IMPLEMENTED:
        text = "Not Implement";
        break;
    default:
        text = "UNKNOWN";
        break;
    }
    char buf[2048];
    memset(buf, 0, sizeof(buf));
    const int n = snprintf(buf, sizeof(buf), "\r\n%s\r\n", text);
    return writeDataToSerial(buf, n);
}
