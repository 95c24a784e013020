// The simulated device's root folder and the mapping of device paths into it.
#include <tolk_platform/device_root.h>

#include <errno.h>
#include <limits.h>
#include <stdint.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>

// Length of root without trailing slashes ("/tmp/r/" and "/tmp/r" name the same root;
// "/" gives 0, which means the host's own tree).
static size_t root_length(const char *root) {
    size_t n = strlen(root);
    while (n > 0 && root[n - 1] == '/') n--;
    return n;
}

static const char *copy_out(const char *text, size_t len, char *out, size_t size) {
    if (len + 1 > size) {
        errno = ENAMETOOLONG;
        return nullptr;
    }
    memmove(out, text, len);
    out[len] = '\0';
    return out;
}

extern "C" const char *tolk_device_root(void) {
    // Read on every call: tests point the process at a fresh root for each case.
    const char *root = getenv(TOLKD_ROOT_ENV);
    if (root == nullptr || root[0] == '\0') return nullptr;
    return root;
}

extern "C" const char *tolk_device_path(const char *path, char *out, size_t size) {
    if (path == nullptr || out == nullptr || size == 0) {
        errno = EINVAL;
        return nullptr;
    }
    size_t plen = strlen(path);
    const char *root = tolk_device_root();
    size_t rlen = root != nullptr ? root_length(root) : 0;
    if (rlen == 0 || path[0] != '/') return copy_out(path, plen, out, size);
    // A path that is already under the root (a host tool or a test passing the
    // resolved name back in) must not be prefixed twice.
    if (plen >= rlen && strncmp(path, root, rlen) == 0 && (path[rlen] == '/' || path[rlen] == '\0'))
        return copy_out(path, plen, out, size);
    if (rlen + plen + 1 > size) {
        errno = ENAMETOOLONG;
        return nullptr;
    }
    memcpy(out, root, rlen);
    memcpy(out + rlen, path, plen + 1);
    return out;
}

// FNV-1a, 64 bits: stable across processes and runs, which is all the name needs.
static uint64_t fnv1a(const char *s) {
    uint64_t h = 1469598103934665603ULL;
    for (; *s != '\0'; s++) {
        h ^= static_cast<unsigned char>(*s);
        h *= 1099511628211ULL;
    }
    return h;
}

extern "C" int tolk_abstract_name(const char *name, char *out, size_t size) {
    if (name == nullptr || out == nullptr || size == 0) {
        errno = EINVAL;
        return -1;
    }
    const char *root = tolk_device_root();
    int n;
    if (root == nullptr) {
        n = snprintf(out, size, "%s", name);
    } else {
        // The same root reached through different spellings ("/tmp/r", "/tmp/r/",
        // a symlink) must give the same name, so hash the resolved path.
        char real[PATH_MAX];
        const char *key = realpath(root, real) != nullptr ? real : root;
        char trimmed[PATH_MAX];
        if (key == root) {
            size_t rlen = root_length(root);
            if (rlen >= sizeof(trimmed)) rlen = sizeof(trimmed) - 1;
            memcpy(trimmed, root, rlen);
            trimmed[rlen] = '\0';
            key = trimmed;
        }
        n = snprintf(out, size, "tolk.%016llx.%s", static_cast<unsigned long long>(fnv1a(key)), name);
    }
    if (n < 0 || static_cast<size_t>(n) >= size) {
        errno = ENAMETOOLONG;
        return -1;
    }
    return n;
}
