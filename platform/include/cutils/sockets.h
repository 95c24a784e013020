// Host stand-in for Android's libcutils socket helpers.
#ifndef TOLK_PLATFORM_CUTILS_SOCKETS_H
#define TOLK_PLATFORM_CUTILS_SOCKETS_H

#include <sys/socket.h>

#ifdef __cplusplus
extern "C" {
#endif

#define ANDROID_SOCKET_ENV_PREFIX "ANDROID_SOCKET_"
#define ANDROID_SOCKET_DIR "/dev/socket"

#define ANDROID_SOCKET_NAMESPACE_ABSTRACT 0
#define ANDROID_SOCKET_NAMESPACE_RESERVED 1
#define ANDROID_SOCKET_NAMESPACE_FILESYSTEM 2

// The descriptor of the socket init created for this service under name, or -1.
int android_get_control_socket(const char *name);
// A client socket of the given type connected to name in the given namespace, or -1.
int socket_local_client(const char *name, int namespaceId, int type);

#ifdef __cplusplus
}
#endif

#endif
