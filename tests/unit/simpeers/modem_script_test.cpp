// The answer-script format of the radio and generic services. The modem's own
// answers are what the end-to-end modem and SMS tests assert.
#include "../../../sim/modem_script.h"

#include <gtest/gtest.h>

using namespace tolksim;

TEST(ScriptFormat, EscapesRenderReversibly) {
    EXPECT_EQ(cUnescape("\\x4\\xg tail\\"), "\x04\\xg tail\\");
    std::string bytes = std::string("AT+CMGS\x1a\r\n\\", 11) + std::string(1, '\0') + "\xff";
    EXPECT_EQ(visibleBytes(bytes), "AT+CMGS\\x1a\\r\\n\\\\\\x00\\xff");
    // Reversible, which is what lets tests compare journal lines.
    EXPECT_EQ(cUnescape(visibleBytes(bytes)), bytes);
}

TEST(ScriptFormat, FileIsReReadWhenItChanges) {
    char dir[] = "/tmp/simscriptXXXXXX";
    ASSERT_NE(mkdtemp(dir), nullptr);
    std::string path = std::string(dir) + "/script";
    ScriptFile file(path);
    ScriptAnswer a;
    EXPECT_FALSE(file.lookup("AT+CSQ", &a));  // no file: built-in answers apply

    auto write = [&](const std::string &text) {
        FILE *f = fopen(path.c_str(), "w");
        ASSERT_NE(f, nullptr);
        fputs(text.c_str(), f);
        fclose(f);
    };
    write("AT+CMGS=* => one\nAT+CSQ => (split) two || 2\nbroken line\nAT+CSQ => shadowed\n");
    ASSERT_TRUE(file.lookup(std::string("at+csq\r\n\0", 9), &a));
    EXPECT_EQ(a.frames, (std::vector<std::string>{"two", "2"}));
    ASSERT_TRUE(file.lookup("AT+CMGS=\"1\"", &a));
    EXPECT_EQ(a.frames.at(0), "one");
    EXPECT_FALSE(file.lookup("AT+CSQX", &a));

    // Same second, different size: still noticed.
    write("AT+CSQ => three, longer\n");
    ASSERT_TRUE(file.lookup("AT+CSQ", &a));
    EXPECT_EQ(a.frames.at(0), "three, longer");
    unlink(path.c_str());
    EXPECT_FALSE(file.lookup("AT+CSQ", &a));
    rmdir(dir);
}

// The generic link has no framing: what one read brings is cut into the
// daemon's messages, and an MMI answer cut by the reads is put together again.
TEST(GenericSplitter, CutsReadsIntoCommandsAndMmiAnswers) {
    using Messages = std::vector<std::string>;
    const std::string mmi = "AT+CPIN=+ORVTOLKJ\r\n+CPIN: READY\r\n\r\nOK\r\n;";
    struct Case {
        std::vector<std::string> reads;
        Messages messages;
    } cases[] = {
        {{"AT+SN"}, {"AT+SN"}},
        {{"AT+SNAT+CPIN=+ORVTOLKJ\r\nOK\r\n;"}, {"AT+SN", "AT+CPIN=+ORVTOLKJ\r\nOK\r\n;"}},
        {{mmi + "AT%OSVER" + mmi}, {mmi, "AT%OSVER", mmi}},
        {{"AT+SNAT+MODEL", "AT%TEST=\"AT+X;\"AT+SN"}, {"AT+SN", "AT+MODEL", "AT%TEST=\"AT+X;\"", "AT+SN"}},
        // The answer's own ";" is not its end while more of it follows.
        {{"AT+CPIN?+ORVTOLKJ\r\n+X: a;b\r\n;AT+SN"}, {"AT+CPIN?+ORVTOLKJ\r\n+X: a;b\r\n;", "AT+SN"}},
        {{"AT+MODELAT+CPIN=+ORVTOLKJ\r\n+CPIN:", " READY\r\n", "\r\nOK\r\n;AT+SN"},
         {"AT+MODEL", mmi, "AT+SN"}},
    };
    for (const Case &c : cases) {
        GenericSplitter split;
        Messages got;
        for (const std::string &r : c.reads)
            for (const std::string &m : split.feed(r)) got.push_back(m);
        EXPECT_EQ(got, c.messages) << c.reads.front();
        EXPECT_EQ(split.pending(), "");
    }
    // An answer the link ends in the middle of is handed over as far as it came.
    GenericSplitter split;
    EXPECT_EQ(split.feed("AT+CPIN=+ORVTOLKJ\r\n+CP"), Messages{});
    EXPECT_EQ(split.flush(), "AT+CPIN=+ORVTOLKJ\r\n+CP");
}
