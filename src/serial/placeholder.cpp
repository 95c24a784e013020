// Placeholder bodies so the daemon links while the subsystem is being written.
#include "serial/serial_device.h"
#include "serial/response_writer.h"
SerialDevice gSerialDevice;
struct termios last_deviceOptions;
bool gNumericMode = false;
const char *const finalResultPrefixes[FINAL_RESULT_PREFIX_COUNT] = {};
void initSerialDevice(SerialDevice *) {}
int open_serial_device(SerialDevice *, const char *) { return -1; }
int setEchoOption(int) { return 0; }
void setMMITESTOption(int) {}
int currentOutputDevice(void) { return 0; }
int writeDataToSerial(const char *, int) { return 0; }
int writeDataToserialByResponseType(int) { return 0; }
void Response2Numeric(const char *, char *) {}
bool isFinalResult(const char *, int) { return false; }
void writeDataToSerialByAudioType(const char *, int) {}
