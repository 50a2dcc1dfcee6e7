// Common set-up of the MAA language tests: an empty symbol table and address
// map, caught log lines and result records, and a few test functions that
// record how they were called.
#pragma once

#include <gtest/gtest.h>

#include <cstdio>
#include <cstring>
#include <string>
#include <vector>

#include "LoggerHost.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Symbol.h"
#include "support/MaaRecords.h"

namespace maatest {

using namespace maarec;

struct Call {
    std::string function;
    std::vector<U32> words;
};

inline std::vector<Call> calls;
inline TMAAResult stResult;
inline U8 aubText[64];

inline TMAAResult *finish(const char *name, TMAAResultStatus status = MAA_RESULT_END) {
    std::snprintf(reinterpret_cast<char *>(aubText), sizeof aubText, "%s done", name);
    stResult = {status, 1, static_cast<U32>(std::strlen(reinterpret_cast<char *>(aubText))), aubText};
    return &stResult;
}

// Test functions of several arities.
inline TMAAResult *f0() {
    calls.push_back({"f0", {}});
    return finish("f0");
}
inline TMAAResult *g0() {
    calls.push_back({"g0", {}});
    return finish("g0");
}
inline TMAAResult *f2(U32 a, U32 b) {
    calls.push_back({"f2", {a, b}});
    return finish("f2");
}
inline TMAAResult *f3(U32 a, S32 b, U32 c) {
    calls.push_back({"f3", {a, static_cast<U32>(b), c}});
    return finish("f3");
}
inline TMAAResult *f10(U32 a, U32 b, U32 c, U32 d, U32 e, U32 f, U32 g, U32 h, U32 i, U32 j) {
    calls.push_back({"f10", {a, b, c, d, e, f, g, h, i, j}});
    return finish("f10");
}
// Reads its text argument through the address map.
inline std::vector<std::string> texts;
inline TMAAResult *text1(U32 address) {
    calls.push_back({"text1", {address}});
    const char *t = MAA_AddrString(address);
    texts.push_back(t ? t : "<refused>");
    return finish("text1");
}
inline TMAAResult *silent0() {
    calls.push_back({"silent0", {}});
    stResult = {MAA_RESULT_NONE, 0, 0, nullptr};
    return &stResult;
}
// A scanner-side function: writes its own record.
inline TMAAResult *scan1(U32 a) {
    calls.push_back({"scan1", {a}});
    TMAAResult *r = finish("scan1");
    MAA_IF_WriteResult(r);
    return r;
}
inline TMAAResult *general(U32 argc, U32 *args) {
    calls.push_back({"general", std::vector<U32>(args, args + argc)});
    return finish("general");
}

class ShellTest : public ::testing::Test {
protected:
    void SetUp() override {
        MAA_SymbolClear();
        MAA_AddrReset();
        written.clear();
        calls.clear();
        texts.clear();
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(&Capture);
        LoggerHost_StartCapture();
    }
    void TearDown() override {
        MAA_SymbolClear();
        MAA_SetResultWriter(nullptr);
        LoggerHost_StopCapture();
    }

    static U32 run(const std::string &line) {
        lineBuffer = line;
        MAA_InputSet(reinterpret_cast<const U8 *>(lineBuffer.c_str()));
        return MAA_Parser();
    }

    // A registered 4-byte variable of the test.
    static void addData(const char *name, U32 *cell) {
        MAA_SymbolAdd(ftarget_ppc, name, MAA_SYM_DATA, MAA_AddrMap(cell, sizeof *cell), 0);
    }

    // Texts of the statement values logged by the shell, in order.
    static std::vector<std::string> values() {
        std::vector<std::string> out;
        for (const LoggedLine &l : LoggerHost_Captured()) {
            if (l.text.rfind("Value", 0) == 0) out.push_back(l.text);
        }
        return out;
    }
    static std::string lastValue() {
        auto v = values();
        return v.empty() ? std::string() : v.back();
    }

    inline static std::string lineBuffer;
};

}  // namespace maatest
