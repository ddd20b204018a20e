// Session cost with a HAL that answers at once: opening and closing, and from
// the tool end closed to the pump joined or ended by itself. Everything runs
// on the benchmark thread, as on the Java thread.
#include <fcntl.h>
#include <poll.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <benchmark/benchmark.h>

#include "bench/bench_hal.h"
#include "bench/bench_util.h"
#include "transport/session.h"

namespace {

void BM_Session_OpenClose(benchmark::State& state) {
    bool log = state.range(0) != 0;
    auto hal = registerBenchHal();
    setLibraryLog(log);
    for (auto _ : state) {
        auto start = BenchClock::now();
        hidl_client_init();
        bool opened = bt_fd >= 0;
        hidl_client_close();
        double us = microsSince(start);
        if (!opened) {
            state.SkipWithError("no session");
            break;
        }
        state.SetIterationTime(us / 1e6);
        recordSample(withLog("session: open + close", log), us);
    }
    setLibraryLog(true);
    hidl_client_close_tool_end();
    unregisterBenchHal();
}

// The quit path's end of a session: the tool end closed, then the bridge
// stopped, which returns once the pump has been joined.
void BM_Session_ToolEndClosedToPumpJoined(benchmark::State& state) {
    bool log = state.range(0) != 0;
    auto hal = registerBenchHal();
    setLibraryLog(log);
    for (auto _ : state) {
        hidl_client_init();
        if (bt_fd < 0) {
            state.SkipWithError("no session");
            break;
        }
        auto start = BenchClock::now();
        hidl_client_close_tool_end();
        hidl_client_stop_bridge();
        double us = microsSince(start);
        hidl_client_close();
        state.SetIterationTime(us / 1e6);
        recordSample(withLog("session: tool end closed to pump joined", log), us);
    }
    setLibraryLog(true);
    unregisterBenchHal();
}

// Descriptor that becomes readable when thread `tid` has ended (a thread
// pidfd, PIDFD_THREAD being O_EXCL; Linux 6.9 and later), or -1.
int threadEndDescriptor(int tid) { return static_cast<int>(syscall(SYS_pidfd_open, tid, O_EXCL)); }

// The pump on its own: from the tool end closed to the pump thread gone,
// with nothing else to wake it (the bridge end is left alone until then).
void BM_Session_ToolEndClosedToPumpEnded(benchmark::State& state) {
    bool log = state.range(0) != 0;
    auto hal = registerBenchHal();
    setLibraryLog(log);
    for (auto _ : state) {
        auto threads = threadIds();
        hidl_client_init();
        int ended = threadEndDescriptor(newThread(threads, threadIds()));
        if (bt_fd < 0 || ended < 0) {
            state.SkipWithError("no session, or no thread pidfd on this kernel");
            hidl_client_close();
            break;
        }
        auto start = BenchClock::now();
        hidl_client_close_tool_end();
        struct pollfd pfd = {ended, POLLIN, 0};
        bool gone = poll(&pfd, 1, 2000) == 1;
        double us = microsSince(start);
        close(ended);
        hidl_client_close();
        if (!gone) {
            state.SkipWithError("the pump did not end by itself within 2 s");
            break;
        }
        state.SetIterationTime(us / 1e6);
        recordSample(withLog("session: tool end closed to pump ended by itself", log), us);
    }
    setLibraryLog(true);
    unregisterBenchHal();
}

}  // namespace

BENCHMARK(BM_Session_OpenClose)
        ->ArgName("log")
        ->Arg(1)
        ->Arg(0)
        ->UseManualTime()
        ->Iterations(300)
        ->Repetitions(kRepetitions);
BENCHMARK(BM_Session_ToolEndClosedToPumpEnded)
        ->ArgName("log")
        ->Arg(1)
        ->Arg(0)
        ->UseManualTime()
        ->Iterations(300)
        ->Repetitions(kRepetitions);
BENCHMARK(BM_Session_ToolEndClosedToPumpJoined)
        ->ArgName("log")
        ->Arg(1)
        ->Arg(0)
        ->UseManualTime()
        ->Iterations(300)
        ->Repetitions(kRepetitions);
