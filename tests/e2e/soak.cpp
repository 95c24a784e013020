// Soak: a long run of mixed commands over both host links with unsolicited modem
// output in between. Every command gets its exact answer, every forwarded one
// reaches its peer once, and the daemon's memory and descriptors do not grow.
//
// TOLK_SOAK_COMMANDS sets the number of commands (default 100000, at least 2000;
// the sanitizer and valgrind runs use fewer). Roughly one in fifty goes to the
// serial port, whose reads carry a fixed 10 ms pause each.
#include <stdlib.h>

#include <algorithm>
#include <chrono>
#include <fstream>

#include "fault_checks.h"

enum Target { kLocal, kModem, kGeneric };
const struct {
    const char *line, *answer;
    Target target;
} kMix[] = {
    {"AT+CSDF?", kCsdfAnswer, kLocal},
    {"AT+CSQ", "\r\n+CSQ: 20,99\r\n\r\nOK\r\n", kModem},
    {"AT+ESUO?", "\r\n+ESUO:4\r\n\r\nOK\r\n", kLocal},
    {"AT+CGSN", "\r\n350000000000001\r\n\r\nOK\r\n", kModem},
    {"AT%OSVER", "\r\nOK\r\n", kGeneric},
    {"AT+CPIN?", "\r\n+CPIN: READY\r\n\r\nOK\r\n", kModem},
    {"AT+CSDF=1,1", "\r\nOK\r\n", kLocal},
};

// Resident memory of the daemon in kB, once it has settled; negative when unknown.
static long tolkdRssKb(const SimDevice &d) {
    usleep(100 * 1000);
    long size = 0, pages = -1;
    std::ifstream("/proc/" + std::to_string(d.tolkdPid()) + "/statm") >> size >> pages;
    return pages * (sysconf(_SC_PAGESIZE) / 1024);
}

TEST(Soak, MixedTrafficOnBothLinks) {
    SimDevice d({"--prop", "persist.service.tolk.usermode=1"});
    ASSERT_TRUE(d.started()) << d.upOutput();
    // The host links, held to the end (a failed assertion leaves them to the
    // process's exit).
    int serial = d.openSerial(), adb = d.connectAdb();
    ASSERT_TRUE(serial >= 0 && adb >= 0);
    writeAll(serial, "ATE0\r");
    ASSERT_EQ("ATE0\n\r\nOK\r\n", readUntil(serial, "OK\r\n"));

    const int errorsAtStart = countOf(d.log(), " E TOLKD");
    const char *env = getenv("TOLK_SOAK_COMMANDS");
    const long total = std::max(2000L, env && *env ? atol(env) : 100000L);
    long sent[3] = {0, 0, 0}, rssAfterWarmup = -1, fdsAfterWarmup = -1;
    auto start = std::chrono::steady_clock::now();
    for (long i = 0; i < total; i++) {
        const auto &c = kMix[i % std::size(kMix)];
        int fd = i % 50 == 7 ? serial : adb;
        ASSERT_TRUE(writeAll(fd, std::string(c.line) + "\r"));
        ASSERT_EQ(visible(c.answer), visible(readUntil(fd, c.answer))) << "command " << i << " " << c.line;
        sent[c.target]++;
        // Unsolicited output, always after AT+CSQ, goes to the link of the last command.
        if (i % 140 == 1) {
            std::string text = "\r\n+CREG: " + std::to_string(i % 5) + "\r\n";
            simOk(d, {"urc", visible(text)});
            ASSERT_EQ(visible(text), visible(readUntil(fd, text, 3000))) << "urc after command " << i;
        }
        if (i == 999) {
            rssAfterWarmup = tolkdRssKb(d);
            fdsAfterWarmup = d.tolkdFdCount();
        }
    }
    long rss = tolkdRssKb(d);
    std::chrono::duration<double> took = std::chrono::steady_clock::now() - start;
    printf("soak: %ld commands in %.1f s, RSS %ld kB after 1000, %ld kB at the end\n", total, took.count(),
           rssAfterWarmup, rss);
    EXPECT_EQ(fdsAfterWarmup, d.tolkdFdCount());
    EXPECT_GT(rssAfterWarmup, 0);
    // Under a wrapper (valgrind) the process's memory is mostly the wrapper's own;
    // under AddressSanitizer freed blocks stay in its quarantine and count too.
#if !defined(__SANITIZE_ADDRESS__)
    const char *wrapper = getenv("TOLK_E2E_TOLKD");
    if (!wrapper || !*wrapper) {
        EXPECT_EQ(rssAfterWarmup, rss) << "resident memory grew";
    }
#endif
    // Each forwarded command reached its peer exactly once.
    std::string radio = d.readFile("/journal/radio.slot1.log"), generic = d.readFile("/journal/generic.log");
    EXPECT_EQ(countOf(radio, "\n"), countOf(radio, "\n-1\t") + 1) << "every request with serial -1";
    EXPECT_EQ(0, countOf(radio, "refused"));
    EXPECT_EQ(sent[kModem], countOf(radio, "\n"));
    EXPECT_EQ(sent[kGeneric], countOf(generic, "\n"));
    EXPECT_EQ(sent[kGeneric], countOf(generic, "AT%OSVER\n"));
    EXPECT_EQ(errorsAtStart, countOf(d.log(), " E TOLKD")) << "no error was logged";
    close(serial);
    close(adb);
}
