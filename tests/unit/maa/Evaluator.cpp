// Evaluation: assignments, operators, casts and memory access through the
// address map, and the call operator with its result writing.
#include <string>

#include "maa/MAA_Executor.h"
#include "maa/ShellFixture.h"

namespace maatest {
namespace {

class Evaluator : public ShellTest {
protected:
    void SetUp() override {
        ShellTest::SetUp();
        addData("x", &x);
        addData("y", &y);
        undefinedU = MAA_SymbolAdd(ftarget_ppc, "u", MAA_SYM_UNDEF, 0x7FFFFFF0, 0);
        MAA_SymbolAdd(ftarget_ppc, "f", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f0>(), 0);
        MAA_SymbolAdd(ftarget_ppc, "g", MAA_SYM_FUNC, MAA_FuncEntry<g0>(), 0);
        MAA_SymbolAdd(ftarget_ppc, "f3", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f3>(), 3);
        MAA_SymbolAdd(ftarget_ppc, "f10", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f10>(), 10);
        MAA_SymbolAdd(ftarget_ppc, "text1", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<text1>(), 1);
        MAA_SymbolAdd(ftarget_ppc, "silent", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<silent0>(), 0);
        MAA_SymbolAdd(ftarget_scn, "scan1", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<scan1>(), 1);
    }

    // The statement's value as the shell logs it, e.g. "ValueNum = 7 = 0x7".
    std::string eval(const std::string &line) {
        LoggerHost_StartCapture();
        EXPECT_EQ(run(line), 0u) << line;
        std::string v = lastValue();
        while (!v.empty() && v.back() == '\n') v.pop_back();
        return v;
    }
    static std::string num(U32 n) {
        char text[64];
        std::snprintf(text, sizeof text, "ValueNum = %d = 0x%x", static_cast<int>(n), n);
        return text;
    }
    std::vector<std::string> calledFunctions() const {
        std::vector<std::string> out;
        for (const Call &c : calls) out.push_back(c.function);
        return out;
    }

    U32 x = 0, y = 0;
    TSymbol *undefinedU = nullptr;
};

TEST_F(Evaluator, AssignmentStoresIntoDataCellsAndYieldsTheCell) {
    EXPECT_EQ(eval("x = 5"), "ValueRef = 5 = 0x5");
    EXPECT_EQ(x, 5u);
    EXPECT_EQ(eval("x = y = 3"), "ValueRef = 3 = 0x3");
    const struct {
        const char *line;
        U32 x, y;
    } steps[] = {
        {"", 3, 3}, {"x += 4; y -= 5", 7, 0xFFFFFFFE}, {"x *= 3; y /= 0", 21, 0xFFFFFFFE}, {"x %= 4; y <<= 40", 1, 0},
        {"x |= 0xF0; x &= 0x3C; x ^= 0xFF; y = 0x80; y >>= 3", 0xCF, 0x10},
    };
    for (const auto &s : steps) {
        run(s.line);
        EXPECT_EQ(std::make_pair(x, y), std::make_pair(s.x, s.y)) << s.line;
    }
}

TEST_F(Evaluator, AnUndefinedSymbolGetsItsCellOnFirstAssignment) {
    eval("u + 1");
    EXPECT_TRUE(LoggerHost_Contains("Undefined symbol 'u'\n"));
    EXPECT_EQ(undefinedU->ulType, MAA_SYM_UNDEF);
    EXPECT_EQ(eval("u += 1"), num(0));  // compound assignment does not create
    EXPECT_EQ(undefinedU->ulType, MAA_SYM_UNDEF);

    EXPECT_EQ(eval("u = 9"), "ValueRef = 9 = 0x9");
    EXPECT_EQ(undefinedU->ulType, MAA_SYM_DATA);
    EXPECT_GT(undefinedU->ulAddress, 1000000u);
    U32 cell = 0;
    ASSERT_TRUE(MAA_AddrRead(undefinedU->ulAddress, 4, &cell));
    EXPECT_EQ(cell, 9u);
    EXPECT_EQ(eval("u * 2"), num(18));
}

TEST_F(Evaluator, AnUnregisteredNameIsZeroAndNotAssignable) {
    EXPECT_EQ(eval("zz = 5"), num(5));
    EXPECT_TRUE(LoggerHost_Contains("Undefined symbol 'zz'\n"));
    EXPECT_TRUE(LoggerHost_Contains("invalid lvalue\n"));
    EXPECT_EQ(eval("zz + 1"), num(1));
    EXPECT_EQ(eval("zz++"), num(0));
}

TEST_F(Evaluator, PostIncrementChangesTheCellPreIncrementDoesNot) {
    x = 10;
    EXPECT_EQ(eval("x++"), num(10));
    EXPECT_EQ(eval("x--"), num(11));
    EXPECT_EQ(eval("++x"), num(10));
    EXPECT_EQ(eval("--x"), num(10));
    EXPECT_EQ(x, 10u);
    eval("5++");
    EXPECT_TRUE(LoggerHost_Contains("invalid lvalue\n"));
}

TEST_F(Evaluator, ArithmeticIsUnsigned32Bit) {
    const std::pair<const char *, U32> cases[] = {
        {"7 / 0", 7},  {"7 % 0", 7},  {"1 << 32", 0}, {"1 << 31", 0x80000000u}, {"0x80000000 >> 31", 1},
        {"1 << 0x120", 0}, {"1 << 0x101", 2},  // the count is the low 8 bits
        {"0xFFFFFFFF > 1", 1}, {"-1 > 0", 1}, {"-1 / 2", 0x7FFFFFFFu}, {"0 - 1", 0xFFFFFFFFu},
        {"0x10000 * 0x10000 + 3", 3}, {"2 + 3 * 4 - 10 % 4", 12}, {"1 < 2 == 2 > 1", 1}, {"3 <= 3 != 4 >= 5", 1},
        {"6 & 3 | 8 ^ 1", 11}, {"~0 == 0xFFFFFFFF", 1}, {"!5 + !0 + +4", 5}, {"2 && 3 |& 0", 1}, {"0 && 3", 0},
        {"1, 2", 2}, {"0 ? 10 : 1 ? 30 : 40", 30}, {"(char)300", 300}, {"(short)0x12345678", 0x12345678},
    };
    for (const auto &[line, value] : cases) EXPECT_EQ(eval(line), num(value)) << line;
    eval("7 / 0");
    EXPECT_TRUE(LoggerHost_Contains("divied by zero\n"));
    EXPECT_EQ(eval("'A'"), "ValueNum = 65 = 0x41 = 'A'");
}

TEST_F(Evaluator, CommaAndConditionalExpressions) {
    EXPECT_EQ(eval("x = 4, y = 5, x + y"), num(9));
    EXPECT_EQ(eval("x ? 10 : 20"), num(10));
    // The chosen branch is passed on unevaluated: still the cell.
    EXPECT_EQ(eval("1 ? x : y"), "ValueRef = 4 = 0x4");
}

TEST_F(Evaluator, PointerCastsSelectTheCellWidth) {
    x = 0xAABBCCDD;
    EXPECT_EQ(eval("*(char*)&x"), "ValueRef = 221 = 0xdd");
    EXPECT_EQ(eval("*(short*)&x"), "ValueRef = 52445 = 0xccdd");
    eval("*(short*)&x = 5");
    EXPECT_EQ(x, 0xAABB0005u);
    eval("*(char*)&x = 0x1FF");
    EXPECT_EQ(x, 0xAABB00FFu);
    eval("*(short*)(&x + 2) = 0x1234");
    EXPECT_EQ(x, 0x123400FFu);
    eval("*&y = 77");
    EXPECT_EQ(y, 77u);
    EXPECT_EQ(eval("*(long*)&y"), "ValueRef = 77 = 0x4d = 'M'");
}

TEST_F(Evaluator, AddressesOutsideTheMapAreRefused) {
    EXPECT_EQ(eval("*(int*)0x1000"), "ValueRef = 0 = 0x0");
    EXPECT_TRUE(LoggerHost_Contains("invalid address 0x1000"));
    eval("*(char*)0x40001000 = 1");
    EXPECT_TRUE(LoggerHost_Contains("invalid address 0x40001000"));
    // Crossing the end of a cell is refused too.
    x = 0x11223344;
    eval("*(int*)(&x + 2) = 0");
    EXPECT_EQ(x, 0x11223344u);
    EXPECT_EQ(eval("*(int*)(&x + 1)"), "ValueRef = 0 = 0x0");
    EXPECT_EQ(eval("*(char*)(&x + 3)"), "ValueRef = 17 = 0x11");
    EXPECT_EQ(eval("*(char*)(&x + 4)"), "ValueRef = 0 = 0x0");
    EXPECT_EQ(eval("*(char*)(&x - 1)"), "ValueRef = 0 = 0x0");
    EXPECT_EQ(eval("*f"), "ValueRef = 0 = 0x0");  // a function entry is no data
}

TEST_F(Evaluator, EveryOperandIsEvaluatedThereIsNoShortCircuit) {
    eval("1 ? f() : g()");
    EXPECT_EQ(calledFunctions(), (std::vector<std::string>{"f0", "g0"}));
    calls.clear();
    eval("0 && f()");
    eval("1 |& g()");
    EXPECT_EQ(calledFunctions(), (std::vector<std::string>{"f0", "g0"}));
}

TEST_F(Evaluator, ACallPassesTenWordsAndItsResultIsWritten) {
    EXPECT_EQ(eval("x = f3(1, -2, x)"), "ValueRef = 1 = 0x1");  // a call's value is 1
    ASSERT_EQ(calls.size(), 1u);
    EXPECT_EQ(calls[0].words, (std::vector<U32>{1, 0xFFFFFFFE, 0}));
    EXPECT_EQ(written, Recs{End("f3 done", 1)});
    EXPECT_TRUE(LoggerHost_Contains("[MAA_FuncCall]: MAA_WriteResult\n"));

    eval("f10(1,2,3,4,5,6,7,8,9,10)");
    ASSERT_EQ(calls.size(), 2u);
    EXPECT_EQ(calls[1].words, (std::vector<U32>{1, 2, 3, 4, 5, 6, 7, 8, 9, 10}));
}

TEST_F(Evaluator, AStringArgumentArrivesAsItsAddress) {
    eval("text1(\"hello\\n\")");
    ASSERT_EQ(texts.size(), 1u);
    EXPECT_EQ(texts[0], "hello\n");
    EXPECT_GT(calls[0].words[0], 1000000u);
    EXPECT_EQ(MAA_AddrString(calls[0].words[0]), nullptr);  // released after the call
    // The literals of a statement are released after its first call.
    eval("text1(\"a\"), text1(\"b\")");
    EXPECT_EQ(texts[1], "a");
    EXPECT_EQ(texts[2], "<refused>");
    eval("text1(\"c\"); text1(\"d\")");
    EXPECT_EQ(texts[3], "c");
    EXPECT_EQ(texts[4], "d");
}

TEST_F(Evaluator, AWrongArgumentCountCallsAndWritesNothing) {
    EXPECT_EQ(eval("f3(1, 2)"), num(0));
    EXPECT_EQ(eval("f(1)"), num(0));
    EXPECT_TRUE(calls.empty());
    EXPECT_TRUE(written.empty());
}

TEST_F(Evaluator, ElevenArgumentsAreTooMany) {
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, MAA_AddrGeneralHandle(&general), 2);
    EXPECT_EQ(eval("f10(1,2,3,4,5,6,7,8,9,10,11)"), num(0));
    EXPECT_EQ(LoggerHost_Count("too many args\n"), 1);
    EXPECT_EQ(eval("nope(1,2,3,4,5,6,7,8,9,10,11)"), num(0));
    EXPECT_EQ(LoggerHost_Count("too many args\n"), 1);
    EXPECT_TRUE(calls.empty());
    EXPECT_TRUE(written.empty());
}

TEST_F(Evaluator, UnregisteredNamesReachTheGeneralFunctionWithTheCount) {
    eval("nope(7, 8)");
    EXPECT_TRUE(LoggerHost_Contains("Address location in Symbol Table failed\n"));
    EXPECT_TRUE(calls.empty());

    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, MAA_AddrGeneralHandle(&general), 2);
    EXPECT_EQ(eval("nope(7, 8)"), num(1));
    EXPECT_EQ(eval("other()"), num(1));
    EXPECT_EQ(eval("nope(1,2,3,4,5,6,7,8,9,10)"), num(1));
    ASSERT_EQ(calls.size(), 3u);
    EXPECT_EQ(calls[0].function, "general");
    EXPECT_EQ(calls[0].words, (std::vector<U32>{7, 8}));
    EXPECT_TRUE(calls[1].words.empty());
    EXPECT_EQ(calls[2].words.size(), 10u);
    EXPECT_TRUE(LoggerHost_Contains("pstSymbol is Null\n"));
    EXPECT_TRUE(LoggerHost_Contains("MAA_FuncCall - IsGeneralFunc 1\n"));
    EXPECT_EQ(written.size(), 3u);
}

TEST_F(Evaluator, ResultsAreNotWrittenForScannerFunctionsNoneResultsOrStoredRuns) {
    eval("scan1(4)");
    EXPECT_EQ(written, Recs{End("scan1 done", 1)});  // the function's own write only
    written.clear();
    eval("silent()");
    EXPECT_TRUE(written.empty());
    enSpecialMode = MAA_AUTO_RUN_CMD;
    eval("f()");
    enSpecialMode = MAA_JIG_RUN_CMD;
    eval("g()");
    EXPECT_TRUE(written.empty());
    EXPECT_EQ(calls.size(), 4u);
    enSpecialMode = MAA_AUTO_SAVE_CMD;
    eval("f()");
    EXPECT_EQ(written.size(), 1u);
}

TEST_F(Evaluator, StatementValuesAreLoggedByType) {
    EXPECT_EQ(eval("200"), num(200));
    x = 66;
    EXPECT_EQ(eval("x"), "ValueRef = 66 = 0x42 = 'B'");
    std::string adr = eval("\"s\"");
    ASSERT_EQ(adr.rfind("ValueAdr = ", 0), 0u) << adr;
    EXPECT_GT(std::stoul(adr.substr(adr.find("0x") + 2), nullptr, 16), 1000000ul);
    LoggerHost_StartCapture();
    run("g");
    EXPECT_TRUE(LoggerHost_Contains("\r\nFUNC "));
    char entry[32];
    std::snprintf(entry, sizeof entry, "\r\nvalue = 0x%x", MAA_SymbolFind("g")->ulAddress);
    EXPECT_EQ(LoggerHost_Count(entry), 1);
    EXPECT_EQ(lastValue(), num(MAA_SymbolFind("g")->ulAddress) + "\n");
}

TEST_F(Evaluator, QueueOverflowDropsTheRestOfTheStatement) {
    std::string line = "x = 1";
    for (int i = 0; i < 100; ++i) line += " + 1";
    // 128 entries fit: x, 1 and 63 additions; the rest, the assignment included, is dropped.
    EXPECT_EQ(eval(line), "ValueNum = 64 = 0x40 = '@'");
    EXPECT_TRUE(LoggerHost_Contains("\r\nvalue que overflow"));
    EXPECT_EQ(x, 0u);
    EXPECT_EQ(eval("x = 3"), "ValueRef = 3 = 0x3");  // the next statement starts afresh
}

}  // namespace
}  // namespace maatest
