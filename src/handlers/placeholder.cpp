// Placeholder bodies so the daemon links while the subsystem is being written.
#include "handlers/handlers.h"
int gCmecConfig[4];
int gVzwTolkCfg;
int gCsdfMode;
int gCsdfAuxmode;
int gCclkTz;
int wifiEnableState;
int wifiBand;
int wifiFrequency;
int wifiDataRate;
int wifiTxPower;
int pas_echo_handler(const char *, int, char *) { return 4; }
int pas_modem_handler(const char *, int, char *) { return 4; }
int pas_reboot_handler(const char *, int, char *) { return 4; }
int pas_eurc_handler(const char *, int, char *) { return 4; }
int pas_tolk_handler(const char *, int, char *) { return 4; }
int pas_vzwtolkcfg_handler(const char *, int, char *) { return 4; }
int pas_cmec_handler(const char *, int, char *) { return 4; }
int pas_cclk_handler(const char *, int, char *) { return 4; }
int pas_csdf_handler(const char *, int, char *) { return 4; }
int pas_esuo_handler(const char *, int, char *) { return 4; }
int pas_wienable_handler(const char *, int, char *) { return 4; }
int pas_wimode_handler(const char *, int, char *) { return 4; }
int pas_wiband_handler(const char *, int, char *) { return 4; }
int pas_wifreq_handler(const char *, int, char *) { return 4; }
int pas_widatarate_handler(const char *, int, char *) { return 4; }
int pas_wipow_handler(const char *, int, char *) { return 4; }
int pas_witx_handler(const char *, int, char *) { return 4; }
int pas_wirx_handler(const char *, int, char *) { return 4; }
int pas_wirpckg_handler(const char *, int, char *) { return 4; }
int pas_usbTethering_handler(const char *, int, char *) { return 4; }
int pas_usbconfig_handler(const char *, int, char *) { return 4; }
