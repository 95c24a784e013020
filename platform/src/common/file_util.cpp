// File helpers of the stand-ins: folder creation, atomic replacement, whole reads.
#include <tolk_platform/file_util.h>

#include <errno.h>
#include <fcntl.h>
#include <limits.h>
#include <stdio.h>
#include <string.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <atomic>

static int open_host(const char *path, int flags, mode_t mode = 0) {
    int fd;
    do {
        fd = openat(AT_FDCWD, path, flags | O_CLOEXEC, mode);
    } while (fd < 0 && errno == EINTR);
    return fd;
}

static int write_all(int fd, const void *data, size_t len) {
    const char *p = static_cast<const char *>(data);
    while (len > 0) {
        ssize_t n = write(fd, p, len);
        if (n < 0) {
            if (errno == EINTR) continue;
            return -1;
        }
        p += n;
        len -= static_cast<size_t>(n);
    }
    return 0;
}

extern "C" int tolk_mkdirs(const char *dir) {
    char buf[PATH_MAX];
    size_t len = strlen(dir);
    if (len == 0) return 0;
    if (len >= sizeof(buf)) {
        errno = ENAMETOOLONG;
        return -1;
    }
    memcpy(buf, dir, len + 1);
    for (size_t i = 1; i <= len; i++) {
        if (buf[i] != '/' && buf[i] != '\0') continue;
        char saved = buf[i];
        buf[i] = '\0';
        if (mkdir(buf, 0755) != 0 && errno != EEXIST) return -1;
        buf[i] = saved;
    }
    struct stat st;
    if (stat(dir, &st) != 0) return -1;
    if (!S_ISDIR(st.st_mode)) {
        errno = ENOTDIR;
        return -1;
    }
    return 0;
}

extern "C" int tolk_mkdirs_for(const char *path) {
    char buf[PATH_MAX];
    size_t len = strlen(path);
    if (len >= sizeof(buf)) {
        errno = ENAMETOOLONG;
        return -1;
    }
    memcpy(buf, path, len + 1);
    char *slash = strrchr(buf, '/');
    if (slash == nullptr || slash == buf) return 0;
    *slash = '\0';
    return tolk_mkdirs(buf);
}

extern "C" int tolk_write_file_atomic(const char *path, const void *data, size_t len, bool replace) {
    static std::atomic<unsigned> counter{0};
    const char *slash = strrchr(path, '/');
    size_t dirlen = slash != nullptr ? static_cast<size_t>(slash - path + 1) : 0;
    const char *base = path + dirlen;
    char tmp[PATH_MAX];
    // A leading dot keeps temporaries out of listings that skip hidden names; pid,
    // thread and a counter keep concurrent writers apart.
    int n = snprintf(tmp, sizeof(tmp), "%.*s.%s.tmp.%ld.%ld.%u", static_cast<int>(dirlen), path, base,
                     static_cast<long>(getpid()), static_cast<long>(syscall(SYS_gettid)),
                     counter.fetch_add(1));
    if (n < 0 || static_cast<size_t>(n) >= sizeof(tmp)) {
        errno = ENAMETOOLONG;
        return -1;
    }
    if (tolk_mkdirs_for(path) != 0) return -1;
    int fd = open_host(tmp, O_WRONLY | O_CREAT | O_EXCL, 0644);
    if (fd < 0) return -1;
    int rc = write_all(fd, data, len);
    int err = errno;
    if (close(fd) != 0 && rc == 0) {
        rc = -1;
        err = errno;
    }
    if (rc == 0) {
        // link() fails with EEXIST instead of replacing, which makes create-only
        // atomic between processes too.
        rc = replace ? rename(tmp, path) : link(tmp, path);
        err = errno;
    }
    if (rc != 0 || !replace) unlink(tmp);
    errno = err;
    return rc == 0 ? 0 : -1;
}

extern "C" ssize_t tolk_read_file(const char *path, char *buf, size_t size) {
    if (size == 0) {
        errno = EINVAL;
        return -1;
    }
    int fd = open_host(path, O_RDONLY);
    if (fd < 0) return -1;
    size_t got = 0;
    while (got + 1 < size) {
        ssize_t n = read(fd, buf + got, size - 1 - got);
        if (n < 0) {
            if (errno == EINTR) continue;
            int err = errno;
            close(fd);
            errno = err;
            return -1;
        }
        if (n == 0) break;
        got += static_cast<size_t>(n);
    }
    buf[got] = '\0';
    close(fd);
    return static_cast<ssize_t>(got);
}

extern "C" int tolk_append_file(const char *path, const void *data, size_t len) {
    if (tolk_mkdirs_for(path) != 0) return -1;
    int fd = open_host(path, O_WRONLY | O_CREAT | O_APPEND, 0644);
    if (fd < 0) return -1;
    int rc = write_all(fd, data, len);
    int err = errno;
    close(fd);
    errno = err;
    return rc;
}
