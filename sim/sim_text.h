// Text rules shared by tolk-sim and its peers: the escapes of command-line texts
// and of answer scripts, the one-line rendering of bytes in journals, and the
// pieces of the "KEY => ANSWER" script line that every peer's script shares.
// Each peer keeps its own directives and matching on top of these.
#ifndef TOLK_SIM_TEXT_H
#define TOLK_SIM_TEXT_H

#include <string>

namespace sim {

// 0..15 for a hex digit, -1 otherwise.
int hexDigitValue(char c);
// Drops leading blanks and tabs, and trailing blanks, tabs, CR and LF.
std::string trimBlanks(const std::string &s);
// Compares without regard to ASCII case.
bool equalsNoCase(const std::string &a, const std::string &b);
bool startsWithNoCase(const std::string &s, const std::string &prefix);

// The escapes of a command-line text (`tolk-sim at`, `urc`): \r \n \t \b \e \0,
// a doubled backslash and \xNN with exactly two hex digits. Anything else is
// refused: false, with a message in err.
bool decodeEscapes(const std::string &in, std::string *out, std::string *err);

// The escapes of an answer script, which never refuse a line: \r \n \t \0 \e, \a
// only where withBell is set, \xNN with one or two hex digits (\x without one
// stays as it is), and any other escaped character stands for itself (\\ \" \').
// A lone trailing backslash stays as it is.
std::string decodeScriptEscapes(const std::string &text, bool withBell);

// Renders bytes on one line: printable ASCII as is, backslash as \\, CR LF TAB as
// \r \n \t, every other byte as \xNN in lower case (NUL is \x00, Ctrl-Z \x1a).
std::string visibleBytes(const std::string &bytes);

// A request as its script rules see it: one trailing NUL dropped, then trailing CR
// and LF bytes (the daemon sends a line's delimiter or its NUL along).
std::string stripRequestEnd(const std::string &request);

// One script line "KEY => ANSWER", split but not yet interpreted.
struct ScriptLine {
    std::string key;     // trimmed, still escaped, without a prefix '*'
    bool prefix = false; // KEY ended in an unescaped '*'
    std::string answer;  // trimmed, still escaped, directives included
};
// 1 for a rule, 0 for a blank or '#' comment line, -1 for a line without "=>" or
// with an empty KEY (err: "empty " + keyName). loneStarIsPrefix: whether a KEY of
// a single '*' is a prefix matching everything or the literal text "*".
int splitScriptLine(const std::string &raw, const char *keyName, bool loneStarIsPrefix, ScriptLine *out,
                    std::string *err);
// Looks at a leading "(WORD ARG)" of text: true, with the trimmed inner text, its
// first word, the trimmed rest as arg and the trimmed text after ')' as rest, when
// text starts with '(' and has a ')'. The caller decides whether WORD is one of its
// directives.
bool peekDirective(const std::string &text, std::string *inner, std::string *word, std::string *arg,
                   std::string *rest);
// A whole decimal number from 0 to max; false for anything else.
bool parseBoundedNumber(const std::string &arg, long max, long *out);

}  // namespace sim

#endif
