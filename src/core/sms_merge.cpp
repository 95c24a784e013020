// SMS commands whose text body follows a "> " prompt. For every operator the body is
// relayed line by line to the modem; for OP12 the body is collected here instead and
// sent as one command with the text as a quoted parameter (AT+CMGS -> AT+EMGS ...).
#include "core/sms_merge.h"

#include <stdio.h>
#include <stdlib.h>
#include <string.h>

#include <cutils/properties.h>

#include "attok/at_tok.h"
#include "core/line_edit.h"
#include "core/prop_number.h"
#include "core/reader.h"
#include "core/tolkd_log.h"
#include "dispatch/dispatcher.h"
#include "serial/response_writer.h"
#include "targets/modem_link.h"
#include "targets/target_conn.h"

bool isNeedMergeMsgCmdInput = false;
int msgCmdMode = 0;
// The merged command is complete: the message is whole once it has gone out.
static bool mergedMessageReady = false;

#define MSG_CMD_COUNT 4
static const char msgCmdTable[MSG_CMD_COUNT][CMD_NAME_SIZE] = {
    "AT+CMGS",
    "AT+CMGW",
    "AT+CMGC",
    "AT+CNMA",
};

#define MSG_MODE_TEXT 1
// "AT+ESUO=9" stores this SIM selection: the CDMA modem, which takes no merged text.
#define SIM_SELECT_CDMA 9

// Open the quoted text parameter: after a lone destination an empty type-of-address
// field is added; after a PDU length or a destination with type only the quote.
static const char kLongSuffix[] = ",,\"";
static const char kShortSuffix[] = ",\"";
// Replaces the last character of the collected text (its delimiter).
static const char kClosing[] = "\"\r\n";
static const char kPrompt[] = "\r\n> ";

#define CTRL_Z 0x1A
#define ESC 0x1B

// Scratch copy for the tokenizer, which writes into the line it reads.
static char tokBuf[DATA_BUF_SIZE];

int isMsgCmd(const char *line) {
    // The name ends at the first "=" that carries parameters; "=?" and a bare "="
    // (test form, nothing to send) leave the whole line as the name.
    size_t headLen = strlen(line);
    const char *eq = strchr(line, '=');
    if (eq != NULL && eq[1] != '?' && eq[1] != '\0') headLen = (size_t)(eq - line);

    for (int i = 0; i < MSG_CMD_COUNT; i++) {
        if (strlen(msgCmdTable[i]) == headLen && strncmp(line, msgCmdTable[i], headLen) == 0) return 1;
    }
    LOGD("line_cut: %.*s", (int)headLen, line);

    static const char kCmgf[] = "AT+CMGF";
    if (headLen == strlen(kCmgf) && strncmp(line, kCmgf, headLen) == 0) {
        snprintf(tokBuf, sizeof(tokBuf), "%s", line);
        char *cursor = tokBuf;
        int mode = 0;
        if (at_tok_start_flag(&cursor, '=') >= 0 && at_tok_nextint(&cursor, &mode) >= 0) {
            msgCmdMode = mode;
            LOGD("msgCmdMode = %d", msgCmdMode);
        }
    }
    return 0;
}

int getMsgCmdParameterCount(const char *line) {
    const char *eq = strchr(line, '=');
    if (eq == NULL || eq[1] == '?') return 0;

    snprintf(tokBuf, sizeof(tokBuf), "%s", eq + 1);
    char *cursor = tokBuf;
    int count = 0;
    while (at_tok_hasmore(&cursor)) {
        char *param = NULL;
        if (at_tok_nextstr(&cursor, &param) < 0) break;
        count++;
    }
    return count;
}

int startMergeMsgCmdInputIfNeed(SerialDevice *dev, const char *line) {
    char sim[PROPERTY_VALUE_MAX];
    memset(sim, 0, sizeof(sim));
    property_get("persist.service.tolk.sim", sim, "0");
    if (propertyNumber(sim) == SIM_SELECT_CDMA) return 0;

    int count = getMsgCmdParameterCount(line);
    LOGD("startMergeMsgCmdInputIfNeed count %d msgCmdMode %d", count, msgCmdMode);

    const char *suffix;
    if (count == 1) {
        suffix = (msgCmdMode == MSG_MODE_TEXT) ? kLongSuffix : kShortSuffix;
    } else if (count == 2 && msgCmdMode == MSG_MODE_TEXT) {
        suffix = kShortSuffix;
    } else {
        return 0;
    }

    // The held command must start at cmdBuf[0]: the "E" goes to its fourth character.
    char *buf = dev->cmdBuf;
    if (line > buf && line < buf + sizeof(dev->cmdBuf)) memmove(buf, line, strlen(line) + 1);

    // Keep room for the suffix, the closing sequence and the NUL; a command too
    // long for that is relayed as it is instead.
    size_t len = strlen(buf);
    size_t suffixLen = strlen(suffix);
    if (len + suffixLen + strlen(kClosing) + 1 > sizeof(dev->cmdBuf)) return 0;
    memcpy(buf + len, suffix, suffixLen + 1);
    dev->cmdLen += (int)suffixLen;
    LOGD("startMergeMsgCmdInputIfNeed update buffer: %s", buf);

    writeDataToSerial(kPrompt, (int)sizeof(kPrompt));
    return 1;
}

char *handleMsgTextLine(SerialDevice *dev, char *lineBuf, int n) {
    if (!isNeedMergeMsgCmdInput) {
        // Relayed raw: the modem sees exactly what the host typed, delimiter included.
        dev->cmdLen = n;
        LOGD("isMsgCmdInput, text=%s", lineBuf);
        memcpy(dev->cmdBuf, lineBuf, DATA_BUF_SIZE);
        return dev->cmdBuf;
    }

    n = applyBackspaces(lineBuf, n);
    LOGD("isNeedMergeMsgCmdInput, text=%s", lineBuf);

    char *buf = dev->cmdBuf;
    size_t len = strlen(buf);
    size_t add = strlen(lineBuf);
    // Text that does not fit is left out; the message is still completed and sent.
    if (len + add + 4 <= sizeof(dev->cmdBuf)) {
        memcpy(buf + len, lineBuf, add + 1);
        dev->cmdLen += (int)add;
    }
    LOGD("isNeedMergeMsgCmdInput update buffer: %s", buf);

    if (memchr(lineBuf, CTRL_Z, n) != NULL || memchr(lineBuf, ESC, n) != NULL) {
        LOGD("SUB or ESC in line, clear isNeedMergeMsgCmdInput");
        isNeedMergeMsgCmdInput = false;
        len = strlen(buf);
        if (len > 0) {
            // Room is guaranteed: appends keep 4 bytes free, and the start of the
            // merge kept room for the closing after the suffix.
            memcpy(buf + len - 1, kClosing, sizeof(kClosing));
            dev->cmdLen += (int)strlen(kClosing);
        }
        if (len > 3) buf[3] = 'E';
        mergedMessageReady = true;
        LOGD("isNeedMergeMsgCmdInput update buffer: %s", buf);
    }
    return buf;
}

void routeMsgTextLine(SerialDevice *dev, const HostLink *origin) {
    if (isNeedMergeMsgCmdInput) {
        writeDataToSerial(kPrompt, (int)sizeof(kPrompt));
        return;
    }
    if (s_fdRild_command < 0) connectTarget(RIL_TYPE);
    // Ctrl-Z (send) or ESC (cancel) ends the message with this line, and so does a
    // merged command, which carries the whole message: the host's next line is a
    // command again. A line the modem never got ends it too, since no final result
    // will come for it.
    const char *text = dev->cmdBuf;
    bool ends = mergedMessageReady || strchr(text, CTRL_Z) != NULL || strchr(text, ESC) != NULL;
    mergedMessageReady = false;
    if (sendToModem(text, origin, msgTextPhase) < 0) ends = true;
    if (ends) {
        LOGD(" SUB or ESC in line, clear isMsgCmdInput");
        endMsgTextPhase();
    }
}
