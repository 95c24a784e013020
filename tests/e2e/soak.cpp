// Soak: a long run of mixed commands over both host links with unsolicited modem
// output in between. Every command gets its exact answer, every forwarded one
// reaches its peer once, and the daemon's memory and descriptors do not grow.
//
// TOLK_SOAK_COMMANDS sets the number of commands (default 100000; the sanitizer
// and valgrind runs use fewer). Roughly one in fifty goes to the serial port,
// whose reads carry a fixed 10 ms pause each.
#include <stdlib.h>
#include <unistd.h>

#include <chrono>

#include <gtest/gtest.h>

#include "fault_checks.h"

using namespace fault_checks;

namespace {

struct Command {
    const char *line;
    const char *answer;
    enum { Local, Modem, Generic } target;
};

const Command kMix[] = {
    {"AT+CSDF?", "\r\n+CSDF: 1,1\n\r\n\r\nOK\r\n", Command::Local},
    {"AT+CSQ", "\r\n+CSQ: 20,99\r\n\r\nOK\r\n", Command::Modem},
    {"AT+ESUO?", "\r\n+ESUO:4\r\n\r\nOK\r\n", Command::Local},
    {"AT+CGSN", "\r\n350000000000001\r\n\r\nOK\r\n", Command::Modem},
    {"AT%OSVER", "\r\nOK\r\n", Command::Generic},
    {"AT+CPIN?", "\r\n+CPIN: READY\r\n\r\nOK\r\n", Command::Modem},
    {"AT+CSDF=1,1", "\r\nOK\r\n", Command::Local},
};
const int kMixSize = sizeof(kMix) / sizeof(kMix[0]);

long soakCommands() {
    const char *env = getenv("TOLK_SOAK_COMMANDS");
    long n = env && *env ? atol(env) : 100000;
    return n > 2000 ? n : 2000;
}

TEST(Soak, MixedTrafficOnBothLinks) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    HostLink serial(d, false);
    HostLink adb(d, true);
    ASSERT_GE(serial.fd(), 0);
    ASSERT_GE(adb.fd(), 0);

    const int errorsAtStart = countOf(d.log(), " E TOLKD");
    const long total = soakCommands();
    long sent[3] = {0, 0, 0}, urcs = 0, serialCount = 0;
    long rssAfterWarmup = -1;
    int fdsAfterWarmup = -1;
    auto start = std::chrono::steady_clock::now();
    for (long i = 0; i < total; i++) {
        const Command &c = kMix[i % kMixSize];
        bool onSerial = i % 50 == 7;
        HostLink &host = onSerial ? serial : adb;
        serialCount += onSerial;
        ASSERT_TRUE(writeAll(host.fd(), std::string(c.line) + "\r"));
        std::string got = readUntil(host.fd(), c.answer, 5000);
        ASSERT_EQ(visible(c.answer), visible(got)) << "command " << i << " " << c.line << (onSerial ? " serial" : " adb");
        sent[c.target]++;

        // Unsolicited output goes to the link of the last command.
        if (i % 140 == 1) {  // always after AT+CSQ
            std::string text = "\r\n+CREG: " + std::to_string(i % 5) + "\r\n";
            int status = -1;
            d.sim({"urc", "\\r\\n+CREG: " + std::to_string(i % 5) + "\\r\\n"}, &status);
            ASSERT_EQ(0, status);
            ASSERT_EQ(visible(text), visible(readUntil(host.fd(), text, 3000))) << "urc after command " << i;
            urcs++;
        }
        if (i == 999) {
            usleep(100 * 1000);
            rssAfterWarmup = tolkdRssKb(d);
            fdsAfterWarmup = d.tolkdFdCount();
        }
    }
    double seconds = std::chrono::duration<double>(std::chrono::steady_clock::now() - start).count();
    usleep(100 * 1000);
    long rss = tolkdRssKb(d);
    int fds = d.tolkdFdCount();
    printf("soak: %ld commands (%ld on serial; %ld local, %ld modem, %ld generic), %ld unsolicited, %.1f s, "
           "VmRSS %ld kB after 1000, %ld kB at the end, %d descriptors\n",
           total, serialCount, sent[Command::Local], sent[Command::Modem], sent[Command::Generic], urcs, seconds,
           rssAfterWarmup, rss, fds);

    EXPECT_GT(urcs, 0);
    EXPECT_EQ(fdsAfterWarmup, fds) << tolkdFdList(d);
    EXPECT_GT(rssAfterWarmup, 0);
    // Under a wrapper (valgrind) the process's memory is mostly the wrapper's own;
    // under AddressSanitizer freed blocks stay in its quarantine and count too.
    const char *wrapper = getenv("TOLK_E2E_TOLKD");
    bool sanitized = false;
#if defined(__SANITIZE_ADDRESS__)
    sanitized = true;
#endif
    if ((!wrapper || !*wrapper) && !sanitized) {
        EXPECT_EQ(rssAfterWarmup, rss) << "resident memory grew";
    }
    // Each forwarded command reached its peer exactly once.
    std::string radio = d.readFile("/journal/radio.slot1.log"), generic = d.readFile("/journal/generic.log");
    long radioLines = countOf(radio, "\n"), genericLines = countOf(generic, "\n");
    EXPECT_EQ(radioLines, countOf(radio, "\n-1\t") + 1) << "every request with serial -1, none refused";
    EXPECT_EQ(0, countOf(radio, "refused"));
    EXPECT_EQ(sent[Command::Modem], radioLines);
    EXPECT_EQ(sent[Command::Generic], genericLines);
    EXPECT_EQ(sent[Command::Generic], countOf(generic, "AT%OSVER\n"));
    EXPECT_EQ(errorsAtStart, countOf(d.log(), " E TOLKD")) << "no error was logged";
}

}  // namespace
