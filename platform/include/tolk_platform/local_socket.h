// Host-only: the serving side of the local socket addresses that the daemon reaches
// with socket_local_client, for tolk-sim's peers and the tests.
#ifndef TOLK_PLATFORM_LOCAL_SOCKET_H
#define TOLK_PLATFORM_LOCAL_SOCKET_H

#include <stddef.h>
#include <sys/un.h>

#ifdef __cplusplus
extern "C" {
#endif

// Fills addr with the address socket_local_client uses for name in namespace ns
// (ANDROID_SOCKET_NAMESPACE_*); returns the address length, or -1 with errno.
int tolk_local_address(const char *name, int ns, struct sockaddr_un *addr);
// A socket of the given type bound to that address and, for stream and seqpacket
// types, listening with backlog. For the reserved and filesystem namespaces the
// parent folders are created and a stale socket file is removed first; a socket
// file that still has a live server is left alone (-1, errno EADDRINUSE).
// Returns the descriptor (close-on-exec), or -1 with errno.
int tolk_local_server(const char *name, int ns, int type, int backlog);

#ifdef __cplusplus
}
#endif

#endif
