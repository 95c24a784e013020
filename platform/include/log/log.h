#ifndef TOLK_PLATFORM_LOG_LOG_H
#define TOLK_PLATFORM_LOG_LOG_H
#include <android/log.h>
#endif
