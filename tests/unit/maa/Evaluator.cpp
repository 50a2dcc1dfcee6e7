// Evaluation: assignments, operators, casts and memory access through the
// address map, and the call operator with its result writing.
#include <sstream>
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

    U32 x = 0, y = 0;
    TSymbol *undefinedU = nullptr;
};

// Statements on the cells x and y, in order (the cells keep their values from
// row to row): the value the shell logs (nullptr: not checked), the cells
// afterwards and a line logged.
TEST_F(Evaluator, StatementsOnDataCells) {
    struct Step { const char *line, *value; U32 x, y; const char *logged; } steps[] = {
        // Assignment yields the cell; compound assignments.
        {"x = 5", "ValueRef = 5 = 0x5", 5, 0, nullptr},
        {"x = y = 3", "ValueRef = 3 = 0x3", 3, 3, nullptr},
        {"x += 4; y -= 5", nullptr, 7, 0xFFFFFFFE, nullptr},
        {"x *= 3; y /= 0", nullptr, 21, 0xFFFFFFFE, nullptr},
        {"x %= 4; y <<= 40", nullptr, 1, 0, nullptr},
        {"x |= 0xF0; x &= 0x3C; x ^= 0xFF; y = 0x80; y >>= 3", nullptr, 0xCF, 0x10, nullptr},
        // Post-increment changes the cell, pre-increment does not.
        {"x = 10", nullptr, 10, 0x10, nullptr},
        {"x++", "ValueNum = 10 = 0xa", 11, 0x10, nullptr},
        {"x--", "ValueNum = 11 = 0xb", 10, 0x10, nullptr},
        {"++x", "ValueNum = 10 = 0xa", 10, 0x10, nullptr},
        {"--x", "ValueNum = 10 = 0xa", 10, 0x10, nullptr},
        {"5++", nullptr, 10, 0x10, "invalid lvalue\n"},
        // An unregistered name is zero and not assignable.
        {"zz = 5", "ValueNum = 5 = 0x5", 10, 0x10, "invalid lvalue\n"},
        {"zz + 1", "ValueNum = 1 = 0x1", 10, 0x10, "Undefined symbol 'zz'\n"},
        {"zz++", "ValueNum = 0 = 0x0", 10, 0x10, nullptr},
        // Comma and conditional; the chosen branch is passed on unevaluated: still the cell.
        {"x = 4, y = 5, x + y", "ValueNum = 9 = 0x9", 4, 5, nullptr},
        {"x ? 10 : 20", "ValueNum = 10 = 0xa", 4, 5, nullptr},
        {"1 ? x : y", "ValueRef = 4 = 0x4", 4, 5, nullptr},
        // Pointer casts select the cell width.
        {"x = 0xAABBCCDD", nullptr, 0xAABBCCDD, 5, nullptr},
        {"*(char*)&x", "ValueRef = 221 = 0xdd", 0xAABBCCDD, 5, nullptr},
        {"*(short*)&x", "ValueRef = 52445 = 0xccdd", 0xAABBCCDD, 5, nullptr},
        {"*(short*)&x = 5", nullptr, 0xAABB0005, 5, nullptr},
        {"*(char*)&x = 0x1FF", nullptr, 0xAABB00FF, 5, nullptr},
        {"*(short*)(&x + 2) = 0x1234", nullptr, 0x123400FF, 5, nullptr},
        {"*&y = 77", nullptr, 0x123400FF, 77, nullptr},
        {"*(long*)&y", "ValueRef = 77 = 0x4d = 'M'", 0x123400FF, 77, nullptr},
        // Addresses outside the map, or crossing the end of a cell, are refused.
        {"*(int*)0x1000", "ValueRef = 0 = 0x0", 0x123400FF, 77, "invalid address 0x1000"},
        {"*(char*)0x40001000 = 1", nullptr, 0x123400FF, 77, "invalid address 0x40001000"},
        {"x = 0x11223344; *(int*)(&x + 2) = 0", nullptr, 0x11223344, 77, nullptr},
        {"*(int*)(&x + 1)", "ValueRef = 0 = 0x0", 0x11223344, 77, nullptr},
        {"*(char*)(&x + 3)", "ValueRef = 17 = 0x11", 0x11223344, 77, nullptr},
        {"*(char*)(&x + 4)", "ValueRef = 0 = 0x0", 0x11223344, 77, nullptr},
        {"*(char*)(&x - 1)", "ValueRef = 0 = 0x0", 0x11223344, 77, nullptr},
        {"*f", "ValueRef = 0 = 0x0", 0x11223344, 77, nullptr},  // a function entry is no data
        // Values are logged by type.
        {"200", "ValueNum = 200 = 0xc8", 0x11223344, 77, nullptr},
        {"x = 66; x", "ValueRef = 66 = 0x42 = 'B'", 66, 77, nullptr},
    };
    for (const Step &s : steps) {
        const std::string value = eval(s.line);
        if (s.value) { EXPECT_EQ(value, s.value) << s.line; }
        EXPECT_EQ(std::make_pair(x, y), std::make_pair(s.x, s.y)) << s.line;
        if (s.logged) { EXPECT_TRUE(LoggerHost_Contains(s.logged)) << s.line; }
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

// Calls as the shell makes them: the functions called with their words, and
// the records written for the host (the returned one unless the function
// writes its own, returns none, or the line runs stored).
TEST_F(Evaluator, CallsAndTheRecordsTheyWrite) {
    eval("nope(7, 8)");
    EXPECT_TRUE(LoggerHost_Contains("Address location in Symbol Table failed\n"));
    EXPECT_TRUE(calls.empty());
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, MAA_AddrGeneralHandle(&general), 2);
    struct Case {
        const char *line, *value, *called;  // functions with their words
        Recs written;
        const char *logged = nullptr;
        TMAASpecialMode mode = MAA_NORMAL_CMD;
    } cases[] = {
        {"x = f3(1, -2, x)", "ValueRef = 1 = 0x1", "f3(1,4294967294,0)", {End("f3 done", 1)},
         "[MAA_FuncCall]: MAA_WriteResult\n"},  // a call's value is 1
        {"f10(1,2,3,4,5,6,7,8,9,10)", "ValueNum = 1 = 0x1", "f10(1,2,3,4,5,6,7,8,9,10)", {End("f10 done", 1)}},
        // A wrong count calls and writes nothing; eleven arguments are too many.
        {"f3(1, 2)", "ValueNum = 0 = 0x0", "", {}},
        {"f(1)", "ValueNum = 0 = 0x0", "", {}},
        {"f10(1,2,3,4,5,6,7,8,9,10,11)", "ValueNum = 0 = 0x0", "", {}, "too many args\n"},
        {"nope(1,2,3,4,5,6,7,8,9,10,11)", "ValueNum = 0 = 0x0", "", {}, "too many args\n"},
        // Unregistered names reach the general function with the count.
        {"nope(7, 8)", "ValueNum = 1 = 0x1", "general(7,8)", {End("general done", 1)}, "MAA_FuncCall - IsGeneralFunc 1\n"},
        {"other()", "ValueNum = 1 = 0x1", "general()", {End("general done", 1)}, "pstSymbol is Null\n"},
        {"nope(1,2,3,4,5,6,7,8,9,10)", "ValueNum = 1 = 0x1", "general(1,2,3,4,5,6,7,8,9,10)",
         {End("general done", 1)}},
        // Every operand is evaluated: there is no short circuit.
        {"1 ? f() : g()", nullptr, "f0() g0()", {End("f0 done"), End("g0 done")}},
        {"0 && f()", nullptr, "f0()", {End("f0 done")}},
        {"1 |& g()", nullptr, "g0()", {End("g0 done")}},
        // Scanner functions write their own record; none-results and stored runs write nothing.
        {"scan1(4)", nullptr, "scan1(4)", {End("scan1 done", 1)}},
        {"silent()", nullptr, "silent0()", {}},
        {"f()", nullptr, "f0()", {}, nullptr, MAA_AUTO_RUN_CMD},
        {"g()", nullptr, "g0()", {}, nullptr, MAA_JIG_RUN_CMD},
        {"f()", nullptr, "f0()", {End("f0 done")}, nullptr, MAA_AUTO_SAVE_CMD},
    };
    for (const Case &c : cases) {
        SCOPED_TRACE(c.line);
        calls.clear();
        written.clear();
        enSpecialMode = c.mode;
        const std::string value = eval(c.line);
        if (c.value) { EXPECT_EQ(value, c.value); }
        std::ostringstream called;
        for (const Call &call : calls) {
            called << (&call == &calls.front() ? "" : " ") << call.function << '(';
            for (size_t i = 0; i < call.words.size(); ++i) called << (i ? "," : "") << call.words[i];
            called << ')';
        }
        EXPECT_EQ(called.str(), c.called);
        EXPECT_EQ(written, c.written);
        if (c.logged) { EXPECT_EQ(LoggerHost_Count(c.logged), 1); }
    }
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

TEST_F(Evaluator, AStringOrAFunctionNameIsLoggedAsItsAddress) {
    std::string adr = eval("\"s\"");
    ASSERT_EQ(adr.rfind("ValueAdr = ", 0), 0u) << adr;
    EXPECT_GT(std::stoul(adr.substr(adr.find("0x") + 2), nullptr, 16), 1000000ul);
    const U32 entry = MAA_SymbolFind("g")->ulAddress;
    EXPECT_EQ(eval("g"), num(entry));
    EXPECT_TRUE(LoggerHost_Contains("\r\nFUNC "));
    char text[32];
    std::snprintf(text, sizeof text, "\r\nvalue = 0x%x", entry);
    EXPECT_EQ(LoggerHost_Count(text), 1);
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
