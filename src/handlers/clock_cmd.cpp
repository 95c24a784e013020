// Clock commands: AT+CCLK reads and sets the system clock, AT+CSDF chooses the
// date format of the AT+CCLK read answer. The clock is kept and reported in UTC;
// the zone a set command carries is only stored and echoed back by later reads.
#include <errno.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/time.h>
#include <time.h>

#include "attok/at_tok.h"
#include "core/tolkd_log.h"
#include "handlers/handler_util.h"
#include "handlers/handlers.h"
#include "serial/response_writer.h"

int gCsdfMode = 1;
int gCsdfAuxmode = 1;
// Zone of the last AT+CCLK set in quarters of an hour; CCLK_TZ_UNSET until one
// has been stored.
int gCclkTz = 65535;

#define CCLK_TZ_UNSET 65535
#define CCLK_TZ_MIN (-96)
#define CCLK_TZ_MAX 96
#define CCLK_WORK_SIZE 40
#define CCLK_LEN_NO_TZ 17  // yy/MM/dd,hh:mm:ss
#define CCLK_LEN_TZ 20     // yy/MM/dd,hh:mm:ss followed by +zz or -zz

#define CSDF_MODE_MAX 7
#define CSDF_AUXMODE_MAX 2

// Drops line feeds, blanks and both kinds of quote; stops at the end of out.
static size_t cleanClockValue(const char *in, char *out, size_t size) {
    size_t n = 0;
    for (; *in != '\0' && n + 1 < size; in++) {
        if (*in == '\n' || *in == ' ' || *in == '"' || *in == '\'') continue;
        out[n++] = *in;
    }
    out[n] = '\0';
    return n;
}

static int cclkSet(const char *param, char *response) {
    char value[CCLK_WORK_SIZE];
    size_t len = cleanClockValue(param, value, sizeof(value));
    if (len != CCLK_LEN_NO_TZ && len != CCLK_LEN_TZ) {
        snprintf(response, RESPONSE_BUF_SIZE, "CME ERROR: Invalid parameters: [%lu] cmdline:%s; [%lu] cclkSetCmd:%s",
                 (unsigned long)strlen(param), param, (unsigned long)len, value);
        return RESPONSE_ERROR;
    }
    int hasInputTimeZone = (len == CCLK_LEN_TZ) ? 1 : 0;
    LOGD("hasInputTimeZone %d", hasInputTimeZone);

    int year = 0, month = 0, day = 0, hour = 0, minute = 0, second = 0, zone = 0;
    if (hasInputTimeZone) {
        sscanf(value, "%2d/%2d/%2d,%2d:%2d:%2d%3d", &year, &month, &day, &hour, &minute, &second, &zone);
        if (zone < CCLK_TZ_MIN || zone > CCLK_TZ_MAX) return RESPONSE_ERROR;
        // Kept even if the date or time below turns out to be wrong.
        gCclkTz = zone;
        LOGD("Input time zone:%02d", zone);
    } else {
        sscanf(value, "%2d/%2d/%2d,%2d:%2d:%2d", &year, &month, &day, &hour, &minute, &second);
    }

    if (year < 0 || month < 1 || month > 12 || day < 1 || day > 31 || hour < 0 || hour > 24 || minute < 0 ||
        minute > 60 || second < 0 || second > 60) {
        LOGE("Input format error");
        return RESPONSE_ERROR;
    }

    struct tm tm;
    memset(&tm, 0, sizeof(tm));
    tm.tm_year = year + 100;  // two-digit years count from 2000
    tm.tm_mon = month - 1;
    tm.tm_mday = day;
    tm.tm_hour = hour;
    tm.tm_min = minute;
    tm.tm_sec = second;
    tm.tm_isdst = 0;
    // timegm reads the time as UTC without touching TZ: the radio HAL's threads
    // format log times while this runs, and the environment is not thread-safe.
    time_t seconds = timegm(&tm);
    if (seconds < 0) {
        LOGD("mktime error: %d %s\n", errno, strerror(errno));
        return RESPONSE_ERROR;
    }

    struct timeval tv;
    tv.tv_sec = seconds;
    tv.tv_usec = 0;
    if (settimeofday(&tv, NULL) != 0) {
        LOGD("Unable to set clock to %d.%d: %s\n", (int)tv.tv_sec, (int)tv.tv_usec, strerror(errno));
        return RESPONSE_ERROR;
    }
    return RESPONSE_OK;
}

static int cclkRead(char *response) {
    time_t now = time(NULL);
    struct tm utc;
    memset(&utc, 0, sizeof(utc));
    gmtime_r(&now, &utc);
    struct timeval tv;
    struct timezone tz;
    memset(&tz, 0, sizeof(tz));
    gettimeofday(&tv, &tz);
    LOGD("timezone: %d", tz.tz_minuteswest);

    // Before any set the kernel's zone is reported, in whole hours east of UTC
    // counted in quarters.
    int zone = gCclkTz;
    if (zone == CCLK_TZ_UNSET) zone = (tz.tz_minuteswest / -60) * 4;

    int year;
    if (gCsdfAuxmode == 2) year = utc.tm_year + 1900;
    else if (gCsdfAuxmode == 1) year = (utc.tm_year + 1900) % 100;
    else return RESPONSE_ERROR;

    if (gCsdfAuxmode == 2) {
        if (zone >= 0) {
            snprintf(response, RESPONSE_BUF_SIZE, "+CCLK: \"%04d/%02d/%02d,%02d:%02d:%02d+%02d\"\n", year,
                     utc.tm_mon + 1, utc.tm_mday, utc.tm_hour, utc.tm_min, utc.tm_sec, zone);
        } else {
            snprintf(response, RESPONSE_BUF_SIZE, "+CCLK: \"%04d/%02d/%02d,%02d:%02d:%02d%03d\"\n", year,
                     utc.tm_mon + 1, utc.tm_mday, utc.tm_hour, utc.tm_min, utc.tm_sec, zone);
        }
    } else {
        if (zone >= 0) {
            snprintf(response, RESPONSE_BUF_SIZE, "+CCLK: \"%02d/%02d/%02d,%02d:%02d:%02d+%02d\"\n", year,
                     utc.tm_mon + 1, utc.tm_mday, utc.tm_hour, utc.tm_min, utc.tm_sec, zone);
        } else {
            snprintf(response, RESPONSE_BUF_SIZE, "+CCLK: \"%02d/%02d/%02d,%02d:%02d:%02d%03d\"\n", year,
                     utc.tm_mon + 1, utc.tm_mday, utc.tm_hour, utc.tm_min, utc.tm_sec, zone);
        }
    }
    return RESPONSE_OK;
}

int pas_cclk_handler(const char *param, int opType, char *response) {
    const char *text = param != NULL ? param : "";
    LOGD("cmdline %s", text);
    switch (opType) {
    case AT_SET_OP:
        return cclkSet(text, response);
    case AT_READ_OP:
        return cclkRead(response);
    case AT_TEST_OP:
        snprintf(response, RESPONSE_BUF_SIZE, "%s", "+CCLK: yy/MM/dd,hh:mm:ss[+/-tz]");
        return RESPONSE_OK;
    default:
        return RESPONSE_ERROR;
    }
}

int pas_csdf_handler(const char *param, int opType, char *response) {
    const char *text = param != NULL ? param : "";
    LOGD("[pas_csdf_handler] cmdline %s", text);
    switch (opType) {
    case AT_SET_OP: {
        if (text[0] == '\0') return RESPONSE_ERROR;
        char buf[PARAM_BUF_SIZE];
        char *cursor = copyParam(text, buf, sizeof(buf));
        int mode = 1;
        bool modeOk = true;
        // An empty or unreadable field takes its default; a readable one out of
        // range fails the command.
        if (at_tok_nextint(&cursor, &mode) < 0) mode = 1;
        else if (mode < 1 || mode > CSDF_MODE_MAX) modeOk = false;
        int auxmode = 1;
        if (at_tok_nextint(&cursor, &auxmode) < 0) auxmode = 1;
        else if (auxmode < 1 || auxmode > CSDF_AUXMODE_MAX) return RESPONSE_ERROR;
        if (!modeOk) return RESPONSE_ERROR;
        gCsdfMode = mode;
        gCsdfAuxmode = auxmode;
        LOGD("[pas_csdf_handler] After set: mode %d, auxmode %d", gCsdfMode, gCsdfAuxmode);
        return RESPONSE_OK;
    }
    case AT_READ_OP:
        snprintf(response, RESPONSE_BUF_SIZE, "+CSDF: %d,%d\n", gCsdfMode, gCsdfAuxmode);
        LOGD("[pas_csdf_handler] response %s", response);
        return RESPONSE_OK;
    case AT_TEST_OP:
        snprintf(response, RESPONSE_BUF_SIZE, "%s", "+CSDF: (1,2,3,4,5,6,7),(1,2)\n");
        LOGD("[pas_csdf_handler] response %s", response);
        return RESPONSE_OK;
    default:
        return RESPONSE_ERROR;
    }
}
