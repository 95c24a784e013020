// Battery ADC commands AT@GCSF, AT@GBV and AT@SCC. They answer with their own
// final result text and ignore the operation form: AT@GBV, AT@GBV? and AT@GBV=1
// all read the battery. Only AT@SCC, which drives the charger, tells them apart.
#include "dispatch/bat_cmd.h"

#include <fcntl.h>
#include <stdio.h>
#include <string.h>
#include <sys/ioctl.h>
#include <unistd.h>

#include "core/tolkd_log.h"
#include "dispatch/cmd_tables.h"
#include "dispatch/dispatcher.h"
#include "serial/response_writer.h"

// Samples the driver takes per read; the AT@GBV answer is their average.
int ADC_COUNT = 5;

#define ADC_CHANNEL_STATUS 66
#define ADC_CHANNEL_BATTERY 1
#define ADC_SET_VALUE 16

enum { BAT_CMD_GCSF = 0, BAT_CMD_GBV = 1, BAT_CMD_SCC = 2 };

static int openAdcDevice(void) {
    int fd = open(PMIC_ADC_DEV, O_RDONLY);
    if (fd < 0) LOG_RAW(LOG_LVL_DEBUG, TOLKD_LOG_TAG, "TOLKDget_ADC_channel - Can't open " PMIC_ADC_DEV "\n");
    return fd;
}

int get_ADC_channel(int channel, int count) {
    int fd = openAdcDevice();
    if (fd < 0) return -1;
    // In: {channel, sample count}. Out: {sum of the samples, status}.
    int data[2] = {channel, count};
    int rc = ioctl(fd, ADC_READ_IOCTL, data);
    close(fd);
    // A failed request leaves the input pair in place, which must not pass for
    // a reading.
    if (rc < 0 || data[1] != 0) return -1;
    LOG_RAW(LOG_LVL_DEBUG, TOLKD_LOG_TAG, "TOLKDread channel[%d] %d times : %d\n", channel, count, data[0]);
    return data[0];
}

static int answerNumber(int value) {
    char answer[32];
    snprintf(answer, sizeof(answer), "%d\r\nOK\r\n", value);
    writeDataToSerial(answer, (int)strlen(answer));
    return value;
}

static int answerError(void) {
    static const char kError[] = "ERROR\r\n";
    writeDataToSerial(kError, (int)strlen(kError));
    return -1;
}

int handleBatCmd(const char *line, int code) {
    LOGD("line: %s", line != NULL ? line : "");
    switch (code) {
    case BAT_CMD_GCSF: {
        int v = get_ADC_channel(ADC_CHANNEL_STATUS, ADC_COUNT);
        return answerNumber(v < 0 ? 1 : 0);
    }
    case BAT_CMD_GBV: {
        int v = get_ADC_channel(ADC_CHANNEL_BATTERY, ADC_COUNT);
        if (v == -1 || ADC_COUNT <= 0) return answerError();
        int average = v / ADC_COUNT;
        if (average == -1) return answerError();
        return answerNumber(average);
    }
    case BAT_CMD_SCC: {
        // Asking about the charger setting (AT@SCC?, AT@SCC=?) must not change it;
        // there is nothing to read back.
        if (line == NULL || strchr(line, '?') != NULL) return answerError();
        // The station records the 0 as a charger that took the setting.
        int fd = openAdcDevice();
        int value = ADC_SET_VALUE;
        bool set = fd >= 0 && ioctl(fd, ADC_SET_IOCTL, &value) == 0;
        if (fd >= 0) close(fd);
        return set ? answerNumber(0) : answerError();
    }
    default:
        return answerError();
    }
}

int bat_command_hdlr(const char *line) {
    char name[CMD_NAME_SIZE];
    if (getCmdName(line, name, sizeof(name)) != 0) return 0;
    for (int i = 0; i < BAT_CMD_COUNT; i++) {
        if (strcmp(name, bat_cmd_table[i].cmdName) == 0) {
            handleBatCmd(line, i);
            return 1;
        }
    }
    return 0;
}
