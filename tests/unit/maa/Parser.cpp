// Parsing of whole lines: what the grammar accepts and rejects, statements run
// as they are reduced, and limits that reject a line without ending the shell.
#include <string>

#include "maa/ShellFixture.h"

namespace maatest {
namespace {

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
