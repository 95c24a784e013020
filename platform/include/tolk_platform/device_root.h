// Host-only: the simulated device's root folder. Never included by the daemon's
// sources; the platform stand-ins, tolk-sim and the tests use it.
#ifndef TOLK_PLATFORM_DEVICE_ROOT_H
#define TOLK_PLATFORM_DEVICE_ROOT_H

#include <stddef.h>

#ifdef __cplusplus
extern "C" {
#endif

#define TOLKD_ROOT_ENV "TOLKD_ROOT"

// The root named by TOLKD_ROOT, or NULL when unset or empty (paths used unchanged).
const char *tolk_device_root(void);
// Resolves a device path under the root (unchanged without a root or for relative
// paths). Returns out, or NULL when the result does not fit into size bytes.
const char *tolk_device_path(const char *path, char *out, size_t size);
// The abstract-namespace socket name for name, made unique per device root.
// Returns the length of the name written into out (no leading NUL), or -1.
int tolk_abstract_name(const char *name, char *out, size_t size);

#ifdef __cplusplus
}
#endif

#endif
