// The host side of the simulated device: a scripted AT client and an
// interactive console, on the host serial port or on the adb link.
#ifndef TOLK_SIM_CLIENT_H
#define TOLK_SIM_CLIENT_H

#include <string>
#include <vector>

namespace sim {

struct AtOptions {
    std::string root;
    bool adb = false;
    int timeoutMs = 60000;  // per line: how long its complete answer may take
    int quietMs = 50;       // after a complete answer: the quiet that ends the exchange
    bool noCr = false;
    bool rawLines = false;           // lines are bytes already: no escapes
    bool numeric = false;            // the daemon is in numeric mode (ATV0) from the start
    bool silenceEnds = false;        // the console's piped mode: quietMs of silence ends a line
                                     // that has no complete answer, and that is no failure
    std::vector<std::string> lines;  // with escapes still in them (unless rawLines)
};

// True when the bytes received so far hold a final result line of an AT
// answer (numeric: a lone digit 0-8 counts too).
bool hasFinalResult(const std::string &received, bool numeric);

// True when received, the bytes that came back for the line sent (without its
// CR), hold a complete answer: a final result, or an answer that carries none by
// design (the user-mode refusal; whatever the audio service relays back for an
// audio or device-maker test command). A leading echo of the line is no answer.
bool isCompleteAnswer(const std::string &sent, const std::string &received, bool numeric);

// The descriptor that run's signal handlers write to (-1 for none): the client
// and the console stop waiting once it is readable.
void setInterruptFd(int fd);

int cmdAt(const AtOptions &opt);
int cmdConsole(const std::string &root, bool adb);

}  // namespace sim

#endif
