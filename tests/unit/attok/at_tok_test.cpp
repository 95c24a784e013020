// The tokenizer, the operation-form classifier and the line normalisation.
#include <gtest/gtest.h>

#include <climits>
#include <cstring>
#include <string>

#include "attok/at_tok.h"

namespace {

// The plain forms are told apart by the answers of the transcripts as well
// (ATQ0V1E, AT%REBOOT, AT+CCLK?, AT+CCLK=?).
TEST(AtOp, Forms) {
    const std::pair<const char *, AtOpType> cases[] = {
        {"", AT_NONE_OP},         {"A", AT_NONE_OP},          {"ATE?", AT_BASIC_OP},
        {"atd123", AT_BASIC_OP},  {"AT+CMEC", AT_ACTION_OP},  {"AT?", AT_READ_OP},
        {"AT#CLS=?", AT_TEST_OP}, {"AT+EURC=\"a?\"", AT_READ_OP}, {"AT+X=a=b", AT_SET_OP},
    };
    for (const auto &c : cases) {
        std::string text = c.first;
        char *cursor = &text[0];
        EXPECT_EQ(c.second, getAtOp(&cursor)) << c.first;
        // Only a set form moves the cursor, just past the first "=".
        EXPECT_STREQ(c.second == AT_SET_OP ? "a=b" : c.first, cursor);
    }
    EXPECT_EQ(AT_NONE_OP, getAtOp(nullptr));
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

    // One number each: its result, the value stored (even when nothing converted)
    // and what is left of the line ("<null>": used up). Quoted strings and 64-bit
    // numbers are checked end to end (USB configuration, Wi-Fi addresses).
    struct Case {
        const char *text;
        int result, value;
        const char *rest;
    } cases[] = {
        {"12abc", 0, 12, "<null>"}, {"abc", -1, 0, "<null>"},  {"4294967297", 0, 1, "<null>"},
        {"+", -1, 0, "<null>"},     {" \t-7", 0, -7, "<null>"}, {"2147483648", 0, INT_MIN, "<null>"},
        {",5", -1, 0, "5"},         {"\"12\"", 0, 12, ""},      {"\"3\"x,b", 0, 3, "b"},
    };
    for (const Case &c : cases) {
        line = c.text;
        cursor = &line[0];
        int v = 99;
        EXPECT_EQ(c.result, at_tok_nextint(&cursor, &v)) << c.text;
        EXPECT_EQ(c.value, v) << c.text;
        EXPECT_STREQ(c.rest, cursor != nullptr ? cursor : "<null>") << c.text;
    }
}

// The whole-number readers take a number with blanks or quotes around it and
// nothing else; a refused token stores nothing.
TEST(AtTok, StrictReadersTakeOnlyWholeNumbersInRange) {
    const int kWhole = 0, kNotWhole = AT_TOK_NOT_WHOLE;
    const struct {
        const char *text;
        int result;
        long long value;  // stored by a successful read
        int result64;
    } cases[] = {
        {" \"-12\" ,x", kWhole, -12, kWhole},       {"2147483647", kWhole, INT_MAX, kWhole},
        {"-2147483648", kWhole, INT_MIN, kWhole},      {"4294967297", kNotWhole, 4294967297LL, kWhole},
        {"9223372036854775808", kNotWhole, 7, kNotWhole}, {"1abc", kNotWhole, 7, kNotWhole},
        {"1 2", kNotWhole, 7, kNotWhole},              {"\"3\"x", kNotWhole, 7, kNotWhole},
        {"\"3", kNotWhole, 7, kNotWhole},              {"abc", AT_TOK_NO_NUMBER, 7, AT_TOK_NO_NUMBER},
        {"+", AT_TOK_NO_NUMBER, 7, AT_TOK_NO_NUMBER},  {"\" \",1", AT_TOK_EMPTY, 7, AT_TOK_EMPTY},
    };
    for (const auto &c : cases) {
        std::string line = c.text;
        char *cursor = &line[0];
        int v = 7;
        EXPECT_EQ(c.result, at_tok_nextint_strict(&cursor, &v)) << c.text;
        EXPECT_EQ(c.result == kWhole ? c.value : 7, v) << c.text;
        line = c.text;
        cursor = &line[0];
        int64_t v64 = 7;
        EXPECT_EQ(c.result64, at_tok_nextint64_strict(&cursor, &v64)) << c.text;
        EXPECT_EQ(c.result64 == kWhole ? c.value : 7, v64) << c.text;
    }
    std::string used = "5";
    char *cursor = &used[0];
    int v = 0;
    ASSERT_EQ(kWhole, at_tok_nextint_strict(&cursor, &v));
    EXPECT_EQ(AT_TOK_EMPTY, at_tok_nextint_strict(&cursor, &v)) << "a used-up cursor";
}

TEST(AtNormalize, UpperCaseAndTrim) {
    std::string a = "at+cmgs=\"abc\"";
    convertToUpperCase(&a[0], '=');
    EXPECT_EQ("AT+CMGS=\"abc\"", a);
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
