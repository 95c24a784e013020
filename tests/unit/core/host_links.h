// Real descriptors in every slot the reader watches: a pseudo-terminal as the serial
// port, a socketpair as the accepted adb connection, a listening AF_UNIX socket as
// the adb control socket, and a socketpair as the modem link.
#ifndef TOLK_TESTS_CORE_HOST_LINKS_H
#define TOLK_TESTS_CORE_HOST_LINKS_H

#include <fcntl.h>
#include <poll.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <functional>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "core/reader.h"
#include "core/sms_merge.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/target_conn.h"
#include "test_root.h"

// open() is redirected under the device root in this binary; openat() is not.
inline int openHostPath(const std::string &path, int flags) { return openat(AT_FDCWD, path.c_str(), flags); }

// A pseudo-terminal pair whose slave side is in the canonical mode the daemon uses:
// lines end at LF, Ctrl-Z and ESC (ESC needs IEXTEN), nothing is echoed, no input
// mapping.
struct Pty {
    int master = -1;
    int slave = -1;
    std::string slavePath;
    Pty() {
        master = posix_openpt(O_RDWR | O_NOCTTY);
        if (master < 0 || grantpt(master) != 0 || unlockpt(master) != 0) return;
        slavePath = ptsname(master);
        slave = openHostPath(slavePath, O_RDWR | O_NOCTTY);
        struct termios t;
        tcgetattr(slave, &t);
        t.c_iflag = 0;
        t.c_oflag = 0;
        t.c_lflag = ICANON | IEXTEN;
        t.c_cc[VEOL] = 0x1A;
        t.c_cc[VEOL2] = 0x1B;
        tcsetattr(slave, TCSANOW, &t);
    }
    ~Pty() {
        if (master >= 0) close(master);
    }
};

inline void writeAll(int fd, const std::string &s) {
    ASSERT_EQ((ssize_t)s.size(), write(fd, s.data(), s.size()));
}

// Everything that arrives on fd within the quiet period.
inline std::string drain(int fd, int quietMs = 150) {
    std::string out;
    char buf[8192];
    struct pollfd p = {fd, POLLIN, 0};
    while (poll(&p, 1, quietMs) > 0) {
        ssize_t n = read(fd, buf, sizeof(buf));
        if (n <= 0) break;
        out.append(buf, n);
    }
    return out;
}

inline void later(int ms, std::function<void()> fn) {
    std::thread([ms, fn] {
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));
        fn();
    }).detach();
}

class HostLinks : public ::testing::Test {
protected:
    TestRoot root;
    Pty serial;
    int adbHost = -1;
    int rildPeer = -1;
    std::string listenPath;

    void SetUp() override {
        alarm(30);  // a reader bug must fail the run, not hang it
        ASSERT_GE(serial.slave, 0);
        memset(&gSerialDevice, 0, sizeof(gSerialDevice));
        for (int i = 0; i < DEVICE_COUNT; i++) gSerialDevice.fd[i] = -1;
        gSerialDevice.fd[DEVICE_SERIAL] = serial.slave;

        int sp[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sp));
        gSerialDevice.fd[DEVICE_ADB] = sp[0];
        adbHost = sp[1];

        listenPath = root.path() + "/adb_tolk_socket";
        int lfd = socket(AF_UNIX, SOCK_STREAM, 0);
        struct sockaddr_un addr = {};
        addr.sun_family = AF_UNIX;
        snprintf(addr.sun_path, sizeof(addr.sun_path), "%s", listenPath.c_str());
        ASSERT_EQ(0, bind(lfd, (struct sockaddr *)&addr, sizeof(addr)));
        ASSERT_EQ(0, listen(lfd, 2));
        gSerialDevice.fd[DEVICE_ADB_LISTEN] = lfd;

        int rp[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, rp));
        s_fdRild_command = rp[0];
        rildPeer = rp[1];
        s_fdService_command = -1;

        isMsgCmdInput = false;
        isNeedMergeMsgCmdInput = false;
        msgCmdMode = 0;
        gNumericMode = false;
        discardAdbLine();
    }

    void TearDown() override {
        for (int i = 0; i < DEVICE_COUNT; i++) {
            if (gSerialDevice.fd[i] >= 0) close(gSerialDevice.fd[i]);
            gSerialDevice.fd[i] = -1;
        }
        if (s_fdRild_command >= 0) close(s_fdRild_command);
        s_fdRild_command = -1;
        if (s_fdService_command >= 0) close(s_fdService_command);
        s_fdService_command = -1;
        if (adbHost >= 0) close(adbHost);
        if (rildPeer >= 0) close(rildPeer);
        isMsgCmdInput = false;
        isNeedMergeMsgCmdInput = false;
        discardAdbLine();
        alarm(0);
    }

    int connectAdbClient() {
        int fd = socket(AF_UNIX, SOCK_STREAM, 0);
        struct sockaddr_un addr = {};
        addr.sun_family = AF_UNIX;
        snprintf(addr.sun_path, sizeof(addr.sun_path), "%s", listenPath.c_str());
        EXPECT_EQ(0, connect(fd, (struct sockaddr *)&addr, sizeof(addr)));
        return fd;
    }

    // One reading cycle; the line as routing would see it, "<null>" for no line.
    std::string nextLine() {
        char *line = readline(&gSerialDevice);
        return line == nullptr ? std::string("<null>") : std::string(line);
    }
};

#endif
