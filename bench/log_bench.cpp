// The price of one of the library's log lines on this platform: a dump line
// of the event reader, formatted and written by liblog, and the same line
// skipped below the minimum priority. Runs on the benchmark thread.
#include <android/log.h>

#include <benchmark/benchmark.h>

#include "bench/bench_util.h"

namespace {

void BM_LogLine(benchmark::State& state) {
    bool log = state.range(0) != 0;
    setLibraryLog(log);
    int byte = 0;
    auto start = BenchClock::now();
    for (auto _ : state) {
        __android_log_print(ANDROID_LOG_INFO, "halvenor", "[%x]", byte++ & 0xFF);
    }
    double us = microsSince(start);
    setLibraryLog(true);
    recordSample(withLog("log: one line", log), us / static_cast<double>(state.iterations()));
}

}  // namespace

BENCHMARK(BM_LogLine)->ArgName("log")->Arg(1)->Arg(0)->Iterations(20000)->Repetitions(kRepetitions);
