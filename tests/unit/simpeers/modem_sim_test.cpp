// The simulated modem's command interpreter and the answer-script format.
#include "../../../sim/modem_script.h"
#include "../../../sim/modem_sim.h"

#include <gtest/gtest.h>

using namespace tolksim;

namespace {

std::string ask(ModemSim &m, const std::string &line) {
    std::string answer;
    EXPECT_TRUE(m.handle(line + std::string(1, '\0'), &answer)) << line;
    return answer;
}

}  // namespace

TEST(ModemSim, IdentityDiffersPerSlotAndAnswersAreFramed) {
    ModemSim one(1), two(2);
    EXPECT_EQ(ask(one, "AT+CGSN"), "\r\n350000000000001\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(two, "AT+CGSN"), "\r\n350000000000002\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(two, "AT+CIMI"), "\r\n001010000000002\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(two, "AT+CCID"), "\r\n+CCID: 89001000000000000002\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(one, "AT"), "\r\nOK\r\n");
    EXPECT_EQ(ask(one, "AT+CSQ"), "\r\n+CSQ: 20,99\r\n\r\nOK\r\n");
    // Command names are case-insensitive; the request may arrive without its NUL.
    std::string a;
    ASSERT_TRUE(one.handle("at+cpin?", &a));
    EXPECT_EQ(a, "\r\n+CPIN: READY\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(one, "AT+CPIN=\"1234\""), "\r\nOK\r\n");
    // Several commands on one line: information in order, one final result.
    EXPECT_EQ(ask(one, "AT+CMGF=1;+CMGF?;+CSCS?"), "\r\n+CMGF: 1\r\n\r\n+CSCS: \"IRA\"\r\n\r\nOK\r\n");
    // ATV0 is acknowledged; the channel keeps verbose codes for the daemon to convert.
    EXPECT_EQ(ask(one, "ATV0"), "\r\nOK\r\n");
    EXPECT_EQ(ask(one, "AT"), "\r\nOK\r\n");
}

TEST(ModemSim, UnknownCommandsAndErrorReporting) {
    ModemSim m(1);
    EXPECT_EQ(ask(m, "AT+FOO"), "\r\nERROR\r\n");
    EXPECT_EQ(ask(m, "AT+CREG=7"), "\r\nERROR\r\n");
    EXPECT_EQ(ask(m, "garbage"), "\r\nERROR\r\n");
    EXPECT_EQ(ask(m, "AT+CMEE=1"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+FOO"), "\r\n+CME ERROR: 4\r\n");
    EXPECT_EQ(ask(m, "AT+CREG=7"), "\r\n+CME ERROR: 50\r\n");
    // An error stops the line: what ran before it still reported.
    EXPECT_EQ(ask(m, "AT+CSQ;+FOO;+CIMI"), "\r\n+CSQ: 20,99\r\n\r\n+CME ERROR: 4\r\n");
    EXPECT_EQ(ask(m, "AT+CMEE=2"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+FOO"), "\r\n+CME ERROR: operation not supported\r\n");
    EXPECT_EQ(ask(m, "ATZ"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+FOO"), "\r\nERROR\r\n");
    EXPECT_EQ(ask(m, "AT+CMGR=7"), "\r\n+CMS ERROR: 321\r\n");
}

TEST(ModemSim, SmsTextPhaseEndsWithCtrlZOrEsc) {
    ModemSim m(1);
    // Test and read forms never open the text phase.
    EXPECT_EQ(ask(m, "AT+CMGS=?"), "\r\nOK\r\n");
    EXPECT_FALSE(m.inTextPhase());
    EXPECT_EQ(ask(m, "AT+CMGS?"), "\r\nERROR\r\n");

    EXPECT_EQ(ask(m, "AT+CMGS=\"123\""), "\r\n> ");
    EXPECT_TRUE(m.inTextPhase());
    EXPECT_EQ(ask(m, "hello\n"), "\r\n> ");
    EXPECT_EQ(ask(m, "world\x1a"), "\r\n+CMGS: 1\r\n\r\nOK\r\n");
    EXPECT_FALSE(m.inTextPhase());
    // ESC abandons the message without using a reference.
    EXPECT_EQ(ask(m, "AT+CMGS=17"), "\r\n> ");
    EXPECT_EQ(ask(m, "0011\x1b"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CMGS=17"), "\r\n> ");
    EXPECT_EQ(ask(m, "0011\x1a\r"), "\r\n+CMGS: 2\r\n\r\nOK\r\n");
    // A new client drops an unfinished message.
    EXPECT_EQ(ask(m, "AT+CMGC=3"), "\r\n> ");
    m.reset();
    EXPECT_EQ(ask(m, "AT"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CNMA"), "\r\nOK\r\n");
}

TEST(ModemSim, WrittenMessagesAreListedAndMergedFormsAnswerLikeTextPhase) {
    ModemSim m(3);
    ask(m, "AT+CMGF=1");
    EXPECT_EQ(ask(m, "AT+CMGW=\"555\""), "\r\n> ");
    EXPECT_EQ(ask(m, "hi there\x1a"), "\r\n+CMGW: 1\r\n\r\nOK\r\n");
    // The one-line form stores its quoted text, commas included.
    EXPECT_EQ(ask(m, "AT+EMGW=\"777\",,\"a,b\x1a\"\r\n"), "\r\n+CMGW: 2\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CMGL=\"ALL\""),
              "\r\n+CMGL: 1,\"STO UNSENT\",\"555\",,\r\nhi there\r\n"
              "\r\n+CMGL: 2,\"STO UNSENT\",\"777\",,\r\na,b\x1a\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CMGR=1"), "\r\n+CMGR: \"STO UNSENT\",\"555\",\r\nhi there\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CPMS?"), "\r\n+CPMS: \"SM\",2,20,\"SM\",2,20,\"SM\",2,20\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CMGD=1"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+CMGR=1"), "\r\n+CMS ERROR: 321\r\n");

    EXPECT_EQ(ask(m, "AT+EMGS=\"123\",,\"hello\"\r\n"), "\r\n+CMGS: 1\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+EMGS=12,\"0011AABB\"\r\n"), "\r\n+CMGS: 2\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+EMGC=\"1\",,\"x\"\r\n"), "\r\n+CMGC: 3\r\n\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+ENMA=0,\"00\"\r\n"), "\r\nOK\r\n");
    EXPECT_EQ(ask(m, "AT+EMGS"), "\r\nERROR\r\n");
}

TEST(ScriptFormat, EscapesAndVisibleRendering) {
    EXPECT_EQ(cUnescape("a\\r\\n\\x1a\\x1B\\0z\\\\\\\"\\e"), std::string("a\r\n\x1a\x1b", 5) + std::string(1, '\0') +
                                                               "z\\\"\x1b");
    EXPECT_EQ(cUnescape("\\x4"), "\x04");
    EXPECT_EQ(cUnescape("\\xg"), "\\xg");
    EXPECT_EQ(cUnescape("tail\\"), "tail\\");
    std::string bytes = std::string("AT+CMGS\x1a\r\n\\", 11) + std::string(1, '\0') + "\xff";
    EXPECT_EQ(visibleBytes(bytes), "AT+CMGS\\x1a\\r\\n\\\\\\x00\\xff");
    // Rendering is reversible, which is what lets tests compare journal lines.
    EXPECT_EQ(cUnescape(visibleBytes(bytes)), bytes);
}

TEST(ScriptFormat, RulesDirectivesAndMatching) {
    ScriptRule r;
    std::string err;
    EXPECT_EQ(parseScriptLine("  # comment", &r, &err), 0);
    EXPECT_EQ(parseScriptLine("   ", &r, &err), 0);
    EXPECT_EQ(parseScriptLine("AT+CSQ", &r, &err), -1);
    EXPECT_EQ(parseScriptLine(" => x", &r, &err), -1);
    EXPECT_EQ(parseScriptLine("AT+X => (delay soon) x", &r, &err), -1);

    ASSERT_EQ(parseScriptLine("AT+CSQ => \\r\\n+CSQ: 5,99\\r\\n\\r\\nOK\\r\\n", &r, &err), 1);
    EXPECT_EQ(r.key, "AT+CSQ");
    EXPECT_FALSE(r.prefix);
    ASSERT_EQ(r.answer.frames.size(), 1u);
    EXPECT_EQ(r.answer.frames[0], "\r\n+CSQ: 5,99\r\n\r\nOK\r\n");

    ASSERT_EQ(parseScriptLine("AT+FOO => (none)", &r, &err), 1);
    EXPECT_TRUE(r.answer.frames.empty());

    ASSERT_EQ(parseScriptLine("at+cmgs=* => (delay 250) (gap 40) (split) \\r\\n>\\x20 || \\r\\nOK\\r\\n", &r, &err), 1);
    EXPECT_TRUE(r.prefix);
    EXPECT_EQ(r.answer.delayMs, 250);
    EXPECT_EQ(r.answer.gapMs, 40);
    ASSERT_EQ(r.answer.frames.size(), 2u);
    EXPECT_EQ(r.answer.frames[0], "\r\n> ");
    EXPECT_EQ(r.answer.frames[1], "\r\nOK\r\n");

    ASSERT_EQ(parseScriptLine("AT+POWERKEY => (hold) \\r\\nOK\\r\\n", &r, &err), 1);
    EXPECT_TRUE(r.answer.hold);
    ASSERT_EQ(parseScriptLine("AT+BYE => (close)", &r, &err), 1);
    EXPECT_TRUE(r.answer.close);

    // Requests are compared without their NUL and line end, and without case.
    EXPECT_EQ(matchKey(std::string("AT+CSQ\r\n\0", 9)), "AT+CSQ");
    EXPECT_EQ(matchKey(std::string("hello\n\0", 7)), "hello");
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
    write("AT+CMGS=* => one\nAT+CSQ => two\nbroken line\nAT+CSQ => shadowed\n");
    ASSERT_TRUE(file.lookup(std::string("at+csq\0", 7), &a));
    EXPECT_EQ(a.frames.at(0), "two");
    ASSERT_TRUE(file.lookup("AT+CMGS=\"1\"", &a));
    EXPECT_EQ(a.frames.at(0), "one");
    EXPECT_FALSE(file.lookup("AT+CMGSX", &a));
    EXPECT_FALSE(file.lookup("AT+CSQX", &a));

    // Same second, different size: still noticed.
    write("AT+CSQ => three, longer\n");
    ASSERT_TRUE(file.lookup("AT+CSQ", &a));
    EXPECT_EQ(a.frames.at(0), "three, longer");
    unlink(path.c_str());
    EXPECT_FALSE(file.lookup("AT+CSQ", &a));
    rmdir(dir);
}
