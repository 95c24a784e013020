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

// A host link as the origin of a command and the destination of its answer: the
// device slot and, for adb, which accepted connection it was, so that an answer
// never reaches a later host that connected in its place.
typedef struct HostLink {
    int device;           // DEVICE_SERIAL or DEVICE_ADB
    unsigned connection;  // gAdbConnection when the command was read (adb only)
} HostLink;

// Counts the adb connections accepted so far; the one in fd[DEVICE_ADB] has this
// number. The reader advances it with every accepted connection.
extern unsigned gAdbConnection;

// The link of the current command line (currDevice), where answers without a
// known origin and unsolicited output go.
HostLink currentHostLink(void);
// The descriptor an answer for link goes to, or -1 when that link is gone.
int hostLinkFd(const HostLink *link);

// Whether the serial port is in the MMI test settings (between an enable applied
// to it and the matching restore); every reopen of the port applies exactly this.
extern bool gMmiSettingsInForce;

// Resets dev (start-up resets the MMI command sequence queue itself).
void initSerialDevice(SerialDevice *dev);
// Opens and configures a serial port, in the MMI test settings while they are in
// force; returns the descriptor or -1.
int open_serial_device(SerialDevice *dev, const char *path);
// Echo on (1) or off (0) for the current link; returns the tcsetattr result.
int setEchoOption(int on);
// 1: save the current port settings and apply the MMI test set; 0: restore them.
void setMMITESTOption(int enable);

// Index into fd[] of the link that answers go to: 2 for an adb line, else 0.
int currentOutputDevice(void);

#endif
