// Clock commands: AT+CCLK reads and sets the system clock, AT+CSDF chooses the
// date format of the AT+CCLK read answer. The clock is kept and reported in UTC;
// the zone a set command carries is only stored and echoed back by later reads.
#include <ctype.h>
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
#define CCLK_BASE_YEAR 2000
enum { CCLK_YEAR, CCLK_MONTH, CCLK_DAY, CCLK_HOUR, CCLK_MINUTE, CCLK_SECOND, CCLK_FIELD_COUNT };

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

// Two decimal digits, nothing else: a field of the clock value.
static bool twoDigits(const char *p, int *out) {
    if (!isdigit((unsigned char)p[0]) || !isdigit((unsigned char)p[1])) return false;
    *out = (p[0] - '0') * 10 + (p[1] - '0');
    return true;
}

// The fields as a calendar time in UTC; two-digit years count from 2000.
static void clockTime(const int f[CCLK_FIELD_COUNT], struct tm *tm) {
    memset(tm, 0, sizeof(*tm));
    tm->tm_year = CCLK_BASE_YEAR - 1900 + f[CCLK_YEAR];
    tm->tm_mon = f[CCLK_MONTH] - 1;
    tm->tm_mday = f[CCLK_DAY];
    tm->tm_hour = f[CCLK_HOUR];
    tm->tm_min = f[CCLK_MINUTE];
    tm->tm_sec = f[CCLK_SECOND];
}

// yy/MM/dd,hh:mm:ss, then with a zone its sign and two digits. Every field must be
// there in full: a field that did not scan would set a time nobody asked for.
static bool scanClockValue(const char *value, bool hasZone, int fields[CCLK_FIELD_COUNT], int *zone) {
    static const char kSeparators[] = "//,::";
    for (int i = 0; i < CCLK_FIELD_COUNT; i++) {
        const char *p = value + 3 * i;
        if (!twoDigits(p, &fields[i])) return false;
        if (i < CCLK_FIELD_COUNT - 1 && p[2] != kSeparators[i]) return false;
    }
    if (!hasZone) return true;
    const char *z = value + CCLK_LEN_NO_TZ;
    if ((z[0] != '+' && z[0] != '-') || !twoDigits(z + 1, zone)) return false;
    if (z[0] == '-') *zone = -*zone;
    return true;
}

// Days in a month (1..12): day 0 of the next month, which is the last of this one.
static int daysInMonth(int year, int month) {
    struct tm last;
    memset(&last, 0, sizeof(last));
    last.tm_year = year - 1900;
    last.tm_mon = month;
    (void)timegm(&last);
    return last.tm_mday;
}

// A real date and time. Kept from the looser check stations may rely on: second 60
// (a leap second, set as the next minute's first) and 24:00:00 (the end of a day,
// set as the next day's start); nothing else may roll over into another time.
static bool validClockFields(const int f[CCLK_FIELD_COUNT]) {
    const int month = f[CCLK_MONTH], day = f[CCLK_DAY];
    if (month < 1 || month > 12 || day < 1 || day > daysInMonth(CCLK_BASE_YEAR + f[CCLK_YEAR], month)) return false;
    const int hour = f[CCLK_HOUR], minute = f[CCLK_MINUTE], second = f[CCLK_SECOND];
    if (minute > 59 || second > 60) return false;
    return hour < 24 || (hour == 24 && minute == 0 && second == 0);
}

// A refused value changes nothing: neither the clock nor the stored zone.
static int cclkSet(const char *param, char *response) {
    char value[CCLK_WORK_SIZE];
    size_t len = cleanClockValue(param, value, sizeof(value));
    if (len != CCLK_LEN_NO_TZ && len != CCLK_LEN_TZ) {
        snprintf(response, RESPONSE_BUF_SIZE, "CME ERROR: Invalid parameters: [%lu] cmdline:%s; [%lu] cclkSetCmd:%s",
                 (unsigned long)strlen(param), param, (unsigned long)len, value);
        return RESPONSE_ERROR;
    }
    const bool hasInputTimeZone = len == CCLK_LEN_TZ;
    LOGD("hasInputTimeZone %d", hasInputTimeZone);

    int fields[CCLK_FIELD_COUNT];
    int zone = 0;
    if (!scanClockValue(value, hasInputTimeZone, fields, &zone) || zone < CCLK_TZ_MIN || zone > CCLK_TZ_MAX ||
        !validClockFields(fields)) {
        LOGE("Input format error");
        return RESPONSE_ERROR;
    }
    if (hasInputTimeZone) LOGD("Input time zone:%02d", zone);

    struct tm tm;
    clockTime(fields, &tm);
    // timegm reads the time as UTC without touching TZ: the radio HAL's threads
    // format log times while this runs, and the environment is not thread-safe.
    struct timeval tv;
    tv.tv_sec = timegm(&tm);
    tv.tv_usec = 0;
    if (settimeofday(&tv, NULL) != 0) {
        LOGD("Unable to set clock to %d.%d: %s\n", (int)tv.tv_sec, (int)tv.tv_usec, strerror(errno));
        return RESPONSE_ERROR;
    }
    if (hasInputTimeZone) gCclkTz = zone;
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

// One field of AT+CSDF=: empty (it keeps *value, the default) or a whole number
// from 1 to max. A typo must not select a format.
static bool csdfField(char **cursor, int max, int *value) {
    int v = 0;
    int rc = at_tok_nextint_strict(cursor, &v);
    if (rc == AT_TOK_EMPTY) return true;
    if (rc != 0 || v < 1 || v > max) return false;
    *value = v;
    return true;
}

int pas_csdf_handler(const char *param, int opType, char *response) {
    const char *text = param != NULL ? param : "";
    LOGD("[pas_csdf_handler] cmdline %s", text);
    switch (opType) {
    case AT_SET_OP: {
        if (text[0] == '\0') return RESPONSE_ERROR;
        char buf[PARAM_BUF_SIZE];
        char *cursor = copyParam(text, buf, sizeof(buf));
        // An empty field takes its default; anything else must be a whole number
        // in range, or the command fails and changes nothing.
        int mode = 1;
        int auxmode = 1;
        if (!csdfField(&cursor, CSDF_MODE_MAX, &mode) || !csdfField(&cursor, CSDF_AUXMODE_MAX, &auxmode) ||
            at_tok_hasmore(&cursor))
            return RESPONSE_ERROR;
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
