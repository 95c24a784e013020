// The tokenizer, the operation-form classifier and the line normalisation.
#include <gtest/gtest.h>

#include <cstdint>
#include <cstring>
#include <string>

#include "attok/at_tok.h"

namespace {

// Classifies a copy of text; *rest receives where the cursor was left.
AtOpType classify(std::string text, std::string *rest = nullptr) {
    char *cursor = &text[0];
    AtOpType op = getAtOp(&cursor);
    if (rest != nullptr) *rest = cursor != nullptr ? cursor : "<null>";
    return op;
}

TEST(AtOp, Forms) {
    const std::pair<const char *, AtOpType> cases[] = {
        {"", AT_NONE_OP},           {"A", AT_NONE_OP},           {"AT", AT_BASIC_OP},
        {"ATQ0V1E", AT_BASIC_OP},   {"ATE?", AT_BASIC_OP},       {"atd123", AT_BASIC_OP},
        {"AT+CMEC", AT_ACTION_OP},  {"AT%REBOOT", AT_ACTION_OP}, {"AT+CCLK?", AT_READ_OP},
        {"AT?", AT_READ_OP},        {"AT#CLS=?", AT_TEST_OP},    {"AT+EURC=\"a?\"", AT_READ_OP},
    };
    for (const auto &c : cases) EXPECT_EQ(c.second, classify(c.first)) << c.first;
    EXPECT_EQ(AT_NONE_OP, getAtOp(nullptr));

    // Only a set form moves the cursor, just past the first "=".
    std::string rest;
    EXPECT_EQ(AT_SET_OP, classify("AT+CSDF=1,2", &rest));
    EXPECT_EQ("1,2", rest);
    EXPECT_EQ(AT_SET_OP, classify("AT+X=a=b", &rest));
    EXPECT_EQ("a=b", rest);
    EXPECT_EQ(AT_TEST_OP, classify("AT+CCLK=?", &rest));
    EXPECT_EQ("AT+CCLK=?", rest);
}

TEST(AtTok, ParameterWalkUsesUpCursor) {
    std::string line = "1,\"abc\",  2";
    char *cursor = &line[0];
    int i = 0;
    char *s = nullptr;
    ASSERT_EQ(0, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(1, i);
    ASSERT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("abc", s);
    EXPECT_EQ(1, at_tok_hasmore(&cursor));
    ASSERT_EQ(0, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(2, i);
    EXPECT_EQ(nullptr, cursor);
    EXPECT_EQ(0, at_tok_hasmore(&cursor));
    // A used-up cursor fails every call and leaves the output alone.
    i = 7;
    EXPECT_EQ(-1, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(7, i);
    EXPECT_EQ(-1, at_tok_nextstr(&cursor, &s));
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, ','));

    std::string csq = "+CSQ: 20,99";
    cursor = &csq[0];
    ASSERT_EQ(0, at_tok_start_flag(&cursor, ':'));
    EXPECT_STREQ(" 20,99", cursor);
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, ':'));
    EXPECT_EQ(nullptr, cursor);
    // Asking for the terminator must not step past the end of the line.
    cursor = &csq[0];
    EXPECT_EQ(-1, at_tok_start_flag(&cursor, '\0'));
    EXPECT_EQ(nullptr, cursor);
}

TEST(AtTok, QuotedTokens) {
    std::string a = "\"12\"";
    char *cursor = &a[0];
    int i = 0;
    EXPECT_EQ(0, at_tok_nextint(&cursor, &i));
    EXPECT_EQ(12, i);
    ASSERT_NE(nullptr, cursor);  // rests on the terminator
    EXPECT_EQ(0, at_tok_hasmore(&cursor));

    std::string b = "\"a\"x,b";
    cursor = &b[0];
    char *s = nullptr;
    EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("a", s);
    EXPECT_STREQ("b", cursor);

    std::string c = " \"a,b\" , \"abc";
    cursor = &c[0];
    EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("a,b", s);
    EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("abc", s);
    EXPECT_EQ(nullptr, cursor);
}

TEST(AtTok, IntegerConversion) {
    struct Case {
        const char *text;
        int result;
        int value;
    };
    const Case cases[] = {
        {"12abc", 0, 12}, {"abc", -1, 0}, {"4294967297", 0, 1}, {"2147483648", 0, INT32_MIN},
        {"+", -1, 0},     {"", -1, 0},    {" \t-7", 0, -7},
    };
    for (const Case &c : cases) {
        std::string line = c.text;
        char *cursor = &line[0];
        int v = 99;
        EXPECT_EQ(c.result, at_tok_nextint(&cursor, &v)) << c.text;
        EXPECT_EQ(c.value, v) << c.text;  // stored even when nothing converted
        EXPECT_EQ(nullptr, cursor) << c.text;
    }

    std::string empty = ",5";
    char *cursor = &empty[0];
    int v = 99;
    EXPECT_EQ(-1, at_tok_nextint(&cursor, &v));
    EXPECT_EQ(0, v);
    EXPECT_STREQ("5", cursor);

    std::string blank = "   ";
    cursor = &blank[0];
    char *s = nullptr;
    EXPECT_EQ(0, at_tok_nextstr(&cursor, &s));
    EXPECT_STREQ("", s);
    EXPECT_EQ(nullptr, cursor);

    std::string wide = "4294967297,-9000000000,x";
    cursor = &wide[0];
    int64_t w = 0;
    EXPECT_EQ(0, at_tok_nextint64(&cursor, &w));
    EXPECT_EQ(4294967297LL, w);
    EXPECT_EQ(0, at_tok_nextint64(&cursor, &w));
    EXPECT_EQ(-9000000000LL, w);
    EXPECT_EQ(-1, at_tok_nextint64(&cursor, &w));
}

TEST(AtNormalize, UpperCaseAndTrim) {
    std::string a = "at+cmgs=\"abc\"";
    convertToUpperCase(&a[0], '=');
    EXPECT_EQ("AT+CMGS=\"abc\"", a);
    std::string b = "at+cclk?";
    convertToUpperCase(&b[0], '=');
    EXPECT_EQ("AT+CCLK?", b);

    const std::pair<const char *, const char *> trims[] = {
        {"  AT+CCLK?  ", "AT+CCLK?"}, {"    ", ""}, {"AT\t", "AT\t"}, {" \r\nAT \r\n ", "\r\nAT \r\n"}};
    for (const auto &t : trims) {
        std::string line = t.first;
        char *cursor = &line[0];
        EXPECT_EQ(static_cast<int>(strlen(t.second)), trim_string(&cursor)) << t.first;
        EXPECT_STREQ(t.second, cursor);
    }
}

}  // namespace
