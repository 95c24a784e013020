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
