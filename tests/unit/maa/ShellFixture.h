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
#include "adapter/USB.h"
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

// Records the call; the result is "<name> done".
inline TMAAResult *called(const char *name, std::vector<U32> words) {
    calls.push_back({name, std::move(words)});
    std::snprintf(reinterpret_cast<char *>(aubText), sizeof aubText, "%s done", name);
    stResult = {MAA_RESULT_END, 1, static_cast<U32>(std::strlen(reinterpret_cast<char *>(aubText))), aubText};
    return &stResult;
}

// Test functions of several arities.
inline TMAAResult *f0() { return called("f0", {}); }
inline TMAAResult *g0() { return called("g0", {}); }
inline TMAAResult *f2(U32 a, U32 b) { return called("f2", {a, b}); }
inline TMAAResult *f3(U32 a, S32 b, U32 c) { return called("f3", {a, static_cast<U32>(b), c}); }
inline TMAAResult *f10(U32 a, U32 b, U32 c, U32 d, U32 e, U32 f, U32 g, U32 h, U32 i, U32 j) {
    return called("f10", {a, b, c, d, e, f, g, h, i, j});
}
inline TMAAResult *general(U32 argc, U32 *args) { return called("general", std::vector<U32>(args, args + argc)); }
// Reads its text argument through the address map.
inline std::vector<std::string> texts;
inline TMAAResult *text1(U32 address) {
    const char *t = MAA_AddrString(address);
    texts.push_back(t ? t : "<refused>");
    return called("text1", {address});
}
inline TMAAResult *silent0() {
    called("silent0", {});
    stResult = {MAA_RESULT_NONE, 0, 0, nullptr};
    return &stResult;
}
// A scanner-side function: writes its own record.
inline TMAAResult *scan1(U32 a) {
    TMAAResult *r = called("scan1", {a});
    MAA_IF_WriteResult(r);
    return r;
}

// What every test of the shell starts and ends with, here and in the session
// and test-function tests: no symbols, an empty address map, no literals, a
// plugged-in cable, a normal run and caught log lines.
class ShellBase : public ::testing::Test {
protected:
    void SetUp() override {
        MAA_SymbolClear();
        MAA_AddrReset();
        written.clear();
        IsDisconnected = 0;
        enSpecialMode = MAA_NORMAL_CMD;
        LoggerHost_StartCapture();
    }
    void TearDown() override {
        MAA_FreeParamString();
        MAA_AddrReset();
        MAA_SymbolClear();
        IsDisconnected = 0;
        enSpecialMode = MAA_NORMAL_CMD;
        MAA_SetResultWriter(nullptr);
        LoggerHost_StopCapture();
    }

    // A command line through the shell.
    static U32 run(const std::string &line) {
        lineBuffer = line;
        MAA_InputSet(reinterpret_cast<const U8 *>(lineBuffer.c_str()));
        return MAA_Parser();
    }
    inline static std::string lineBuffer;
};

class ShellTest : public ShellBase {
protected:
    void SetUp() override {
        ShellBase::SetUp();
        calls.clear();
        texts.clear();
        MAA_SetResultWriter(&Capture);
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
};

}  // namespace maatest
