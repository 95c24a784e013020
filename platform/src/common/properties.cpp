// System properties: one file per property under <root>/properties/, or an
// in-process table when no device root is set.
#include <cutils/properties.h>
#include <tolk_platform/device_root.h>
#include <tolk_platform/file_util.h>

#include <dirent.h>
#include <errno.h>
#include <limits.h>
#include <stdio.h>
#include <string.h>

#include <map>
#include <mutex>
#include <string>
#include <utility>
#include <vector>

namespace {

std::mutex gMemMutex;
std::map<std::string, std::string> gMemProps;

// Names longer than PROP_NAME_MAX - 1 do not exist. The name is also a file name in
// the store, so anything that could leave the properties folder or collide with a
// temporary file (a '/', a leading '.') is refused too.
bool valid_name(const char *key) {
    if (key == nullptr || key[0] == '\0' || key[0] == '.') return false;
    size_t len = strnlen(key, PROP_NAME_MAX);
    if (len >= PROP_NAME_MAX) return false;
    return strchr(key, '/') == nullptr;
}

bool store_dir(char *out, size_t size) {
    return tolk_device_path("/properties", out, size) != nullptr;
}

bool store_path(const char *key, char *out, size_t size) {
    char dir[PATH_MAX];
    if (!store_dir(dir, sizeof(dir))) return false;
    int n = snprintf(out, size, "%s/%s", dir, key);
    return n > 0 && static_cast<size_t>(n) < size;
}

// Reads the stored value; its length (0 when unset), -1 never: a missing or
// unreadable file is an unset property.
int read_value(const char *key, char *value) {
    value[0] = '\0';
    if (tolk_device_root() == nullptr) {
        std::lock_guard<std::mutex> lock(gMemMutex);
        auto it = gMemProps.find(key);
        if (it == gMemProps.end()) return 0;
        size_t len = it->second.size() < PROP_VALUE_MAX - 1 ? it->second.size() : PROP_VALUE_MAX - 1;
        memcpy(value, it->second.data(), len);
        value[len] = '\0';
        return static_cast<int>(len);
    }
    char path[PATH_MAX];
    if (!store_path(key, path, sizeof(path))) return 0;
    ssize_t n = tolk_read_file(path, value, PROP_VALUE_MAX);
    if (n < 0) {
        value[0] = '\0';
        return 0;
    }
    // A value holds no NUL; a file edited by hand that has one ends there.
    return static_cast<int>(strlen(value));
}

}  // namespace

extern "C" int property_get(const char *key, char *value, const char *default_value) {
    if (value == nullptr) return -1;
    int len = 0;
    if (valid_name(key)) len = read_value(key, value);
    else value[0] = '\0';
    if (len > 0) return len;
    // An unset property and an empty one both give the default, as on the device.
    if (default_value != nullptr) {
        len = static_cast<int>(strnlen(default_value, PROP_VALUE_MAX - 1));
        memmove(value, default_value, static_cast<size_t>(len));
        value[len] = '\0';
    }
    return len;
}

extern "C" int property_set(const char *key, const char *value) {
    if (!valid_name(key)) return -1;
    if (value == nullptr) value = "";
    size_t vlen = strnlen(value, PROP_VALUE_MAX);
    if (vlen >= PROP_VALUE_MAX) return -1;
    bool readOnly = strncmp(key, "ro.", 3) == 0;

    if (tolk_device_root() == nullptr) {
        std::lock_guard<std::mutex> lock(gMemMutex);
        auto it = gMemProps.find(key);
        if (readOnly && it != gMemProps.end()) return -1;
        gMemProps[key] = std::string(value, vlen);
        return 0;
    }
    char path[PATH_MAX];
    if (!store_path(key, path, sizeof(path))) return -1;
    // ro. properties are created once and never replaced, also when two processes race.
    return tolk_write_file_atomic(path, value, vlen, !readOnly) == 0 ? 0 : -1;
}

extern "C" int property_list(void (*propfn)(const char *key, const char *value, void *cookie), void *cookie) {
    if (propfn == nullptr) return -1;
    std::vector<std::pair<std::string, std::string>> all;
    if (tolk_device_root() == nullptr) {
        std::lock_guard<std::mutex> lock(gMemMutex);
        all.assign(gMemProps.begin(), gMemProps.end());
    } else {
        char dir[PATH_MAX];
        if (!store_dir(dir, sizeof(dir))) return -1;
        DIR *d = opendir(dir);
        if (d == nullptr) return errno == ENOENT ? 0 : -1;
        while (struct dirent *e = readdir(d)) {
            if (!valid_name(e->d_name)) continue;
            char value[PROP_VALUE_MAX];
            if (read_value(e->d_name, value) < 0) continue;
            all.emplace_back(e->d_name, value);
        }
        closedir(d);
    }
    // The callback runs without any lock held, so it may call property_set itself.
    for (const auto &p : all) propfn(p.first.c_str(), p.second.c_str(), cookie);
    return 0;
}
