// Logging of the daemon: every line goes to the Android log under one tag, prefixed
// with the source line and the function, at a syslog-style level turned into an
// Android priority by android_log_lvl_convert.
#ifndef TOLKD_CORE_TOLKD_LOG_H
#define TOLKD_CORE_TOLKD_LOG_H

#include <log/log.h>

#define TOLKD_LOG_TAG "TOLKD"
#define NVRAM_LOG_TAG "NVRAM"

// Syslog scale used throughout the daemon.
#define LOG_LVL_ERROR 3
#define LOG_LVL_WARNING 4
#define LOG_LVL_INFO 6
#define LOG_LVL_DEBUG 7

// Level 0..7 to Android priority: 0,1 silent; 2 fatal; 3 error; 4 warn; 5,6 info; 7 debug.
extern const int android_log_lvl_convert[8];

#define TOLKD_LOG_AT(lvl, tag, fmt, ...) \
    __android_log_print(android_log_lvl_convert[(lvl)], (tag), "%d:%s(): " fmt, __LINE__, __func__, ##__VA_ARGS__)

#define LOGE(fmt, ...) TOLKD_LOG_AT(LOG_LVL_ERROR, TOLKD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGW(fmt, ...) TOLKD_LOG_AT(LOG_LVL_WARNING, TOLKD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGI(fmt, ...) TOLKD_LOG_AT(LOG_LVL_INFO, TOLKD_LOG_TAG, fmt, ##__VA_ARGS__)
#define LOGD(fmt, ...) TOLKD_LOG_AT(LOG_LVL_DEBUG, TOLKD_LOG_TAG, fmt, ##__VA_ARGS__)

// Lines that carry no "%d:%s(): " prefix (a few fixed messages are logged bare).
#define LOG_RAW(lvl, tag, fmt, ...) \
    __android_log_print(android_log_lvl_convert[(lvl)], (tag), fmt, ##__VA_ARGS__)

// The factory test commands log under their own tag.
#define NLOGE(fmt, ...) TOLKD_LOG_AT(LOG_LVL_ERROR, NVRAM_LOG_TAG, fmt, ##__VA_ARGS__)
#define NLOGD(fmt, ...) TOLKD_LOG_AT(LOG_LVL_DEBUG, NVRAM_LOG_TAG, fmt, ##__VA_ARGS__)

#endif
