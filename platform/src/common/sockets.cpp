// libcutils' local socket helpers on the host: reserved and filesystem names live
// under the device root, abstract names are made unique per device root, so that
// two simulated devices on one machine never meet.
#include <cutils/sockets.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>
#include <tolk_platform/local_socket.h>

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stddef.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <sys/un.h>
#include <unistd.h>

extern "C" int android_get_control_socket(const char *name) {
    if (name == nullptr) return -1;
    char key[128];
    int n = snprintf(key, sizeof(key), "%s%s", ANDROID_SOCKET_ENV_PREFIX, name);
    if (n < 0 || static_cast<size_t>(n) >= sizeof(key)) return -1;
    const char *val = getenv(key);
    if (val == nullptr || val[0] == '\0') return -1;
    long fd = 0;
    for (const char *p = val; *p != '\0'; p++) {
        if (*p < '0' || *p > '9') return -1;
        fd = fd * 10 + (*p - '0');
        if (fd > INT_MAX) return -1;
    }
    // A number that names no open descriptor is as good as no socket.
    if (fcntl(static_cast<int>(fd), F_GETFD) < 0) return -1;
    return static_cast<int>(fd);
}

extern "C" int tolk_local_address(const char *name, int ns, struct sockaddr_un *addr) {
    if (name == nullptr || addr == nullptr) {
        errno = EINVAL;
        return -1;
    }
    memset(addr, 0, sizeof(*addr));
    addr->sun_family = AF_UNIX;
    const size_t base = offsetof(struct sockaddr_un, sun_path);
    switch (ns) {
    case ANDROID_SOCKET_NAMESPACE_ABSTRACT: {
        // sun_path[0] stays NUL; the name follows without a terminator.
        int len = tolk_abstract_name(name, addr->sun_path + 1, sizeof(addr->sun_path) - 1);
        if (len < 0) return -1;
        return static_cast<int>(base + 1 + static_cast<size_t>(len));
    }
    case ANDROID_SOCKET_NAMESPACE_RESERVED:
    case ANDROID_SOCKET_NAMESPACE_FILESYSTEM: {
        char device[PATH_MAX];
        const char *path = name;
        if (ns == ANDROID_SOCKET_NAMESPACE_RESERVED) {
            int n = snprintf(device, sizeof(device), "%s/%s", ANDROID_SOCKET_DIR, name);
            if (n < 0 || static_cast<size_t>(n) >= sizeof(device)) {
                errno = ENAMETOOLONG;
                return -1;
            }
            path = device;
        }
        if (tolk_device_path(path, addr->sun_path, sizeof(addr->sun_path)) == nullptr) {
            errno = ENAMETOOLONG;
            return -1;
        }
        return static_cast<int>(base + strlen(addr->sun_path) + 1);
    }
    default:
        errno = EINVAL;
        return -1;
    }
}

extern "C" int socket_local_client(const char *name, int namespaceId, int type) {
    struct sockaddr_un addr;
    int alen = tolk_local_address(name, namespaceId, &addr);
    if (alen < 0) return -1;
    int fd = socket(AF_UNIX, type, 0);
    if (fd < 0) return -1;
    int rc;
    do {
        rc = connect(fd, reinterpret_cast<struct sockaddr *>(&addr), static_cast<socklen_t>(alen));
    } while (rc != 0 && errno == EINTR);
    if (rc != 0) {
        int err = errno;
        close(fd);
        errno = err;
        return -1;
    }
    return fd;
}

// True when someone still serves the socket file at addr.
static bool live_server(const struct sockaddr_un *addr, int alen, int type) {
    // Non-blocking, so a server with a full backlog answers EAGAIN instead of
    // holding the probe up; it is alive all the same.
    int probe = socket(AF_UNIX, (type & ~(SOCK_CLOEXEC | SOCK_NONBLOCK)) | SOCK_CLOEXEC | SOCK_NONBLOCK, 0);
    if (probe < 0) return false;
    bool live = connect(probe, reinterpret_cast<const struct sockaddr *>(addr), static_cast<socklen_t>(alen)) == 0 ||
                errno == EAGAIN;
    close(probe);
    return live;
}

extern "C" int tolk_local_server(const char *name, int ns, int type, int backlog) {
    struct sockaddr_un addr;
    int alen = tolk_local_address(name, ns, &addr);
    if (alen < 0) return -1;
    if (ns != ANDROID_SOCKET_NAMESPACE_ABSTRACT) {
        if (tolk_mkdirs_for(addr.sun_path) != 0) return -1;
        struct stat st;
        if (lstat(addr.sun_path, &st) == 0) {
            // Only a socket file left behind by a server that is gone may be
            // removed; anything else at that path is not ours to delete.
            if (!S_ISSOCK(st.st_mode)) {
                errno = EADDRINUSE;
                return -1;
            }
            if (live_server(&addr, alen, type)) {
                errno = EADDRINUSE;
                return -1;
            }
            unlink(addr.sun_path);
        }
    }
    int kind = type & ~(SOCK_CLOEXEC | SOCK_NONBLOCK);
    int fd = socket(AF_UNIX, type | SOCK_CLOEXEC, 0);
    if (fd < 0) return -1;
    if (bind(fd, reinterpret_cast<struct sockaddr *>(&addr), static_cast<socklen_t>(alen)) != 0 ||
        ((kind == SOCK_STREAM || kind == SOCK_SEQPACKET) && listen(fd, backlog) != 0)) {
        int err = errno;
        close(fd);
        errno = err;
        return -1;
    }
    return fd;
}
