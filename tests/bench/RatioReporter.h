// Console output of Google Benchmark plus a closing table: each benchmark's
// rate next to the rate of its baseline from the same run, and their ratio.
//
// On a loaded machine one measurement of each side says little: the load
// changes between them. So every benchmark runs as several repetitions, the
// repetitions of all benchmarks interleaved in random order (a change of load
// falls on both sides alike), and the ratio is that of the two medians. The
// closing table shows each side's spread between repetitions (coefficient of
// variation) next to it.
#pragma once

#include <benchmark/benchmark.h>
#include <unistd.h>

#include <cstdio>
#include <cstdlib>
#include <map>
#include <string>
#include <utility>
#include <vector>

class RatioReporter : public benchmark::ConsoleReporter {
public:
    RatioReporter() : ConsoleReporter(::isatty(1) ? OO_ColorTabular : OO_Tabular) {}

    // benchmark::Initialize with `repetitions` interleaved repetitions, the
    // console showing their aggregates only; arguments given on the command
    // line win. False on an unrecognised argument. The library's log is off
    // unless the environment sets its level: the figures measure the path, not
    // the terminal.
    static bool Initialize(int *argc, char **argv, int repetitions) {
        ::setenv("USBADAPTER_LOG_LEVEL", "OFF", 0);
        static std::vector<std::string> defaults;
        static std::vector<char *> args;
        defaults = {"--benchmark_enable_random_interleaving=true",
                    "--benchmark_repetitions=" + std::to_string(repetitions),
                    "--benchmark_report_aggregates_only=true"};
        args.assign(argv, argv + 1);
        for (std::string &d : defaults) args.push_back(d.data());
        args.insert(args.end(), argv + 1, argv + *argc);
        args.push_back(nullptr);
        int n = static_cast<int>(args.size()) - 1;
        benchmark::Initialize(&n, args.data());
        return !benchmark::ReportUnrecognizedArguments(n, args.data());
    }

    // `name` and `baseline`: function name and arguments ("BM_Print/65536");
    // compared on the rate `counter` both set.
    void Compare(std::string name, std::string baseline, std::string counter = "bytes_per_second") {
        pairs_.push_back({std::move(name), std::move(baseline), std::move(counter)});
    }

    void ReportRuns(const std::vector<Run> &runs) override {
        for (const Run &r : runs) {
            if (r.error_occurred) continue;
            std::string key = r.run_name.function_name;
            if (!r.run_name.args.empty()) key += "/" + r.run_name.args;
            for (const auto &[counter, value] : r.counters) {
                Rate &rate = rates_[key + " " + counter];
                // A single repetition has no aggregates: its own rate stands.
                if (r.run_type == Run::RT_Iteration || r.aggregate_name == "median") rate.median = value;
                else if (r.aggregate_name == "cv") rate.cv = value;
            }
        }
        ConsoleReporter::ReportRuns(runs);
    }

    // Runs the benchmarks, then prints the closing table.
    void RunAll() {
        benchmark::RunSpecifiedBenchmarks(this);
        PrintRatios();
        benchmark::Shutdown();
    }

private:
    void PrintRatios() const {
        std::printf("\n%-44s %10s %6s %-24s %10s %6s %7s\n", "medians of", "rate/1e6", "cv", "baseline", "", "cv",
                    "ratio");
        for (const Pair &p : pairs_) {
            auto a = rates_.find(p.name + " " + p.counter), b = rates_.find(p.baseline + " " + p.counter);
            if (a == rates_.end() || b == rates_.end() || b->second.median <= 0) continue;
            std::printf("%-44s %10.1f %5.1f%% %-24s %10.1f %5.1f%% %7.3f\n", (p.name + " " + p.counter).c_str(),
                        a->second.median / 1e6, a->second.cv * 100, p.baseline.c_str(), b->second.median / 1e6,
                        b->second.cv * 100, a->second.median / b->second.median);
        }
    }

    struct Rate {
        double median = 0;
        double cv = 0;
    };
    struct Pair {
        std::string name, baseline, counter;
    };
    std::vector<Pair> pairs_;
    std::map<std::string, Rate> rates_;
};
