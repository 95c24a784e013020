// Placeholder bodies so the daemon links while the subsystem is being written.
#include "dispatch/bat_cmd.h"
#include "dispatch/dispatcher.h"
int ADC_COUNT = 5;
int process_cmd_line(const char *) { return RIL_TYPE; }
int ril_command_hdlr(const char *) { return 0; }
int custom_command_hdlr(const char *) { return 0; }
int generic_command_hdlr(const char *) { return 0; }
int audio_command_hdlr(const char *) { return 0; }
int belvo_audio_command_hdlr(const char *) { return 0; }
int getCmdName(const char *, char *, int) { return -1; }
int bat_command_hdlr(const char *) { return 0; }
int handleBatCmd(const char *, int) { return -1; }
int get_ADC_channel(int, int) { return -1; }
