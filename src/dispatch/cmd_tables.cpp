// The command tables. Order matters: every table is searched from its first row
// and the first match wins.
#include "dispatch/cmd_tables.h"

#include "handlers/handlers.h"

const RilMmiCmd ril_mmi_cmd_table[RIL_MMI_CMD_COUNT] = {
    // Read, test and set are known; only the set form is recorded (0x20 << 4).
    {"AT+CPIN", 0x238},
};

// The %WLAN and %MAC rows are refused here rather than forwarded to the generic
// service (which would otherwise claim them): pas_modem_handler answers ERROR.
const CustomCmd custom_cmd_table[CUSTOM_CMD_COUNT] = {
    {"ATQ0V1E", 0x02, pas_echo_handler},
    {"ATE0", 0x02, pas_echo_handler},
    {"ATE1", 0x02, pas_echo_handler},
    {"AT#CLS", 0x10, pas_modem_handler},
    {"AT+GCI", 0x18, pas_modem_handler},
    {"AT+CCLK", 0x38, pas_cclk_handler},
    {"AT+CSDF", 0x38, pas_csdf_handler},
    {"AT+ESUO", 0x38, pas_esuo_handler},
    {"AT+TOLK", 0x38, pas_tolk_handler},
    {"AT%REBOOT", 0x04, pas_reboot_handler},
    {"AT^WIENABLE", 0x38, pas_wienable_handler},
    {"AT^WIMODE", 0x38, pas_wimode_handler},
    {"AT^WIBAND", 0x38, pas_wiband_handler},
    {"AT^WIFREQ", 0x38, pas_wifreq_handler},
    {"AT^WIDATARATE", 0x38, pas_widatarate_handler},
    {"AT^WIPOW", 0x38, pas_wipow_handler},
    {"AT^WITX", 0x38, pas_witx_handler},
    {"AT^WIRX", 0x38, pas_wirx_handler},
    {"AT^WIRPCKG", 0x38, pas_wirpckg_handler},
    {"AT%WLAN", 0x2C, pas_modem_handler},
    {"AT%WLANT", 0x2C, pas_modem_handler},
    {"AT%WLANR", 0x3C, pas_modem_handler},
    {"AT%MAC", 0x3C, pas_modem_handler},
    {"AT%MACCK", 0x3C, pas_modem_handler},
    {"AT%USBTETHERING", 0x28, pas_usbTethering_handler},
    {"AT@USBCONFIG", 0x28, pas_usbconfig_handler},
    {"AT%EURC", 0x38, pas_eurc_handler},
    {"AT+VZWTOLKCFG", 0x38, pas_vzwtolkcfg_handler},
    {"AT+CMEC", 0x38, pas_cmec_handler},
};

const NamedCmd generic_cmd_table[GENERIC_CMD_COUNT] = {
    {"AT%ECALL"}, {"AT%FLIGHT"}, {"AT%GPS"}, {"AT%GNSS"}, {"AT%TEST"},
    {"AT%WLANT"}, {"AT%WLANR"}, {"AT%WLAN"}, {"AT%MACCK"}, {"AT%MAC"},
    {"AT%LANG"}, {"AT%VLC"}, {"AT%MMCCHK"}, {"AT%MMCFORMAT"}, {"AT%MMCTOTALSIZE"},
    {"AT%MMCUSEDSIZE"}, {"AT%CODECRC"}, {"AT%INITDB"}, {"AT%DBCHK"}, {"AT%OSVER"},
    {"AT%NFC"}, {"AT%FBOOT"}, {"AT%RESTART"}, {"AT%SAFERESTART"}, {"AT%NOSLEEP"},
    {"AT%LEDON"}, {"AT%MOT"}, {"AT%FKPD"}, {"AT%GKPD"}, {"AT%CAM"},
    {"AT%AVR"}, {"AT%IMEI"}, {"AT%IMEI2"}, {"AT%IMEI3"}, {"AT%IMEI4"},
    {"AT+SN"}, {"AT+MODEL"}, {"AT+SHUTDOWN"}, {"AT+POWERKEY"}, {"AT+FACTORYRESET"},
    {"AT%PQ"}, {"AT%CCT"}, {"AT%MJC"}, {"AT+CBC"}, {"AT+CKPD"},
    {"AT+CBKLT"}, {"AT+CTSA"}, {"AT+CPMS"}, {"AT+CMSS"}, {"AT+CMGL"},
    {"AT+CMGR"}, {"AT+CMGF"}, {"AT+DATACONNECT"}, {"AT%SUPPLEMENTARYSERVICE"}, {"AT%ENABLEDATA"},
    {"AT%DATAON"}, {"AT%DIAL"}, {"AT+VZWACT"}, {"AT%EMMO"}, {"AT%BROWSER"},
    {"AT%DATAROAMING"}, {"AT%VILTEUPGRADE"}, {"AT%CONFERENCE"}, {"AT%MUTE"}, {"AT+VZWAPNE"},
    {"AT+VZWAPNETMR"}, {"AT+VZWTOLKCFG"}, {"AT%CAR"}, {"AT%NAFG"},
};

// Prefix match: a line belongs to a row when it begins with the row's name.
const DestCmd audio_cmd_table[AUDIO_CMD_COUNT] = {
    {"AUD+", 1},
    {"MM+", 1},
    {"AT+EAPS", 2},
    {"AT+EADP", 2},
};

// Prefix match, case-sensitive. These lines reach the dispatcher as typed (no
// upper-casing), hence the lower-case row.
const DestCmd belvo_audio_cmd_table[BELVO_AUDIO_CMD_COUNT] = {
    {"AT^MMITESTENABLE", 9}, {"at^mmitest", 9}, {"AT^ALLVER?", 9}, {"AT^TMMI?", 9},
    {"AT^RUNTEST?", 9}, {"AT^BSN?", 9}, {"AT^FACINFO?", 9}, {"AT^TCHRENABLE", 9},
    {"AT^TBATLVL", 9}, {"AT^FACINFO=", 9}, {"AT^IINLIMIT=1", 9}, {"AT^TMMI=", 9},
    {"AT^POWERDOWN", 9}, {"AT+AUDLOOP=", 9}, {"AT+FMTEST", 9},
};

// The row index is the command code handed to handleBatCmd.
const NamedCmd bat_cmd_table[BAT_CMD_COUNT] = {
    {"AT@GCSF"},
    {"AT@GBV"},
    {"AT@SCC"},
};
