// The factory CIT command family ("AT*CIT_..."): a few commands are answered here
// from the product-information flags and the result file, every other one is sent
// as one word to the on-device test application, whose answer is judged and framed
// for the host.
#include "cit/cit_cmd.h"

#include <ctype.h>
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <strings.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cutils/properties.h>
#include <cutils/sockets.h>

#include "attok/at_tok.h"
#include "cit/pro_info.h"
#include "core/tolkd_log.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

int sock_id = -1;

namespace {

const char kCitPrefix[] = "AT*CIT";
const char kAnswerOk[] = "\r\nOK\r\n";
const char kAnswerError[] = "\r\nERROR\r\n";
const char kRunningProp[] = "debug.autocit.running";
// How long the pieces of one answer of the test application may lie apart.
const int CIT_PIECE_WAIT_MS = 50;

// How the test application's answer is judged.
enum CitRule {
    RULE_FAIL_WORD,   // failure when it begins with "Fail"
    RULE_NULL_WORD,   // failure when it begins with "null"
    RULE_ZERO_RANGE,  // failure when it begins with "0.255"
    RULE_OK_NEEDED,   // success only when it begins with "OK"
    RULE_ALWAYS,      // always a success
};

typedef int (*CitLocalHandler)(char *line);

struct CitLocalCmd {
    const char *cmdName;
    CitLocalHandler handler;
};

struct CitForwardCmd {
    const char *cmdName;
    const char *word;
    CitRule rule;
};

// A name matches when the line begins with it, case ignored over the name's length.
bool nameMatches(const char *line, const char *name) {
    return strncasecmp(line, name, strlen(name)) == 0;
}

void answer(const char *text, int len) { writeDataToSerial(text, len); }

void answerText(const char *text) { writeDataToSerial(text, (int)strlen(text)); }

// Answers ERROR; gives the handler result of a command that was answered.
int answerError(void) {
    answer(kAnswerError, (int)strlen(kAnswerError));
    return 0;
}

// The next parameter of a flag command: one whole decimal number from 0 to max,
// blanks around it allowed. A station records every OK, so a typo must never
// stand for an index or a value.
bool flagNumber(char **cursor, int max, int *out) {
    int v = 0;
    if (at_tok_nextint_strict(cursor, &v) != 0 || v < 0 || v > max) return false;
    *out = v;
    return true;
}

// A run that did not start is not answered as started.
int cit_start_handler(char *) {
    if (property_set(kRunningProp, "1") != 0) {
        NLOGE("set %s fails", kRunningProp);
        return answerError();
    }
    char value[PROPERTY_VALUE_MAX] = {0};
    property_get(kRunningProp, value, "2");
    NLOGD("%s = %s", kRunningProp, value);
    answer(kAnswerOk, 6);
    return 0;
}

// The power-off is requested first and answered after, as the station has always
// seen it; a request init refused is an error, not a power-off that never comes.
int cit_shutdown_handler(char *) {
    NLOGD("power off: %s", POWER_ACTION_SHUTDOWN);
    if (requestPowerAction(POWER_ACTION_SHUTDOWN) != 0) {
        answer(kAnswerError, 9);
        return 0;
    }
    answer(kAnswerOk, 6);
    return 0;
}

// A flag that could not be read answers ERROR: the fallback of an unreadable
// record must not pass for a stored result.
int cit_readmmi1_handler(char *) {
    int flag = getFlag(FLAG_MMI1_RESULT);
    NLOGD("(%d)==%d", FLAG_MMI1_RESULT, flag);
    if (flag < 0) return answerError();
    const char *mark = flag == 0 ? "F" : (flag == 1 ? "P" : "");
    char buf[64];
    snprintf(buf, sizeof(buf), "MMI1 _%s%s", mark, kAnswerOk);
    answerText(buf);
    return 0;
}

int cit_readuserat_handler(char *) {
    int flag = getFlag(FLAG_USER_AT);
    NLOGD("(%d)==%d", FLAG_USER_AT, flag);
    if (flag < 0) return answerError();
    const char *mark = flag == 0 ? "0" : (flag == 1 ? "1" : "");
    char buf[64];
    snprintf(buf, sizeof(buf), "UserAT =%s%s", mark, kAnswerOk);
    answerText(buf);
    return 0;
}

// A pass is answered only for a flag that reached the store: the station records it.
int cit_writeuserat_handler(char *) {
    if (setFlag(FLAG_USER_AT, 0) != 0) return answerError();
    NLOGD("(%d)==%d", FLAG_USER_AT, getFlag(FLAG_USER_AT));
    answer("WriteUserAT Pass\r\nOK\r\n", 22);
    return 0;
}

int cit_readreset_handler(char *) {
    int flag = getFlag(FLAG_RESET_STATE);
    if (flag < 0) return answerError();
    const char *mark = "";
    if (flag == 'b') {
        NLOGD("(208)=='b'");
        mark = "b";
    } else if (flag == 'a') {
        NLOGD("(208)=='a'");
        mark = "a";
    } else if (flag == 1) {
        NLOGD("(208)=='1'");
        mark = "1";
    }
    char buf[64];
    snprintf(buf, sizeof(buf), "Reset =%s%s", mark, kAnswerOk);
    answerText(buf);
    return 0;
}

// "=index": the index must be a whole number within the record, and nothing may
// follow it; anything else is refused, as is a flag that could not be read.
int cit_readproinfo_handler(char *line) {
    char *cursor = line;
    int index = 0;
    if (at_tok_start_flag(&cursor, '=') < 0 || !flagNumber(&cursor, PRODUCT_INFO_SIZE - 1, &index) ||
        at_tok_hasmore(&cursor)) {
        NLOGE("no flag index in %s", line);
        return answerError();
    }
    NLOGD("Index = %d", index);
    int flag = getFlag(index);
    if (flag < 0) return answerError();
    char buf[64];
    snprintf(buf, sizeof(buf), "Result=%d%s", flag, kAnswerOk);
    answerText(buf);
    return 0;
}

// "=index,value": both whole numbers, the index within the record and the value a
// byte. Anything else, and a value that did not reach the store, is answered with
// an error and stores nothing.
int cit_writeproinfo_handler(char *line) {
    char *cursor = line;
    int index = 0;
    int value = 0;
    if (at_tok_start_flag(&cursor, '=') < 0 || !flagNumber(&cursor, PRODUCT_INFO_SIZE - 1, &index) ||
        !flagNumber(&cursor, FLAG_VALUE_MAX, &value) || at_tok_hasmore(&cursor)) {
        NLOGE("no flag index and value in %s", line);
        return answerError();
    }
    NLOGD("index = %d", index);
    NLOGD("flag = %d", value);
    if (setFlag(index, (unsigned char)value) != 0) return answerError();
    answer(kAnswerOk, 6);
    return 0;
}

int cit_gacitf_handler(char *) {
    FILE *f = fopen(CIT_RESULT_FILE, "r");
    if (f == nullptr) {
        NLOGE("open %s fails errno %d", CIT_RESULT_FILE, errno);
        answer("x0000000\r\nOK\r\n", 14);
        return 0;
    }
    char text[33] = {0};
    if (fgets(text, sizeof(text), f) == nullptr) text[0] = '\0';
    fclose(f);
    char buf[sizeof(text) + sizeof(kAnswerOk)];
    snprintf(buf, sizeof(buf), "%s%s", text, kAnswerOk);
    answerText(buf);
    return 0;
}

// Character 7 of the result file holds the CIT result. An existing file is changed
// in place; a missing one, or one too short to hold character 7 (seeking past its
// end would fill the gap with NUL bytes), is written whole.
bool writeResultInPlace(char result) {
    FILE *f = fopen(CIT_RESULT_FILE, "r+");
    if (f == nullptr) return false;
    if (fseek(f, 0, SEEK_END) != 0 || ftell(f) < 7 || fseek(f, 7, SEEK_SET) != 0) {
        fclose(f);
        return false;
    }
    bool put = fputc(result, f) != EOF;
    bool done = (fclose(f) == 0) && put;
    if (!done) NLOGE("update of %s fails errno %d", CIT_RESULT_FILE, errno);
    return done;
}

bool writeResultWhole(char result) {
    FILE *f = fopen(CIT_RESULT_FILE, "w");
    if (f == nullptr) {
        NLOGE("create %s fails errno %d", CIT_RESULT_FILE, errno);
        return false;
    }
    bool put = fputs(result == '1' ? "x0000001" : "x0000000", f) != EOF;
    bool done = (fclose(f) == 0) && put;
    if (!done) NLOGE("write of %s fails errno %d", CIT_RESULT_FILE, errno);
    return done;
}

int cit_write_result(char result) {
    if (!writeResultInPlace(result) && !writeResultWhole(result)) return answerError();
    sync();
    answer(kAnswerOk, 6);
    return 0;
}

int cit_wcitf_handler(char *) { return cit_write_result('1'); }

int cit_ccitf_handler(char *) { return cit_write_result('0'); }

// Commands answered here, in the order they are compared.
const CitLocalCmd cit_local_cmd_table[] = {
    {"AT*CIT_Start", cit_start_handler},
    {"AT*CIT_ShutDown", cit_shutdown_handler},
    {"AT*CIT_ReadMMI1", cit_readmmi1_handler},
    {"AT*CIT_ReadUserAT", cit_readuserat_handler},
    {"AT*CIT_WriteUserAT", cit_writeuserat_handler},
    {"AT*CIT_ReadReset", cit_readreset_handler},
    {"AT*CIT_ReadProInfo", cit_readproinfo_handler},
    {"AT*CIT_WriteProInfo", cit_writeproinfo_handler},
    {"AT*CIT_GACITF", cit_gacitf_handler},
    {"AT*CIT_WCITF", cit_wcitf_handler},
    {"AT*CIT_CCITF", cit_ccitf_handler},
};

// Commands passed to the test application, in the order they are compared: where
// one name begins another, the longer one stands first.
const CitForwardCmd cit_forward_cmd_table[] = {
    {"AT*CIT_Version", "Version", RULE_FAIL_WORD},
    {"AT*CIT_SN2", "sn2", RULE_FAIL_WORD},
    {"AT*CIT_SN", "sn", RULE_FAIL_WORD},
    {"AT*CIT_IMEI1", "imei1", RULE_FAIL_WORD},
    {"AT*CIT_IMEI2", "imei2", RULE_FAIL_WORD},
    {"AT*CIT_VER", "ver", RULE_FAIL_WORD},
    {"AT*CIT_Emmc", "Emmc", RULE_FAIL_WORD},
    {"AT*CIT_Sdcard", "Sdcard", RULE_FAIL_WORD},
    {"AT*CIT_SIM1", "SIM1", RULE_FAIL_WORD},
    {"AT*CIT_SIM2", "SIM2", RULE_FAIL_WORD},
    {"AT*CIT_BT", "BT", RULE_FAIL_WORD},

    {"AT*CIT_WIFI", "WIFI", RULE_NULL_WORD},
    {"AT*CIT_GPS", "GPS", RULE_NULL_WORD},

    {"AT*CIT_KEY", "KEY", RULE_OK_NEEDED},
    {"AT*CIT_HOME", "HOME", RULE_OK_NEEDED},
    {"AT*CIT_MENU", "MENU", RULE_OK_NEEDED},
    {"AT*CIT_BACK", "BACK", RULE_OK_NEEDED},

    {"AT*CIT_TP_TEST_1", "tp_test_1", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_2", "tp_test_2", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_3", "tp_test_3", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_4", "tp_test_4", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_5", "tp_test_5", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_6", "tp_test_6", RULE_FAIL_WORD},
    {"AT*CIT_TP_TEST_END", "tp_touchtest_end", RULE_FAIL_WORD},
    {"AT*CIT_TP_RESULT", "TP_result", RULE_FAIL_WORD},
    {"AT*CIT_AUTO_TP_RESULT", "AUTO_TP_result", RULE_FAIL_WORD},
    {"AT*CIT_AUTO_TP", "auto_tp_test", RULE_FAIL_WORD},
    {"AT*CIT_AUTO_Charge", "auto_Charge_result", RULE_FAIL_WORD},
    {"AT*CIT_AUTO_Current", "auto_Charge_current", RULE_FAIL_WORD},

    {"AT*CIT_PSensor", "PSensor", RULE_ZERO_RANGE},

    {"AT*CIT_PCalib", "PCalib", RULE_FAIL_WORD},
    {"AT*CIT_PCblib35", "PCblib35", RULE_FAIL_WORD},
    {"AT*CIT_PCdlib25", "PCdlib25", RULE_FAIL_WORD},

    {"AT*CIT_LSensor", "LSensor", RULE_ZERO_RANGE},

    {"AT*CIT_WriteFlag", "WriteFlag", RULE_FAIL_WORD},
    {"AT*CIT_ClearFlag", "ClearFlag", RULE_FAIL_WORD},
    {"AT*CIT_ReadFlag", "ReadFlag", RULE_FAIL_WORD},
    {"AT*CIT_ReadLcd", "ReadLcd", RULE_FAIL_WORD},

    {"AT*CIT_GSensor", "GSensor", RULE_ZERO_RANGE},
    {"AT*CIT_GSCal", "GSCal", RULE_ZERO_RANGE},

    {"AT*CIT_Vibrate_On", "vibrate_on", RULE_ALWAYS},
    {"AT*CIT_Vibrate_Off", "vibrate_off", RULE_ALWAYS},
    {"AT*CIT_LCDL_On", "lcd_light_on", RULE_ALWAYS},
    {"AT*CIT_LCD_Red", "lcd_red", RULE_ALWAYS},
    {"AT*CIT_LCD_Green", "lcd_green", RULE_ALWAYS},
    {"AT*CIT_LCD_Blue", "lcd_blue", RULE_ALWAYS},
    {"AT*CIT_LCD_Black", "lcd_black", RULE_ALWAYS},
    {"AT*CIT_LCD_White", "lcd_white", RULE_ALWAYS},
    {"AT*CIT_LCD_Gray", "lcd_gray", RULE_ALWAYS},
    {"AT*CIT_LCD_RGB", "lcd_rgb", RULE_ALWAYS},
    {"AT*CIT_LCD_Stop", "lcd_stop", RULE_ALWAYS},
    {"AT*CIT_LCD_Close", "lcd_close", RULE_ALWAYS},
    {"AT*CIT_LCD_Wake", "lcd_wake", RULE_ALWAYS},
    {"AT*CIT_LCDL_Off", "lcd_light_off", RULE_ALWAYS},
    {"AT*CIT_ShowLight_R", "showlight_red", RULE_ALWAYS},
    {"AT*CIT_ShowLight_G", "showlight_green", RULE_ALWAYS},
    {"AT*CIT_ShowLight_B", "showlight_blue", RULE_ALWAYS},
    {"AT*CIT_ShowLight_End", "showlight_end", RULE_ALWAYS},

    {"AT*CIT_Headset_In", "headset_in", RULE_OK_NEEDED},
    {"AT*CIT_Headset_Key", "headset_key", RULE_OK_NEEDED},
    {"AT*CIT_CameraL_On", "camera_light_on", RULE_OK_NEEDED},
    {"AT*CIT_CameraL_Off", "camera_light_off", RULE_OK_NEEDED},
    {"AT*CIT_CameraBackOpen", "camera_back_open", RULE_OK_NEEDED},
    {"AT*CIT_CameraBPhotoFlash", "camerab_photo_flash", RULE_OK_NEEDED},
    {"AT*CIT_CameraBPhotoNoFlash", "camerab_photo_noflash", RULE_OK_NEEDED},
    {"AT*CIT_CameraBackClose", "camera_back_close", RULE_OK_NEEDED},
    {"AT*CIT_CameraFrontOpen", "camera_front_open", RULE_OK_NEEDED},
    {"AT*CIT_CameraFPhoto", "cameraf_photo", RULE_OK_NEEDED},
    {"AT*CIT_CameraFrontClose", "cameraf_close", RULE_OK_NEEDED},

    {"AT*CIT_finish", "finish", RULE_ALWAYS},
};

// The answer is NUL-terminated within its buffer, so a comparison over n
// characters stops at the answer's end.
bool answerPasses(CitRule rule, const char *text) {
    switch (rule) {
    case RULE_FAIL_WORD:
        return strncasecmp(text, "Fail", 4) != 0;
    case RULE_NULL_WORD:
        return strncasecmp(text, "null", 4) != 0;
    case RULE_ZERO_RANGE:
        return strncasecmp(text, "0.255", 5) != 0;
    case RULE_OK_NEEDED:
        return strncasecmp(text, "OK", 2) == 0;
    case RULE_ALWAYS:
        return true;
    }
    return false;
}

// Appends the final result to the answer inside its buffer. A long answer is cut
// so that the final result and the terminating NUL always fit: a success keeps at
// most 1010 characters, a failure as many as leave room for "\r\nERROR\r\n".
int frameAnswer(char *buf, bool success) {
    size_t len = strnlen(buf, CIT_ANSWER_SIZE - 1);
    if (success) {
        if (len > 1009) len = 1010;
        memcpy(buf + len, kAnswerOk, sizeof(kAnswerOk));
        return (int)(len + sizeof(kAnswerOk) - 1);
    }
    const size_t room = CIT_ANSWER_SIZE - sizeof(kAnswerError);
    if (len > room) len = room;
    memcpy(buf + len, kAnswerError, sizeof(kAnswerError));
    return (int)(len + sizeof(kAnswerError) - 1);
}

// A link kept after an unmatched line may have been closed by the test application
// since (it restarted). Nothing is ever due on an idle link, so a link that reports
// a hang-up, an error or anything readable (end of file included) is not reused.
void dropDeadTestAppLink(void) {
    if (sock_id < 0) return;
    struct pollfd p;
    p.fd = sock_id;
    p.events = POLLIN | POLLRDHUP;
    p.revents = 0;
    int rc;
    do {
        rc = poll(&p, 1, 0);
    } while (rc < 0 && errno == EINTR);
    if (rc == 0) return;
    NLOGE("link to %s is no longer usable (revents 0x%x), connecting again", CIT_SOCKET_NAME, (unsigned)p.revents);
    close(sock_id);
    sock_id = -1;
}

// The uid the device build gives the test application; false when the property
// holds no uid, in which case no peer is trusted.
bool configuredTestAppUid(uid_t *uid) {
    char value[PROPERTY_VALUE_MAX] = {0};
    property_get(CIT_APP_UID_PROPERTY, value, "");
    // strtoul would take blanks and a sign; a uid is digits only.
    if (!isdigit((unsigned char)value[0])) return false;
    char *end = nullptr;
    errno = 0;
    unsigned long n = strtoul(value, &end, 10);
    // (uid_t)-1 means "no uid" to the kernel; it can be nobody's.
    if (errno != 0 || *end != '\0' || n >= (unsigned long)(uid_t)-1) return false;
    *uid = (uid_t)n;
    return true;
}

// An abstract socket name belongs to whichever process binds it first, so any
// installed app could pose as the test application and pass every test. Only a
// peer running under the configured uid is taken for the application.
bool peerIsTestApp(int fd) {
    uid_t expected = 0;
    if (!configuredTestAppUid(&expected)) {
        NLOGE("%s holds no uid: no test application is trusted", CIT_APP_UID_PROPERTY);
        return false;
    }
    struct ucred cred;
    socklen_t len = sizeof(cred);
    if (getsockopt(fd, SOL_SOCKET, SO_PEERCRED, &cred, &len) != 0 || len != sizeof(cred)) {
        NLOGE("credentials of %s unknown errno %d", CIT_SOCKET_NAME, errno);
        return false;
    }
    if (cred.uid != expected) {
        NLOGE("%s is served by uid %u pid %d, not the test application (uid %u)", CIT_SOCKET_NAME,
              (unsigned)cred.uid, (int)cred.pid, (unsigned)expected);
        return false;
    }
    return true;
}

int forwardToTestApp(char *line) {
    dropDeadTestAppLink();
    if (sock_id < 0) {
        sock_id = socket_local_client(CIT_SOCKET_NAME, ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM);
        if (sock_id < 0) {
            NLOGE("connect to %s fails errno %d", CIT_SOCKET_NAME, errno);
            sock_id = -1;
            answer("test_fail\r\nERROR\r\n", 19);
            return -1;
        }
        // An impostor hears nothing and is answered for as a missing application.
        if (!peerIsTestApp(sock_id)) {
            close(sock_id);
            sock_id = -1;
            answer("test_fail\r\nERROR\r\n", 19);
            return -1;
        }
    }

    const CitForwardCmd *row = nullptr;
    for (const CitForwardCmd &cmd : cit_forward_cmd_table) {
        if (nameMatches(line, cmd.cmdName)) {
            row = &cmd;
            break;
        }
    }
    if (row == nullptr) {
        NLOGE("no CIT case for %s", line);
        answer("test_fail_no_case\r\nERROR\r\n", 27);
        return -1;
    }

    char result[CIT_ANSWER_SIZE];
    memset(result, 0, sizeof(result));
    // An answer that never came (the link failed or ended) is never a pass.
    bool answered = cit_socket_write(row->word, result) > 0;
    int len = frameAnswer(result, answered && answerPasses(row->rule, result));
    answer(result, len);
    NLOGD(" resultBuf=  %s", result);
    close(sock_id);
    sock_id = -1;
    return 0;
}

}  // namespace

int cit_test_check(const char *line) {
    NLOGD("cit_test_check===");
    if (line == nullptr) return 0;
    return strncasecmp(line, kCitPrefix, sizeof(kCitPrefix) - 1) == 0 ? 1 : 0;
}

int cit_test_pase(char *line) {
    if (line == nullptr) return 0;
    NLOGD("cit_test_pase   pRecvData =  %s", line);
    for (const CitLocalCmd &cmd : cit_local_cmd_table) {
        if (nameMatches(line, cmd.cmdName)) return cmd.handler(line);
    }
    return forwardToTestApp(line);
}

// Sends word with its NUL, then takes one receive as the answer. At most
// CIT_ANSWER_SIZE - 1 bytes are taken, so the answer is always a terminated text.
// Returns -1 without a link or a buffer, else the bytes received (0: no answer came).
int cit_socket_write(const char *word, char *answerBuf) {
    if (sock_id < 0) return -1;
    if (word != nullptr) {
        size_t len = strlen(word) + 1;
        ssize_t sent;
        do {
            sent = send(sock_id, word, len, MSG_NOSIGNAL);
        } while (sent < 0 && errno == EINTR);
        if (sent != (ssize_t)len) NLOGE("send of %s fails errno %d", word, errno);
    }
    if (answerBuf == nullptr) return -1;

    ssize_t rc;
    do {
        rc = recv(sock_id, answerBuf, CIT_ANSWER_SIZE - 1, 0);
    } while (rc < 0 && errno == EINTR);
    // The answer may reach the daemon in pieces: a "Fail..." judged on its first
    // two letters would pass. Its pieces follow each other closely.
    while (rc > 0 && rc < CIT_ANSWER_SIZE - 1) {
        struct pollfd p = {sock_id, POLLIN, 0};
        if (poll(&p, 1, CIT_PIECE_WAIT_MS) <= 0) break;
        ssize_t more = recv(sock_id, answerBuf + rc, (size_t)(CIT_ANSWER_SIZE - 1 - rc), 0);
        if (more < 0 && errno == EINTR) continue;
        if (more <= 0) break;
        rc += more;
    }
    if (rc < 0) answerBuf[0] = '\0';
    else answerBuf[rc] = '\0';
    fprintf(stderr, "[%s]:  buffer : %s\n", "getResult", answerBuf);
    fprintf(stderr, "[%s]:  rc : %d\n", "getResult", (int)rc);
    return rc > 0 ? (int)rc : 0;
}
