// Idle cost of an open session: the pump thread's wake-ups (its voluntary
// context switches: each is one return from a wait) and its CPU time over
// 10 s with no traffic. Reads the pump's counters from /proc.
#include <chrono>
#include <thread>

#include <benchmark/benchmark.h>

#include "bench/bench_hal.h"
#include "bench/bench_util.h"
#include "transport/session.h"

namespace {

const int kIdleSeconds = 10;

void BM_Idle_Pump(benchmark::State& state) {
    auto hal = registerBenchHal();
    auto before = threadIds();
    hidl_client_init();
    int pump = newThread(before, threadIds());
    if (bt_fd < 0 || pump < 0) {
        state.SkipWithError("no session or no pump thread found");
        unregisterBenchHal();
        return;
    }
    // Let the pump reach its first wait before counting.
    std::this_thread::sleep_for(std::chrono::milliseconds(50));
    for (auto _ : state) {
        ThreadCounters start = readThreadCounters(pump);
        auto begun = BenchClock::now();
        std::this_thread::sleep_for(std::chrono::seconds(kIdleSeconds));
        ThreadCounters end = readThreadCounters(pump);
        double seconds = microsSince(begun) / 1e6;
        state.SetIterationTime(seconds);
        // A preemption is no wake-up: it is counted apart.
        double wakeups = static_cast<double>(end.voluntary - start.voluntary) / seconds;
        double preempted = static_cast<double>(end.involuntary - start.involuntary);
        double cpu_us = (end.cpu_ns - start.cpu_ns) / 1e3;
        state.counters["wakeups_per_s"] = wakeups;
        state.counters["preemptions"] = preempted;
        state.counters["cpu_us"] = cpu_us;
        recordSample("idle: pump wake-ups per second", wakeups);
        recordSample("idle: pump preemptions over the run", preempted);
        recordSample("idle: pump CPU time over the run (us)", cpu_us);
        recordSample("idle: run length (s)", seconds);
    }
    hidl_client_close_tool_end();
    hidl_client_close();
    unregisterBenchHal();
}

}  // namespace

BENCHMARK(BM_Idle_Pump)->UseManualTime()->Iterations(1)->Repetitions(1)->Unit(benchmark::kSecond);
