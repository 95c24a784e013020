// The phone's users in the simulated device: tolkd under its service user with
// only the capabilities its .rc grants, the CIT application under an app uid,
// and the device root's files, device nodes and sockets owned as on the phone,
// so that every end-to-end test shows the daemon needs nothing more.
#include "sim_privilege.h"

#include <errno.h>
#include <fcntl.h>
#include <fnmatch.h>
#include <grp.h>
#include <linux/capability.h>
#include <sys/prctl.h>
#include <sys/stat.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <cstring>
#include <filesystem>
#include <map>
#include <sstream>

#include <cutils/properties.h>

#ifndef TOLK_DEVICE_DIR
#error "TOLK_DEVICE_DIR must name the folder of tolkd.rc and ueventd.rc"
#endif

namespace sim {

namespace {

// Android's fixed user and group ids by name (system/core's android_filesystem_config).
const std::map<std::string, unsigned> kAndroidIds = {
    {"root", 0},           {"system", 1000},  {"radio", 1001},       {"bluetooth", 1002}, {"graphics", 1003},
    {"input", 1004},       {"audio", 1005},   {"camera", 1006},      {"log", 1007},       {"compass", 1008},
    {"mount", 1009},       {"wifi", 1010},    {"adb", 1011},         {"install", 1012},   {"media", 1013},
    {"dhcp", 1014},        {"sdcard_rw", 1015}, {"vpn", 1016},       {"keystore", 1017},  {"usb", 1018},
    {"drm", 1019},         {"gps", 1021},     {"media_rw", 1023},    {"nfc", 1027},       {"audioserver", 1041},
    {"shell", 2000},       {"cache", 2001},   {"diag", 2002},        {"net_bt_admin", 3001}, {"net_bt", 3002},
    {"inet", 3003},        {"net_raw", 3004}, {"net_admin", 3005},   {"readproc", 3009},  {"nobody", 9999},
};

// init's capability names (the CAP_ constants without their prefix).
const std::map<std::string, int> kCapabilities = {
    {"CHOWN", CAP_CHOWN}, {"DAC_OVERRIDE", CAP_DAC_OVERRIDE}, {"DAC_READ_SEARCH", CAP_DAC_READ_SEARCH},
    {"FOWNER", CAP_FOWNER}, {"FSETID", CAP_FSETID}, {"KILL", CAP_KILL}, {"SETGID", CAP_SETGID},
    {"SETUID", CAP_SETUID}, {"SETPCAP", CAP_SETPCAP}, {"NET_BIND_SERVICE", CAP_NET_BIND_SERVICE},
    {"NET_BROADCAST", CAP_NET_BROADCAST}, {"NET_ADMIN", CAP_NET_ADMIN}, {"NET_RAW", CAP_NET_RAW},
    {"IPC_LOCK", CAP_IPC_LOCK}, {"SYS_MODULE", CAP_SYS_MODULE}, {"SYS_RAWIO", CAP_SYS_RAWIO},
    {"SYS_PTRACE", CAP_SYS_PTRACE}, {"SYS_ADMIN", CAP_SYS_ADMIN}, {"SYS_BOOT", CAP_SYS_BOOT},
    {"SYS_NICE", CAP_SYS_NICE}, {"SYS_RESOURCE", CAP_SYS_RESOURCE}, {"SYS_TIME", CAP_SYS_TIME},
    {"SYS_TTY_CONFIG", CAP_SYS_TTY_CONFIG}, {"MKNOD", CAP_MKNOD}, {"WAKE_ALARM", CAP_WAKE_ALARM},
    {"BLOCK_SUSPEND", CAP_BLOCK_SUSPEND}, {"SYSLOG", CAP_SYSLOG},
};

const char kServiceName[] = "tolkd";
const char kControlSocket[] = "adb_tolk_socket";
// Set by the device build; the simulated phone's build gives it its CIT peer's uid.
const char kCitUidProperty[] = "ro.vendor.tolk.cit_uid";

// One owner rule: a path under the root (fnmatch pattern) and what it gets.
struct Owner {
    std::string pattern;
    uid_t uid;  // (uid_t)-1: keep
    gid_t gid;  // (gid_t)-1: keep
    mode_t mode;
    bool folder;  // created when missing
};

struct Definitions {
    bool loaded = false;
    ServiceUser user;
    std::vector<Owner> owners;
};

Definitions gDefs;

bool androidId(const std::string &name, unsigned *id) {
    auto it = kAndroidIds.find(name);
    if (it == kAndroidIds.end()) return false;
    *id = it->second;
    return true;
}

std::vector<std::string> words(const std::string &line) {
    std::istringstream in(line);
    std::vector<std::string> w;
    for (std::string s; in >> s;) {
        if (s[0] == '#') break;
        w.push_back(s);
    }
    return w;
}

bool octalMode(const std::string &s, mode_t *mode) {
    char *end = nullptr;
    unsigned long v = strtoul(s.c_str(), &end, 8);
    if (s.empty() || *end != '\0' || v > 07777) return false;
    *mode = static_cast<mode_t>(v);
    return true;
}

// "MODE USER GROUP" of a socket, mkdir or ueventd line, into an owner rule.
bool ownerOf(const std::string &pattern, const std::string &mode, const std::string &user, const std::string &group,
             bool folder, Owner *o, std::string *err) {
    unsigned u = 0, g = 0;
    o->pattern = pattern;
    o->folder = folder;
    if (!octalMode(mode, &o->mode) || !androidId(user, &u) || !androidId(group, &g)) {
        *err = "cannot read the owner of " + pattern + ": " + mode + " " + user + " " + group;
        return false;
    }
    o->uid = u;
    o->gid = g;
    return true;
}

bool readText(const std::string &path, std::string *text, std::string *err) {
    if (readFile(path, text)) return true;
    *err = "cannot read " + path + ": " + strerror(errno);
    return false;
}

// Device paths become root-relative patterns ("/data/prod" -> "data/prod").
std::string rel(const std::string &devicePath) {
    size_t i = devicePath.find_first_not_of('/');
    return i == std::string::npos ? "" : devicePath.substr(i);
}

// The service's socket and folders from its .rc file.
bool parseRcOwners(const std::string &rcText, const ServiceUser &user, std::vector<Owner> *owners,
                   std::string *err) {
    std::istringstream in(rcText);
    bool inService = false;
    for (std::string line; std::getline(in, line);) {
        std::vector<std::string> w = words(line);
        if (w.empty()) continue;
        if (w[0] == "service" || w[0] == "on") inService = w[0] == "service" && w.size() > 1 && w[1] == kServiceName;
        Owner o;
        if (inService && w[0] == "socket" && w.size() >= 6 && w[1] == kControlSocket) {
            if (!ownerOf("dev/socket/" + w[1], w[3], w[4], w[5], false, &o, err)) return false;
            owners->push_back(o);
        } else if (!inService && w[0] == "mkdir" && w.size() >= 5) {
            if (!ownerOf(rel(w[1]), w[2], w[3], w[4], true, &o, err)) return false;
            owners->push_back(o);
            // What the daemon creates in its own folder is its own.
            owners->push_back({rel(w[1]) + "/*", user.uid, user.gid, 0660, false});
        }
    }
    return true;
}

bool parseUeventdOwners(const std::string &text, std::vector<Owner> *owners, std::string *err) {
    std::istringstream in(text);
    for (std::string line; std::getline(in, line);) {
        std::vector<std::string> w = words(line);
        if (w.size() < 4 || w[0][0] != '/') continue;
        Owner o;
        if (!ownerOf(rel(w[0]), w[1], w[2], w[3], false, &o, err)) return false;
        owners->push_back(o);
    }
    return true;
}

// Owners the daemon relies on but this project does not define: the peers'
// sockets as their own services create them, the vendor NVRAM data, and the
// folders where the simulator's stand-ins of platform services keep their
// state (the property service, the clock, logd and the journals).
void addPlatformOwners(std::vector<Owner> *owners) {
    const uid_t keep = static_cast<uid_t>(-1);
    const gid_t keepGroup = static_cast<gid_t>(-1);
    const unsigned system = 1000, radio = 1001, audio = 1005, audioserver = 1041;
    const std::vector<Owner> fixed = {
        {"", keep, keepGroup, 0755, false},  // every process finds its way into the root
        {"dev/socket/tolk-service", system, system, 0660, false},
        {"dev/socket/tolk-audio", audioserver, audio, 0660, false},
        {"dev/socket/rild-tolk-md2", radio, radio, 0660, false},
        {"dev/hwbinder/radio.slot*", 0, 0, 0666, false},  // /dev/hwbinder is open to all; the policy decides
        {"nvram", 0, system, 0770, true},
        {"nvram/*", 0, system, 0660, false},
        {"properties", 0, system, 0775, true},
        {"clock", 0, system, 0775, true},
        {"log", 0, 0, 01777, true},
        {"journal", 0, 0, 01777, true},
    };
    owners->insert(owners->end(), fixed.begin(), fixed.end());
}

bool loadDefinitions(std::string *err) {
    if (gDefs.loaded) return true;
    std::string rc, ueventd;
    Definitions d;
    if (!readText(TOLK_DEVICE_DIR "/tolkd.rc", &rc, err) || !parseServiceUser(rc, &d.user, err) ||
        !parseRcOwners(rc, d.user, &d.owners, err) || !readText(TOLK_DEVICE_DIR "/ueventd.rc", &ueventd, err) ||
        !parseUeventdOwners(ueventd, &d.owners, err))
        return false;
    addPlatformOwners(&d.owners);
    d.loaded = true;
    gDefs = d;
    return true;
}

void applyOwner(const std::string &path, const Owner &o) {
    struct stat st;
    if (stat(path.c_str(), &st) != 0) {
        if (!o.folder || mkdir(path.c_str(), 0755) != 0) return;
    }
    // chown and chmod follow a symbolic link: dev/ttyGS0 names the pseudo-terminal.
    if (chown(path.c_str(), o.uid, o.gid) != 0 || chmod(path.c_str(), o.mode) != 0)
        fprintf(stderr, "tolk-sim: cannot give %s its owner: %s\n", path.c_str(), strerror(errno));
}

const Owner *ownerFor(const std::string &relPath) {
    for (const Owner &o : gDefs.owners)
        if (fnmatch(o.pattern.c_str(), relPath.c_str(), FNM_PATHNAME) == 0) return &o;
    return nullptr;
}

bool hasWildcard(const std::string &p) { return p.find_first_of("*?[") != std::string::npos; }

bool setCapabilities(const std::vector<int> &caps, std::string *err) {
    struct __user_cap_header_struct header = {_LINUX_CAPABILITY_VERSION_3, 0};
    struct __user_cap_data_struct data[_LINUX_CAPABILITY_U32S_3];
    memset(data, 0, sizeof data);
    for (int c : caps) {
        data[CAP_TO_INDEX(c)].effective |= CAP_TO_MASK(c);
        data[CAP_TO_INDEX(c)].permitted |= CAP_TO_MASK(c);
        data[CAP_TO_INDEX(c)].inheritable |= CAP_TO_MASK(c);
    }
    if (syscall(SYS_capset, &header, data) != 0) {
        *err = std::string("capset: ") + strerror(errno);
        return false;
    }
    return true;
}

}  // namespace

bool runsWithPhoneUsers() { return geteuid() == 0; }

bool parseServiceUser(const std::string &rcText, ServiceUser *user, std::string *err) {
    std::istringstream in(rcText);
    bool inService = false, found = false, hasUser = false;
    ServiceUser u;
    for (std::string line; std::getline(in, line);) {
        std::vector<std::string> w = words(line);
        if (w.empty()) continue;
        if (w[0] == "service" || w[0] == "on") {
            inService = w[0] == "service" && w.size() > 1 && w[1] == kServiceName;
            found = found || inService;
            continue;
        }
        if (!inService) continue;
        unsigned id = 0;
        if (w[0] == "user" && w.size() == 2) {
            if (!androidId(w[1], &id)) {
                *err = "unknown user " + w[1];
                return false;
            }
            u.uid = id;
            hasUser = true;
        } else if (w[0] == "group") {
            for (size_t i = 1; i < w.size(); i++) {
                if (!androidId(w[i], &id)) {
                    *err = "unknown group " + w[i];
                    return false;
                }
                if (i == 1) u.gid = id;
                u.groups.push_back(id);
            }
        } else if (w[0] == "capabilities") {
            for (size_t i = 1; i < w.size(); i++) {
                auto it = kCapabilities.find(w[i]);
                if (it == kCapabilities.end()) {
                    *err = "unknown capability " + w[i];
                    return false;
                }
                u.caps.push_back(it->second);
            }
        }
    }
    if (!found || !hasUser) {
        *err = std::string("no service ") + kServiceName + " with a user in the .rc file";
        return false;
    }
    // Without a group line init runs the service in the user's own group.
    if (u.groups.empty()) u.gid = u.uid;
    *user = u;
    return true;
}

bool prepareDeviceUsers(const RootLayout &L, std::string *err) {
    // The device build names the uid of its CIT application; this phone's is
    // the simulated peer's (unless `up --prop` gave another).
    char current[PROPERTY_VALUE_MAX] = {0};
    property_get(kCitUidProperty, current, "");
    if (current[0] == '\0') {
        uid_t app = runsWithPhoneUsers() ? kSimCitAppUid : getuid();
        property_set(kCitUidProperty, std::to_string(app).c_str());
    }
    if (!runsWithPhoneUsers()) return true;
    if (!loadDefinitions(err)) return false;
    ownDeviceRoot(L);
    return true;
}

void ownDeviceRoot(const RootLayout &L) {
    if (!gDefs.loaded) return;
    for (const Owner &o : gDefs.owners) {
        if (!hasWildcard(o.pattern)) {
            applyOwner(o.pattern.empty() ? L.root : L.path(o.pattern), o);
            continue;
        }
        std::string dir = o.pattern.substr(0, o.pattern.rfind('/'));
        std::error_code ec;
        for (const auto &e : std::filesystem::directory_iterator(L.path(dir), ec)) {
            std::string r = dir + "/" + e.path().filename().string();
            if (fnmatch(o.pattern.c_str(), r.c_str(), FNM_PATHNAME) == 0 && ownerFor(r) == &o) applyOwner(L.path(r), o);
        }
    }
}

void ownDevicePath(const RootLayout &L, const std::string &devicePath) {
    std::string err;
    if (!runsWithPhoneUsers() || !loadDefinitions(&err)) return;
    std::string r = rel(devicePath);
    if (const Owner *o = ownerFor(r)) applyOwner(L.path(r), *o);
}

void ownSerialPort(int slaveFd) {
    if (!gDefs.loaded) return;
    if (const Owner *o = ownerFor("dev/ttyGS0")) {
        if (fchown(slaveFd, o->uid, o->gid) != 0 || fchmod(slaveFd, o->mode) != 0)
            fprintf(stderr, "tolk-sim: cannot give the serial port its owner: %s\n", strerror(errno));
    }
}

bool becomeServiceUser(std::string *err) {
    if (!runsWithPhoneUsers()) return true;
    if (!gDefs.loaded) {
        *err = "the service definition was not read";
        return false;
    }
    const ServiceUser &u = gDefs.user;
    auto wanted = [&](int c) {
        for (int w : u.caps)
            if (w == c) return true;
        return false;
    };
    // As init does: the bounding set first (it needs CAP_SETPCAP, still held),
    // then groups and ids keeping the permitted set across the uid change, then
    // the service's capabilities as the only ones, raised into the ambient set
    // so that they survive the exec of an ordinary binary.
    for (int c = 0; prctl(PR_CAPBSET_READ, c, 0, 0, 0) >= 0; c++) {
        if (!wanted(c) && prctl(PR_CAPBSET_DROP, c, 0, 0, 0) != 0) {
            *err = "cannot drop capability " + std::to_string(c) + ": " + strerror(errno);
            return false;
        }
    }
    if (setgroups(u.groups.size(), u.groups.data()) != 0 || setresgid(u.gid, u.gid, u.gid) != 0 ||
        prctl(PR_SET_KEEPCAPS, 1, 0, 0, 0) != 0 || setresuid(u.uid, u.uid, u.uid) != 0) {
        *err = std::string("cannot become the service user: ") + strerror(errno);
        return false;
    }
    if (!setCapabilities(u.caps, err)) return false;
    for (int c : u.caps) {
        if (prctl(PR_CAP_AMBIENT, PR_CAP_AMBIENT_RAISE, c, 0, 0) != 0) {
            *err = std::string("cannot raise an ambient capability: ") + strerror(errno);
            return false;
        }
    }
    prctl(PR_SET_KEEPCAPS, 0, 0, 0, 0);
    return true;
}

bool becomeTestApp(int logFd, std::string *err) {
    if (!runsWithPhoneUsers()) return true;
    const uid_t app = kSimCitAppUid;
    if ((logFd >= 0 && fchown(logFd, app, app) != 0) || setgroups(0, nullptr) != 0 ||
        setresgid(app, app, app) != 0 || setresuid(app, app, app) != 0) {
        *err = std::string("cannot become the test application's user: ") + strerror(errno);
        return false;
    }
    return true;
}

}  // namespace sim
