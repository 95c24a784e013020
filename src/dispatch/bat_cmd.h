// Battery ADC commands AT@GCSF, AT@GBV and AT@SCC, answered from the PMIC ADC device.
#ifndef TOLKD_DISPATCH_BAT_CMD_H
#define TOLKD_DISPATCH_BAT_CMD_H

#define PMIC_ADC_DEV "/dev/OV_pmic_adc_cali"
#define ADC_READ_IOCTL 0x40046B04
#define ADC_SET_IOCTL 0x40046B06

extern int ADC_COUNT;

int bat_command_hdlr(const char *line);
int handleBatCmd(const char *line, int code);
int get_ADC_channel(int channel, int count);

#endif
