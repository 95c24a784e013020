#include "fuzz_env.h"

#include <fcntl.h>
#include <stdio.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <filesystem>
#include <fstream>

#include "serial/serial_device.h"

namespace fs = std::filesystem;

namespace fuzzenv {
namespace {

std::string gRoot;
// putenv keeps the pointer, so the assignment text lives as long as the process.
char gRootAssign[512];
int gDepth = 0;

void removeRoot() {
    unsetenv("TOLKD_ROOT");
    std::error_code ec;
    if (!gRoot.empty()) fs::remove_all(gRoot, ec);
}

}  // namespace

void init() {
    if (!gRoot.empty()) return;
    // TMPDIR lets a campaign keep the roots that a crash leaves behind in one place.
    const char *tmp = getenv("TMPDIR");
    std::string base = tmp != nullptr && tmp[0] != '\0' ? tmp : "/tmp";
    std::string pattern = base + "/tolk-fuzz-XXXXXX";
    char tmpl[512];
    snprintf(tmpl, sizeof(tmpl), "%s", pattern.c_str());
    if (mkdtemp(tmpl) == nullptr) {
        perror("mkdtemp");
        abort();
    }
    gRoot = tmpl;
    snprintf(gRootAssign, sizeof(gRootAssign), "TOLKD_ROOT=%s", gRoot.c_str());
    atexit(removeRoot);
    // The daemon logs every byte at debug level; the fuzz runs want none of it. A
    // campaign that needs the log can set ANDROID_LOG_TAGS itself.
    setenv("ANDROID_LOG_TAGS", "*:s", 0);
    unsetenv("TOLKD_ROOT");
}

const std::string &root() { return gRoot; }

InRoot::InRoot() {
    if (gDepth++ == 0) putenv(gRootAssign);
}

InRoot::~InRoot() {
    if (--gDepth == 0) unsetenv("TOLKD_ROOT");
}

void writeFile(const char *devicePath, const void *data, size_t len) {
    fs::path p = gRoot + devicePath;
    fs::create_directories(p.parent_path());
    std::ofstream out(p, std::ios::binary | std::ios::trunc);
    out.write(static_cast<const char *>(data), static_cast<std::streamsize>(len));
}

void trimJournals() {
    static unsigned runs = 0;
    if (++runs % 1000 != 0) return;
    std::error_code ec;
    for (const char *j : {"/journal/shell.log", "/journal/adc_set.log"}) fs::remove(gRoot + j, ec);
}

HostSide::HostSide(int slot) : slot_(slot) {
    int sv[2];
    if (socketpair(AF_UNIX, SOCK_STREAM, 0, sv) != 0) {
        perror("socketpair");
        abort();
    }
    device_ = sv[0];
    host_ = sv[1];
    fcntl(host_, F_SETFL, O_NONBLOCK);
    gSerialDevice.fd[slot_] = device_;
    gSerialDevice.currDevice = slot_;
}

HostSide::~HostSide() {
    // The daemon may have closed its end itself after a failed write.
    if (gSerialDevice.fd[slot_] == device_) {
        close(device_);
        gSerialDevice.fd[slot_] = -1;
    }
    close(host_);
}

size_t HostSide::drain(std::string *out) {
    char buf[8192];
    size_t total = 0;
    ssize_t n;
    while ((n = read(host_, buf, sizeof(buf))) > 0) {
        total += static_cast<size_t>(n);
        if (out != nullptr) out->append(buf, static_cast<size_t>(n));
    }
    return total;
}

}  // namespace fuzzenv
