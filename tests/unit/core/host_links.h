// Real descriptors in every slot the reader watches: a pseudo-terminal in the
// daemon's canonical mode as the serial port, a socketpair as the accepted adb
// connection, a listening AF_UNIX socket as the control socket, a modem pair.
#ifndef TOLK_TESTS_CORE_HOST_LINKS_H
#define TOLK_TESTS_CORE_HOST_LINKS_H

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <termios.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

#include <gtest/gtest.h>

#include "core/reader.h"
#include "core/sms_merge.h"
#include "serial/serial_device.h"
#include "targets/target_conn.h"
#include "test_root.h"

inline void writeAll(int fd, const std::string &s) { ASSERT_EQ((ssize_t)s.size(), write(fd, s.data(), s.size())); }

// Everything that arrives on fd until it has been quiet for quietMs.
inline std::string drain(int fd, int quietMs = 150) {
    std::string out;
    char buf[8192];
    struct pollfd p = {fd, POLLIN, 0};
    ssize_t n;
    while (poll(&p, 1, quietMs) > 0 && (n = read(fd, buf, sizeof(buf))) > 0) out.append(buf, n);
    return out;
}

// Host input that must arrive only after the reader has consumed what came before.
inline void writeLater(int fd, std::string s, int ms = 100) {
    std::thread([fd, s, ms] {
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));
        if (write(fd, s.data(), s.size()) < 0) ADD_FAILURE();
    }).detach();
}

class HostLinks : public ::testing::Test {
protected:
    TestRoot root;
    int master = -1;  // host side of the serial port
    int adbHost = -1;
    int rildPeer = -1;
    sockaddr_un listenAddr = {};

    void SetUp() override {
        alarm(30);  // a reader that waits forever fails the run instead of hanging it
        memset(&gSerialDevice, 0, sizeof(gSerialDevice));
        master = posix_openpt(O_RDWR | O_NOCTTY);
        ASSERT_TRUE(master >= 0 && grantpt(master) == 0 && unlockpt(master) == 0);
        // open() resolves paths under the device root in this binary; openat() does not.
        int slave = openat(AT_FDCWD, ptsname(master), O_RDWR | O_NOCTTY);
        struct termios t;
        ASSERT_EQ(0, tcgetattr(slave, &t));
        t.c_iflag = 0;
        t.c_oflag = 0;
        t.c_lflag = ICANON | IEXTEN;  // no echo; IEXTEN makes VEOL2 end a line
        t.c_cc[VEOL] = 0x1A;
        t.c_cc[VEOL2] = 0x1B;
        tcsetattr(slave, TCSANOW, &t);
        gSerialDevice.fd[DEVICE_SERIAL] = slave;

        int sp[2];
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sp));
        gSerialDevice.fd[DEVICE_ADB] = sp[0];
        adbHost = sp[1];
        listenAddr.sun_family = AF_UNIX;
        snprintf(listenAddr.sun_path, sizeof(listenAddr.sun_path), "%s/adb", root.path().c_str());
        int lfd = socket(AF_UNIX, SOCK_STREAM, 0);
        ASSERT_EQ(0, bind(lfd, (sockaddr *)&listenAddr, sizeof(listenAddr)));
        ASSERT_EQ(0, adb_socket_listen(lfd));
        gSerialDevice.fd[DEVICE_ADB_LISTEN] = lfd;
        ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, sp));
        s_fdRild_command = sp[0];
        rildPeer = sp[1];

        isMsgCmdInput = isNeedMergeMsgCmdInput = false;
        msgCmdMode = 0;
        discardAdbLine();
    }

    void TearDown() override {
        for (int &fd : gSerialDevice.fd) {
            if (fd >= 0) close(fd);
            fd = -1;
        }
        for (int fd : {master, adbHost, rildPeer, s_fdRild_command}) {
            if (fd >= 0) close(fd);
        }
        s_fdRild_command = -1;
        isMsgCmdInput = isNeedMergeMsgCmdInput = false;
        alarm(0);
    }

    // One reading cycle: the line as routing gets it, "<null>" for none.
    std::string nextLine() {
        char *line = readline(&gSerialDevice);
        return line == nullptr ? "<null>" : std::string(line);
    }
};

#endif
