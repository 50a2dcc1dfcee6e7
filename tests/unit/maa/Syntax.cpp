// Tokenising of command lines: operators, type words, constants, strings,
// and the lines that end or are rejected early. Parsing of whole lines: what
// the grammar accepts and rejects, statements run as they are reduced, and
// limits that reject a line without ending the shell.
#include <string>
#include <vector>

#include "maa/ShellFixture.h"

namespace maatest {
namespace {

class Lexer : public ShellTest {
protected:
    // Every token code up to (not including) the end; identifier texts go to names.
    static std::vector<U32> tokens(const char *line) {
        lineBuffer = line;
        names.clear();
        MAA_InputSet(reinterpret_cast<const U8 *>(lineBuffer.c_str()));
        std::vector<U32> out;
        for (U32 t; (t = MAA_TokenDivider()) != 0;) {
            out.push_back(t);
            if (t == IDENTIFIER) {
                names.push_back(reinterpret_cast<char *>(stVal.pubSymbol));
                MAA_Free(stVal.pubSymbol);
            }
        }
        return out;
    }
    inline static std::vector<std::string> names;
    static U32 constant(const char *line) {
        lineBuffer = line;
        MAA_InputSet(reinterpret_cast<const U8 *>(lineBuffer.c_str()));
        EXPECT_EQ(MAA_TokenDivider(), CONSTANT) << line;
        return stVal.ulNumber;
    }
};

constexpr U32 I = IDENTIFIER;

// Operators take the longest match; a name beginning with a type word is that
// type word. Where a line ends early: an unterminated string or an unknown
// character ends it there, an unknown escape rejects all of it.
TEST_F(Lexer, TokensOfALineAndWhereItEnds) {
    struct Case {
        const char *text;
        std::vector<U32> expected;
        bool rejected = false;
        const char *logged = nullptr;
    } cases[] = {
        {"a|&b", {I, LOR, I}}, {"a||b", {I, '|', '|', I}}, {"x<<=2", {I, LSE, CONSTANT}}, {"x<<2", {I, LS, CONSTANT}},
        {"x>>=2 x>>2 x>=2 x<=2", {I, RSE, CONSTANT, I, RS, CONSTANT, I, GE, CONSTANT, I, LE, CONSTANT}},
        {"== != += ++ -= -- *= /= %= ^= &= && |=", {EQ, NE, PE, PP, ME, MM, TE, DE, RE, EXE, AE, LAND, OE}},
        {"+++", {PP, '+'}}, {" \t\v\f\r\n x", {I}}, {"integer", {R_INT}},
        {"( ) , : ; ? ~ ! % & * + - / < = > ^ |",
         {'(', ')', ',', ':', ';', '?', '~', '!', '%', '&', '*', '+', '-', '/', '<', '=', '>', '^', '|'}},
        {"longitude chart shortcut int", {R_LONG, R_CHAR, R_SHORT, R_INT}},
        {"x \"abc", {I}, false, "\r\ninvalid string"},
        {"f(1) [2]", {I, '(', CONSTANT, ')'}}, {"a.b", {I}}, {"\xc3\xa9", {}},
        {"'ab'", {}, false, "\r\ninvalid charactor constant"},
        {"\"a\\qb\" x", {}, true, "*ptr >= '0' && *ptr <= '7'"},
        {"'\\z'", {}, true}, {"\"\\", {}, true},  // the last: backslash at the end of the line
        {"Int in_1x _9", {I, I, I}},  // names last
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.text);
        LoggerHost_StartCapture();
        EXPECT_EQ(tokens(c.text), c.expected);
        EXPECT_EQ(MAA_TokenDivider(), 0u);
        EXPECT_EQ(fMAALineReject, c.rejected);
        if (c.logged) { EXPECT_TRUE(LoggerHost_Contains(c.logged)); }
        EXPECT_EQ(ulAllocCount, 0u);
    }
    EXPECT_EQ(names, (std::vector<std::string>{"Int", "in_1x", "_9"}));
}

TEST_F(Lexer, ConstantsAreDecimalHexadecimalOrCharactersAndDropOverflowingDigits) {
    const std::pair<const char *, U32> cases[] = {
        {"0x1F", 31},          {"0X1f", 31},        {"010", 10},        {"017", 17},         {"4294967295", 0xFFFFFFFF},
        {"4294967296", 429496729}, {"0xFFFFFFFFF", 0xFFFFFFFF}, {"'\\n'", 10}, {"'\\x41'", 65}, {"'\\101'", 65},
        {"'\\777'", 255},    {"'\\''", 39},      {"'a'", 97},
    };
    for (const auto &[text, value] : cases) EXPECT_EQ(constant(text), value) << text;
    // "0x" without a digit is the constant 0 and leaves the input at the "0".
    EXPECT_EQ(constant("0xg"), 0u);
    EXPECT_EQ(MAA_TokenDivider(), CONSTANT);
    EXPECT_EQ(run("0x"), 1u);
    // At most three octal or two hexadecimal digits in an escape.
    for (const char *text : {"\\1234", "\\x4142"}) {
        const U8 *p = reinterpret_cast<const U8 *>(text);
        EXPECT_EQ(MAA_DecodeEscape(&p), text[1] == 'x' ? 0x41 : 0123);
        EXPECT_EQ(*p, '4');
    }
}

// Text, base, value and the characters taken.
TEST_F(Lexer, StringToNumberConversion) {
    const struct { const char *text; U32 base, value; size_t taken; } cases[] = {
        {"  -1z", 10, ~1u, 4},  // complement, not negation
        {"017", 0, 15, 3}, {"0x10", 0, 16, 4}, {"zz", 36, 36 * 35 + 35, 2}, {"xyz", 10, 0, 0},
    };
    for (const auto &c : cases) {
        const U8 *end = nullptr;
        EXPECT_EQ(MAA_Logic(reinterpret_cast<const U8 *>(c.text), &end, c.base), c.value) << c.text;
        EXPECT_EQ(end, reinterpret_cast<const U8 *>(c.text + c.taken)) << c.text;
    }
}

TEST_F(Lexer, StringLiteralsAreDecodedRecordedAndAddressable) {
    lineBuffer = "\"a\\tb\"";
    MAA_InputSet(reinterpret_cast<const U8 *>(lineBuffer.c_str()));
    ASSERT_EQ(MAA_TokenDivider(), STRING);
    EXPECT_STREQ(reinterpret_cast<char *>(stVal.pubString), "a\tb");
    EXPECT_EQ(ulAllocCount, 1u);
    EXPECT_EQ(paubAllocTable[0], stVal.pubString);
    U32 address = MAA_AddrOf(stVal.pubString);
    EXPECT_GT(address, 1000000u);
    EXPECT_STREQ(MAA_AddrString(address), "a\tb");

    MAA_FreeParamString();
    EXPECT_EQ(ulAllocCount, 0u);
    EXPECT_EQ(MAA_AddrString(address), nullptr);  // gone with the line
}

TEST_F(Lexer, TwentyStringLiteralsFitATwentyFirstRejectsTheLine) {
    std::string line;
    for (int i = 0; i < 20; ++i) line += "\"s\",";
    EXPECT_EQ(tokens(line.c_str()).size(), 40u);
    EXPECT_FALSE(fMAALineReject);
    EXPECT_EQ(ulAllocCount, 20u);

    line += "\"t\"";
    EXPECT_EQ(tokens(line.c_str()).size(), 40u);  // InputSet released the earlier ones
    EXPECT_TRUE(fMAALineReject);
    EXPECT_EQ(ulAllocCount, 20u);
    EXPECT_TRUE(LoggerHost_Contains("too many string literals"));
}

// ---- parsing ------------------------------------------------------------------------

class Parser : public ShellTest {
protected:
    void SetUp() override {
        ShellTest::SetUp();
        addData("a", &a);
        addData("b", &b);
        addData("y", &y);
        MAA_SymbolAdd(ftarget_ppc, "f", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f0>(), 0);
        MAA_SymbolAdd(ftarget_ppc, "f2", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f2>(), 2);
    }
    U32 a = 0, b = 0, y = 0;
};

// Lines in order, with the parser's verdict and the cells afterwards: every
// statement of an accepted line runs, statements reduced before a syntax error
// have run, a lexical error ends the input early, a rejected line runs nothing more.
TEST_F(Parser, StatementsOfALineRunUntilTheLineEndsOrIsRejected) {
    struct Step { const char *line; U32 result, a, b; bool syntaxError = false; } steps[] = {
        {"", 0, 0, 0}, {"   \t ", 0, 0, 0}, {";;", 0, 0, 0}, {";", 0, 0, 0},
        {"a=1;b=2", 0, 1, 2}, {"a=3;;b=4;", 0, 3, 4},
        {"y = 0x12345; a = (int)y", 0, 0x12345, 4},
        {"b = (char)(short)(long)y + 1", 0, 0x12345, 0x12346},
        {"(char*)1, (short *)2, (long*)3", 0, 0x12345, 0x12346},
        {"a=1; b=(2 y", 1, 1, 0x12346, true},  // the statement in error never completed
        {"a=3; b=4 y", 1, 3, 4, true},  // default reductions complete a statement before the stray token is seen
        {"a = 5 \"abc", 0, 5, 4},  // an unterminated string is an early end of the line
        {"a = 6 \"\\q\"", 1, 5, 4},  // an unknown escape rejects the line
        {"b = 7; a = \"\\q\"", 1, 5, 7},
        // Outside the grammar: nothing runs.
        {"a ? b : y = 5", 1, 5, 7, true}, {"(unsigned)y", 1, 5, 7, true}, {"a b", 1, 5, 7, true},
        {"a = ", 1, 5, 7, true}, {"(a", 1, 5, 7, true}, {"a)", 1, 5, 7, true}, {"f(1,)", 1, 5, 7, true},
        {"(int)", 1, 5, 7, true}, {"1 2", 1, 5, 7, true}, {"a ; b c", 1, 5, 7, true}, {"||", 1, 5, 7, true},
        {"a ? b", 1, 5, 7, true},
    };
    for (const Step &s : steps) {
        LoggerHost_StartCapture();
        EXPECT_EQ(run(s.line), s.result) << s.line;
        EXPECT_EQ(std::make_pair(a, b), std::make_pair(s.a, s.b)) << s.line;
        EXPECT_EQ(LoggerHost_Contains("syntax error"), s.syntaxError) << s.line;
        if (std::string(s.line).find_first_not_of(" \t;") == std::string::npos) { EXPECT_TRUE(values().empty()); }
    }
    EXPECT_EQ(y, 0x12345u);
    EXPECT_EQ(run("(int*)0x1000"), 0u);
    EXPECT_EQ(lastValue(), "ValueAdr = 4096 = 0x1000\n");
    EXPECT_EQ(run("f()"), 0u);
    EXPECT_EQ(run("f2(1,2)"), 0u);
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].function, "f0");
    EXPECT_EQ(calls[1].words, (std::vector<U32>{1, 2}));
}

TEST_F(Parser, NestingDeeperThanTheStackIsRejectedAndManyCallsAreNot) {
    std::string deep = std::string(60, '(') + "7" + std::string(60, ')');
    EXPECT_EQ(run("a = " + deep), 0u);
    EXPECT_EQ(a, 7u);
    std::string tooDeep = std::string(200, '(') + "8" + std::string(200, ')');
    EXPECT_EQ(run("a = " + tooDeep), 1u);
    EXPECT_TRUE(LoggerHost_Contains("parser stack overflow"));
    EXPECT_EQ(a, 7u);
    EXPECT_EQ(run(std::string(200, '~') + "a"), 1u);
    // Many calls in one line do not exhaust it.
    std::string line;
    for (int i = 0; i < 100; ++i) line += "a=1;f();";
    EXPECT_EQ(run(line), 0u);
    EXPECT_EQ(calls.size(), 100u);
}

}  // namespace
}  // namespace maatest
