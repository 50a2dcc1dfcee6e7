// Harmless test-shell functions for the fuzz targets: every arity, every
// result kind, a scanner-side function, text arguments read through the
// address map, data cells, an undefined symbol and the general function; and
// for the session targets the download echoed or forwarded, and Dump_File
// over a private root.
#pragma once

#include <algorithm>
#include <cstdio>
#include <cstring>

#include "maa/MAA_Address.h"
#include "maa/MAA_Hook.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Result.h"
#include "maa/MAA_Symbol.h"
#include "support/TempRoot.h"

namespace probes {

inline TMAAResult stResult;
inline U8 aubDone[] = "done";
inline U32 ulX, ulY;
inline volatile U32 ulSink;

inline TMAAResult *done(TMAAResultStatus status) {
    stResult = {status, 1, 4, aubDone};
    return &stResult;
}
// Touches a text argument the way test functions do.
inline void useText(U32 word) {
    if (word > 1000000) {
        if (const char *t = MAA_AddrString(word)) ulSink = ulSink + static_cast<U32>(std::strlen(t));
    }
}
inline TMAAResult *f0() { return done(MAA_RESULT_END); }
inline TMAAResult *f2(U32 a, U32 b) {
    useText(a);
    useText(b);
    return done(MAA_RESULT_CONTINUE);
}
inline TMAAResult *none1(U32 a) {
    useText(a);
    return done(MAA_RESULT_NONE);
}
inline TMAAResult *scan3(U32 a, U32 b, U32 c) {
    MAA_IF_WriteResult(done(MAA_RESULT_CONTINUE));
    MAA_IF_SkipResult();
    return done(static_cast<TMAAResultStatus>((a + b + c) % 3));
}
inline TMAAResult *f10(U32 a, U32, U32, U32, U32, U32, U32, U32, U32, U32 j) {
    useText(a);
    useText(j);
    return nullptr;
}
inline TMAAResult *general(U32 argc, U32 *args) {
    for (U32 i = 0; i < argc; ++i) useText(args[i]);
    return done(MAA_RESULT_END);
}

// The host's last download, sent back as a file (first 64 KiB).
inline TMAAResult *echoDownload() {
    U32 size = 0;
    const U8 *p = MAA_DownloadBuffer(&size);
    MAA_IF_WriteFile(p, p ? std::min<U32>(size, 64 * 1024) : 0);
    MAA_IF_FileEnd();
    return done(MAA_RESULT_END);
}
// The host's last download taken as ready-made frames (first 8 KiB).
inline TMAAResult *forwardDownload() {
    U32 size = 0;
    U8 *p = MAA_DownloadBuffer(&size);
    if (p) MAA_WriteFileForward(p, std::min<U32>(size, 8 * 1024));
    return done(MAA_RESULT_NONE);
}
// A private USBADAPTER_ROOT for Dump_File, with a short text at "/t" (once).
inline void MakeShellFiles() {
    static TempRoot root;
    if (FILE *f = std::fopen((root / "/t").c_str(), "w")) {
        std::fputs("first line\nsecond line\n\nafter the empty line\n", f);
        std::fclose(f);
    }
}
inline void AddFileFunctions() {
    MAA_SymbolAdd(ftarget_ppc, "dl", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<echoDownload>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "fw", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<forwardDownload>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "Dump_File", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<Dump_File>(), 1);
}

// Registers the probes (the general function last, as the registry does).
inline void Register(void (*extra)() = nullptr) {
    MAA_SymbolAdd(ftarget_all, "MAA_SymbolDump", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<MAA_SymbolDump>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "f", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f0>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "g", MAA_SYM_FUNC, MAA_FuncEntry<f2>(), 2);
    MAA_SymbolAdd(ftarget_ppc, "h", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<none1>(), 1);
    MAA_SymbolAdd(ftarget_scn, "s", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<scan3>(), 3);
    MAA_SymbolAdd(ftarget_ppc, "t", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<f10>(), 10);
    if (extra) extra();
    MAA_SymbolAdd(ftarget_ppc, "x", MAA_SYM_DATA, MAA_AddrMap(&ulX, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "y", MAA_SYM_DATA, MAA_AddrMap(&ulY, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "u", MAA_SYM_UNDEF, 0x7FFFFFF0, 0);
    MAA_SymbolAddGeneral(ftarget_ppc, "MAA_GENERAL_FUNCTION", MAA_SYM_FUNC_HIDE, MAA_AddrGeneralHandle(&general), 2);
}

// A session's start as the print channel's reader leaves it.
inline void ResetSession() {
    maa_session::slPollTimeout = MAA_POLL_TIMEOUT_FIRST;
    enSpecialMode = MAA_NORMAL_CMD;
    fSellStop = 0;
    ulReadCount = 0;
    dataReadCount = 0;
}

// The shell's state between inputs: what sessions held is freed (libFuzzer's
// leak check compares inputs) and the next input starts afresh.
inline void ForgetShell() {
    for (MAAHeapHandle *h : {&stCmdHeap, &stDataHeap}) {
        MAA_HeapFree(h->ulHeapPtr, 0);
        *h = {};
    }
    MAA_DownloadFreeAll();
    MAA_SetResultWriter(nullptr);
    MAA_SymbolClear();
    MAA_AddrReset();
}

}  // namespace probes
