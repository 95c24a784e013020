// Test doubles for the CIT unit tests: a test application served on the same
// abstract socket the daemon connects to. The host end of the serial link is
// the shared HostCapture.
#ifndef TOLK_TESTS_UNIT_CIT_FAKES_H
#define TOLK_TESTS_UNIT_CIT_FAKES_H

#include <map>
#include <mutex>
#include <string>
#include <thread>

#include "host_capture.h"

// The on-device test application: one word per NUL, answers by word ("OK" by default).
class FakeTestApp {
public:
    FakeTestApp();
    ~FakeTestApp();

    void reply(const std::string &word, const std::string &text);

private:
    void serve();
    bool serveConnection(int conn);

    int listen_ = -1;
    int stop_[2] = {-1, -1};
    std::thread thread_;
    std::mutex mutex_;
    std::map<std::string, std::string> replies_;
};

// Host bytes for a forwarded command's answer text and verdict, as the writer
// frames "<text>\r\nOK\r\n" (or "\r\nERROR\r\n").
std::string framedVerdict(const std::string &text, bool ok);

#endif
