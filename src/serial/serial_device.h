// The host-link record: the serial port, the adb listening socket and the accepted
// adb connection, the command buffer, and the link that supplied the current line.
#ifndef TOLKD_SERIAL_SERIAL_DEVICE_H
#define TOLKD_SERIAL_SERIAL_DEVICE_H

#include <termios.h>

#define DEVICE_SERIAL 0
#define DEVICE_ADB_LISTEN 1
#define DEVICE_ADB 2
#define DEVICE_COUNT 3

// Longest command line or target answer, and the buffers that hold one with its NUL.
#define MAX_DATA_LEN 6144
#define DATA_BUF_SIZE (MAX_DATA_LEN + 1)

#define SERIAL_DEV_NAME "/dev/ttyGS0"

typedef struct SerialDevice {
    char devName[DEVICE_COUNT][64];
    int fd[DEVICE_COUNT];
    int echoOption[DEVICE_COUNT];
    char cmdBuf[DATA_BUF_SIZE];
    int cmdLen;
    int state;
    int currDevice;
} SerialDevice;

extern SerialDevice gSerialDevice;
extern struct termios last_deviceOptions;

// Resets dev and the MMI command sequence queue.
void initSerialDevice(SerialDevice *dev);
// Opens and configures a serial port; returns the descriptor or -1.
int open_serial_device(SerialDevice *dev, const char *path);
// Echo on (1) or off (0) for the current link; returns the tcsetattr result.
int setEchoOption(int on);
// 1: save the current port settings and apply the MMI test set; 0: restore them.
void setMMITESTOption(int enable);

// Index into fd[] of the link that answers go to: 2 for an adb line, else 0.
int currentOutputDevice(void);

#endif
