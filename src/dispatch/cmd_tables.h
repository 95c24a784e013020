// The constant command tables the dispatcher searches, in search order.
#ifndef TOLKD_DISPATCH_CMD_TABLES_H
#define TOLKD_DISPATCH_CMD_TABLES_H

#include "dispatch/dispatcher.h"

// Customer MMI commands whose answer also goes back to the MMI client. The low
// bits of supportOp list the forms the row knows; bits 0x3C0 list, shifted left
// by 4, the forms that are recorded in the MMI command sequence queue.
#define RIL_MMI_RECORD_MASK 0x3C0u
#define RIL_MMI_CMD_COUNT 1
extern const RilMmiCmd ril_mmi_cmd_table[RIL_MMI_CMD_COUNT];

#define CUSTOM_CMD_COUNT 29
extern const CustomCmd custom_cmd_table[CUSTOM_CMD_COUNT];

#define GENERIC_CMD_COUNT 69
extern const NamedCmd generic_cmd_table[GENERIC_CMD_COUNT];

#define AUDIO_CMD_COUNT 4
extern const DestCmd audio_cmd_table[AUDIO_CMD_COUNT];

#define BELVO_AUDIO_CMD_COUNT 15
extern const DestCmd belvo_audio_cmd_table[BELVO_AUDIO_CMD_COUNT];

#define BAT_CMD_COUNT 3
extern const NamedCmd bat_cmd_table[BAT_CMD_COUNT];

#endif
