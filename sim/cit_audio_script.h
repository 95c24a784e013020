// Shared pieces of the simulated CIT test application and audio services: their
// answer scripts. Escapes, the journal rendering (sim_text.h) and the socket
// helpers (sim_util.h) are those of every peer.
//
// Script format (one rule per line, '#' starts a comment line):
//     KEY => ANSWER
// KEY is compared without regard to case; a KEY ending in '*' matches every request
// that begins with the rest. The first matching rule wins. ANSWER is raw bytes
// written with C escapes (\r \n \t \0 \e \\ \xNN); blanks around it are dropped,
// so a leading or trailing blank is written \x20. ANSWER may begin with
// directives:
//     (none)          answer nothing, keep the connection open
//     (close)         close the connection instead of answering
//     (delay MS)      wait MS milliseconds before answering
//     (long N) TEXT   answer exactly N bytes: TEXT, then filler bytes where the
//                     byte at offset i is 'a' + i % 26 (cut to N if TEXT is longer)
#ifndef TOLK_SIM_CIT_AUDIO_SCRIPT_H
#define TOLK_SIM_CIT_AUDIO_SCRIPT_H

#include <stddef.h>

#include <string>
#include <vector>

namespace peerscript {

// The filler of a (long N) answer.
std::string longAnswer(const std::string &head, size_t n);

struct Answer {
    bool none = false;
    bool close = false;
    int delayMs = 0;
    std::string bytes;
};

struct Rule {
    std::string key;
    bool prefix = false;
    Answer answer;
};

// Parses one line: 1 rule, 0 blank or comment, -1 malformed (err says why).
int parseRule(const std::string &line, Rule *rule, std::string *err);

// A script file read afresh at every lookup (they are small, and a test may
// rewrite one between two commands).
class Script {
public:
    explicit Script(std::string path) : path_(std::move(path)) {}
    // The answer of the first rule matching key; false when none matches.
    bool lookup(const std::string &key, Answer *out) const;

private:
    std::string path_;
};

}  // namespace peerscript

#endif
