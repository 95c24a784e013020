// The tokenizer, the operation-form classifier and the line normalisation.
#include <gtest/gtest.h>

#include <cstdint>
#include <string>

#include "attok/at_tok.h"

namespace {

// A mutable copy of a literal that lives for the whole test.
struct Line {
    explicit Line(const std::string &text) : buf(text) {}
    char *c_str() { return &buf[0]; }
    std::string buf;
};

AtOpType classify(const std::string &text, std::string *rest = nullptr) {
    Line line(text);
    char *cursor = line.c_str();
    AtOpType op = getAtOp(&cursor);
    if (rest != nullptr) *rest = cursor != nullptr ? cursor : "<null>";
    return op;
}

TEST(AtOp, ShortLinesAndBasicCommands) {
    EXPECT_EQ(AT_NONE_OP, classify(""));
    EXPECT_EQ(AT_NONE_OP, classify("A"));
    EXPECT_EQ(AT_BASIC_OP, classify("AT"));
    EXPECT_EQ(AT_BASIC_OP, classify("ATE0"));
    EXPECT_EQ(AT_BASIC_OP, classify("ATQ0V1E"));
    // A letter third outranks "?" and "=" further on.
    EXPECT_EQ(AT_BASIC_OP, classify("ATE?"));
    EXPECT_EQ(AT_BASIC_OP, classify("atd123"));
    EXPECT_EQ(AT_BASIC_OP, classify("ATS0=1"));
    EXPECT_EQ(AT_NONE_OP, getAtOp(nullptr));
}

TEST(AtOp, ExtendedForms) {
    EXPECT_EQ(AT_ACTION_OP, classify("AT+CMEC"));
    EXPECT_EQ(AT_ACTION_OP, classify("AT%REBOOT"));
    EXPECT_EQ(AT_READ_OP, classify("AT+CCLK?"));
    EXPECT_EQ(AT_READ_OP, classify("AT?"));
    EXPECT_EQ(AT_TEST_OP, classify("AT+CCLK=?"));
    EXPECT_EQ(AT_TEST_OP, classify("AT#CLS=?"));
    // A "?" inside a parameter still makes the line a read.
    EXPECT_EQ(AT_READ_OP, classify("AT+EURC=\"a?\""));
}

TEST(AtOp, SetMovesCursorPastFirstEqualsOnly) {
    std::string rest;
    EXPECT_EQ(AT_SET_OP, classify("AT+CSDF=1,2", &rest));
    EXPECT_EQ("1,2", rest);
    EXPECT_EQ(AT_SET_OP, classify("AT+X=a=b", &rest));
    EXPECT_EQ("a=b", rest);
    EXPECT_EQ(AT_SET_OP, classify("AT+X=", &rest));
    EXPECT_EQ("", rest);
    // Other forms leave the cursor where it was.
    EXPECT_EQ(AT_READ_OP, classify("AT+CCLK?", &rest));
    EXPECT_EQ("AT+CCLK?", rest);
    EXPECT_EQ(AT_TEST_OP, classify("AT+CCLK=?", &rest));
    EXPECT_EQ("AT+CCLK=?", rest);
}

TEST(AtTok, StartFlag) {
    Line line("+CSQ: 20,99");
    char *cursor = line.c_str();
    ASSERT_EQ(0, at_tok_start_flag(&cursor, ':'));
    EXPECT_STREQ(" 20,99", cursor);
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, ':'));
    EXPECT_EQ(nullptr, cursor);
    // A used-up cursor fails every later call.
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, ','));
    int v = 7;
    EXPECT_EQ(-1, at_tok_nextint(&cursor, &v));
    EXPECT_EQ(7, v);
    char *s = nullptr;
    EXPECT_EQ(-1, at_tok_nextstr(&cursor, &s));
    EXPECT_EQ(0, at_tok_hasmore(&cursor));

    // Asking for the terminator must not step past the end of the line.
    Line other("abc");
    cursor = other.c_str();
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, '\0'));
    EXPECT_EQ(nullptr, cursor);
}

TEST(AtTok, MixedParameterWalk) {
    Line line("1,\"abc\",  2");
    char *cursor = line.c_str();
    int i = 0;
    char *s = nullptr;
    ASSERT_EQ(0, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(1, i);
    EXPECT_EQ(1, at_tok_hasmore(&cursor));
    ASSERT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("abc", s);
    ASSERT_EQ(0, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(2, i);
    EXPECT_EQ(nullptr, cursor);
    EXPECT_EQ(0, at_tok_hasmore(&cursor));
    // Tokens are cut in place: the first comma became a NUL.
    EXPECT_STREQ("1", line.c_str());
}

TEST(AtTok, QuotedTokens) {
    {
        Line line("\"12\"");
        char *cursor = line.c_str();
        int i = 0;
        EXPECT_EQ(0, at_tok_nextint(&cursor, &i));
        EXPECT_EQ(12, i);
        // No comma after the closing quote: the cursor rests on the terminator.
        ASSERT_NE(nullptr, cursor);
        EXPECT_EQ('\0', *cursor);
        EXPECT_EQ(0, at_tok_hasmore(&cursor));
    }
    {
        Line line("\"a\"x,b");
        char *cursor = line.c_str();
        char *s = nullptr;
        EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
        EXPECT_STREQ("a", s);
        EXPECT_STREQ("b", cursor);
    }
    {
        Line line("\"abc");
        char *cursor = line.c_str();
        char *s = nullptr;
        EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
        EXPECT_STREQ("abc", s);
        EXPECT_EQ(nullptr, cursor);
    }
    {
        // Commas inside quotes belong to the token.
        Line line(" \"a,b\" , 3");
        char *cursor = line.c_str();
        char *s = nullptr;
        int i = 0;
        EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
        EXPECT_STREQ("a,b", s);
        EXPECT_EQ(0, at_tok_nextint(&cursor, &i));
        EXPECT_EQ(3, i);
    }
}

TEST(AtTok, IntegerConversion) {
    struct Case {
        const char *text;
        int result;
        int value;
    };
    const Case cases[] = {
        {"12abc", 0, 12}, {"abc", -1, 0}, {"4294967297", 0, 1}, {"-5", 0, -5},
        {"+", -1, 0},     {"", -1, 0},    {" \t7", 0, 7},       {"2147483648", 0, INT32_MIN},
    };
    for (const Case &c : cases) {
        Line line(c.text);
        char *cursor = line.c_str();
        int v = 99;
        EXPECT_EQ(c.result, at_tok_nextint(&cursor, &v)) << c.text;
        // The value is stored even when nothing converted.
        EXPECT_EQ(c.value, v) << c.text;
        EXPECT_EQ(nullptr, cursor) << c.text;
    }

    Line wide("4294967297,-9000000000,x");
    char *cursor = wide.c_str();
    int64_t v = 0;
    EXPECT_EQ(0, at_tok_nextint64(&cursor, &v));
    EXPECT_EQ(4294967297LL, v);
    EXPECT_EQ(0, at_tok_nextint64(&cursor, &v));
    EXPECT_EQ(-9000000000LL, v);
    EXPECT_EQ(-1, at_tok_nextint64(&cursor, &v));
    EXPECT_EQ(0, v);
}

TEST(AtTok, EmptyTokens) {
    Line line(",5");
    char *cursor = line.c_str();
    int i = 99;
    EXPECT_EQ(-1, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(0, i);
    EXPECT_STREQ("5", cursor);

    // An empty rest of line: an int fails, a string is an empty success; both use up
    // the cursor.
    Line a("");
    cursor = a.c_str();
    EXPECT_EQ(-1, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(nullptr, cursor);
    Line b("   ");
    cursor = b.c_str();
    char *s = nullptr;
    EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("", s);
    EXPECT_EQ(nullptr, cursor);
}

TEST(AtNormalize, UpperCaseStopsAtStopCharacter) {
    Line a("at+cmgs=\"abc\"");
    convertToUpperCase(a.c_str(), '=');
    EXPECT_EQ("AT+CMGS=\"abc\"", a.buf);
    Line b("at+cclk?");
    convertToUpperCase(b.c_str(), '=');
    EXPECT_EQ("AT+CCLK?", b.buf);
    Line c("=abc");
    convertToUpperCase(c.c_str(), '=');
    EXPECT_EQ("=abc", c.buf);
}

TEST(AtNormalize, TrimCutsBlanksOnly) {
    Line a("  AT+CCLK?  ");
    char *cursor = a.c_str();
    EXPECT_EQ(8, trim_string(&cursor));
    EXPECT_STREQ("AT+CCLK?", cursor);

    Line b("    ");
    cursor = b.c_str();
    EXPECT_EQ(0, trim_string(&cursor));
    EXPECT_STREQ("", cursor);

    Line c("AT\t");
    cursor = c.c_str();
    EXPECT_EQ(3, trim_string(&cursor));
    EXPECT_STREQ("AT\t", cursor);

    Line d(" \r\nAT \r\n ");
    cursor = d.c_str();
    EXPECT_EQ(7, trim_string(&cursor));
    EXPECT_STREQ("\r\nAT \r\n", cursor);
}

}  // namespace
