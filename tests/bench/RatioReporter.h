// Console output of Google Benchmark plus a closing table: each benchmark's
// rate next to the rate of its baseline from the same run, and their ratio.
#pragma once

#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <map>
#include <string>
#include <utility>
#include <vector>

class RatioReporter : public benchmark::ConsoleReporter {
public:
    RatioReporter() : ConsoleReporter(::isatty(1) ? OO_ColorTabular : OO_Tabular) {}

    // `name` and `baseline` are run names as printed ("BM_Print/65536/...").
    void Compare(std::string name, std::string baseline) { pairs_.emplace_back(std::move(name), std::move(baseline)); }

    void ReportRuns(const std::vector<Run> &runs) override {
        for (const Run &r : runs) {
            auto it = r.counters.find("bytes_per_second");
            if (it != r.counters.end() && r.run_type == Run::RT_Iteration) rates_[r.benchmark_name()] = it->second;
        }
        ConsoleReporter::ReportRuns(runs);
    }

    void PrintRatios() const {
        std::printf("\n%-46s %12s %12s %8s\n", "benchmark", "MB/s", "baseline", "ratio");
        for (const auto &[name, base] : pairs_) {
            auto a = rates_.find(name), b = rates_.find(base);
            if (a == rates_.end() || b == rates_.end() || b->second <= 0) continue;
            std::printf("%-46s %12.1f %12.1f %8.3f\n", name.c_str(), a->second / 1e6, b->second / 1e6,
                        a->second / b->second);
        }
    }

private:
    std::vector<std::pair<std::string, std::string>> pairs_;
    std::map<std::string, double> rates_;
};
