// The host-link record and the terminal settings of the serial port: opening the
// port for the AT interface, the ATE echo switch and the MMI audio test option set.
#include "serial/serial_device.h"

#include <errno.h>
#include <fcntl.h>
#include <linux/serial.h>
#include <string.h>
#include <sys/ioctl.h>
#include <termios.h>
#include <unistd.h>

#include "core/tolkd_log.h"

SerialDevice gSerialDevice;
struct termios last_deviceOptions;
unsigned gAdbConnection = 0;
bool gMmiSettingsInForce = false;

// Output post-processing bits the daemon always clears, so answers leave unchanged:
// OPOST | OLCUC | OCRNL | ONOCR | ONLRET.
#define OFLAG_CLEAR_MASK 0x3B

// The gadget serial port gets its own output setting and serial-driver tuning.
#define SERIAL_DEV_NAME_2 "/dev/ttyGS1"
#define GADGET_SERIAL_FLAGS 4000000

// currDevice indexes fd[] and echoOption[] directly; a value outside the table
// would index past them, so callers treat it as "no link".
static bool validDeviceIndex(int index) {
    return index >= 0 && index < DEVICE_COUNT;
}

int currentOutputDevice(void) {
    int cur = gSerialDevice.currDevice;
    return (cur == DEVICE_ADB_LISTEN || cur == DEVICE_ADB) ? DEVICE_ADB : DEVICE_SERIAL;
}

HostLink currentHostLink(void) {
    HostLink link;
    link.device = currentOutputDevice();
    link.connection = gAdbConnection;
    return link;
}

int hostLinkFd(const HostLink *link) {
    if (link == NULL) return gSerialDevice.fd[currentOutputDevice()];
    if (link->device == DEVICE_ADB) {
        // The host that asked has hung up; a later connection is another host.
        if (link->connection != gAdbConnection) return -1;
        return gSerialDevice.fd[DEVICE_ADB];
    }
    return gSerialDevice.fd[DEVICE_SERIAL];
}

void initSerialDevice(SerialDevice *dev) {
    LOGD("Enter");
    if (dev == NULL) return;
    memset(dev, 0, sizeof(*dev));
    dev->fd[DEVICE_SERIAL] = -1;
    dev->fd[DEVICE_ADB_LISTEN] = -1;
    dev->fd[DEVICE_ADB] = -1;
    dev->echoOption[DEVICE_SERIAL] = 1;
    dev->echoOption[DEVICE_ADB_LISTEN] = 1;
    dev->cmdLen = 0;
}

// The MMI test set on top of the settings in t: no input processing (frames are
// bytes, not text), output unchanged, canonical lines without echo, and neither an
// erase nor a kill character, so that no byte of a frame edits or discards it.
static void applyMmiSet(struct termios *t) {
    t->c_iflag = 0;
    t->c_oflag &= ~(tcflag_t)OFLAG_CLEAR_MASK;
    t->c_lflag = ICANON;
    t->c_cc[VERASE] = 0;
    t->c_cc[VKILL] = _POSIX_VDISABLE;
}

int open_serial_device(SerialDevice *dev, const char *path) {
    LOGD("Enter");
    if (path == NULL) {
        LOGE("Fail to open serial device(%s) with error code:%d", "(null)", EINVAL);
        return -1;
    }
    LOGI("Opened serial port:%s", path);

    int fd;
    do {
        fd = open(path, O_RDWR | O_NOCTTY | O_NONBLOCK);
    } while (fd < 0 && errno == EINTR);
    if (fd < 0) {
        LOGE("Fail to open serial device(%s) with error code:%d", path, errno);
        return -1;
    }

    const bool isGadget = strcmp(path, SERIAL_DEV_NAME) == 0;
    if (isGadget) {
        // Driver tuning only; ports whose driver lacks these calls work as they are.
        struct serial_struct info;
        memset(&info, 0, sizeof(info));
        (void)ioctl(fd, TIOCGSERIAL, &info);
        LOGE("open_serial_device xmit_fifo_size=%d flag=%x", info.xmit_fifo_size, (unsigned)info.flags);
        info.flags = GADGET_SERIAL_FLAGS;
        info.xmit_fifo_size = 0;
        (void)ioctl(fd, TIOCSSERIAL, &info);
    }

    // A reopen after a fatal error brings back the echo the host chose with ATE.
    int echo = 1;
    if (isGadget) {
        echo = dev != NULL ? dev->echoOption[DEVICE_SERIAL] : 1;
    } else if (strcmp(path, SERIAL_DEV_NAME_2) == 0) {
        echo = dev != NULL ? dev->echoOption[DEVICE_ADB_LISTEN] : 1;
    }

    LOGD("serial->fd is %d ", fd);

    // Non-blocking only so that the open cannot hang on carrier detect; every later
    // read and write must block.
    int flags = fcntl(fd, F_GETFL);
    if (flags < 0 || fcntl(fd, F_SETFL, flags & ~O_NONBLOCK) < 0) {
        LOGE("Error clearing O_NONBLOCK errno: %d", errno);
    }

    struct termios options;
    memset(&options, 0, sizeof(options));
    const bool haveSettings = tcgetattr(fd, &options) == 0;
    LOGE("open_serial_device c_oflag=%d c_lflag=%x", (int)options.c_oflag, (unsigned)options.c_lflag);

    options.c_oflag = isGadget ? ONLCR : (options.c_oflag & ~(tcflag_t)OFLAG_CLEAR_MASK);
    // Canonical mode: the kernel hands over whole lines, and SUB/ESC end an SMS body
    // line just as a newline does.
    options.c_lflag = echo == 1 ? (ICANON | ECHO | IEXTEN) : (ICANON | IEXTEN);
    options.c_cc[VEOL] = 0x1A;
    options.c_cc[VEOL2] = 0x1B;
    // Ctrl-D is data here, not end of file: as end of file it would make a read
    // return 0 at a line start, which the reader must take for a dead port (close,
    // reopen, queued input flushed), and would cut a line short anywhere else.
    options.c_cc[VEOF] = _POSIX_VDISABLE;

    // A port reopened while the MMI test runs (a replug, a failed read or write)
    // must stay in its settings: in the line settings a frame would be echoed and
    // edited. The restore at the end of the test brings back the line settings
    // saved when it began (a port that was not replugged still holds the MMI
    // input settings, which are no line settings to go back to).
    if (gMmiSettingsInForce && haveSettings) applyMmiSet(&options);

    (void)tcflush(fd, TCIFLUSH);
    // Never apply a record that was not read from the port: on a terminal an
    // all-zero record would drop the line speed and the receiver.
    if (haveSettings) (void)tcsetattr(fd, TCSANOW, &options);
    return fd;
}

int setEchoOption(int on) {
    const int cur = gSerialDevice.currDevice;
    LOGI("set echo option:%d for device:%d", on, cur);
    if (!validDeviceIndex(cur)) return -1;
    const int fd = gSerialDevice.fd[cur];

    struct termios options;
    memset(&options, 0, sizeof(options));
    const bool haveSettings = tcgetattr(fd, &options) == 0;
    // IEXTEN stays as the port had it: without it the kernel no longer ends a line at
    // VEOL2, and an SMS body cancelled with ESC would never reach the reader.
    options.c_lflag = (on == 1 ? (ICANON | ECHO) : ICANON) | (options.c_lflag & IEXTEN);

    // Recorded even where the link is no terminal, so a later reopen honours it.
    gSerialDevice.echoOption[cur] = on;

    // TCSANOW, and no flush: a command the host typed right behind ATE0 is
    // already waiting in the port and must still be read.
    if (!haveSettings) return -1;
    return tcsetattr(fd, TCSANOW, &options);
}

static bool isEmptySettings(const struct termios *t) {
    static const struct termios zero = {};
    return memcmp(t, &zero, sizeof(zero)) == 0;
}

void setMMITESTOption(int enable) {
    const int cur = gSerialDevice.currDevice;
    const int fd = validDeviceIndex(cur) ? gSerialDevice.fd[cur] : -1;

    if (enable) {
        struct termios options;
        memset(&options, 0, sizeof(options));
        const bool haveSettings = tcgetattr(fd, &options) == 0;
        (void)tcflush(fd, TCIFLUSH);
        // A link without terminal settings (the adb socket) keeps the saved record,
        // so a later restore on the serial port never applies garbage.
        if (haveSettings) {
            last_deviceOptions = options;
            applyMmiSet(&options);
            if (tcsetattr(fd, TCSANOW, &options) == 0 && cur == DEVICE_SERIAL) gMmiSettingsInForce = true;
        }
        LOGI("%s:%d for device:%d, deviceOptions[lflag=0x%x][iflag=0x%x][oflag=0x%x]", "setMMITESTOption", 1, cur,
             (unsigned)last_deviceOptions.c_lflag, (unsigned)last_deviceOptions.c_iflag,
             (unsigned)last_deviceOptions.c_oflag);
        return;
    }

    struct termios current;
    memset(&current, 0, sizeof(current));
    (void)tcgetattr(fd, &current);
    (void)tcflush(fd, TCIFLUSH);
    // Without a matching enable nothing was saved; an all-zero record would switch
    // off the port's receiver and line speed.
    if (!isEmptySettings(&last_deviceOptions) && tcsetattr(fd, TCSANOW, &last_deviceOptions) == 0 &&
        cur == DEVICE_SERIAL) {
        gMmiSettingsInForce = false;
    }
    LOGI("%s:%d for device:%d, last_deviceOptions[lflag=0x%x][iflag=0x%x][oflag=0x%x]", "setMMITESTOption", 0, cur,
         (unsigned)last_deviceOptions.c_lflag, (unsigned)last_deviceOptions.c_iflag,
         (unsigned)last_deviceOptions.c_oflag);
}
