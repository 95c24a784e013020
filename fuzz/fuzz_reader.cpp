// The command line reader fed arbitrary host bytes, as serial reads through a real
// pseudo-terminal in the daemon's own line settings, or as adb packets whose
// boundaries the fuzzer picks, optionally with every line routed as the main loop
// does (which drives the SMS text phases and OP12 merging).
//
// The reader waits for the host by design. The harness knows when the host has
// nothing more to say: once every byte is fed, a wait in select or read with
// nothing readable ends the run (jumping back here from the wrapped call) instead
// of blocking the fuzzer. The adb writer hangs up after its last packet, so that
// link also ends the way a host that goes away ends it.
//
// Input: [flags] piece [\xfe\xfe\xfe piece ...]
//   flags bit 0: adb link (else serial); bit 1: route every line;
//   bit 2: an SMS command already waits for its text (isMsgCmdInput);
//   bit 3: the first piece is an SMS command held for OP12 merging;
//   bit 4: text mode (msgCmdMode 1); bit 5: operator OP12 for routing.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <setjmp.h>
#include <stdint.h>
#include <stdlib.h>
#include <string.h>
#include <sys/select.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <cutils/properties.h>

#include "attok/at_tok.h"
#include "core/reader.h"
#include "core/sms_merge.h"
#include "fuzz_env.h"
#include "serial/response_writer.h"
#include "serial/serial_device.h"
#include "targets/target_conn.h"

namespace {

const char kSerialLink[] = "/dev/ttyFUZZ";

sigjmp_buf gOut;
bool gArmed = false;
std::atomic<int> gMaster{-1};  // host side of the pseudo-terminal
std::atomic<int> gAdbHost{-1};
// A second descriptor of the daemon's terminal, the harness's own: the daemon may
// close and reopen its descriptor at any time.
std::atomic<int> gSlaveProbe{-1};

void check(bool ok) {
    if (!ok) abort();
}

bool readable(int fd, int timeoutMs) {
    if (fd < 0) return false;
    struct pollfd p = {fd, POLLIN, 0};
    return poll(&p, 1, timeoutMs) > 0 && (p.revents & (POLLIN | POLLHUP | POLLERR)) != 0;
}

// The host reads its end all the time, as a real one does: otherwise the echo of a
// long input fills the terminal and the daemon's next answer would wait for room.
std::mutex gHostMutex;
std::atomic<bool> gDrainerUp{false};

void drainOnce(int timeoutMs) {
    char buf[8192];
    const int master = gMaster, adbHost = gAdbHost;
    // The port keeps the driver's XON/XOFF flow control: an XOFF byte in the input
    // stops the daemon's answers until the host sends XON. This host sends XON now
    // and then; the line discipline swallows it while flow control is on, and it is
    // only sent then.
    static unsigned tick = 0;
    struct termios t;
    if (++tick % 8 == 0 && master >= 0 && gSlaveProbe >= 0 && tcgetattr(gSlaveProbe, &t) == 0 && (t.c_iflag & IXON))
        (void)!write(master, "\x11", 1);
    struct pollfd p[2] = {{master, POLLIN, 0}, {adbHost, POLLIN, 0}};
    if (poll(p, 2, timeoutMs) <= 0) return;
    if (master >= 0 && (p[0].revents & POLLIN)) (void)!read(master, buf, sizeof(buf));
    if (adbHost >= 0 && (p[1].revents & POLLIN)) (void)!recv(adbHost, buf, sizeof(buf), MSG_DONTWAIT);
}

void startDrainer() {
    if (gDrainerUp.exchange(true)) return;
    std::thread([] {
        for (;;) {
            {
                std::lock_guard<std::mutex> lock(gHostMutex);
                drainOnce(1);
            }
            std::this_thread::sleep_for(std::chrono::microseconds(50));
        }
    }).detach();
}

void drainHost() {
    std::lock_guard<std::mutex> lock(gHostMutex);
    for (int i = 0; i < 4; i++) drainOnce(0);
}

// The daemon's end of the pseudo-terminal opened through the daemon itself, under a
// device path that a reopen after a read error finds again.
void openSerial() {
    gMaster = posix_openpt(O_RDWR | O_NOCTTY | O_NONBLOCK);
    if (gMaster < 0 || grantpt(gMaster) != 0 || unlockpt(gMaster) != 0) abort();
    std::string link = fuzzenv::root() + kSerialLink;
    unlink(link.c_str());
    fuzzenv::writeFile("/dev/.keep", "", 0);
    if (symlink(ptsname(gMaster), link.c_str()) != 0) abort();
    // openat: the wrapped open would look for the terminal under the device root.
    gSlaveProbe = openat(AT_FDCWD, ptsname(gMaster), O_RDWR | O_NOCTTY);
    snprintf(gSerialDevice.devName[DEVICE_SERIAL], sizeof(gSerialDevice.devName[0]), "%s", kSerialLink);
    gSerialDevice.fd[DEVICE_SERIAL] = open_serial_device(&gSerialDevice, kSerialLink);
    check(gSerialDevice.fd[DEVICE_SERIAL] >= 0);
}

void closeAll() {
    std::lock_guard<std::mutex> lock(gHostMutex);
    for (int &fd : gSerialDevice.fd) {
        if (fd >= 0) close(fd);
        fd = -1;
    }
    if (gMaster >= 0) close(gMaster);
    if (gSlaveProbe >= 0) close(gSlaveProbe);
    gSlaveProbe = -1;
    if (gAdbHost >= 0) close(gAdbHost);
    gMaster = gAdbHost = -1;
}

// Every line the reader hands over lies within cmdBuf and is terminated there.
void checkLine(const char *line) {
    if (line == nullptr) return;
    check(line == gSerialDevice.cmdBuf);
    check(gSerialDevice.cmdLen >= 0 && gSerialDevice.cmdLen <= MAX_DATA_LEN);
    check(memchr(gSerialDevice.cmdBuf, '\0', sizeof(gSerialDevice.cmdBuf)) != nullptr);
}

}  // namespace

// The reader's waits. Once armed, a wait on descriptors none of which can become
// readable any more means the host is done: the run ends here.
extern "C" int __real_select(int, fd_set *, fd_set *, fd_set *, struct timeval *);
extern "C" int __wrap_select(int n, fd_set *r, fd_set *w, fd_set *e, struct timeval *t) {
    if (gArmed && r != nullptr && t == nullptr) {
        bool any = false;
        for (int fd = 0; fd < n && !any; fd++) {
            // The pseudo-terminal hands bytes to the reading side a moment after
            // they were written: give it that moment.
            if (FD_ISSET(fd, r) && readable(fd, fd == gSerialDevice.fd[DEVICE_SERIAL] ? 1 : 0)) any = true;
        }
        if (!any) siglongjmp(gOut, 1);
    }
    return __real_select(n, r, w, e, t);
}

extern "C" ssize_t __real_read(int, void *, size_t);
extern "C" ssize_t __wrap_read(int fd, void *buf, size_t n) {
    if (gArmed && (fd == gSerialDevice.fd[DEVICE_SERIAL] || fd == gSerialDevice.fd[DEVICE_ADB]) &&
        !readable(fd, fd == gSerialDevice.fd[DEVICE_SERIAL] ? 1 : 0)) {
        siglongjmp(gOut, 1);
    }
    return __real_read(fd, buf, n);
}

// The reader pauses 10 ms after each serial read to let the link settle; a fuzz run
// has no link to wait for.
extern "C" int __wrap_usleep(useconds_t) { return 0; }

namespace {

bool gRoute = false;
int gSerialFd = -1;  // the port as opened; the terminal never goes away in a run
size_t gLines = 0;
size_t gBudget = 0;

// Runs reading cycles until the host has nothing more for the reader.
void runReader() {
    gArmed = true;
    if (sigsetjmp(gOut, 0) == 0) {
        for (;;) {
            char *line = readline(&gSerialDevice);
            checkLine(line);
            // Nothing a host sends may make the reader take the port for dead: a
            // reopen flushes whatever the host has queued.
            // (A reopen usually gets the same number back; only the original
            // descriptor carries the close-on-exec mark set below.)
            check(gSerialFd < 0 || (gSerialDevice.fd[DEVICE_SERIAL] == gSerialFd &&
                                    (fcntl(gSerialFd, F_GETFD) & FD_CLOEXEC) != 0));
            // Each line or empty cycle consumes host input or ends a link; more of
            // them than bytes given is a loop that makes no progress.
            check(++gLines <= gBudget);
            if (gRoute) routeCommandLine(&gSerialDevice, line);
            drainHost();
            if (line == nullptr && gSerialDevice.fd[DEVICE_ADB] < 0 && gSerialDevice.fd[DEVICE_SERIAL] < 0) break;
        }
    }
    gArmed = false;
    drainHost();
}

void feed(int fd, const uint8_t *p, size_t n, bool packet) {
    size_t off = 0;
    int stuck = 0;
    while (off < n && stuck < 3) {
        ssize_t w = packet ? send(fd, p + off, n - off, MSG_DONTWAIT | MSG_NOSIGNAL) : write(fd, p + off, n - off);
        if (w > 0) {
            off += (size_t)w;
            stuck = 0;
            if (packet) return;
        } else {
            // Full: let the reader take what is there, then go on.
            runReader();
            stuck++;
        }
    }
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    fuzzenv::init();
    startDrainer();
    fuzzenv::InRoot in;
    property_set("persist.service.tolk.usermode", "1");
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    if (size == 0) return 0;
    fuzzenv::InRoot in;
    const uint8_t flags = data[0];
    const bool adb = (flags & 1) != 0;
    std::vector<std::pair<const uint8_t *, size_t>> pieces;
    fuzzenv::forEachPiece(data + 1, size - 1, [&](const uint8_t *p, size_t n) { pieces.emplace_back(p, n); });

    static int lastOperator = -1;
    if (lastOperator != ((flags >> 5) & 1)) {
        lastOperator = (flags >> 5) & 1;
        property_set("persist.operator.optr", lastOperator ? "OP12" : "OM");
        readerLoopPreamble();
    }

    memset(&gSerialDevice, 0, sizeof(gSerialDevice));
    for (int &fd : gSerialDevice.fd) fd = -1;
    gSerialDevice.echoOption[DEVICE_SERIAL] = 1;
    gNumericMode = false;
    isMsgCmdInput = (flags & 4) != 0;
    isNeedMergeMsgCmdInput = false;
    msgCmdMode = (flags & 16) ? 1 : 0;
    discardAdbLine();
    gRoute = (flags & 2) != 0;
    gLines = 0;
    gBudget = size + pieces.size() + 8;

    if (adb) {
        int sv[2];
        if (socketpair(AF_UNIX, SOCK_SEQPACKET, 0, sv) != 0) abort();
        gSerialDevice.fd[DEVICE_ADB] = sv[0];
        gAdbHost = sv[1];
        gSerialDevice.currDevice = DEVICE_ADB;
        gSerialFd = -1;
    } else {
        openSerial();
        gSerialFd = gSerialDevice.fd[DEVICE_SERIAL];
        fcntl(gSerialFd, F_SETFD, FD_CLOEXEC);
        gSerialDevice.currDevice = DEVICE_SERIAL;
    }

    size_t first = 0;
    if ((flags & 8) && !pieces.empty()) {
        // The held command as routing leaves it: normalised in cmdBuf, then the
        // merge starts if its parameters allow.
        size_t n = pieces[0].second < MAX_DATA_LEN ? pieces[0].second : MAX_DATA_LEN;
        memcpy(gSerialDevice.cmdBuf, pieces[0].first, n);
        gSerialDevice.cmdBuf[n] = '\0';
        char *line = gSerialDevice.cmdBuf;
        convertToUpperCase(line, '=');
        trim_string(&line);
        if (line != gSerialDevice.cmdBuf) memmove(gSerialDevice.cmdBuf, line, strlen(line) + 1);
        gSerialDevice.cmdLen = (int)strlen(gSerialDevice.cmdBuf);
        if (isMsgCmd(gSerialDevice.cmdBuf)) {
            isMsgCmdInput = true;
            if (startMergeMsgCmdInputIfNeed(&gSerialDevice, gSerialDevice.cmdBuf)) isNeedMergeMsgCmdInput = true;
        }
        drainHost();
        first = 1;
    }

    for (size_t i = first; i < pieces.size(); i++) {
        if (adb) {
            // An empty packet would read as the end of the connection.
            if (pieces[i].second == 0 || gSerialDevice.fd[DEVICE_ADB] < 0) continue;
            feed(gAdbHost, pieces[i].first, pieces[i].second, true);
        } else {
            feed(gMaster, pieces[i].first, pieces[i].second, false);
        }
        runReader();
    }
    if (adb && gAdbHost >= 0) {
        // The host hangs up: the reader must see the end and drop the connection.
        shutdown(gAdbHost, SHUT_WR);
        runReader();
        check(gSerialDevice.fd[DEVICE_ADB] < 0);
    }

    closeAll();
    isMsgCmdInput = isNeedMergeMsgCmdInput = false;
    fuzzenv::trimJournals();
    return 0;
}
