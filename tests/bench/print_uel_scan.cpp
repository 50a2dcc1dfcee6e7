// Scanning rate of CheckUELCommand, the reader's UEL search, against memchr
// finding every ESC of the same buffer: the least any search for the UEL's
// first byte has to do. Buffers of 1 MiB: print data without ESC, PCL-like
// data with an escape sequence every 64 bytes, and data whose only ESC starts
// a UEL at the very end.
#include <benchmark/benchmark.h>

#include <algorithm>
#include <cstring>
#include <string>

#include "RatioReporter.h"
#include "adapter/Classifier.h"
#include "adapter/prn_thread.h"
#include "support/RandomBytes.h"

namespace {

constexpr size_t kSize = 1 << 20;
const char *const kKinds[] = {"plain", "pcl", "uel-at-end"};

std::string MakeBuffer(int kind) {
    std::string b = RandomBytes(kSize, 12345);
    std::replace(b.begin(), b.end(), '\x1b', 'E');
    if (kind == 1) {
        for (size_t i = 0; i + 8 < kSize; i += 64) std::memcpy(&b[i], "\x1b*b64W", 6);  // raster row command
    } else if (kind == 2) {
        std::memcpy(&b[kSize - 9], "\x1b%-12345X", 9);
    }
    return b;
}

void BM_CheckUEL(benchmark::State &state) {
    std::string buf = MakeBuffer(static_cast<int>(state.range(0)));
    auto *p = reinterpret_cast<U8 *>(buf.data());
    for (auto _ : state) {
        benchmark::DoNotOptimize(CheckUELCommand(p, static_cast<S32>(buf.size())));
        jobCounter = 0;
        splitPatternFlag = 0;
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(buf.size()));
    state.SetLabel(kKinds[state.range(0)]);
}
BENCHMARK(BM_CheckUEL)->DenseRange(0, 2);

// Baseline: every ESC of the buffer found with memchr.
void BM_Memchr(benchmark::State &state) {
    std::string buf = MakeBuffer(static_cast<int>(state.range(0)));
    const char *end = buf.data() + buf.size();
    for (auto _ : state) {
        size_t found = 0;
        for (const char *p = buf.data(); (p = static_cast<const char *>(std::memchr(p, 0x1B, end - p))); ++p) ++found;
        benchmark::DoNotOptimize(found);
    }
    state.SetBytesProcessed(static_cast<int64_t>(state.iterations()) * static_cast<int64_t>(buf.size()));
    state.SetLabel(kKinds[state.range(0)]);
}
BENCHMARK(BM_Memchr)->DenseRange(0, 2);

}  // namespace

int main(int argc, char **argv) {
    // CheckUELCommand logs a line per call: the reporter turns the log off.
    if (!RatioReporter::Initialize(&argc, argv, 9)) return 1;
    RatioReporter reporter;
    for (int k = 0; k < 3; ++k)
        reporter.Compare("BM_CheckUEL/" + std::to_string(k), "BM_Memchr/" + std::to_string(k));
    reporter.RunAll();
    return 0;
}
