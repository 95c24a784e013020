// The simulated radio HAL service: instances "slot1".."slot4", each a simulated
// modem (or, for slot1, a real modem's serial device) behind the frame wire of
// radio_wire.h. One thread serves everything from a poll loop, so answers held
// back by a script never stop the other slots or the URC control socket. Each
// slot is one AT channel: its answers leave in the order of its requests, and a
// request that is not a line plus its NUL is refused and journalled as such.
#include "hostile.h"
#include "modem_script.h"
#include "modem_sim.h"
#include "peers.h"

#include <tolk_platform/radio_wire.h>

#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <string.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <cstdio>
#include <memory>

using namespace tolksim;

namespace {

const int kSlots = 4;
const int kIndicationUnsolicited = 0;
// What a refused request gets: the plain error a modem gives a line it cannot take.
const char kRefusedAnswer[] = "\r\nERROR\r\n";
// Hostile timing: how late an answer may be, and how often (in percent) the
// noise line stands before or after one.
const int kHostileLateMs = 12;
const int kNoisePercent = 30;

bool wireSend(int fd, uint32_t type, int32_t serial, int32_t extra, const std::string &payload) {
    return radio_wire_send(fd, type, serial, extra, payload.data(), static_cast<uint32_t>(payload.size())) == 0;
}

// One frame as bytes, so that several can leave in one write.
std::string wireFrame(uint32_t type, int32_t serial, int32_t extra, const std::string &payload) {
    RadioWireHeader h = {type, serial, extra, static_cast<uint32_t>(payload.size())};
    return std::string(reinterpret_cast<const char *>(&h), sizeof h) + payload;
}

bool wireRecv(int fd, RadioWireHeader *h, std::string *payload) {
    static std::vector<char> buf(RADIO_WIRE_MAX_PAYLOAD);
    if (radio_wire_recv(fd, h, buf.data(), buf.size()) != 0) return false;
    payload->assign(buf.data(), h->length);
    return true;
}

struct Client {
    int fd;
    bool registered;
    unsigned id;  // unique per connection, so answers for a closed one are dropped
};

struct Slot {
    int number = 0;  // 1..4
    int listenFd = -1;
    // Normally one: the daemon's proxy. Several may overlap (a probe, or a new
    // proxy while the old connection is still being torn down); each gets the
    // answers to its own requests, unsolicited output goes to the newest.
    std::vector<Client> clients;
    std::unique_ptr<ModemSim> modem;
    std::unique_ptr<ScriptFile> script;
    std::string journal;
};

struct Pending {
    int slot;
    unsigned client;
    int32_t serial;
    AnswerStep step;
    bool first, last;  // the answer's first and last step: where noise may stand
};

class RadioService {
public:
    RadioService(const std::string &root, const std::string &modemTty)
        : root_(root), modemTtyPath_(modemTty), common_(root + "/sim/radio/script"), hostile_(root, "radio") {}

    int run();

private:
    void acceptClient(Slot &s);
    void dropClient(Slot &s, unsigned id);
    void readClient(Slot &s, unsigned id);
    void answer(Slot &s, unsigned id, int32_t serial, const std::string &request);
    void queueAnswer(Slot &s, unsigned id, int32_t serial, const ScriptAnswer &sa);
    static Client *findClient(Slot &s, unsigned id);
    static Client *newestRegistered(Slot &s);
    void forwardToTty(const std::string &request);
    void readTty();
    void openTty();
    void serveControl();
    void deliverDue();

    std::string root_;
    std::string modemTtyPath_;
    int ttyFd_ = -1;
    int ctlFd_ = -1;
    ScriptFile common_;
    Slot slots_[kSlots];
    std::vector<Pending> pending_;
    unsigned nextClientId_ = 1;
    sim::Hostile hostile_;
};

Client *RadioService::findClient(Slot &s, unsigned id) {
    for (Client &c : s.clients)
        if (c.id == id) return &c;
    return nullptr;
}

Client *RadioService::newestRegistered(Slot &s) {
    for (auto it = s.clients.rbegin(); it != s.clients.rend(); ++it)
        if (it->registered) return &*it;
    return nullptr;
}

void RadioService::acceptClient(Slot &s) {
    int fd = accept4(s.listenFd, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) return;
    s.clients.push_back(Client{fd, false, nextClientId_++});
    // A new proxy starts a new session with the modem: an unfinished SMS text
    // phase of the previous one must not swallow its first command.
    s.modem->reset();
}

void RadioService::dropClient(Slot &s, unsigned id) {
    for (size_t i = 0; i < s.clients.size(); i++) {
        if (s.clients[i].id == id) {
            close(s.clients[i].fd);
            s.clients.erase(s.clients.begin() + static_cast<long>(i));
            return;
        }
    }
}

void RadioService::answer(Slot &s, unsigned id, int32_t serial, const std::string &request) {
    ScriptAnswer sa;
    bool scripted = s.script->lookup(request, &sa) || common_.lookup(request, &sa);
    if (!scripted) {
        if (s.number == 1 && !modemTtyPath_.empty()) {
            forwardToTty(request);
            return;
        }
        std::string text;
        if (!s.modem->handle(request, &text)) return;
        sa.frames.push_back(text);
    }
    queueAnswer(s, id, serial, sa);
}

void RadioService::queueAnswer(Slot &s, unsigned id, int32_t serial, const ScriptAnswer &sa) {
    std::vector<AnswerStep> steps = answerSteps(sa, nowMs());
    // Hostile: each answer a few ms late by its own measure, so that a later
    // answer due sooner waits behind it and both leave together.
    int late = hostile_.on() ? hostile_.below(kHostileLateMs + 1) : 0;
    for (size_t i = 0; i < steps.size(); i++) {
        steps[i].due += late;
        pending_.push_back(Pending{s.number, id, serial, std::move(steps[i]), i == 0, i + 1 == steps.size()});
    }
}

void RadioService::readClient(Slot &s, unsigned id) {
    Client *c = findClient(s, id);
    if (!c) return;
    RadioWireHeader h;
    std::string payload;
    if (!wireRecv(c->fd, &h, &payload)) {
        dropClient(s, id);
        return;
    }
    if (h.type == RADIO_WIRE_REGISTER) {
        c->registered = true;
        return;
    }
    if (h.type != RADIO_WIRE_REQUEST) return;
    // The HAL takes a command line (or a text line) plus its NUL, nothing else:
    // a request that breaks that never reaches the modem.
    std::string fault = s.modem->requestFault(payload);
    std::string entry = std::to_string(h.serial) + "\t" + visibleBytes(payload);
    if (!fault.empty()) entry += "\trefused: " + fault;
    journalLine(s.journal, entry);
    if (!fault.empty()) {
        ScriptAnswer refused;
        refused.frames.push_back(kRefusedAnswer);
        queueAnswer(s, id, h.serial, refused);
        return;
    }
    answer(s, id, h.serial, payload);
}

void RadioService::openTty() {
    if (ttyFd_ >= 0 || modemTtyPath_.empty()) return;
    ttyFd_ = open(modemTtyPath_.c_str(), O_RDWR | O_NOCTTY | O_CLOEXEC);
    if (ttyFd_ < 0) {
        fprintf(stderr, "radio: cannot open %s: %s\n", modemTtyPath_.c_str(), strerror(errno));
        return;
    }
    struct termios t;
    if (tcgetattr(ttyFd_, &t) == 0) {
        cfmakeraw(&t);
        tcsetattr(ttyFd_, TCSANOW, &t);
    }
}

void RadioService::forwardToTty(const std::string &request) {
    openTty();
    if (ttyFd_ < 0) return;
    std::string out = request;
    if (!out.empty() && out.back() == '\0') out.pop_back();
    // SMS text lines already carry their own end (LF, CR, Ctrl-Z or ESC); a command
    // line needs the CR a modem waits for.
    char last = out.empty() ? 0 : out.back();
    if (last != '\r' && last != '\n' && last != '\x1a' && last != '\x1b') out += '\r';
    if (!sendAll(ttyFd_, out.data(), out.size())) {
        close(ttyFd_);
        ttyFd_ = -1;
    }
}

void RadioService::readTty() {
    char buf[4096];
    ssize_t n = read(ttyFd_, buf, sizeof buf);
    if (n < 0 && errno == EINTR) return;
    if (n <= 0) {
        close(ttyFd_);
        ttyFd_ = -1;
        return;
    }
    // Whatever the modem says, answers and unsolicited lines alike, goes to the
    // client as it came.
    Slot &s = slots_[0];
    if (Client *c = newestRegistered(s)) {
        if (!wireSend(c->fd, RADIO_WIRE_RESPONSE, -1, 0, std::string(buf, static_cast<size_t>(n))))
            dropClient(s, c->id);
    }
}

void RadioService::serveControl() {
    int fd = accept4(ctlFd_, nullptr, nullptr, SOCK_CLOEXEC);
    if (fd < 0) return;
    struct timeval tv = {2, 0};
    setsockopt(fd, SOL_SOCKET, SO_RCVTIMEO, &tv, sizeof tv);
    std::string msg;
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof buf)) > 0) msg.append(buf, static_cast<size_t>(n));
    char status = '1';
    if (!msg.empty() && msg[0] >= '1' && msg[0] <= '4') {
        Slot &s = slots_[msg[0] - '1'];
        Client *c = newestRegistered(s);
        if (c && wireSend(c->fd, RADIO_WIRE_INDICATION, -1, kIndicationUnsolicited, msg.substr(1))) status = '0';
    }
    sendAll(fd, &status, 1);
    close(fd);
}

void RadioService::deliverDue() {
    long long now = nowMs();
    if (takeReleaseFile(root_ + "/sim/radio/release")) {
        // Released now, even if an earlier answer still holds it back.
        for (Pending &p : pending_) p.step.hold = false;
    }
    // One AT channel per slot answers in request order: a step that is not due
    // yet holds back every later step of its slot. What is due for one client
    // leaves in one write (the frames stay frames: one callback each).
    bool blocked[kSlots] = {};
    std::vector<Pending> keep;
    std::vector<std::pair<int, unsigned>> out;  // (slot index, client id), in order
    std::vector<std::string> bytes;
    auto flush = [&] {
        for (size_t k = 0; k < out.size(); k++) {
            Client *c = findClient(slots_[out[k].first], out[k].second);
            if (c && !sendAll(c->fd, bytes[k])) dropClient(slots_[out[k].first], out[k].second);
        }
        out.clear(), bytes.clear();
    };
    for (Pending &p : pending_) {
        Slot &s = slots_[p.slot - 1];
        Client *c = findClient(s, p.client);
        if (!c) continue;  // that client is gone
        if (blocked[p.slot - 1] || !p.step.ready(now, false)) {
            blocked[p.slot - 1] = true;
            keep.push_back(p);
            continue;
        }
        if (p.step.close) {
            flush();
            dropClient(s, p.client);
            continue;
        }
        // Answers exist only for a client that registered its callbacks.
        if (!c->registered) continue;
        std::pair<int, unsigned> who(p.slot - 1, p.client);
        size_t k = std::find(out.begin(), out.end(), who) - out.begin();
        if (k == out.size()) out.push_back(who), bytes.emplace_back();
        std::string noise = wireFrame(RADIO_WIRE_INDICATION, -1, kIndicationUnsolicited, sim::kNoiseLine);
        if (hostile_.on() && p.first && hostile_.chance(kNoisePercent)) bytes[k] += noise;
        bytes[k] += wireFrame(RADIO_WIRE_RESPONSE, p.serial, 0, p.step.frame);
        if (hostile_.on() && p.last && hostile_.chance(kNoisePercent)) bytes[k] += noise;
    }
    flush();
    pending_.swap(keep);
}

int RadioService::run() {
    for (int i = 0; i < kSlots; i++) {
        Slot &s = slots_[i];
        s.number = i + 1;
        s.modem.reset(new ModemSim(s.number));
        s.script.reset(new ScriptFile(root_ + "/sim/radio/slot" + std::to_string(s.number) + ".script"));
        s.journal = root_ + "/journal/radio.slot" + std::to_string(s.number) + ".log";
        s.listenFd = listenUnix(underRoot(root_, RADIO_WIRE_PATH_PREFIX "slot" + std::to_string(s.number)));
        if (s.listenFd < 0) return 1;
    }
    ctlFd_ = listenUnix(root_ + "/run/radio.ctl");
    if (ctlFd_ < 0) return 1;
    openTty();

    while (!sim::stopRequested()) {
        std::vector<struct pollfd> fds;
        std::vector<std::pair<int, unsigned>> what;  // (slot index, client id or 0 for the listener); -1 ctl, -2 tty
        for (int i = 0; i < kSlots; i++) {
            fds.push_back({slots_[i].listenFd, POLLIN, 0});
            what.push_back({i, 0});
            for (const Client &c : slots_[i].clients) {
                fds.push_back({c.fd, POLLIN, 0});
                what.push_back({i, c.id});
            }
        }
        fds.push_back({ctlFd_, POLLIN, 0});
        what.push_back({-1, 0});
        if (ttyFd_ >= 0) {
            fds.push_back({ttyFd_, POLLIN, 0});
            what.push_back({-2, 0});
        }
        // Only the oldest step of each slot can leave next (see deliverDue).
        std::vector<Pending> heads;
        bool seen[kSlots] = {};
        for (const Pending &p : pending_) {
            if (seen[p.slot - 1]) continue;
            seen[p.slot - 1] = true;
            heads.push_back(p);
        }
        int r = poll(fds.data(), fds.size(), stepPollTimeout(heads, nowMs()));
        if (r < 0 && errno != EINTR) break;
        for (size_t k = 0; r > 0 && k < fds.size(); k++) {
            if (!(fds[k].revents & (POLLIN | POLLHUP | POLLERR))) continue;
            int w = what[k].first;
            if (w == -1) {
                serveControl();
            } else if (w == -2) {
                if (ttyFd_ >= 0) readTty();
            } else if (what[k].second == 0) {
                acceptClient(slots_[w]);
            } else {
                readClient(slots_[w], what[k].second);
            }
        }
        deliverDue();
    }

    // Gone means gone: a daemon that looks the service up now finds nothing.
    for (Slot &s : slots_) {
        while (!s.clients.empty()) dropClient(s, s.clients.front().id);
        close(s.listenFd);
        unlink(underRoot(root_, RADIO_WIRE_PATH_PREFIX "slot" + std::to_string(s.number)).c_str());
    }
    close(ctlFd_);
    unlink((root_ + "/run/radio.ctl").c_str());
    return 0;
}

}  // namespace

int run_radio_peer(const std::string &root, const std::vector<std::string> &args) {
    std::string modemTty;
    for (size_t i = 0; i < args.size(); i++) {
        if (args[i] == "--modem-tty" && i + 1 < args.size()) {
            modemTty = args[++i];
        } else if (args[i] == "--root" && i + 1 < args.size()) {
            ++i;  // tolk-sim may pass the root along
        } else {
            fprintf(stderr, "radio: unknown argument %s\n", args[i].c_str());
            return 2;
        }
    }
    sim::watchStopSignals();
    RadioService service(root, modemTty);
    return service.run();
}

int send_radio_urc(const std::string &root, int slot, const std::string &text) {
    if (slot == 0) slot = 1;
    if (slot < 1 || slot > kSlots) {
        fprintf(stderr, "urc: slot must be 1..4\n");
        return 2;
    }
    int fd = connectUnix(root + "/run/radio.ctl");
    if (fd < 0) {
        fprintf(stderr, "urc: the radio service is not running\n");
        return 1;
    }
    // tolk-sim has already turned the escapes of its argument into bytes.
    std::string msg = std::to_string(slot) + text;
    bool sent = sendAll(fd, msg.data(), msg.size());
    shutdown(fd, SHUT_WR);
    char status = '1';
    if (sent && read(fd, &status, 1) != 1) status = '1';
    close(fd);
    if (status != '0') fprintf(stderr, "urc: no client on slot%d\n", slot);
    return status == '0' ? 0 : 1;
}
