// Arbitrary command lines through the MAA lexer, parser and evaluator, with a
// few registered functions, data cells, an undefined symbol and the general
// function. Every input starts from an empty table and address map.
#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <cstring>

#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Symbol.h"

namespace {

TMAAResult stResult;
U8 aubData[32] = "done";
U32 ulX, ulY;
volatile U32 ulSink;

TMAAResult *done(TMAAResultStatus status) {
    stResult = {status, 1, 4, aubData};
    return &stResult;
}

// Touches a text argument the way test functions do.
void useText(U32 word) {
    if (word > 1000000) {
        if (const char *t = MAA_AddrString(word)) ulSink = ulSink + static_cast<U32>(std::strlen(t));
    }
}

TMAAResult *f0() { return done(MAA_RESULT_END); }
TMAAResult *f2(U32 a, U32 b) {
    useText(a);
    useText(b);
    return done(MAA_RESULT_CONTINUE);
}
TMAAResult *none1(U32 a) {
    useText(a);
    return done(MAA_RESULT_NONE);
}
TMAAResult *scan3(U32 a, U32 b, U32 c) {
    MAA_IF_WriteResult(done(MAA_RESULT_END));
    return done(static_cast<TMAAResultStatus>((a + b + c) % 3));
}
TMAAResult *f10(U32 a, U32, U32, U32, U32, U32, U32, U32, U32, U32 j) {
    useText(a);
    useText(j);
    return nullptr;
}
TMAAResult *general(U32 argc, U32 *args) {
    for (U32 i = 0; i < argc; ++i) useText(args[i]);
    return done(MAA_RESULT_END);
}

// Reads every byte of a record, as the wire writer does.
void consume(const TMAAResult *r) {
    for (U32 i = 0; r->pubData != nullptr && i < r->ulDataSize; ++i) ulSink = ulSink + r->pubData[i];
}

void registerSymbols() {
    MAA_SymbolAdd(ftarget_all, "MAA_SymbolDump", MAA_SYM_FUNC, MAA_FuncEntry<MAA_SymbolDump>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "f", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f0>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "g", MAA_SYM_FUNC, MAA_FuncEntry<f2>(), 2);
    MAA_SymbolAdd(ftarget_ppc, "h", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<none1>(), 1);
    MAA_SymbolAdd(ftarget_scn, "s", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<scan3>(), 3);
    MAA_SymbolAdd(ftarget_ppc, "t", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f10>(), 10);
    MAA_SymbolAdd(ftarget_ppc, "x", MAA_SYM_DATA, MAA_AddrMap(&ulX, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "y", MAA_SYM_DATA, MAA_AddrMap(&ulY, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "u", MAA_SYM_UNDEF, 0x7FFFFFF0, 0);
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, MAA_AddrGeneralHandle(&general), 2);
}

}  // namespace

extern "C" int LLVMFuzzerInitialize(int *, char ***) {
    setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
    MAA_SetResultWriter(&consume);
    return 0;
}

extern "C" int LLVMFuzzerTestOneInput(const uint8_t *data, size_t size) {
    // The session's line buffer: at most 1024 bytes, NUL-terminated.
    static U8 aubLine[1025];
    size_t n = size < 1024 ? size : 1024;
    std::memcpy(aubLine, data, n);
    aubLine[n] = 0;

    registerSymbols();
    enSpecialMode = n > 0 && data[0] == '#' ? MAA_AUTO_RUN_CMD : MAA_NORMAL_CMD;
    MAA_InputSet(aubLine);
    MAA_Parser();

    MAA_SymbolClear();
    MAA_AddrReset();
    return 0;
}
