// The serial link: the gadget and host pseudo-terminal pairs, the relay between
// their masters, the cable (replug, unplug) and the host port's modem-control
// lines that follow it (acm_lines.h).
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "acm_lines.h"
#include "sim_privilege.h"
#include "sim_supervisor.h"

namespace sim {

namespace {

// Bytes the relay holds per direction before it stops reading that side.
const size_t kRelayCap = 256 * 1024;

}  // namespace

bool openPty(PtyPair *p, std::string *err) {
    int m = posix_openpt(O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (m < 0 || grantpt(m) != 0 || unlockpt(m) != 0) {
        *err = std::string("cannot create a pseudo-terminal: ") + strerror(errno);
        if (m >= 0) close(m);
        return false;
    }
    char name[128];
    if (ptsname_r(m, name, sizeof name) != 0) {
        *err = std::string("ptsname: ") + strerror(errno);
        close(m);
        return false;
    }
    int s = open(name, O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (s < 0) {
        *err = std::string("cannot open ") + name + ": " + strerror(errno);
        close(m);
        return false;
    }
    fcntl(m, F_SETFL, fcntl(m, F_GETFL) | O_NONBLOCK);
    p->master = m;
    p->slave = s;
    p->slaveName = name;
    return true;
}

bool replaceSymlink(const std::string &target, const std::string &link) {
    std::string tmp = link + ".new";
    unlink(tmp.c_str());
    if (symlink(target.c_str(), tmp.c_str()) != 0) return false;
    if (rename(tmp.c_str(), link.c_str()) != 0) {
        unlink(tmp.c_str());
        return false;
    }
    return true;
}

bool Supervisor::setUpLink(std::string *err) {
    // The gadget side. Its terminal settings stay at the pseudo-terminal
    // defaults (ICRNL: a CR typed by the host ends a canonical line); the
    // daemon applies its own when it opens the port.
    if (!openPty(&dev_, err)) return false;
    ownSerialPort(dev_.slave);
    if (!replaceSymlink(dev_.slaveName, L_.deviceTty())) {
        *err = "cannot link " + L_.deviceTty() + ": " + strerror(errno);
        return false;
    }
    // The host side: a raw terminal, like the ACM port a host opens.
    if (!openPty(&host_, err)) return false;
    struct termios t;
    if (tcgetattr(host_.slave, &t) == 0) {
        cfmakeraw(&t);
        tcsetattr(host_.slave, TCSANOW, &t);
    }
    if (!replaceSymlink(host_.slaveName, L_.hostTty())) {
        *err = "cannot link " + L_.hostTty() + ": " + strerror(errno);
        return false;
    }

    // The host port's lines start as on a port just opened with the cable in.
    std::string lines = L_.path(acm::kStateFile);
    linesFd_ = open(lines.c_str(), O_RDWR | O_CREAT | O_TRUNC | O_CLOEXEC, 0644);
    if (linesFd_ < 0 || !acm::updateLines(linesFd_, [](acm::Lines *l) { *l = acm::Lines(); })) {
        *err = "cannot write " + lines + ": " + strerror(errno);
        return false;
    }
    return true;
}

void Supervisor::setCable(bool in) {
    if (linesFd_ >= 0 && !acm::updateLines(linesFd_, [in](acm::Lines *l) { acm::setCable(l, in); }))
        log("cannot update the host port's lines: %s", strerror(errno));
}

std::string Supervisor::replug() {
    PtyPair fresh;
    std::string err;
    if (!openPty(&fresh, &err)) return "error: " + err + "\n";
    ownSerialPort(fresh.slave);  // before tolkd can find it
    if (!replaceSymlink(fresh.slaveName, L_.deviceTty())) {
        close(fresh.master);
        close(fresh.slave);
        return "error: cannot relink " + L_.deviceTty() + "\n";
    }
    // Closing the old master hangs the old port up: tolkd's read fails and it
    // reopens /dev/ttyGS0, which now names the fresh terminal. The host sees
    // its carrier drop and come back, as when a cable is pulled and plugged in.
    setCable(false);
    if (dev_.master >= 0) close(dev_.master);
    if (dev_.slave >= 0) close(dev_.slave);
    dev_ = fresh;
    toDevice_.clear();  // bytes on the wire when the cable was pulled are lost
    setCable(true);
    log("replugged: %s", dev_.slaveName.c_str());
    return "ok\n" + dev_.slaveName + "\n";
}

std::string Supervisor::unplug() {
    unlink(L_.deviceTty().c_str());
    if (dev_.master >= 0) close(dev_.master);
    if (dev_.slave >= 0) close(dev_.slave);
    dev_ = PtyPair();
    toDevice_.clear();
    setCable(false);
    log("unplugged");
    return "ok\n";
}

std::string Supervisor::ttySettings() {
    if (dev_.slave < 0) return "error: the serial link is unplugged\n";
    struct termios t;
    if (tcgetattr(dev_.slave, &t) != 0) return std::string("error: tcgetattr: ") + strerror(errno) + "\n";
    char buf[256];
    snprintf(buf, sizeof buf,
             "ok\nc_iflag=0x%x\nc_oflag=0x%x\nc_lflag=0x%x\nVERASE=0x%02x\nVEOL=0x%02x\nVEOL2=0x%02x\n",
             static_cast<unsigned>(t.c_iflag), static_cast<unsigned>(t.c_oflag),
             static_cast<unsigned>(t.c_lflag), t.c_cc[VERASE], t.c_cc[VEOL], t.c_cc[VEOL2]);
    return buf;
}


void Supervisor::pumpRead(int fd, std::string *buf) {
    char tmp[4096];
    while (buf->size() < kRelayCap) {
        ssize_t n = read(fd, tmp, std::min(sizeof tmp, kRelayCap - buf->size()));
        if (n > 0) {
            buf->append(tmp, static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        break;  // EAGAIN, or EIO while nobody holds the slave
    }
}

void Supervisor::pumpWrite(int fd, std::string *buf) {
    while (!buf->empty()) {
        ssize_t n = write(fd, buf->data(), buf->size());
        if (n > 0) {
            buf->erase(0, static_cast<size_t>(n));
            continue;
        }
        if (n < 0 && errno == EINTR) continue;
        break;
    }
}

void Supervisor::relayLoop() {
    while (!stopping_) {
        long long now = nowMs();
        bool paused = now < pauseUntil_;
        struct pollfd fds[4];
        int nfds = 0;
        int iDev = -1, iHost = -1;
        fds[nfds++] = {signalFd_, POLLIN, 0};
        fds[nfds++] = {ctlFd_, POLLIN, 0};
        if (dev_.master >= 0) {
            short ev = 0;
            if (!paused && toHost_.size() < kRelayCap) ev |= POLLIN;
            if (!toDevice_.empty()) ev |= POLLOUT;
            iDev = nfds;
            fds[nfds++] = {dev_.master, ev, 0};
        }
        {
            short ev = 0;
            if (toDevice_.size() < kRelayCap) ev |= POLLIN;
            if (!toHost_.empty()) ev |= POLLOUT;
            iHost = nfds;
            fds[nfds++] = {host_.master, ev, 0};
        }
        int timeout = paused ? static_cast<int>(pauseUntil_ - now) : -1;
        int r = poll(fds, static_cast<nfds_t>(nfds), timeout);
        if (r < 0) {
            if (errno == EINTR) continue;
            log("poll failed: %s", strerror(errno));
            sleepMs(10);
            continue;
        }
        if (fds[0].revents & POLLIN) {
            unsigned char sigs[32];
            ssize_t n;
            while ((n = read(signalFd_, sigs, sizeof sigs)) > 0) {
                for (ssize_t k = 0; k < n; k++)
                    if (sigs[k] != SIGCHLD) stopping_ = true;
            }
            reapChildren();
            if (stopping_) {
                shutdownAll();
                return;
            }
        }
        if (fds[1].revents & POLLIN) {
            serveControl(ctlFd_);
            if (stopping_) return;
        }
        // Descriptors may have changed under a replug or unplug just served.
        if (iDev >= 0 && fds[iDev].fd == dev_.master) {
            if (fds[iDev].revents & (POLLIN | POLLHUP | POLLERR)) pumpRead(dev_.master, &toHost_);
            if (fds[iDev].revents & POLLOUT) pumpWrite(dev_.master, &toDevice_);
        }
        if (iHost >= 0) {
            if (fds[iHost].revents & (POLLIN | POLLHUP | POLLERR)) pumpRead(host_.master, &toDevice_);
            if (fds[iHost].revents & POLLOUT) pumpWrite(host_.master, &toHost_);
        }
        if (dev_.master < 0) toDevice_.clear();  // unplugged: the host types into nothing
        // Opportunistic flushes so that freshly read bytes do not wait a turn.
        if (dev_.master >= 0 && !toDevice_.empty()) pumpWrite(dev_.master, &toDevice_);
        if (!toHost_.empty()) pumpWrite(host_.master, &toHost_);
    }
}


}  // namespace sim
