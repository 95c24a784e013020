// libtolk-acm.so, preloaded by `tolk-sim host` into a host program: it gives the
// simulated host port, a pseudo-terminal, the modem-control lines of the USB ACM
// port /dev/ttyACM0 that a factory host talks to. A pseudo-terminal answers
// TIOCMGET and friends with ENOTTY, which stops serial tools that drop DTR to
// reset a modem or read CD to see the cable.
//
// Only descriptors open on the host port (same device number as
// $TOLK_ACM_TTY) are handled, and only these requests:
//   TIOCMGET, TIOCMSET, TIOCMBIS, TIOCMBIC  DTR and RTS as set; DSR, CTS and CD
//                                           asserted while the cable is in
//   TIOCMIWAIT                              wakes when a line in the mask changes
//   TIOCGICOUNT                             the input lines' transition counts
// The state is the file $TOLK_ACM_LINES, shared with the supervisor, which pulls
// the cable (acm_lines.h). Everything else goes to the real ioctl unchanged.
// Line settings need nothing here: a pseudo-terminal takes any baud rate,
// CRTSCTS, CLOCAL and HUPCL as a real port does.
#include <dlfcn.h>
#include <errno.h>
#include <fcntl.h>
#include <linux/serial.h>
#include <poll.h>
#include <stdarg.h>
#include <stdlib.h>
#include <string.h>
#include <sys/inotify.h>
#include <sys/ioctl.h>
#include <sys/stat.h>
#include <unistd.h>

#include "acm_lines.h"

namespace {

using IoctlFn = int (*)(int, unsigned long, ...);

IoctlFn realIoctl() {
    static IoctlFn fn = reinterpret_cast<IoctlFn>(dlsym(RTLD_NEXT, "ioctl"));
    return fn;
}

bool handledRequest(unsigned long request) {
    switch (request) {
    case TIOCMGET:
    case TIOCMSET:
    case TIOCMBIS:
    case TIOCMBIC:
    case TIOCMIWAIT:
    case TIOCGICOUNT:
        return true;
    default:
        return false;
    }
}

// Whether fd is open on the host port: the same character device, whatever
// path or symlink it was opened by.
bool isHostPort(int fd) {
    const char *port = getenv("TOLK_ACM_TTY");
    if (!port || !*port) return false;
    struct stat a, b;
    if (fstat(fd, &a) != 0 || !S_ISCHR(a.st_mode)) return false;
    if (stat(port, &b) != 0 || !S_ISCHR(b.st_mode)) return false;
    return a.st_rdev == b.st_rdev;
}

// The line state file, opened for one request; -1 when it cannot be.
int openLines() {
    const char *path = getenv("TOLK_ACM_LINES");
    if (!path || !*path) return -1;
    return open(path, O_RDWR | O_CLOEXEC);
}

int modemBits(const acm::Lines &l) {
    int bits = 0;
    if (l.dtr) bits |= TIOCM_DTR;
    if (l.rts) bits |= TIOCM_RTS;
    if (l.cable) bits |= TIOCM_DSR | TIOCM_CTS | TIOCM_CD;
    return bits;
}

int fail(int err) {
    errno = err;
    return -1;
}

// The change TIOCMIWAIT waits for, as the serial drivers judge it: a counter of
// a line in the mask moved (a drop and a rise in between count too).
bool changed(const acm::Lines &before, const acm::Lines &now, unsigned long mask) {
    return ((mask & TIOCM_DSR) && before.dsrCount != now.dsrCount) ||
           ((mask & TIOCM_CTS) && before.ctsCount != now.ctsCount) ||
           ((mask & TIOCM_CD) && before.dcdCount != now.dcdCount);
}

// Blocks until a line in mask changes (0), a signal arrives (EINTR) or the port
// is hung up (EIO): the supervisor went away.
int waitForChange(int port, int linesFd, unsigned long mask) {
    const char *path = getenv("TOLK_ACM_LINES");
    int watch = inotify_init1(IN_CLOEXEC | IN_NONBLOCK);
    if (watch < 0) return -1;
    // The watch first, then the reading: a change in between is not missed.
    acm::Lines before, now;
    errno = EIO;
    if (inotify_add_watch(watch, path, IN_MODIFY) < 0 || !acm::readLines(linesFd, &before)) {
        int err = errno;
        close(watch);
        return fail(err);
    }
    int result = 0;
    for (;;) {
        struct pollfd fds[2] = {{watch, POLLIN, 0}, {port, 0, 0}};
        if (poll(fds, 2, -1) < 0) {
            result = fail(errno);
            break;
        }
        if (fds[1].revents & (POLLHUP | POLLERR | POLLNVAL)) {
            result = fail(EIO);
            break;
        }
        char events[4096];
        while (read(watch, events, sizeof events) > 0) {
        }
        if (acm::readLines(linesFd, &now) && changed(before, now, mask)) break;
    }
    close(watch);
    return result;
}

int acmIoctl(int port, unsigned long request, void *arg) {
    int linesFd = openLines();
    if (linesFd < 0) return fail(EIO);
    int result = 0;
    acm::Lines l;
    switch (request) {
    case TIOCMGET:
        if (!arg) {
            result = fail(EFAULT);
        } else if (!acm::readLines(linesFd, &l)) {
            result = fail(EIO);
        } else {
            *static_cast<int *>(arg) = modemBits(l);
        }
        break;
    case TIOCMSET:
    case TIOCMBIS:
    case TIOCMBIC: {
        if (!arg) {
            result = fail(EFAULT);
            break;
        }
        // Only DTR and RTS are outputs of the host; other bits are ignored.
        int bits = *static_cast<const int *>(arg);
        bool ok = acm::updateLines(linesFd, [request, bits](acm::Lines *s) {
            if (request == TIOCMSET) {
                s->dtr = (bits & TIOCM_DTR) ? 1 : 0;
                s->rts = (bits & TIOCM_RTS) ? 1 : 0;
            } else {
                unsigned v = request == TIOCMBIS ? 1 : 0;
                if (bits & TIOCM_DTR) s->dtr = v;
                if (bits & TIOCM_RTS) s->rts = v;
            }
        });
        if (!ok) result = fail(EIO);
        break;
    }
    case TIOCMIWAIT:
        result = waitForChange(port, linesFd, reinterpret_cast<unsigned long>(arg));
        break;
    case TIOCGICOUNT: {
        if (!arg) {
            result = fail(EFAULT);
        } else if (!acm::readLines(linesFd, &l)) {
            result = fail(EIO);
        } else {
            struct serial_icounter_struct ic;
            memset(&ic, 0, sizeof ic);
            ic.dsr = static_cast<int>(l.dsrCount);
            ic.cts = static_cast<int>(l.ctsCount);
            ic.dcd = static_cast<int>(l.dcdCount);
            memcpy(arg, &ic, sizeof ic);
        }
        break;
    }
    default:
        result = fail(EINVAL);
        break;
    }
    int saved = errno;
    close(linesFd);
    errno = saved;
    return result;
}

}  // namespace

extern "C" int ioctl(int fd, unsigned long request, ...) noexcept {
    va_list ap;
    va_start(ap, request);
    void *arg = va_arg(ap, void *);
    va_end(ap);
    int saved = errno;
    if (handledRequest(request) && isHostPort(fd)) return acmIoctl(fd, request, arg);
    errno = saved;
    IoctlFn real = realIoctl();
    if (!real) return fail(ENOSYS);
    return real(fd, request, arg);
}
