// Start-up of the daemon: decide from the boot mode whether to run at all, open the
// serial port (unless the device is in ATM mode, where only adb is served), put the
// adb control socket into listening state and hand everything to the main loop.
#include "core/startup.h"

#include <errno.h>
#include <fcntl.h>
#include <signal.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cutils/properties.h>
#include <cutils/sockets.h>

#include "core/reader.h"
#include "core/tolkd_log.h"
#include "serial/serial_device.h"
#include "targets/mmi_queue.h"

int getBootMode(void) {
    int fd = open(BOOT_MODE_FILE, O_RDONLY);
    if (fd < 0) {
        LOGE("Failed to open boot mode file %s", BOOT_MODE_FILE);
        return -1;
    }
    // Only the first character counts: "57" is boot mode 5, a letter or nothing is 0.
    char buf[2] = {0, 0};
    ssize_t got = 0;
    while (got < 1) {
        ssize_t r = read(fd, buf, 1);
        if (r <= 0) break;
        got += r;
    }
    close(fd);
    return atoi(buf);
}

// The daemon must not serve in the engineering boot mode, but a service that exits
// is started again by init a few seconds later, for as long as the device runs.
// Staying alive without opening anything ends that loop, while a crash in any
// other mode is still restarted. init's signal at shutdown ends the wait.
static void idleUntilStopped(void) {
    LOGI("idle until the device shuts down");
    sigset_t none;
    sigemptyset(&none);
    for (;;) sigsuspend(&none);
}

int adb_socket_listen(int fd) {
    LOGD("Listen socket on fd :%d", fd);
    if (listen(fd, 2) < 0) {
        LOGD("Fail to listen socket port err:%d", errno);
        return 3;
    }
    return 0;
}

int tolkdMain(void) {
    int bootMode = getBootMode();
    LOGI("Boot mode = %d", bootMode);
    if (bootMode == BOOT_MODE_ADVANCED_VEMO) {
        LOGI("advanced vemo mode, stop tolkd-daemon");
        idleUntilStopped();
    }
    LOGI("tolkd-daemon start!!!");

    SerialDevice *dev = &gSerialDevice;
    initSerialDevice(dev);
    mmiCmdSeqReset();
    snprintf(dev->devName[DEVICE_SERIAL], 12, "%s", SERIAL_DEV_NAME);

    char atm[PROPERTY_VALUE_MAX];
    memset(atm, 0, sizeof(atm));
    property_get("ro.boot.atm", atm, "");
    int serialOpened = 0;
    // In ATM mode the USB serial function belongs to someone else; serve adb only.
    if (strncmp(atm, "enable", 6) != 0) {
        dev->fd[DEVICE_SERIAL] = open_serial_device(dev, dev->devName[DEVICE_SERIAL]);
        if (dev->fd[DEVICE_SERIAL] == -1) {
            LOGE("Could not open serial device [%d] and start tolk service", 0);
            return 1;
        }
        serialOpened = 1;
    }

    dev->fd[DEVICE_ADB_LISTEN] = android_get_control_socket(ADB_CONTROL_SOCKET);
    if (dev->fd[DEVICE_ADB_LISTEN] < 0) {
        // Tolerated: the daemon still serves the serial port and the target links.
        LOGE("Failed to get socket '%s'", ADB_CONTROL_SOCKET);
    } else if (adb_socket_listen(dev->fd[DEVICE_ADB_LISTEN]) != 0) {
        LOGE("Could not open adb socket [%d] and start tolk service", serialOpened);
        return 1;
    }

    readerLoop(dev);
    return 0;
}
