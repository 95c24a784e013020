// `tolk-sim host`: a host program, unchanged, with the host port behaving as the
// USB ACM port of a real host (modem-control lines, see acm_shim.cpp).
#include <errno.h>
#include <limits.h>
#include <stdlib.h>
#include <unistd.h>

#include <cstdio>
#include <cstring>

#include <tolk_platform/device_root.h>

#include "acm_lines.h"
#include "sim_host_tools.h"
#include "sim_util.h"

#ifndef TOLK_ACM_LIBRARY
#define TOLK_ACM_LIBRARY "libtolk-acm.so"
#endif

namespace sim {

namespace {

const char kLibraryName[] = "libtolk-acm.so";

// The interposer built with this tolk-sim, or the one beside the binary when
// the build folder has moved.
std::string acmLibrary() {
    if (access(TOLK_ACM_LIBRARY, R_OK) == 0) return TOLK_ACM_LIBRARY;
    char exe[PATH_MAX];
    ssize_t n = readlink("/proc/self/exe", exe, sizeof exe - 1);
    if (n <= 0) return "";
    std::string path(exe, static_cast<size_t>(n));
    path = path.substr(0, path.rfind('/') + 1) + kLibraryName;
    return access(path.c_str(), R_OK) == 0 ? path : "";
}

void prependEnv(const char *name, const std::string &value, const char *separator) {
    const char *old = getenv(name);
    std::string v = value;
    if (old && *old) v += separator + std::string(old);
    setenv(name, v.c_str(), 1);
}

}  // namespace

int cmdHost(const std::string &root, const std::vector<std::string> &command) {
    if (command.empty()) {
        fprintf(stderr, "tolk-sim host: no command to run (tolk-sim host --root DIR -- CMD ARGS...)\n");
        return 2;
    }
    std::string lib = acmLibrary();
    if (lib.empty()) {
        fprintf(stderr, "tolk-sim host: %s is missing (built beside tolk-sim)\n", kLibraryName);
        return 1;
    }
    RootLayout L{root};
    prependEnv("LD_PRELOAD", lib, " ");
    setenv("TOLK_ACM_TTY", L.hostTty().c_str(), 1);
    setenv("TOLK_ACM_LINES", L.path(acm::kStateFile).c_str(), 1);
    setenv("TOLK_HOST_TTY", L.hostTty().c_str(), 1);
    // A host program is no part of the device: nothing of it resolves paths
    // under the root.
    unsetenv(TOLKD_ROOT_ENV);
    // A program built with AddressSanitizer refuses to start when a library is
    // preloaded ahead of its runtime; the interposer does not use it.
    prependEnv("ASAN_OPTIONS", "verify_asan_link_order=0", ":");
    std::vector<char *> argv;
    for (const auto &a : command) argv.push_back(const_cast<char *>(a.c_str()));
    argv.push_back(nullptr);
    fflush(stdout);
    execvp(argv[0], argv.data());
    fprintf(stderr, "tolk-sim host: cannot run %s: %s\n", argv[0], strerror(errno));
    return 127;
}

}  // namespace sim
