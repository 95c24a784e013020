// Host stand-in for the vendor Wi-Fi RF test library. Every call returns true on success.
#ifndef TOLK_PLATFORM_LIBWIFITEST_H
#define TOLK_PLATFORM_LIBWIFITEST_H

#include <stdbool.h>
#include <stdint.h>

#ifdef __cplusplus
extern "C" {
#endif

bool WIFI_TEST_OpenDUT(void);
bool WIFI_TEST_CloseDUT(void);
bool WIFI_TEST_GetSupportedMode(int32_t *mode);
bool WIFI_TEST_SetMode(int mode);
bool WIFI_TEST_SetBandwidth(int bandwidth);
bool WIFI_TEST_SetFrequency(int frequency, int offset);
bool WIFI_TEST_SetRate(int rate);
bool WIFI_TEST_SetTXPower(int power);
bool WIFI_TEST_SetTX(bool enable);
bool WIFI_TEST_SetRX(bool enable, unsigned char *addr1, unsigned char *addr2);
bool WIFI_TEST_GetResult(int32_t *first, int32_t *second);
bool WIFI_TEST_ClearResult(void);

#ifdef __cplusplus
}
#endif

#endif
