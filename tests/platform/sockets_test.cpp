#include <cutils/sockets.h>
#include <tolk_platform/local_socket.h>

#include <gtest/gtest.h>

#include <errno.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>

#include "test_root.h"

namespace {

// Sends ping from the client and reads it at the accepted end.
bool talks(int server, int client) {
    int peer = accept(server, nullptr, nullptr);
    if (peer < 0) return false;
    bool ok = write(client, "ping", 5) == 5;
    char buf[8] = "";
    ok = ok && read(peer, buf, sizeof(buf)) == 5 && std::string(buf) == "ping";
    close(peer);
    return ok;
}

}  // namespace

TEST(Sockets, ControlSocketComesFromTheEnvironment) {
    int sv[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, sv), 0);
    setenv("ANDROID_SOCKET_adb_tolk_socket", std::to_string(sv[0]).c_str(), 1);
    EXPECT_EQ(android_get_control_socket("adb_tolk_socket"), sv[0]);
    EXPECT_EQ(android_get_control_socket("other"), -1);
    setenv("ANDROID_SOCKET_adb_tolk_socket", (std::to_string(sv[0]) + "x").c_str(), 1);
    EXPECT_EQ(android_get_control_socket("adb_tolk_socket"), -1);
    setenv("ANDROID_SOCKET_adb_tolk_socket", "99999999999999999999", 1);
    EXPECT_EQ(android_get_control_socket("adb_tolk_socket"), -1);
    // A number that is not an open descriptor.
    close(sv[0]);
    setenv("ANDROID_SOCKET_adb_tolk_socket", std::to_string(sv[0]).c_str(), 1);
    EXPECT_EQ(android_get_control_socket("adb_tolk_socket"), -1);
    unsetenv("ANDROID_SOCKET_adb_tolk_socket");
    close(sv[1]);
}

TEST(Sockets, ClientsReachServersOfTheSameRootOnly) {
    TestRoot root;
    int reserved = tolk_local_server("tolk-service", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2);
    ASSERT_GE(reserved, 0) << strerror(errno);
    int abstract = tolk_local_server("auto_cit", ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM, 2);
    ASSERT_GE(abstract, 0) << strerror(errno);

    int c1 = socket_local_client("tolk-service", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM);
    ASSERT_GE(c1, 0);
    EXPECT_TRUE(talks(reserved, c1));
    close(c1);
    int c2 = socket_local_client("auto_cit", ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM);
    ASSERT_GE(c2, 0);
    EXPECT_TRUE(talks(abstract, c2));
    close(c2);

    {
        TestRoot other;  // a second simulated device on the same machine
        errno = 0;
        EXPECT_EQ(socket_local_client("auto_cit", ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM), -1);
        EXPECT_EQ(errno, ECONNREFUSED);
        EXPECT_EQ(socket_local_client("tolk-service", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM), -1);
        EXPECT_EQ(errno, ENOENT);
        // Its own servers may use the same names.
        int mine = tolk_local_server("auto_cit", ANDROID_SOCKET_NAMESPACE_ABSTRACT, SOCK_STREAM, 2);
        EXPECT_GE(mine, 0);
        close(mine);
    }
    close(reserved);
    close(abstract);
}

TEST(Sockets, ServerReplacesStaleFilesOnly) {
    TestRoot root;
    int first = tolk_local_server("tolk-audio", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2);
    ASSERT_GE(first, 0);
    // A live server keeps its address.
    EXPECT_EQ(tolk_local_server("tolk-audio", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2), -1);
    EXPECT_EQ(errno, EADDRINUSE);
    close(first);  // gone, its file stays behind
    int second = tolk_local_server("tolk-audio", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2);
    ASSERT_GE(second, 0);
    close(second);

    // A file that is not a socket is never deleted.
    root.write("/dev/socket/rild-tolk-md2", "data");
    EXPECT_EQ(tolk_local_server("rild-tolk-md2", ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM, 2), -1);
    EXPECT_EQ(root.read("/dev/socket/rild-tolk-md2"), "data");

    // Names too long for an address fail cleanly.
    std::string longName(200, 'n');
    EXPECT_EQ(socket_local_client(longName.c_str(), ANDROID_SOCKET_NAMESPACE_RESERVED, SOCK_STREAM), -1);
}
