// Test doubles for the CIT unit tests: the host end of the serial link, and a test
// application served on the same abstract socket the daemon connects to.
#ifndef TOLK_TESTS_UNIT_CIT_FAKES_H
#define TOLK_TESTS_UNIT_CIT_FAKES_H

#include <map>
#include <mutex>
#include <string>
#include <thread>
#include <utility>
#include <vector>

// Points the serial slot of gSerialDevice at one end of a socket pair and reads
// what the daemon wrote from the other end.
class HostLink {
public:
    HostLink();
    ~HostLink();
    // Everything written since the last call.
    std::string take();

private:
    int host_ = -1;
    int device_ = -1;
};

// The on-device test application: one word per NUL, answers by word.
class FakeTestApp {
public:
    FakeTestApp();
    ~FakeTestApp();

    void reply(const std::string &word, const std::string &text);
    // Close the connection instead of answering this word.
    void closeOn(const std::string &word);
    // (connection number, word) for every word received so far.
    std::vector<std::pair<int, std::string>> received();
    // Waits until n words have arrived (bounded wait); false on time-out.
    bool waitFor(size_t n);

private:
    void serve();
    bool serveConnection(int conn, int id);

    int listen_ = -1;
    int stop_[2] = {-1, -1};
    std::thread thread_;
    std::mutex mutex_;
    std::map<std::string, std::string> replies_;
    std::map<std::string, bool> closes_;
    std::vector<std::pair<int, std::string>> received_;
};

// Host bytes for a forwarded command's answer text and verdict, as the writer
// frames "<text>\r\nOK\r\n" (or "\r\nERROR\r\n").
std::string framedVerdict(const std::string &text, bool ok);

#endif
