// Shared pieces of the simulated radio and generic services: the answer script
// (a small line format that overrides or adds answers) and the socket helpers. Host tool code: modern C++ is fine here.
#ifndef TOLK_SIM_MODEM_SCRIPT_H
#define TOLK_SIM_MODEM_SCRIPT_H

#include <sys/types.h>
#include <time.h>

#include <string>
#include <vector>

#include "sim_text.h"
#include "sim_util.h"

namespace tolksim {

// Interprets \r \n \t \0 \a \e \\ \" \' and \xNN (one or two hex digits). An
// unknown escape keeps its character; a lone trailing backslash stays as is.
inline std::string cUnescape(const std::string &text) { return sim::decodeScriptEscapes(text, true); }
// Journals render bytes on one line, as every peer does.
using sim::visibleBytes;

// What a script rule answers.
struct ScriptAnswer {
    std::vector<std::string> frames;  // empty: no answer
    int delayMs = 0;                  // before the first frame
    int gapMs = 0;                    // between frames
    bool hold = false;                // wait for the release file
    bool close = false;               // drop the client connection instead of answering
};

// One step of an answer laid out in time: a frame to send, or (close) the
// connection to drop.
struct AnswerStep {
    long long due = 0;  // nowMs() time
    bool hold = false;  // also waits for the release file
    bool close = false;
    std::string frame;

    bool ready(long long now, bool released) const { return due <= now && (!hold || released); }
};
// The steps of an answer given at time now: a single close step, or one step per
// frame, the first after delayMs and the next ones gapMs apart.
std::vector<AnswerStep> answerSteps(const ScriptAnswer &answer, long long now);
// How long a service's poll may sleep while these steps wait (each element of
// pending has its AnswerStep as .step): never past a due step, and at most 20 ms
// while one is held, so that the release file is seen soon.
template <typename Pending>
int stepPollTimeout(const std::vector<Pending> &pending, long long now, int idleMs = 100) {
    int timeout = idleMs;
    for (const Pending &p : pending) {
        if (p.step.hold && timeout > 20) timeout = 20;
        long long left = p.step.due - now;
        if (left < 0) left = 0;
        if (left < timeout) timeout = static_cast<int>(left);
    }
    return timeout;
}
// True once when the release file exists: it is taken away, so each file
// releases what is held at that moment.
bool takeReleaseFile(const std::string &path);

struct ScriptRule {
    std::string key;     // unescaped, compared without case
    bool prefix = false; // key ended in '*'
    ScriptAnswer answer;
};

// Parses one script line. Returns 1 for a rule, 0 for a blank or comment line,
// -1 for a malformed line (err says why).
int parseScriptLine(const std::string &line, ScriptRule *rule, std::string *err);
// The text a request is matched with: one trailing NUL dropped, then trailing CR
// and LF bytes, then surrounding blanks.
std::string matchKey(const std::string &request);

// A script file, re-read whenever its modification time (or size) changes.
class ScriptFile {
public:
    explicit ScriptFile(std::string path) : path_(std::move(path)) {}
    // Finds the first rule matching the request; false when none (or no file).
    bool lookup(const std::string &request, ScriptAnswer *out);
    const std::string &path() const { return path_; }

private:
    void refresh();
    std::string path_;
    bool present_ = false;
    struct timespec mtime_ {};
    off_t size_ = -1;
    std::vector<ScriptRule> rules_;
};

// The generic service link has no framing: the daemon writes each command text,
// and each MMI answer (stored text ending in "+ORVTOLKJ", the modem's answer, and
// ";"), with one send and no terminator, so one read may hold several of them or
// part of an MMI answer. This cuts what a connection delivers into those messages
// where they can be told apart:
//  - an MMI answer starts at the "AT" of the command name in front of the mark
//    (and of its "=", "=?" or "?"), and ends at the first ";" after the mark that
//    is followed by the next message ("AT+" or "AT%") or by the end of what has
//    arrived; without such a ";" the answer is kept until more arrives;
//  - command texts are cut before every "AT+" or "AT%" outside double quotes, the
//    beginnings of the framework commands.
class GenericSplitter {
public:
    // The complete messages, in order, once bytes are added.
    std::vector<std::string> feed(const std::string &bytes);
    // What is kept back: the start of an MMI answer whose ";" has not come.
    const std::string &pending() const { return pending_; }
    // Gives up on a kept answer (the link ended, or it grew without bound): it is
    // returned as it is.
    std::string flush();

private:
    std::string pending_;
};

// Binds and listens on an AF_UNIX stream socket at path (an old file is removed,
// missing folders are made). Returns the descriptor or -1, saying why on stderr.
int listenUnix(const std::string &path, int backlog = 4);
// The file, socket and clock helpers of all tolk-sim.
using sim::connectUnix;
using sim::journalLine;
using sim::makeDirs;
using sim::nowMs;
using sim::sendAll;
// The device path resolved under root: root + path.
std::string underRoot(const std::string &root, const std::string &devicePath);

}  // namespace tolksim

#endif
