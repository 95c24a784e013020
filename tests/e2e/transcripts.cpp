// Plays one transcript file (tests/transcripts/*.tx, format in the README there):
// each group is one gtest test; the groups of a file share one simulated device
// unless a group asks for a fresh one, and its links stay open across cases.
// With --hostile the devices run with hostile timing (sim/hostile.h), adb sends
// are cut into pieces, and the noise line the radio service interleaves is
// removed from what the links receive: the expected bytes stay the same.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <algorithm>
#include <filesystem>
#include <fstream>
#include <map>
#include <memory>
#include <regex>

#include <gtest/gtest.h>

#include "../support/eventually.h"
#include "hostile.h"
#include "sim_device.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

const int kTimeoutMs = 3000;      // the longest wait of a case or check
const int kShortQuietMs = 1000;   // an answer that stopped short is given up after this
const int kEmptyQuietMs = 300;    // an empty answer: nothing arrives for this long

// Hostile timing for the whole run: on with --hostile[=SEED]; the seed comes
// from there, from TOLK_HOSTILE_SEED, or from the clock, and a failure names it.
bool gHostile = false;
uint64_t gSeed = 0;

// What a link received, noise lines taken out (only hostile timing makes them).
std::string withoutNoise(const std::string &raw, size_t *held) {
    *held = 0;
    return gHostile ? sim::removeNoise(raw, held) : raw;
}

// Expected bytes; kDigit and kAny are the answers' wildcards \d and \?.
enum : int { kDigit = 256, kAny = 257 };
using Pattern = std::vector<int>;

// \r \n \t \b \e \0 \\ \xNN, \{N} (the element before, N times in all), and in
// patterns \d and \?. In a journal line (rendered already) only \d \? \{N} count.
bool decode(const std::string &in, int mode, Pattern *out) {  // 0 bytes, 1 pattern, 2 journal
    static const std::string names = "rntbe0\\", bytes("\r\n\t\b\x1b\0\\", 7);
    out->clear();
    for (size_t i = 0; i < in.size(); i++) {
        char e = i + 1 < in.size() ? in[i + 1] : 0;
        size_t k = names.find(e);
        long n = 0;
        size_t close = in.find('}', i);
        if (in[i] != '\\' || (mode == 2 && e != 'd' && e != '?' && e != '{')) {
            out->push_back(static_cast<unsigned char>(in[i]));
            if (mode == 2 && in[i] == '\\' && e) out->push_back(in[++i]);
        } else if (e && k != std::string::npos) {
            out->push_back(static_cast<unsigned char>(bytes[k])), i++;
        } else if (e == 'x' && i + 3 < in.size() && sim::hexDigitValue(in[i + 2]) >= 0 &&
                   sim::hexDigitValue(in[i + 3]) >= 0) {
            out->push_back(sim::hexDigitValue(in[i + 2]) * 16 + sim::hexDigitValue(in[i + 3])), i += 3;
        } else if (mode && (e == 'd' || e == '?')) {
            out->push_back(e == 'd' ? kDigit : kAny), i++;
        } else if (e == '{' && !out->empty() && close != std::string::npos &&
                   sim::parseBoundedNumber(in.substr(i + 2, close - i - 2), 1 << 20, &n) && n > 0) {
            out->insert(out->end(), static_cast<size_t>(n - 1), out->back()), i = close;
        } else {
            return false;
        }
    }
    return true;
}

std::string bytesOf(const Pattern &p) { return std::string(p.begin(), p.end()); }

std::string show(const Pattern &p) {
    std::string s;
    for (int c : p) s += c == kDigit ? "\\d" : c == kAny ? "\\?" : sim::visibleBytes(std::string(1, char(c)));
    return s;
}

// 1: got is the whole answer, 0: it may still grow into it, -1: it never will.
int compare(const Pattern &want, const std::string &got) {
    if (got.size() > want.size()) return -1;
    for (size_t i = 0; i < got.size(); i++) {
        int c = static_cast<unsigned char>(got[i]);
        if (want[i] != kAny && want[i] != c && !(want[i] == kDigit && c >= '0' && c <= '9')) return -1;
    }
    return got.size() == want.size() ? 1 : 0;
}

struct Stmt {
    int line = 0;
    std::string verb, a, b, text;  // text: the line as written, for messages
    Pattern want;
    bool nocr = false, reconnect = false;
    int timeoutMs = kTimeoutMs;
    int afterMs = 0;          // a pipe item: wait this long before writing it
    std::vector<Stmt> items;  // pipe: the writes, in order
};

struct Group {
    std::string title;
    int line = 0;
    bool fresh = false;
    std::vector<std::string> upArgs;
    std::vector<Stmt> stmts;
};

struct Transcript {
    std::string path, name;
    std::vector<std::string> upArgs;
    Group setup;  // before the first group: run on every device of the file
    std::vector<Group> groups;
};

// Words split at blanks; '...' keeps blanks; escapes are decoded.
bool splitWords(const std::string &s, std::vector<std::string> *out) {
    static const std::regex word("'([^']*)'|(\\S+)");
    for (std::sregex_iterator it(s.begin(), s.end(), word), end; it != end; ++it) {
        Pattern p;
        if (!decode((*it)[1].matched ? (*it)[1].str() : (*it)[2].str(), 0, &p)) return false;
        out->push_back(bytesOf(p));
    }
    return true;
}

// One write of a pipe: "| LINK [(nocr)] [(new)] [(after MS)] BYTES".
bool parsePipeItem(const std::string &line, Stmt *st) {
    static const std::regex itemRe("(serial|adb)((?:\\s*\\((?:nocr|new|after \\d+)\\))*)\\s*(.*?)");
    std::smatch m;
    Pattern p;
    if (!std::regex_match(line, m, itemRe) || !decode(m[3], 0, &p)) return false;
    std::string flags = m[2];
    st->verb = m[1];
    st->nocr = flags.find("nocr") != std::string::npos;
    st->reconnect = flags.find("new") != std::string::npos;
    if (flags.find("after") != std::string::npos) st->afterMs = atoi(flags.c_str() + flags.find("after") + 6);
    st->a = bytesOf(p) + (st->nocr ? "" : "\r");
    return true;
}

bool parseStmt(const std::string &line, Stmt *st) {
    static const std::regex caseRe("(serial|adb|both)((?:\\s*\\((?:nocr|new|timeout \\d+)\\))*)\\s*(.*?)\\s*=>\\s*(.*?)"),
        journalRe("journal\\s+(\\S+)(\\s+later)?:\\s*(.*?)"), propRe("(prop|tty)\\s+(\\S+)\\s*=\\s*(.*?)"),
        radioRe("radio\\s+([1-4])(\\s+later)?:\\s*(.*?)(?:\\s+\\((refused: .*)\\))?"),
        fileRe("file\\s+(\\S+)\\s*(?:=\\s*(.*?)|(absent))"), otherRe("(log|quiet|setprop|write|sim)\\s+(\\S+)\\s*(.*?)");
    std::smatch m;
    Pattern p;
    if (std::regex_match(line, m, caseRe)) {
        st->verb = m[1];
        std::string flags = m[2];
        st->nocr = flags.find("nocr") != std::string::npos;
        st->reconnect = flags.find("new") != std::string::npos;
        if (flags.find("timeout") != std::string::npos) st->timeoutMs = atoi(flags.c_str() + flags.find("timeout") + 8);
        if (!decode(m[3], 0, &p) || !decode(m[4], 1, &st->want)) return false;
        st->a = bytesOf(p) + (st->nocr ? "" : "\r");
        return true;
    }
    // The radio journal's lines are SERIAL<TAB>REQUEST[<TAB>refused: WHY]; tolkd sends serial -1.
    bool radio = std::regex_match(line, m, radioRe);
    if (radio || std::regex_match(line, m, journalRe)) {
        st->verb = m[3] == "(end)" ? "journal-end" : m[2].matched ? "journal-later" : "journal";
        st->a = radio ? "radio.slot" + m[1].str() + ".log" : m[1].str();
        std::string text = m[3];
        if (radio && text != "(end)") text = "-1\t" + text + (m[4].matched ? "\t" + m[4].str() : "");
        return decode(text, 2, &st->want);
    }
    if (std::regex_match(line, m, propRe)) {
        st->verb = m[1], st->a = m[2];
        return decode(m[3], 0, &st->want);
    }
    if (std::regex_match(line, m, fileRe)) {
        st->verb = m[3].matched ? "file-absent" : "file", st->a = m[1];
        return decode(m[2], 1, &st->want);
    }
    if (!std::regex_match(line, m, otherRe)) return false;
    st->verb = m[1], st->a = m[2], st->b = m[3];
    if (st->verb == "log" || st->verb == "sim") st->b = sim::trimBlanks(line.substr(st->verb.size()));
    if (st->verb == "quiet") st->timeoutMs = atoi(st->a.c_str());
    if (st->verb == "setprop" || st->verb == "write") return decode(st->b, 0, &p) && (st->b = bytesOf(p), true);
    return true;
}

bool parse(const std::string &path, Transcript *t, std::string *err) {
    std::ifstream in(path);
    t->path = path;
    t->name = std::filesystem::path(path).stem().string();
    std::string raw;
    for (int n = 1; std::getline(in, raw); n++) {
        Group &g = t->groups.empty() ? t->setup : t->groups.back();
        std::string line = sim::trimBlanks(raw), verb = line.substr(0, line.find(' '));
        std::string rest = sim::trimBlanks(line.substr(verb.size()));
        Stmt st;
        st.line = n, st.text = line;
        bool ok = true;
        if (raw.compare(0, 1, "|") == 0 && !g.stmts.empty() && g.stmts.back().verb == "pipe") {
            Stmt item;
            item.line = n, item.text = line;
            ok = parsePipeItem(sim::trimBlanks(raw.substr(1)), &item);
            g.stmts.back().items.push_back(item);
        } else if (raw.compare(0, 1, "|") == 0) {
            ok = !g.stmts.empty() && g.stmts.back().verb == "write";
            if (ok) g.stmts.back().b += raw.substr(raw.compare(0, 2, "| ") == 0 ? 2 : 1) + "\n";
        } else if (line.empty() || line[0] == '#') {
        } else if (line == "pipe") {
            st.verb = "pipe";
            g.stmts.push_back(st);
        } else if (verb == "device") {
            ok = t->groups.empty() && g.stmts.empty() && splitWords(rest, &t->upArgs);
        } else if (verb == "group") {
            t->groups.push_back(Group{rest, n, false, {}, {}});
        } else if (verb == "fresh") {
            ok = g.line > 0 && g.stmts.empty() && splitWords(rest, &g.upArgs);
            g.fresh = true;
        } else if ((ok = parseStmt(line, &st))) {
            if (st.verb == "both") g.stmts.push_back(st), st.verb = "serial", g.stmts.back().verb = "adb";
            g.stmts.push_back(st);
        }
        if (!ok) return *err = path + ":" + std::to_string(n) + ": cannot read: " + raw, false;
    }
    return !in.bad() && (t->groups.size() || (*err = path + ": no groups", false));
}

// What fd holds right now, without waiting.
std::string takeNow(int fd) {
    std::string got;
    char buf[4096];
    for (ssize_t n; (n = read(fd, buf, sizeof buf)) > 0;) got.append(buf, static_cast<size_t>(n));
    return got;
}

// One simulated device and its host links, kept across cases.
struct Device {
    std::unique_ptr<SimDevice> sim;
    std::map<std::string, int> fds;               // "serial", "adb"
    std::map<std::string, std::string> held;      // per link: a tail that may be the start of a noise line
    std::map<std::string, size_t> journalOffset;  // per journal file: bytes taken
    std::vector<std::string> upArgs;
    std::vector<const Stmt *> early;              // writes before up
    uint64_t seed = 0;                            // its hostile timing

    ~Device() {
        for (auto &f : fds)
            if (f.second >= 0) close(f.second);
    }
    bool up() {
        if (!sim) {
            if (gHostile) upArgs.push_back("--hostile=" + std::to_string(seed));
            sim.reset(new SimDevice(upArgs, [this](SimDevice &d) {
                for (const Stmt *w : early) d.writeFile(w->a, w->b);
            }));
            EXPECT_TRUE(sim->started()) << sim->upOutput();
        }
        return sim->started();
    }
    int link(const std::string &which, bool reconnect) {
        int &fd = fds.emplace(which, -1).first->second;
        if (fd >= 0 && reconnect) close(fd), fd = -1;
        if (fd < 0 && (fd = which == "adb" ? sim->connectAdb() : sim->openSerial()) >= 0)
            fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
        return fd;
    }
    // What a link holds right now, noise lines taken out.
    std::string take(const std::string &which) {
        size_t keep = 0;
        std::string raw = held[which] + takeNow(fds[which]);
        std::string out = withoutNoise(raw, &keep);
        held[which] = raw.substr(raw.size() - keep);
        return out;
    }
    // What arrives on the open links within ms; "" when nothing.
    std::string quiet(int ms) {
        std::string out;
        for (long long end = sim::nowMs() + ms, left; (left = end - sim::nowMs()) > 0;) {
            std::vector<struct pollfd> p;
            for (auto &f : fds)
                if (f.second >= 0) p.push_back({f.second, POLLIN, 0});
            if (poll(p.data(), p.size(), static_cast<int>(left)) <= 0) continue;
            for (auto &f : fds)
                if (f.second >= 0) out += sim::visibleBytes(take(f.first));
        }
        return out;
    }
    // Writes one send: on adb in hostile mode cut into pieces a few ms apart,
    // as a TCP forward or a busy host stack delivers it. The serial port is
    // written whole: its line discipline assembles lines anyway, and its echo
    // depends on when bytes arrive.
    bool send(const std::string &which, int fd, const std::string &bytes, const std::string &where) {
        sim::Hostile h(gHostile && which == "adb", seed, where);
        std::vector<std::string> pieces = h.split(bytes);
        for (size_t i = 0; i < pieces.size(); i++) {
            if (i > 0) sim::sleepMs(h.gapMs());
            if (!writeAll(fd, pieces[i])) return false;
        }
        return true;
    }
};

class Runner {
public:
    explicit Runner(const Transcript &t) : t_(t) {}

    void runGroup(size_t gi) {
        const Group &g = t_.groups[gi];
        std::unique_ptr<Device> own(g.fresh ? new Device : nullptr);
        if (!g.fresh && !shared_) shared_.reset(new Device);
        Device &dev = g.fresh ? *own : *shared_;
        if (!dev.sim) {
            dev.upArgs = t_.upArgs, dev.upArgs.insert(dev.upArgs.end(), g.upArgs.begin(), g.upArgs.end());
            dev.seed = gSeed + static_cast<uint64_t>(g.line);
        }
        std::vector<const Stmt *> todo;
        for (const Group *part : {dev.sim ? nullptr : &t_.setup, &g})
            for (size_t i = 0; part && i < part->stmts.size(); i++) todo.push_back(&part->stmts[i]);
        for (const Stmt *st : todo) {
            if (!dev.sim && st->verb == "write") {
                dev.early.push_back(st);
                continue;
            }
            if (!dev.up()) return;
            run(dev, *st);
        }
        bool sharedLater = false;
        for (size_t k = gi + 1; k < t_.groups.size(); k++) sharedLater |= !t_.groups[k].fresh;
        if (dev.sim && dev.sim->started()) {
            std::string extra = dev.quiet(50);
            if (!extra.empty()) fail(g.line, "bytes after the group's last answer: " + extra);
            int status = dev.sim->tolkdExitStatus(0);
            if (status != -1) fail(g.line, "tolkd ended during the group with status " + std::to_string(status));
            // A device that goes down now prints its log itself.
            std::string log = dev.sim->log();
            if (::testing::Test::HasFailure() && gHostile)
                fprintf(stderr, "hostile timing, seed %llu (TOLK_HOSTILE_SEED=%llu repeats this run)\n",
                        static_cast<unsigned long long>(gSeed), static_cast<unsigned long long>(gSeed));
            if (::testing::Test::HasFailure() && !g.fresh && sharedLater)
                fprintf(stderr, "---- end of the tolkd log ----\n%s---- end ----\n",
                        log.substr(log.size() > 6000 ? log.size() - 6000 : 0).c_str());
        }
        // The shared device goes down inside the last test that uses it, so that
        // its sanitizer check and log land in a test.
        if (!g.fresh && !sharedLater) shared_.reset();
    }

private:
    void fail(int line, const std::string &msg) { ADD_FAILURE_AT(t_.path.c_str(), line) << msg; }

    void run(Device &dev, const Stmt &st) {
        SimDevice &d = *dev.sim;
        std::string got;
        if (st.verb == "serial" || st.verb == "adb") {
            exchange(dev, st);
        } else if (st.verb == "pipe") {
            pipe(dev, st);
        } else if (st.verb.compare(0, 7, "journal") == 0) {
            // A peer writes its line before it answers, but a line written after
            // the answer (feedback to the framework) may still be on its way.
            size_t &off = dev.journalOffset[st.a];
            bool found = false, taken = false;
            eventually([&] {
                std::string text = d.readFile("/journal/" + st.a);
                for (size_t nl; !found && off <= text.size() && (nl = text.find('\n', off)) != std::string::npos;) {
                    got = text.substr(off, nl - off), off = nl + 1, taken = true;
                    found = compare(st.want, got) == 1;
                    if (st.verb != "journal-later") break;
                }
                return found || (taken && st.verb == "journal");
            }, st.verb == "journal-end" ? 0 : kTimeoutMs);
            if (st.verb == "journal-end" ? !got.empty() : !found)
                fail(st.line, st.text + "\n  got: " + (got.empty() ? "(no new line)" : got));
        } else if (st.verb == "prop" || st.verb == "tty") {
            auto value = [&] {
                if (st.verb == "prop") return d.getprop(st.a);
                std::string all = "\n" + d.sim({"tty-settings"}), key = "\n" + st.a + "=";
                size_t at = all.find(key), from = at + key.size();
                return at == std::string::npos ? "(none)" : all.substr(from, all.find('\n', from) - from);
            };
            if (!eventually([&] { return compare(st.want, got = value()) == 1; }, kTimeoutMs))
                fail(st.line, st.text + "\n  got: " + sim::visibleBytes(got));
        } else if (st.verb == "file" || st.verb == "file-absent") {
            bool absent = st.verb == "file-absent";
            auto done = [&] { return absent ? !d.fileExists(st.a) : compare(st.want, got = d.readFile(st.a)) == 1; };
            if (!eventually(done, kTimeoutMs))
                fail(st.line, st.text + "\n  got: " + (absent ? "a file" : sim::visibleBytes(got)));
        } else if (st.verb == "log") {
            if (!eventually([&] { return d.log().find(st.b) != std::string::npos; }, kTimeoutMs))
                fail(st.line, st.text + "\n  not in the daemon's log");
        } else if (st.verb == "quiet") {
            if (!(got = dev.quiet(st.timeoutMs)).empty()) fail(st.line, st.text + "\n  got: " + got);
        } else if (st.verb == "setprop") {
            d.setprop(st.a, st.b);
        } else if (st.verb == "write") {
            d.writeFile(st.a, st.b);
        } else if (st.verb == "sim") {
            std::vector<std::string> args;
            int status = -1;
            splitWords(st.b, &args);
            got = d.sim(args, &status);
            if (status != 0) fail(st.line, st.text + "\n  failed with status " + std::to_string(status) + ": " + got);
        }
    }

    // Writes the items of a pipe back to back (or after their own waits),
    // without reading: the cases after it read each link's answer stream.
    void pipe(Device &dev, const Stmt &st) {
        for (const Stmt &item : st.items) {
            int fd = dev.link(item.verb, item.reconnect);
            if (fd < 0) return fail(item.line, item.text + "\n  cannot open the link");
            std::string left = dev.take(item.verb);
            if (!left.empty()) fail(item.line, item.text + "\n  left over from an earlier case: " + sim::visibleBytes(left));
            if (item.afterMs > 0) sim::sleepMs(item.afterMs);
            if (!dev.send(item.verb, fd, item.a, t_.name + ":" + std::to_string(item.line)))
                return fail(item.line, item.text + "\n  cannot send");
        }
    }

    void exchange(Device &dev, const Stmt &st) {
        const std::string where = st.text + (st.text.compare(0, 4, "both") == 0 ? "  (on " + st.verb + ")" : "");
        int fd = dev.link(st.verb, st.reconnect);
        if (fd < 0) return fail(st.line, where + "\n  cannot open the link");
        if (st.reconnect) dev.held[st.verb].clear();
        // Nothing to send: the answer is unsolicited and may be here already.
        std::string raw = dev.held[st.verb] + takeNow(fd);
        size_t held = 0;
        std::string got = withoutNoise(raw, &held);
        if (!got.empty() && !st.a.empty()) {
            fail(st.line, where + "\n  left over from an earlier case: " + sim::visibleBytes(got));
            raw = raw.substr(raw.size() - held), got.clear();
        }
        if (!dev.send(st.verb, fd, st.a, t_.name + ":" + std::to_string(st.line)))
            return fail(st.line, where + "\n  cannot send");
        // A wrong answer is read on until the link is quiet, to show all of it; one
        // that stopped short is given up after kShortQuietMs (or the case's timeout).
        long long end = sim::nowMs() + (st.want.empty() ? kEmptyQuietMs : st.timeoutMs);
        int state, shortQuiet = st.timeoutMs == kTimeoutMs ? kShortQuietMs : st.timeoutMs;
        bool closed = false;
        while ((state = compare(st.want, got)) != 1 || st.want.empty()) {
            int quiet = state == -1 ? 200 : got.empty() ? -1 : shortQuiet;
            long long left = std::min<long long>(end - sim::nowMs(), quiet < 0 ? 1 << 30 : quiet);
            struct pollfd p = {fd, POLLIN, 0};
            if (left <= 0 || (poll(&p, 1, static_cast<int>(left)) == 0 && quiet >= 0)) break;
            char buf[4096];
            ssize_t n = read(fd, buf, sizeof buf);
            if (n == 0 || (n < 0 && errno != EAGAIN && errno != EINTR)) {
                closed = true;
                break;
            }
            if (n > 0) raw.append(buf, static_cast<size_t>(n)), got = withoutNoise(raw, &held);
        }
        if (state == 1) raw += takeNow(fd), got = withoutNoise(raw, &held);  // bytes right behind the answer are wrong too
        dev.held[st.verb] = raw.substr(raw.size() - held);
        if (gHostile && got.find(sim::kNoiseText) != std::string::npos)
            fail(st.line, where + "\n  the noise line arrived torn or framed into an answer: " + sim::visibleBytes(raw));
        bool late = got.size() > st.want.size() && compare(st.want, got.substr(got.size() - st.want.size())) == 1;
        if (compare(st.want, got) != 1)
            fail(st.line, where + "\n  expected: " + show(st.want) + "\n  got:      " + sim::visibleBytes(got) +
                              (closed ? "\n  (the link was closed)" : "") +
                              (late ? "\n  (the bytes before the answer may be left over from the case before)" : ""));
        if (closed) close(fd), dev.fds[st.verb] = -1, dev.held[st.verb].clear();
    }

    const Transcript &t_;
    std::unique_ptr<Device> shared_;
};

struct GroupTest : ::testing::Test {
    GroupTest(Runner *runner, size_t group) : runner(runner), group(group) {}
    void TestBody() override { runner->runGroup(group); }
    Runner *runner;
    size_t group;
};

}  // namespace

int main(int argc, char **argv) {
    ::testing::InitGoogleTest(&argc, argv);
    static Transcript t;
    std::string err = "usage: e2e_transcripts [gtest options] [--hostile[=SEED]] FILE.tx", seed;
    if (argc == 3 && std::string(argv[1]).compare(0, 9, "--hostile") == 0) {
        gHostile = true;
        seed = argv[1][9] == '=' ? argv[1] + 10 : getenv("TOLK_HOSTILE_SEED") ? getenv("TOLK_HOSTILE_SEED") : "";
        if (seed.empty()) seed = std::to_string(static_cast<unsigned long long>(sim::nowMs()) ^ getpid());
        argv[1] = argv[2], argc = 2;
        if (!sim::parseHostileSeed(seed, &gSeed)) err = "--hostile: the seed is a decimal number, got " + seed, argc = 0;
        else fprintf(stderr, "hostile timing, seed %s\n", seed.c_str());
    }
    if (argc != 2 || !parse(argv[1], &t, &err)) {
        fprintf(stderr, "%s\n", err.c_str());
        return 2;
    }
    static Runner runner(t);
    for (size_t gi = 0; gi < t.groups.size(); gi++) {
        std::string name = std::to_string(gi + 1) + "_" + std::regex_replace(t.groups[gi].title, std::regex("\\W+"), "_");
        ::testing::RegisterTest(t.name.c_str(), name.c_str(), nullptr, nullptr, t.path.c_str(), t.groups[gi].line,
                                [gi]() -> ::testing::Test * { return new GroupTest(&runner, gi); });
    }
    return RUN_ALL_TESTS();
}
