// Command lines per second through the MAA shell's lexer, parser and evaluator,
// for a mix of assignments, arithmetic and calls of a registered no-op
// function. Baselines in the same run: tokenising the same lines only, and
// running an empty line (lines per second of each, and their ratios).
#include <benchmark/benchmark.h>

#include "RatioReporter.h"
#include "maa/MAA_Address.h"
#include "maa/MAA_IF.h"
#include "maa/MAA_MM.h"
#include "maa/MAA_Parser.h"
#include "maa/MAA_Symbol.h"

namespace {

const char *const kLines[] = {
    "x = 5",
    "y = x * 3 + 7",
    "x += y >> 2",
    "noop()",
    "noop2(x, 0x10)",
    "z = (x & 0xFF) | (y << 4), x++",
    "noop2(1, \"text\")",
    "y = x > 3 ? x - 3 : 0; noop()",
};
constexpr int kLineCount = sizeof kLines / sizeof kLines[0];

TMAAResult stResult;
U32 ulX, ulY;

TMAAResult *noop() {
    stResult = {MAA_RESULT_END, 1, 0, nullptr};
    return &stResult;
}
TMAAResult *noop2(U32, U32) { return noop(); }
void dropRecord(const TMAAResult *) {}

void setUp() {
    MAA_SymbolClear();
    MAA_AddrReset();
    MAA_SetResultWriter(&dropRecord);
    MAA_SymbolAdd(ftarget_ppc, "noop", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<noop>(), 0);
    MAA_SymbolAdd(ftarget_ppc, "noop2", MAA_SYM_FUNC_HIDE, MAA_FuncEntry<noop2>(), 2);
    MAA_SymbolAdd(ftarget_ppc, "x", MAA_SYM_DATA, MAA_AddrMap(&ulX, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "y", MAA_SYM_DATA, MAA_AddrMap(&ulY, 4), 0);
    MAA_SymbolAdd(ftarget_ppc, "z", MAA_SYM_UNDEF, 0x7FFFFFF0, 0);
}

const U8 *line(int i) { return reinterpret_cast<const U8 *>(kLines[i % kLineCount]); }

// Baseline: tokens only (identifier texts are freed as the parser would).
void BM_LexOnly(benchmark::State &state) {
    setUp();
    int i = 0;
    for (auto _ : state) {
        MAA_InputSet(line(i++));
        for (U32 t; (t = MAA_TokenDivider()) != 0;) {
            if (t == IDENTIFIER) MAA_Free(stVal.pubSymbol);
        }
        MAA_FreeParamString();
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_LexOnly);

// Baseline: the fixed cost of one line.
void BM_EmptyLine(benchmark::State &state) {
    setUp();
    static const U8 empty[] = ";";
    for (auto _ : state) {
        MAA_InputSet(empty);
        benchmark::DoNotOptimize(MAA_Parser());
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_EmptyLine);

void BM_Lines(benchmark::State &state) {
    setUp();
    int i = 0;
    for (auto _ : state) {
        MAA_InputSet(line(i++));
        benchmark::DoNotOptimize(MAA_Parser());
    }
    state.SetItemsProcessed(state.iterations());
}
BENCHMARK(BM_Lines);

}  // namespace

int main(int argc, char **argv) {
    if (!RatioReporter::Initialize(&argc, argv, 9)) return 1;
    RatioReporter reporter;
    reporter.Compare("BM_Lines", "BM_LexOnly", "items_per_second");
    reporter.Compare("BM_Lines", "BM_EmptyLine", "items_per_second");
    reporter.RunAll();
    return 0;
}
