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

// V.250 final result codes in verbose form, and the error reports of 27.007 and
// 27.005: a line that is one of them ends an answer.
static const char *const kFinalResultLines[] = {"OK", "ERROR", "NO CARRIER", "BUSY", "NO ANSWER", "NO DIALTONE",
                                                "CONNECT"};
static const char *const kFinalResultLinePrefixes[] = {"+CME ERROR:", "+CMS ERROR:", "CONNECT "};
// The results of the SMS commands that take a text body; the modem may send them
// without a final result line of their own.
static const char *const kSmsResultPrefixes[] = {"+CMGS:", "+CMGW:", "+CMGC:", "+CNMA:"};

static bool lineIs(const char *line, int n, const char *text) {
    return (size_t)n == strlen(text) && memcmp(line, text, (size_t)n) == 0;
}

static bool lineStartsWith(const char *line, int n, const char *prefix) {
    const size_t k = strlen(prefix);
    return (size_t)n >= k && memcmp(line, prefix, k) == 0;
}

static bool isFinalResultLine(const char *line, int n) {
    for (const char *text : kFinalResultLines) {
        if (lineIs(line, n, text)) return true;
    }
    for (const char *prefix : kFinalResultLinePrefixes) {
        if (lineStartsWith(line, n, prefix)) return true;
    }
    return false;
}

int finalResultEnd(const char *data, int len) {
    if (data == NULL) return 0;
    int start = 0;
    for (int i = 0; i + 1 < len; i++) {
        if (data[i] != '\r' || data[i + 1] != '\n') continue;
        if (isFinalResultLine(data + start, i - start)) return i + 2;
        start = i + 2;
        i++;
    }
    return 0;
}

// The last line of data (its text up to a NUL, trailing line ends dropped).
static const char *lastLineOf(const char *data, int len, int *n) {
    int end = (int)strnlen(data, (size_t)len);
    while (end > 0 && (data[end - 1] == '\r' || data[end - 1] == '\n')) end--;
    int start = end;
    while (start > 0 && data[start - 1] != '\r' && data[start - 1] != '\n') start--;
    *n = end - start;
    return data + start;
}

bool endsWithResultCode(const char *data, int len) {
    if (data == NULL || len <= 0) return false;
    int n = 0;
    const char *line = lastLineOf(data, len, &n);
    return isFinalResultLine(line, n);
}

bool endsWithFinalResult(const char *data, int len) {
    if (data == NULL || len <= 0) return false;
    int n = 0;
    const char *line = lastLineOf(data, len, &n);
    if (isFinalResultLine(line, n)) return true;
    for (const char *prefix : kSmsResultPrefixes) {
        if (lineStartsWith(line, n, prefix)) return true;
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

// The descriptor for an answer to link (NULL: the current line's link), or -1 after
// logging why nothing can be written.
static int answerFd(const HostLink *to) {
    const int fd = hostLinkFd(to);
    if (fd >= 0) return fd;
    if (to != NULL && to->device == DEVICE_ADB && to->connection != gAdbConnection) {
        LOGW("answer dropped: adb connection %u that asked has gone", to->connection);
    } else {
        LOGE("Wrong fd with %d, currDevice = %d", fd, gSerialDevice.currDevice);
    }
    return -1;
}

int writeDataToLink(const HostLink *to, const char *data, int len) {
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

    const int fd = answerFd(to);
    if (fd < 0) return -1;

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
    const size_t textLen = strlen(text);  // at most bodyLen
    framed[0] = '\r';
    framed[1] = '\n';
    memcpy(framed + 2, text, textLen);
    framed[textLen + 2] = '\r';
    framed[textLen + 3] = '\n';
    return writeToHost(fd, framed, (int)textLen + 4);
}

int writeDataToSerial(const char *data, int len) { return writeDataToLink(NULL, data, len); }

int writeRawDataToLink(const HostLink *to, const char *data, int len) {
    if (data == NULL || len < 0) len = 0;
    if (len > WRITER_MAX_LEN) len = WRITER_MAX_LEN;
    const int fd = answerFd(to);
    if (fd < 0) return -1;
    return writeToHost(fd, data != NULL ? data : "", len);
}

void answerPiecesReset(AnswerPieces *pieces) {
    if (pieces != NULL) memset(pieces, 0, sizeof(*pieces));
}

int writeAnswerPiece(const HostLink *to, AnswerPieces *p, const char *data, int len, bool last) {
    if (p == NULL) return writeDataToLink(to, data, len);
    if (data == NULL || len < 0) len = 0;
    if (len > WRITER_MAX_LEN) len = WRITER_MAX_LEN;
    if (p->ended) return 0;

    // What is held back from the piece before goes first.
    char buf[WRITER_MAX_LEN + 2];
    int n = p->heldLen;
    memcpy(buf, p->held, (size_t)n);
    p->heldLen = 0;
    if (len > 0) memcpy(buf + n, data, (size_t)len);
    n += len;

    char out[WRITER_MAX_LEN + 8];
    int outLen = 0;
    int from = 0;
    if (!p->started) {
        if (!last && n < 2) {
            // Not yet known whether the answer begins with CR LF.
            memcpy(p->held, buf, (size_t)n);
            p->heldLen = n;
            return 0;
        }
        p->started = true;
        p->raw = isAudioResponse(buf, n);
        if (!p->raw) {
            // A relayed text ends at its first NUL, so that a NUL-terminated answer
            // is framed like the same answer without it.
            const int textLen = (int)strnlen(buf, (size_t)n);
            if (textLen < n) {
                p->ended = true;
                return writeDataToLink(to, buf, textLen);
            }
        }
        if (last) return writeDataToLink(to, buf, n);
        if (!p->raw) {
            out[outLen++] = '\r';
            out[outLen++] = '\n';
            if (buf[0] == '\r' && buf[1] == '\n') from = 2;
        }
    }
    if (p->raw) return writeRawDataToLink(to, buf, n);

    // The text of an answer ends at its first NUL.
    const int textLen = (int)strnlen(buf, (size_t)n);
    if (textLen < n) {
        n = textLen;
        last = true;
        p->ended = true;
    }
    int end = n;
    if (last) {
        if (end - from >= 2 && buf[end - 2] == '\r' && buf[end - 1] == '\n') end -= 2;
    } else {
        // A CR LF (or its CR) at the end may be the answer's tail: keep it back.
        int keep = 0;
        if (end - from >= 2 && buf[end - 2] == '\r' && buf[end - 1] == '\n') keep = 2;
        else if (end - from >= 1 && buf[end - 1] == '\r') keep = 1;
        end -= keep;
        memcpy(p->held, buf + end, (size_t)keep);
        p->heldLen = keep;
    }
    memcpy(out + outLen, buf + from, (size_t)(end - from));
    outLen += end - from;
    if (last) {
        out[outLen++] = '\r';
        out[outLen++] = '\n';
    }
    LOGD("answer piece of %d bytes%s", outLen, last ? ", the last" : "");
    if (outLen == 0) return 0;
    const int fd = answerFd(to);
    if (fd < 0) return -1;
    return writeToHost(fd, out, outLen);
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
    char buf[32];
    const int n = snprintf(buf, sizeof(buf), "\r\n%s\r\n", text);
    return writeDataToSerial(buf, n);
}
