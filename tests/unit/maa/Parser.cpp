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

TEST_F(Parser, EmptyLinesAndStatementsAreAcceptedAndEveryStatementOfALineRuns) {
    for (const char *line : {"", "   \t ", ";;", ";"}) EXPECT_EQ(run(line), 0u) << line;
    EXPECT_TRUE(values().empty());  // nothing was evaluated
    EXPECT_EQ(run("a=1;b=2"), 0u);
    EXPECT_EQ(std::make_pair(a, b), std::make_pair(1u, 2u));
    EXPECT_EQ(run("a=3;;b=4;"), 0u);
    EXPECT_EQ(std::make_pair(a, b), std::make_pair(3u, 4u));
    EXPECT_EQ(run("f()"), 0u);
    EXPECT_EQ(run("f2(1,2)"), 0u);
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[0].function, "f0");
    EXPECT_EQ(calls[1].words, (std::vector<U32>{1, 2}));
}

TEST_F(Parser, CastsAndPointerCastsParse) {
    y = 0x12345;
    EXPECT_EQ(run("a = (int)y"), 0u);
    EXPECT_EQ(a, 0x12345u);
    EXPECT_EQ(run("b = (char)(short)(long)y + 1"), 0u);
    EXPECT_EQ(b, 0x12346u);
    EXPECT_EQ(run("(int*)0x1000"), 0u);
    EXPECT_EQ(lastValue(), "ValueAdr = 4096 = 0x1000\n");
    EXPECT_EQ(run("(char*)1, (short *)2, (long*)3"), 0u);
}

TEST_F(Parser, LinesOutsideTheGrammarAreRejected) {
    const char *bad[] = {"a ? b : y = 5", "(unsigned)y", "a b", "a = ", "(a", "a)", "f(1,)", "(int)", "1 2",
                         "a ; b c", "||", "a ? b"};
    for (const char *line : bad) {
        LoggerHost_StartCapture();
        EXPECT_EQ(run(line), 1u) << line;
        EXPECT_TRUE(LoggerHost_Contains("syntax error")) << line;
    }
    EXPECT_EQ(y, 0u);
}

TEST_F(Parser, StatementsReducedBeforeASyntaxErrorHaveRun) {
    EXPECT_EQ(run("a=1; b=(2 y"), 1u);
    EXPECT_EQ(a, 1u);
    EXPECT_EQ(b, 0u);  // the statement in error never completed
    // Default reductions complete a statement before the stray token is seen.
    EXPECT_EQ(run("a=3; b=4 y"), 1u);
    EXPECT_EQ(a, 3u);
    EXPECT_EQ(b, 4u);
}

TEST_F(Parser, ALexicalErrorEndsTheInputButARejectedLineRunsNothingMore) {
    // An unterminated string is an early end of the line: what came before runs.
    EXPECT_EQ(run("a = 5 \"abc"), 0u);
    EXPECT_EQ(a, 5u);
    // An unknown escape rejects the line: the statement in progress does not run.
    EXPECT_EQ(run("a = 6 \"\\q\""), 1u);
    EXPECT_EQ(a, 5u);
    EXPECT_EQ(run("b = 7; a = \"\\q\""), 1u);
    EXPECT_EQ(b, 7u);
    EXPECT_EQ(a, 5u);
}

TEST_F(Parser, NestingDeeperThanTheStackIsRejected) {
    std::string deep = std::string(60, '(') + "7" + std::string(60, ')');
    EXPECT_EQ(run("a = " + deep), 0u);
    EXPECT_EQ(a, 7u);
    std::string tooDeep = std::string(200, '(') + "8" + std::string(200, ')');
    EXPECT_EQ(run("a = " + tooDeep), 1u);
    EXPECT_TRUE(LoggerHost_Contains("parser stack overflow"));
    EXPECT_EQ(a, 7u);
    EXPECT_EQ(run(std::string(200, '~') + "a"), 1u);
}

TEST_F(Parser, ManyCallsInOneLineDoNotExhaustTheStack) {
    std::string line;
    for (int i = 0; i < 100; ++i) line += "a=1;f();";
    EXPECT_EQ(run(line), 0u);
    EXPECT_EQ(calls.size(), 100u);
}

}  // namespace
}  // namespace maatest
