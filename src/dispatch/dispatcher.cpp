// process_cmd_line and its stages: each stage either claims a command line (and
// so decides its CommandType) or lets it fall through to the next one. A line no
// stage claims goes to the modem.
#include "dispatch/dispatcher.h"

#include <cutils/properties.h>
#include <stdio.h>
#include <string.h>

#include "attok/at_tok.h"
#include "cit/cit_cmd.h"
#include "core/tolkd_log.h"
#include "dispatch/bat_cmd.h"
#include "dispatch/cmd_tables.h"
#include "dispatch/command_line.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"

// Appended to a recorded MMI command so the MMI client recognises the feedback.
#define MMI_CMD_SUFFIX "+ORVTOLKJ"

int getCmdName(const char *line, char *out, int size) {
    if (out == NULL || size <= 0) return -1;
    out[0] = '\0';
    if (line == NULL) return -1;
    size_t len = strcspn(line, "=?");
    // A name that does not fit cannot equal any table row: report no match
    // rather than comparing a truncated name.
    if (len >= (size_t)size) return -1;
    memcpy(out, line, len);
    out[len] = '\0';
    return 0;
}

static const char *opMark(AtOpType op) {
    switch (op) {
    case AT_SET_OP: return "=";
    case AT_TEST_OP: return "=?";
    case AT_READ_OP: return "?";
    default: return "";
    }
}

int ril_command_hdlr(const CommandLine *cmd) {
    const RilMmiCmd *row = NULL;
    for (int i = 0; i < RIL_MMI_CMD_COUNT; i++) {
        if (strcmp(cmd->name, ril_mmi_cmd_table[i].cmdName) == 0) {
            row = &ril_mmi_cmd_table[i];
            break;
        }
    }
    if (row == NULL) return 0;

    AtOpType op = cmd->op;
    LOGD("The cus mmi command op is 0x%x; Support op is 0x%x", (unsigned)op, row->supportOp);
    if (((unsigned)op & row->supportOp) == 0) {
        LOGD("This is a normal RIL AT command.");
        return 1;
    }
    if ((((unsigned)op << 4) & row->supportOp & RIL_MMI_RECORD_MASK) == 0) return 1;

    MmiCmdSeq *q = &gMmiCmdSeq;
    LOGD("Match ril mmi command.EIdx[%d]", q->EIdx);
    // The routing enqueues the line once it is sent; the enqueue itself reports
    // a full queue.
    q->cusMmiCmdPending = 1;
    if (q->EIdx < 0 || q->EIdx >= MMI_QUEUE_SIZE || q->enSeqIdx < 0 || q->enSeqIdx >= MMI_QUEUE_SIZE) {
        return 1;
    }
    // With every queue entry taken the line gets no entry, so it must not take a
    // text slot either: overwriting the oldest waiting text would pair later
    // answers with the text of a neighbouring command.
    if (q->seq[q->enSeqIdx] != -1) return 1;

    char *slot = q->cmd[q->EIdx];
    memset(slot, 0, MMI_CMD_TEXT_SIZE);
    snprintf(slot, MMI_CMD_TEXT_SIZE, "%s%s%s", cmd->name, opMark(op), MMI_CMD_SUFFIX);
    q->EIdx = (q->EIdx + 1) % MMI_QUEUE_SIZE;
    return 1;
}

// With operator OP12 the +CMEC settings can take the keypad and touch screen
// away from the AT side: a zero refuses the set form of AT+CKPD / AT+CTSA.
static bool disabledByCmec(const CommandLine *cmd) {
    bool gated = (gCmecConfig[0] == 0 && strcmp(cmd->name, "AT+CKPD") == 0) ||
                 (gCmecConfig[3] == 0 && strcmp(cmd->name, "AT+CTSA") == 0);
    return gated && cmd->op == AT_SET_OP;
}

int custom_command_hdlr(const CommandLine *cmd) {
    char optr[PROPERTY_VALUE_MAX];
    property_get("persist.operator.optr", optr, "OM");
    if (strcmp(optr, "OP12") == 0) {
        if (disabledByCmec(cmd)) {
            LOGD("Disabled by +CMEC");
            writeDataToserialByResponseType(RESPONSE_ERROR);
            return 1;
        }
    } else if (strcmp(cmd->name, "AT+CMEC") == 0) {
        // +CMEC is answered here only for OP12; elsewhere the modem answers it.
        return 0;
    }

    const CustomCmd *row = NULL;
    for (int i = 0; i < CUSTOM_CMD_COUNT; i++) {
        if (strcmp(cmd->name, custom_cmd_table[i].cmdName) == 0) {
            row = &custom_cmd_table[i];
            break;
        }
    }
    if (row == NULL) return 0;

    AtOpType op = cmd->op;
    LOGD("The command op is %d; Support op is %d", op, (int)row->supportOp);
    if (((unsigned)op & row->supportOp) == 0) {
        writeDataToserialByResponseType(RESPONSE_NOT_IMPLEMENTED);
        return 1;
    }

    char response[RESPONSE_BUF_SIZE];
    memset(response, 0, sizeof(response));
    int result = row->handler(cmd->param, op, response);
    response[RESPONSE_BUF_SIZE - 1] = '\0';
    size_t len = strlen(response);
    if (len > 0) writeDataToSerial(response, (int)len);
    if (result == RESPONSE_DONE) return 1;
    writeDataToserialByResponseType(result);
    return 1;
}

// In PCT mode the SMS storage commands are the modem's, not the framework's.
static bool isPctSmsCommand(const char *name) {
    static const char *const kPctSms[] = {"AT+CPMS", "AT+CMSS", "AT+CMGL", "AT+CMGR", "AT+CMGF"};
    for (size_t i = 0; i < sizeof(kPctSms) / sizeof(kPctSms[0]); i++) {
        if (strcmp(name, kPctSms[i]) == 0) return true;
    }
    return false;
}

int generic_command_hdlr(const CommandLine *cmd) {
    const char *name = cmd->name;
    char pctMode[PROPERTY_VALUE_MAX];
    property_get("persist.service.pct.mode", pctMode, "1");
    LOGD("pct_mode is %s", pctMode);
    if (strcmp(pctMode, "1") == 0 && isPctSmsCommand(name)) {
        LOGD("PCT mode, sms command send to modem");
        return 0;
    }

    LOGD("The size of generic_cmd_table is %d", GENERIC_CMD_COUNT);
    bool found = false;
    for (int i = 0; i < GENERIC_CMD_COUNT; i++) {
        if (strcmp(name, generic_cmd_table[i].cmdName) == 0) {
            found = true;
            break;
        }
    }
    if (!found) return 0;

    if (strcmp(name, "AT+VZWAPNE") != 0 && strcmp(name, "AT+VZWAPNETMR") != 0) return 1;
    // The APN settings go to the framework only while +VZWTOLKCFG leaves them
    // there; reads are always the modem's.
    return (cmd->op == AT_SET_OP && gVzwTolkCfg != 1) ? 1 : 0;
}

int audio_command_hdlr(const char *line) {
    if (line == NULL) return 0;
    for (int i = 0; i < AUDIO_CMD_COUNT; i++) {
        const char *row = audio_cmd_table[i].cmdName;
        if (strncmp(line, row, strlen(row)) == 0) return audio_cmd_table[i].dest;
    }
    return 0;
}

int belvo_audio_command_hdlr(const char *line) {
    if (line == NULL) return 0;
    for (int i = 0; i < BELVO_AUDIO_CMD_COUNT; i++) {
        const char *row = belvo_audio_cmd_table[i].cmdName;
        LOGD("%s: %s to %s", __func__, line, row);
        if (strncmp(line, row, strlen(row)) == 0) {
            LOGD("%s: dest %d", __func__, belvo_audio_cmd_table[i].dest);
            return belvo_audio_cmd_table[i].dest;
        }
    }
    return 0;
}

int dispatchCommandLine(const CommandLine *cmd) {
    const char *line = cmd->text;

    LOGD("handle in custom_command_hdlr");
    if (ril_command_hdlr(cmd)) return RIL_TYPE;
    if (custom_command_hdlr(cmd)) return TOLK_TYPE;

    LOGD("handle in generic_command_hdlr");
    if (generic_command_hdlr(cmd)) return GENERIC_TYPE;

    LOGD("handle in audio_command_hdlr");
    switch (audio_command_hdlr(line)) {
    case 1: return AUDIO_TYPE;
    case 2: return AUDIO_EXT_TYPE;
    default: break;
    }

    LOGD("handle in belvo_audio_command_hdlr");
    if (belvo_audio_command_hdlr(line)) return BELVO_AUDIO_TYPE;

    LOGD("handle in bat_command_hdlr");
    if (bat_command_hdlr(line)) return BAT_TYPE;

    if (cit_test_check(line) >= 1) return BELVO_AUTIOCIT_TYPE;
    return RIL_TYPE;
}

int process_cmd_line(const char *line) {
    // Parsing only reads the line; the record's pointer is not written through.
    CommandLine cmd;
    parseCommandLine(&cmd, const_cast<char *>(line != NULL ? line : ""), line != NULL ? (int)strlen(line) : 0, NULL);
    return dispatchCommandLine(&cmd);
}
