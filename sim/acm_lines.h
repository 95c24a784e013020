// The modem-control lines of the host serial port, as a USB ACM driver keeps
// them: DTR and RTS as the host last set them, DSR, CTS and CD following the
// cable, and a count of each input line's transitions (what TIOCGICOUNT reports
// and what TIOCMIWAIT waits on). The state lives in one small file under the
// device root, so that the supervisor (the cable) and every host program run
// through `tolk-sim host` (DTR, RTS) see the same port. Header-only: the
// interposer library uses it without the rest of tolk-sim.
#ifndef TOLK_SIM_ACM_LINES_H
#define TOLK_SIM_ACM_LINES_H

#include <errno.h>
#include <stdio.h>
#include <sys/file.h>
#include <unistd.h>

namespace acm {

// The state file, relative to the device root.
constexpr const char kStateFile[] = "run/acm.lines";

struct Lines {
    unsigned dtr = 1;    // the host's output lines; an open port has them raised
    unsigned rts = 1;
    unsigned cable = 1;  // DSR, CTS and CD are asserted while the cable is in
    unsigned dsrCount = 0, ctsCount = 0, dcdCount = 0;
};

// One fixed-width record: every update rewrites the whole file in place with one
// write of the same length, under an exclusive lock; readers take a shared lock.
constexpr size_t kRecordSize = 59;

inline bool formatLines(const Lines &l, char (&out)[kRecordSize + 1]) {
    int n = snprintf(out, sizeof out, "dtr=%u rts=%u cable=%u dsr=%08x cts=%08x dcd=%08x\n", l.dtr & 1,
                     l.rts & 1, l.cable & 1, l.dsrCount, l.ctsCount, l.dcdCount);
    return n == static_cast<int>(kRecordSize);
}

inline bool parseLines(const char *text, Lines *l) {
    return sscanf(text, "dtr=%u rts=%u cable=%u dsr=%x cts=%x dcd=%x", &l->dtr, &l->rts, &l->cable, &l->dsrCount,
                  &l->ctsCount, &l->dcdCount) == 6;
}

inline bool readRecord(int fd, Lines *l) {
    char buf[kRecordSize + 1];
    ssize_t n;
    do {
        n = pread(fd, buf, kRecordSize, 0);
    } while (n < 0 && errno == EINTR);
    if (n != static_cast<ssize_t>(kRecordSize)) return false;
    buf[kRecordSize] = '\0';
    return parseLines(buf, l);
}

inline bool writeRecord(int fd, const Lines &l) {
    char buf[kRecordSize + 1];
    if (!formatLines(l, buf)) return false;
    ssize_t n;
    do {
        n = pwrite(fd, buf, kRecordSize, 0);
    } while (n < 0 && errno == EINTR);
    return n == static_cast<ssize_t>(kRecordSize);
}

inline void lockFile(int fd, int how) {
    while (flock(fd, how) != 0 && errno == EINTR) {
    }
}

// The state now, read under a shared lock.
inline bool readLines(int fd, Lines *l) {
    lockFile(fd, LOCK_SH);
    bool ok = readRecord(fd, l);
    lockFile(fd, LOCK_UN);
    return ok;
}

// Reads, changes and writes back the state under one exclusive lock, so that a
// host setting DTR and the supervisor pulling the cable never undo each other.
// change(Lines *) edits the state; a file without a valid record starts from
// the defaults.
template <typename Change>
bool updateLines(int fd, Change change) {
    lockFile(fd, LOCK_EX);
    Lines l;
    if (!readRecord(fd, &l)) l = Lines();
    change(&l);
    bool ok = writeRecord(fd, l);
    lockFile(fd, LOCK_UN);
    return ok;
}

// The cable goes in or out: the three input lines follow it, each transition
// counted.
inline void setCable(Lines *l, bool in) {
    unsigned v = in ? 1 : 0;
    if (l->cable == v) return;
    l->cable = v;
    l->dsrCount++;
    l->ctsCount++;
    l->dcdCount++;
}

}  // namespace acm

#endif
