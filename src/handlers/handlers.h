// The commands the daemon answers itself. Every handler takes the parameter text
// (for a set form the text after "="), the operation form and a 2048-byte response
// buffer, and returns a ResponseType.
#ifndef TOLKD_HANDLERS_HANDLERS_H
#define TOLKD_HANDLERS_HANDLERS_H

// Terminal and switch commands.
extern int gCmecConfig[4];
extern int gVzwTolkCfg;
int pas_echo_handler(const char *param, int opType, char *response);
int pas_modem_handler(const char *param, int opType, char *response);
int pas_reboot_handler(const char *param, int opType, char *response);
int pas_eurc_handler(const char *param, int opType, char *response);
int pas_tolk_handler(const char *param, int opType, char *response);
int pas_vzwtolkcfg_handler(const char *param, int opType, char *response);
int pas_cmec_handler(const char *param, int opType, char *response);

// Reboot and power-off are requests to init through this property ("reboot,REASON",
// "shutdown,REASON"); 0 once init took the request, -1 when it was refused.
#define POWERCTL_PROPERTY "sys.powerctl"
#define POWER_ACTION_REBOOT "reboot,tolkd"
#define POWER_ACTION_SHUTDOWN "shutdown,tolkd"
int requestPowerAction(const char *action);

// Clock commands.
extern int gCsdfMode;
extern int gCsdfAuxmode;
extern int gCclkTz;
int pas_cclk_handler(const char *param, int opType, char *response);
int pas_csdf_handler(const char *param, int opType, char *response);

// SIM and modem selection.
int pas_esuo_handler(const char *param, int opType, char *response);

// Wi-Fi RF test commands.
extern int wifiEnableState;
extern int wifiBand;
extern int wifiFrequency;
extern int wifiDataRate;
extern int wifiTxPower;
int pas_wienable_handler(const char *param, int opType, char *response);
int pas_wimode_handler(const char *param, int opType, char *response);
int pas_wiband_handler(const char *param, int opType, char *response);
int pas_wifreq_handler(const char *param, int opType, char *response);
int pas_widatarate_handler(const char *param, int opType, char *response);
int pas_wipow_handler(const char *param, int opType, char *response);
int pas_witx_handler(const char *param, int opType, char *response);
int pas_wirx_handler(const char *param, int opType, char *response);
int pas_wirpckg_handler(const char *param, int opType, char *response);

// USB commands.
int pas_usbTethering_handler(const char *param, int opType, char *response);
int pas_usbconfig_handler(const char *param, int opType, char *response);

#endif
