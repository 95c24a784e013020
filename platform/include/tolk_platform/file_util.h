// Host-only file helpers shared by the platform stand-ins and tolk-sim. They use
// openat() rather than open()/fopen(), so they reach exactly the host path they are
// given even inside the daemon, where open and fopen are redirected under the root.
#ifndef TOLK_PLATFORM_FILE_UTIL_H
#define TOLK_PLATFORM_FILE_UTIL_H

#include <stdbool.h>
#include <stddef.h>
#include <sys/types.h>

#ifdef __cplusplus
extern "C" {
#endif

// Creates dir and any missing parents (mode 0755); 0, or -1 with errno.
int tolk_mkdirs(const char *dir);
// Creates the folders above path; 0 or -1.
int tolk_mkdirs_for(const char *path);
// Replaces path with len bytes of data so that a reader sees either the old or the
// new content, never a mix: the data goes into a temporary file in the same folder,
// which is then renamed over path. With replace false the file is only created:
// -1 with errno EEXIST when path already exists. Creates missing folders. 0 or -1.
int tolk_write_file_atomic(const char *path, const void *data, size_t len, bool replace);
// Reads at most size - 1 bytes of path into buf and NUL-terminates them; returns the
// number of bytes read, or -1 with errno.
ssize_t tolk_read_file(const char *path, char *buf, size_t size);
// Appends len bytes to path with one write() (O_APPEND), creating the file and its
// folders; 0 or -1.
int tolk_append_file(const char *path, const void *data, size_t len);

#ifdef __cplusplus
}
#endif

#endif
