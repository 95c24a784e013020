// The text rules the peers and tolk-sim share, where their script and
// command-line flavours must stay apart.
#include "../../../sim/cit_audio_script.h"
#include "../../../sim/sim_text.h"

#include <gtest/gtest.h>

TEST(SimText, CommandLineEscapesAreStrictScriptEscapesNeverRefuse) {
    std::string out, err;
    ASSERT_TRUE(sim::decodeEscapes("AT\\r\\n\\t\\b\\e\\0\\\\\\x1A", &out, &err));
    EXPECT_EQ(out, std::string("AT\r\n\t\b\x1b", 7) + std::string(1, '\0') + "\\\x1a");
    for (const char *bad : {"tail\\", "\\x4", "\\xg1", "\\a", "\\\""}) {
        err.clear();
        EXPECT_FALSE(sim::decodeEscapes(bad, &out, &err)) << bad;
        EXPECT_FALSE(err.empty()) << bad;
    }
    // The radio and generic scripts know \a; the CIT and audio scripts read it as
    // the letter. Neither refuses what the command line refuses.
    EXPECT_EQ(sim::decodeScriptEscapes("\\a\\b\\x4\\xg\\", true), "\a" "b\x04\\xg\\");
    EXPECT_EQ(sim::decodeScriptEscapes("\\a\\b\\x4\\xg\\", false), "ab\x04\\xg\\");
    // Requests lose one NUL and their line end only.
    EXPECT_EQ(sim::stripRequestEnd(std::string("at+x \r\n\0", 8)), "at+x ");
    EXPECT_EQ(sim::stripRequestEnd(std::string("a\0\0", 3)), std::string("a\0", 2));
}

TEST(SimText, StarKeysOfTheCitAndAudioScriptsOnly) {
    peerscript::Rule r;
    std::string err;
    EXPECT_EQ(peerscript::parseRule(" => OK", &r, &err), -1);
    EXPECT_EQ(err, "empty key");
    EXPECT_EQ(peerscript::parseRule("A => (delay -1) t", &r, &err), -1);

    // A lone '*' matches everything here (the radio script reads it as text).
    ASSERT_EQ(peerscript::parseRule("* => (delay 20) (long 30) \\aHEAD\\x20", &r, &err), 1);
    EXPECT_TRUE(r.prefix);
    EXPECT_EQ(r.key, "");
    EXPECT_EQ(r.answer.delayMs, 20);
    EXPECT_EQ(r.answer.bytes, "aHEAD " + peerscript::longAnswer("aHEAD ", 30).substr(6));
    EXPECT_EQ(r.answer.bytes.size(), 30u);
    sim::ScriptLine line;
    ASSERT_EQ(sim::splitScriptLine("* => x", "command", false, &line, &err), 1);
    EXPECT_FALSE(line.prefix);
    EXPECT_EQ(line.key, "*");

    // An escaped '*' is text; an answer that merely starts with '(' is text too.
    ASSERT_EQ(peerscript::parseRule("A\\* => (none) (ok)", &r, &err), 1);
    EXPECT_FALSE(r.prefix);
    EXPECT_EQ(r.key, "A*");
    EXPECT_TRUE(r.answer.none);
    EXPECT_EQ(r.answer.bytes, "(ok)");
}
