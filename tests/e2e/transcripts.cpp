// Runs one transcript file (tests/transcripts/*.tx, format in the README there):
// each group of cases is one gtest test, and the groups of a file share one
// simulated device unless a group asks for a fresh one.
#include <errno.h>
#include <fcntl.h>
#include <poll.h>
#include <unistd.h>

#include <cstdio>
#include <fstream>
#include <map>
#include <memory>
#include <sstream>

#include <gtest/gtest.h>

#include "sim_device.h"
#include "sim_text.h"
#include "sim_util.h"

namespace {

const int kDefaultTimeoutMs = 3000;
const int kEmptyAnswerQuietMs = 300;
const int kGroupEndQuietMs = 50;

// An expected answer: bytes, or wildcards (kDigit: one ASCII digit, kAny: one byte).
enum : int { kDigit = 256, kAny = 257 };
using Pattern = std::vector<int>;

// Escapes of sends, answers and file contents: \r \n \t \b \e \0 \\ \xNN, and
// \{N} repeating the element before it to N in all; answers also take \d and \?.
bool decode(const std::string &in, bool wildcards, Pattern *out, std::string *err) {
    out->clear();
    for (size_t i = 0; i < in.size(); i++) {
        unsigned char c = static_cast<unsigned char>(in[i]);
        if (c != '\\') {
            out->push_back(c);
            continue;
        }
        if (++i >= in.size()) return *err = "a lone backslash at the end", false;
        char e = in[i];
        static const std::string simple = "rntbe0\\", bytes("\r\n\t\b\x1b\0\\", 7);
        size_t k = simple.find(e);
        if (k != std::string::npos) {
            out->push_back(static_cast<unsigned char>(bytes[k]));
        } else if (e == 'x' && i + 2 < in.size() && sim::hexDigitValue(in[i + 1]) >= 0 &&
                   sim::hexDigitValue(in[i + 2]) >= 0) {
            out->push_back(sim::hexDigitValue(in[i + 1]) * 16 + sim::hexDigitValue(in[i + 2]));
            i += 2;
        } else if (wildcards && (e == 'd' || e == '?')) {
            out->push_back(e == 'd' ? kDigit : kAny);
        } else if (e == '{') {
            size_t close = in.find('}', i);
            long n = 0;
            if (out->empty() || close == std::string::npos ||
                !sim::parseBoundedNumber(in.substr(i + 1, close - i - 1), 1 << 20, &n) || n < 1)
                return *err = "\\{N} needs a count of at least 1 after an element", false;
            out->insert(out->end(), static_cast<size_t>(n - 1), out->back());
            i = close;
        } else {
            return *err = std::string("unknown escape \\") + e, false;
        }
    }
    return true;
}

// A journal line as the peers render it, where only \d, \? and \{N} are
// escapes; "\\" and every other backslash pair stay as they are.
bool journalPattern(const std::string &in, Pattern *out, std::string *err) {
    std::string esc;
    for (size_t i = 0; i < in.size(); i++) {
        bool special = in[i] == '\\' && i + 1 < in.size() && (in[i + 1] == 'd' || in[i + 1] == '?' || in[i + 1] == '{');
        if (special) esc += in.substr(i, 2);
        else if (in[i] == '\\') esc += "\\\\";
        else esc.push_back(in[i]);
        if (special) i++;
    }
    return decode(esc, true, out, err);
}

std::string bytesOf(const Pattern &p) {
    std::string s;
    for (int c : p) s.push_back(static_cast<char>(c));
    return s;
}

std::string show(const Pattern &p) {
    std::string s;
    for (int c : p) s += c == kDigit ? "\\d" : c == kAny ? "\\?" : sim::visibleBytes(std::string(1, char(c)));
    return s;
}

// 1: got is the whole answer, 0: got may still grow into it, -1: it never will.
int compare(const Pattern &want, const std::string &got) {
    size_t n = std::min(want.size(), got.size());
    for (size_t i = 0; i < n; i++) {
        unsigned char c = static_cast<unsigned char>(got[i]);
        bool ok = want[i] == kAny || (want[i] == kDigit ? c >= '0' && c <= '9' : want[i] == c);
        if (!ok) return -1;
    }
    if (got.size() > want.size()) return -1;
    return got.size() == want.size() ? 1 : 0;
}

struct Stmt {
    int line = 0;
    std::string verb;   // serial, adb, journal, prop, file, log, quiet, setprop, write, sim
    std::string text;   // the statement as written, for messages
    std::string a, b;   // verb-specific words
    std::string send;   // a case: bytes sent
    Pattern want;       // a case: the answer; file: the content
    bool nocr = false, reconnect = false;
    int timeoutMs = kDefaultTimeoutMs;
    std::vector<std::string> args;
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
    std::vector<Stmt> setup;  // before the first group: run on every device of the file
    std::vector<Group> groups;
};

// Words split at blanks; '...' and "..." keep blanks; escapes are decoded.
bool splitWords(const std::string &s, std::vector<std::string> *out, std::string *err) {
    out->clear();
    size_t i = 0;
    while (i < s.size()) {
        while (i < s.size() && isspace(static_cast<unsigned char>(s[i]))) i++;
        if (i >= s.size()) break;
        std::string w;
        while (i < s.size() && !isspace(static_cast<unsigned char>(s[i]))) {
            if (s[i] == '\'' || s[i] == '"') {
                size_t close = s.find(s[i], i + 1);
                if (close == std::string::npos) return *err = "an unclosed quote", false;
                w += s.substr(i + 1, close - i - 1);
                i = close + 1;
            } else {
                w.push_back(s[i++]);
            }
        }
        Pattern p;
        if (!decode(w, false, &p, err)) return false;
        out->push_back(bytesOf(p));
    }
    return true;
}

std::string firstWord(std::string *rest) {
    std::string s = sim::trimBlanks(*rest);
    size_t sp = s.find_first_of(" \t");
    std::string w = s.substr(0, sp);
    *rest = sp == std::string::npos ? "" : sim::trimBlanks(s.substr(sp));
    return w;
}

bool parseStmt(const std::string &verb, std::string rest, Stmt *st, std::string *err) {
    st->verb = verb;
    if (verb == "serial" || verb == "adb") {
        while (!rest.empty() && rest[0] == '(') {
            size_t close = rest.find(')');
            if (close == std::string::npos) return *err = "an unclosed (", false;
            std::string flag = rest.substr(1, close - 1);
            long ms = 0;
            if (flag == "nocr") st->nocr = true;
            else if (flag == "new") st->reconnect = true;
            else if (flag.compare(0, 8, "timeout ") == 0 && sim::parseBoundedNumber(flag.substr(8), 600000, &ms))
                st->timeoutMs = static_cast<int>(ms);
            else return *err = "unknown flag (" + flag + ")", false;
            rest = sim::trimBlanks(rest.substr(close + 1));
        }
        size_t arrow = rest.find("=>");
        if (arrow == std::string::npos) return *err = "a case needs SEND => ANSWER", false;
        Pattern send;
        if (!decode(sim::trimBlanks(rest.substr(0, arrow)), false, &send, err)) return false;
        st->send = bytesOf(send);
        if (!st->nocr) st->send.push_back('\r');
        return decode(sim::trimBlanks(rest.substr(arrow + 2)), true, &st->want, err);
    }
    if (verb == "journal") {
        // journal FILE: LINE | journal FILE later: LINE | journal FILE: (end)
        size_t colon = rest.find(':');
        if (colon == std::string::npos) return *err = "journal FILE: LINE", false;
        std::string head = rest.substr(0, colon);
        st->a = firstWord(&head);
        if (head != "" && head != "later") return *err = "journal FILE [later]: LINE", false;
        st->verb = head == "later" ? "journal-later" : "journal";
        st->b = sim::trimBlanks(rest.substr(colon + 1));
        if (st->b == "(end)") return st->verb = "journal-end", true;
        return journalPattern(st->b, &st->want, err);
    }
    if (verb == "prop") {
        size_t eq = rest.find('=');
        if (eq == std::string::npos) return *err = "prop NAME = VALUE", false;
        st->a = sim::trimBlanks(rest.substr(0, eq));
        Pattern p;
        if (!decode(sim::trimBlanks(rest.substr(eq + 1)), false, &p, err)) return false;
        st->b = bytesOf(p);
        return true;
    }
    if (verb == "file") {
        st->a = firstWord(&rest);
        if (rest == "absent") return st->verb = "file-absent", true;
        if (rest.compare(0, 1, "=") != 0) return *err = "file PATH = CONTENT or file PATH absent", false;
        return decode(sim::trimBlanks(rest.substr(1)), true, &st->want, err);
    }
    if (verb == "log") return st->b = rest, !rest.empty() || (*err = "log TEXT", false);
    if (verb == "quiet") {
        long ms = 0;
        if (!sim::parseBoundedNumber(rest, 60000, &ms)) return *err = "quiet MS", false;
        return st->timeoutMs = static_cast<int>(ms), true;
    }
    if (verb == "setprop") {
        st->a = firstWord(&rest);
        Pattern p;
        if (st->a.empty() || !decode(rest, false, &p, err)) return *err = "setprop NAME VALUE", false;
        st->b = bytesOf(p);
        return true;
    }
    if (verb == "write") {
        st->a = firstWord(&rest);
        if (st->a.empty()) return *err = "write PATH [CONTENT]", false;
        Pattern p;
        if (!decode(rest, false, &p, err)) return false;
        st->b = bytesOf(p);
        return true;
    }
    if (verb == "sim") return splitWords(rest, &st->args, err) && (!st->args.empty() || (*err = "sim COMMAND", false));
    return *err = "unknown statement '" + verb + "'", false;
}

bool parse(const std::string &path, Transcript *t, std::string *err) {
    std::ifstream in(path);
    if (!in) return *err = "cannot read " + path, false;
    t->path = path;
    t->name = path.substr(path.rfind('/') + 1);
    t->name = t->name.substr(0, t->name.find('.'));
    Group setup;
    std::string raw;
    for (int n = 1; std::getline(in, raw); n++) {
        auto fail = [&](const std::string &why) { return *err = path + ":" + std::to_string(n) + ": " + why, false; };
        Group &g = t->groups.empty() ? setup : t->groups.back();
        if (raw.compare(0, 1, "|") == 0) {
            if (g.stmts.empty() || g.stmts.back().verb != "write") return fail("a | line belongs after write PATH");
            g.stmts.back().b += raw.substr(raw.compare(0, 2, "| ") == 0 ? 2 : 1) + "\n";
            continue;
        }
        std::string rest = sim::trimBlanks(raw);
        if (rest.empty() || rest[0] == '#') continue;
        std::string verb = firstWord(&rest);
        if (verb == "device") {
            if (!t->groups.empty() || !g.stmts.empty()) return fail("device comes before everything else");
            if (!splitWords(rest, &t->upArgs, err)) return fail(*err);
            continue;
        }
        if (verb == "group") {
            t->groups.emplace_back();
            t->groups.back().title = rest;
            t->groups.back().line = n;
            continue;
        }
        if (verb == "fresh") {
            if (g.line == 0 || !g.stmts.empty()) return fail("fresh belongs right after its group line");
            g.fresh = true;
            if (!splitWords(rest, &g.upArgs, err)) return fail(*err);
            continue;
        }
        bool both = verb == "both";
        Stmt st;
        st.line = n;
        st.text = sim::trimBlanks(raw);
        if (!parseStmt(both ? "adb" : verb, rest, &st, err)) return fail(*err);
        g.stmts.push_back(st);
        if (both) {
            st.verb = "serial";
            g.stmts.push_back(st);
        }
    }
    t->setup = setup.stmts;
    return true;
}

// Reads what fd has right now, without waiting.
std::string takeNow(int fd) {
    std::string got;
    char buf[4096];
    ssize_t n;
    while ((n = read(fd, buf, sizeof buf)) > 0) got.append(buf, static_cast<size_t>(n));
    return got;
}

// One simulated device with its host links kept open across cases.
struct Device {
    std::unique_ptr<SimDevice> sim;
    std::map<std::string, int> fds;               // "serial", "adb"
    std::map<std::string, int> lastCase;          // per link: the line of its last case
    std::map<std::string, size_t> journalOffset;  // per journal file: bytes consumed
    std::vector<std::string> upArgs;
    std::vector<std::pair<std::string, std::string>> early;  // files written before up

    ~Device() { closeLinks(); }
    void closeLinks() {
        for (auto &f : fds)
            if (f.second >= 0) close(f.second);
        fds.clear();
    }
    bool up() {
        if (!sim) {
            sim.reset(new SimDevice(upArgs, [this](SimDevice &d) {
                for (const auto &f : early) d.writeFile(f.first, f.second);
            }));
            EXPECT_TRUE(sim->started()) << "tolk-sim up " << ::testing::PrintToString(upArgs) << ":\n"
                                        << sim->upOutput();
        }
        return sim->started();
    }
    int link(const std::string &which, bool reconnect) {
        int &fd = fds.emplace(which, -1).first->second;
        if (fd >= 0 && reconnect) {
            close(fd);
            fd = -1;
        }
        if (fd < 0) {
            fd = which == "adb" ? sim->connectAdb() : sim->openSerial();
            if (fd >= 0) fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
        }
        return fd;
    }
};

class Runner {
public:
    explicit Runner(const Transcript &t) : t_(t) {}

    void runGroup(size_t gi) {
        const Group &g = t_.groups[gi];
        std::unique_ptr<Device> own;
        Device *dev;
        if (g.fresh) {
            own.reset(new Device);
            dev = own.get();
            dev->upArgs = t_.upArgs;
            dev->upArgs.insert(dev->upArgs.end(), g.upArgs.begin(), g.upArgs.end());
        } else {
            if (!shared_) {
                shared_.reset(new Device);
                shared_->upArgs = t_.upArgs;
            }
            dev = shared_.get();
        }
        std::vector<Stmt> stmts = dev->sim ? g.stmts : t_.setup;
        if (!dev->sim) stmts.insert(stmts.end(), g.stmts.begin(), g.stmts.end());
        for (const Stmt &st : stmts) {
            if (!dev->sim && st.verb == "write") {
                dev->early.emplace_back(st.a, st.b);
                continue;
            }
            if (!dev->up()) return;
            run(*dev, st);
        }
        if (dev->sim && dev->sim->started()) finishGroup(*dev, g);
        // The shared device goes down inside the last test that uses it, so that
        // its sanitizer check and log land in a test.
        bool sharedLater = false;
        for (size_t k = gi + 1; k < t_.groups.size(); k++) sharedLater |= !t_.groups[k].fresh;
        if (!g.fresh && !sharedLater) shared_.reset();
    }

private:
    void failAt(int line, const std::string &msg) {
        ADD_FAILURE_AT(t_.path.c_str(), line) << msg;
    }

    void finishGroup(Device &dev, const Group &g) {
        std::string extra = quietLinks(dev, kGroupEndQuietMs);
        if (!extra.empty()) failAt(g.line, "bytes arrived after the group's last answer: " + extra);
        int status = dev.sim->tolkdExitStatus(0);
        if (status != -1) failAt(g.line, "tolkd ended during the group, status " + std::to_string(status));
        if (::testing::Test::HasFailure() && !g.fresh) {
            std::string log = dev.sim->log();
            if (log.size() > 4000) log = "..." + log.substr(log.size() - 4000);
            fprintf(stderr, "---- tolkd log (shared device %s) ----\n%s---- end ----\n", dev.sim->root().c_str(),
                    log.c_str());
        }
    }

    // What arrives on any open link within ms, rendered per link; "" when nothing.
    std::string quietLinks(Device &dev, int ms) {
        std::string out;
        long long end = sim::nowMs() + ms;
        for (;;) {
            std::vector<struct pollfd> p;
            for (auto &f : dev.fds)
                if (f.second >= 0) p.push_back({f.second, POLLIN, 0});
            long long left = end - sim::nowMs();
            if (left <= 0) break;
            if (p.empty()) {
                sim::sleepMs(static_cast<int>(left));
                break;
            }
            if (poll(p.data(), p.size(), static_cast<int>(left)) <= 0) continue;
            for (auto &f : dev.fds) {
                if (f.second < 0) continue;
                std::string got = takeNow(f.second);
                if (!got.empty()) out += f.first + ": " + sim::visibleBytes(got) + "  ";
            }
        }
        return out;
    }

    // Waits until done() holds (checked every 5 ms) or ms have passed.
    template <typename F>
    static bool waitFor(int ms, F done) {
        long long end = sim::nowMs() + ms;
        while (!done()) {
            if (sim::nowMs() >= end) return false;
            sim::sleepMs(5);
        }
        return true;
    }

    void run(Device &dev, const Stmt &st) {
        SimDevice &d = *dev.sim;
        if (st.verb == "serial" || st.verb == "adb") return exchange(dev, st);
        if (st.verb == "journal" || st.verb == "journal-later" || st.verb == "journal-end") {
            std::string path = "/journal/" + st.a;
            size_t &off = dev.journalOffset[st.a];
            std::string lastSeen;
            auto nextLine = [&](std::string *line) {
                std::string text = d.readFile(path);
                size_t nl = text.find('\n', off);
                if (text.size() < off || nl == std::string::npos) return false;
                *line = text.substr(off, nl - off);
                off = nl + 1;
                return true;
            };
            if (st.verb == "journal-end") {
                std::string line;
                if (nextLine(&line)) failAt(st.line, st.text + "\n  but the journal goes on with: " + line);
                return;
            }
            // No wait: a peer writes its line before it answers.
            bool found = false;
            std::string line;
            while (!found && nextLine(&line)) {
                lastSeen = line;
                found = compare(st.want, line) == 1 || st.verb == "journal";
            }
            if (!found || compare(st.want, lastSeen) != 1)
                failAt(st.line, st.text + "\n  expected: " + st.b + "\n  got:      " +
                                    (found || !lastSeen.empty() ? lastSeen : "(no new line)"));
            return;
        }
        if (st.verb == "prop") {
            std::string v;
            if (!waitFor(st.timeoutMs, [&] { return (v = d.getprop(st.a)) == st.b; }))
                failAt(st.line, st.text + "\n  got: " + st.a + " = " + v);
            return;
        }
        if (st.verb == "file" || st.verb == "file-absent") {
            std::string got;
            bool ok = waitFor(st.timeoutMs, [&] {
                if (st.verb == "file-absent") return !d.fileExists(st.a);
                return compare(st.want, got = d.readFile(st.a)) == 1;
            });
            if (!ok)
                failAt(st.line, st.verb == "file-absent" ? st.text + "\n  but it exists"
                                                         : st.text + "\n  expected: " + show(st.want) +
                                                               "\n  got:      " + sim::visibleBytes(got));
            return;
        }
        if (st.verb == "log") {
            if (!waitFor(st.timeoutMs, [&] { return d.log().find(st.b) != std::string::npos; }))
                failAt(st.line, st.text + "\n  not in the daemon's log");
            return;
        }
        if (st.verb == "quiet") {
            std::string extra = quietLinks(dev, st.timeoutMs);
            if (!extra.empty()) failAt(st.line, st.text + "\n  but got " + extra);
            return;
        }
        if (st.verb == "setprop") return d.setprop(st.a, st.b);
        if (st.verb == "write") return d.writeFile(st.a, st.b);
        if (st.verb == "sim") {
            int status = -1;
            std::string out = d.sim(st.args, &status);
            if (status != 0) failAt(st.line, st.text + "\n  exit status " + std::to_string(status) + ": " + out);
        }
    }

    void exchange(Device &dev, const Stmt &st) {
        const std::string where = st.text + (st.text.compare(0, 4, "both") == 0 ? " (on " + st.verb + ")" : "");
        int fd = dev.link(st.verb, st.reconnect);
        if (fd < 0) return failAt(st.line, where + "\n  cannot open the " + st.verb + " link");
        std::string stale = takeNow(fd);
        if (!stale.empty()) {
            auto it = dev.lastCase.find(st.verb);
            failAt(st.line, where + "\n  bytes waiting before the send" +
                                (it != dev.lastCase.end() ? " (after line " + std::to_string(it->second) + ")" : "") +
                                ": " + sim::visibleBytes(stale));
        }
        dev.lastCase[st.verb] = st.line;
        if (!st.send.empty() && !writeAll(fd, st.send)) return failAt(st.line, where + "\n  cannot send");
        std::string got;
        int state = 0;
        bool closed = false;
        long long end = sim::nowMs() + (st.want.empty() ? kEmptyAnswerQuietMs : st.timeoutMs);
        // An answer that went wrong is read on until the link is quiet, to show all of it.
        int quietAfterMismatch = 200;
        for (;;) {
            state = compare(st.want, got);
            if (state == 1 && !st.want.empty()) break;
            long long left = end - sim::nowMs();
            if (state == -1) left = std::min<long long>(left, quietAfterMismatch);
            if (left <= 0) break;
            struct pollfd p = {fd, POLLIN, 0};
            int r = poll(&p, 1, static_cast<int>(left));
            if (r < 0 && errno == EINTR) continue;
            if (r <= 0) {
                if (state == -1) break;
                continue;
            }
            char buf[4096];
            ssize_t n = read(fd, buf, sizeof buf);
            if (n < 0 && (errno == EAGAIN || errno == EINTR)) continue;
            if (n <= 0) {
                closed = true;
                break;
            }
            got.append(buf, static_cast<size_t>(n));
        }
        if (state == 1) got += takeNow(fd);  // bytes right behind a complete answer are still wrong
        if (compare(st.want, got) != 1)
            failAt(st.line, where + "\n  expected: " + show(st.want) + "\n  got:      " + sim::visibleBytes(got) +
                                (closed ? "\n  (the link was closed)" : ""));
        if (closed) {
            close(fd);
            dev.fds[st.verb] = -1;
        }
    }

    const Transcript &t_;
    std::unique_ptr<Device> shared_;
};

class GroupTest : public ::testing::Test {
public:
    GroupTest(Runner *r, size_t gi) : r_(r), gi_(gi) {}
    void TestBody() override { r_->runGroup(gi_); }

private:
    Runner *r_;
    size_t gi_;
};

std::string testName(const Group &g, size_t gi) {
    std::string s = std::to_string(gi) + "_";
    bool up = true;
    for (char c : g.title) {
        if (isalnum(static_cast<unsigned char>(c))) {
            s.push_back(up ? static_cast<char>(toupper(static_cast<unsigned char>(c))) : c);
            up = false;
        } else {
            up = true;
        }
    }
    return s;
}

}  // namespace

int main(int argc, char **argv) {
    ::testing::InitGoogleTest(&argc, argv);
    if (argc != 2) {
        fprintf(stderr, "usage: %s [gtest options] FILE.tx\n", argv[0]);
        return 2;
    }
    static Transcript t;
    std::string err;
    if (!parse(argv[1], &t, &err)) {
        fprintf(stderr, "%s\n", err.c_str());
        return 2;
    }
    static Runner runner(t);
    for (size_t gi = 0; gi < t.groups.size(); gi++) {
        const Group &g = t.groups[gi];
        ::testing::RegisterTest(t.name.c_str(), testName(g, gi + 1).c_str(),
                                nullptr, nullptr, t.path.c_str(), g.line,
                                [gi]() -> ::testing::Test * { return new GroupTest(&runner, gi); });
    }
    return RUN_ALL_TESTS();
}
