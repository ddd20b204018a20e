// Exchange latency: one command out, its Command Complete back, through the
// library (engine writer, pump, HAL callback, event reader) and through the
// least a bridge can do. The benchmark thread plays the Java thread.
#include <poll.h>
#include <sys/resource.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <thread>

#include <benchmark/benchmark.h>

#include "bench/bench_hal.h"
#include "bench/bench_util.h"
#include "engine/hci_cmd.h"
#include "transport/session.h"

namespace {

const uint8_t kReset[] = {0x01, 0x03, 0x0C, 0x00};

// Context switches of the whole process so far: voluntary plus preemptions.
double contextSwitches() {
    struct rusage usage;
    getrusage(RUSAGE_SELF, &usage);
    return static_cast<double>(usage.ru_nvcsw + usage.ru_nivcsw);
}

void reportSwitches(benchmark::State& state, double before) {
    state.counters["switches_per_exchange"] =
            benchmark::Counter((contextSwitches() - before) / static_cast<double>(state.iterations()));
}

// The far side of the minimal bridge: one blocking read of the command, and
// the controller's answer written straight back, as the HAL callback would.
void answerCommands(int fd) {
    uint8_t command[260];
    for (;;) {
        ssize_t n = read(fd, command, sizeof(command));
        if (n < 3) return;
        const uint8_t reply[] = {0x04, 0x0E, 0x04, 0x01, command[1], command[2], 0x00};
        if (!writeAll(fd, reply, sizeof(reply))) return;
    }
}

void BM_Exchange_MinimalBridge(benchmark::State& state) {
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) == -1) {
        state.SkipWithError("socketpair failed");
        return;
    }
    std::thread forwarder(answerCommands, fds[1]);
    uint8_t reply[260];
    double switches = contextSwitches();
    for (auto _ : state) {
        auto start = BenchClock::now();
        bool ok = writeAll(fds[0], kReset, sizeof(kReset)) && read(fds[0], reply, sizeof(reply)) == 7;
        double us = microsSince(start);
        if (!ok) {
            state.SkipWithError("exchange failed");
            break;
        }
        state.SetIterationTime(us / 1e6);
        recordSample("exchange: minimal bridge", us);
    }
    reportSwitches(state, switches);
    shutdown(fds[0], SHUT_RDWR);
    forwarder.join();
    close(fds[0]);
    close(fds[1]);
}

// The calls the library makes for one exchange, without the library: where
// the time between the bridge and the library goes. The caller side makes the
// engine's calls (a check for stale input, the write, then a bounded wait
// before each of the three reads of an event); the forwarding side makes the
// pump's (a look for a waiting byte, the wait, the type and header reads).
bool waitReadable(int fd, int ms) {
    struct pollfd pfd = {fd, POLLIN, 0};
    return poll(&pfd, 1, ms) == 1;
}

bool exchangeLikeEngine(int fd) {
    uint8_t reply[260];
    waitReadable(fd, 0);
    if (send(fd, kReset, sizeof(kReset), MSG_NOSIGNAL) != sizeof(kReset)) return false;
    if (!waitReadable(fd, 2000) || !readExactly(fd, reply, 1)) return false;
    if (!waitReadable(fd, 2000) || !readExactly(fd, reply, 2)) return false;
    return waitReadable(fd, 2000) && readExactly(fd, reply + 2, reply[1]);
}

// The same exchange with a wait only where a read would block: before the
// type byte. The rest of an event is written in one piece with it, so its
// header and parameters are read without a wait, and stale input is looked
// for with a non-blocking read.
bool exchangeWaitingOnce(int fd) {
    uint8_t reply[260];
    if (recv(fd, reply, sizeof(reply), MSG_DONTWAIT) > 0) return false;
    if (send(fd, kReset, sizeof(kReset), MSG_NOSIGNAL) != sizeof(kReset)) return false;
    if (!waitReadable(fd, 2000) || !readExactly(fd, reply, 1)) return false;
    if (!readExactly(fd, reply, 2)) return false;
    return readExactly(fd, reply + 2, reply[1]);
}

bool exchangeLikeBridge(int fd) {
    uint8_t reply[260];
    return writeAll(fd, kReset, sizeof(kReset)) && read(fd, reply, sizeof(reply)) == 7;
}

void answerLikePump(int fd) {
    uint8_t type, header[3];
    for (;;) {
        if (recv(fd, &type, 1, MSG_DONTWAIT) != 1) {
            if (!waitReadable(fd, 500) || !readExactly(fd, &type, 1)) return;
        }
        if (!readExactly(fd, header, 3)) return;
        const uint8_t reply[] = {0x04, 0x0E, 0x04, 0x01, header[0], header[1], 0x00};
        if (send(fd, reply, sizeof(reply), MSG_NOSIGNAL) != sizeof(reply)) return;
    }
}

void BM_Exchange_BridgeWithLibraryCalls(benchmark::State& state) {
    int engine_side = static_cast<int>(state.range(0));  // 0 bridge, 1 engine, 2 engine waiting once
    bool pump_side = state.range(1) != 0;
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) == -1) {
        state.SkipWithError("socketpair failed");
        return;
    }
    std::thread forwarder(pump_side ? answerLikePump : answerCommands, fds[1]);
    const char* engine_names[] = {"", "engine", "engine waiting once"};
    std::string series = std::string("exchange: bridge with the calls of the ") +
                         engine_names[engine_side] + (engine_side && pump_side ? " and " : "") +
                         (pump_side ? "pump" : "");
    bool (*exchange)(int) = engine_side == 2   ? exchangeWaitingOnce
                            : engine_side == 1 ? exchangeLikeEngine
                                               : exchangeLikeBridge;
    for (auto _ : state) {
        auto start = BenchClock::now();
        bool ok = exchange(fds[0]);
        double us = microsSince(start);
        if (!ok) {
            state.SkipWithError("exchange failed");
            break;
        }
        state.SetIterationTime(us / 1e6);
        recordSample(series, us);
    }
    shutdown(fds[0], SHUT_RDWR);
    forwarder.join();
    close(fds[0]);
    close(fds[1]);
}

// Reset through hci_send_cmd_rawcmd: framed, written to bt_fd, forwarded by
// the pump to the HAL, answered in its callback, read by the event reader.
void BM_Exchange_Library(benchmark::State& state) {
    bool log = state.range(0) != 0;
    auto hal = registerBenchHal();
    hidl_client_init();
    if (bt_fd < 0) {
        state.SkipWithError("no session");
        unregisterBenchHal();
        return;
    }
    setLibraryLog(log);
    double switches = contextSwitches();
    for (auto _ : state) {
        auto start = BenchClock::now();
        int rc = hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr);
        double us = microsSince(start);
        if (rc != 0) {
            state.SkipWithError("exchange failed");
            break;
        }
        state.SetIterationTime(us / 1e6);
        recordSample(withLog("exchange: library", log), us);
    }
    reportSwitches(state, switches);
    setLibraryLog(true);
    hidl_client_close_tool_end();
    hidl_client_close();
    unregisterBenchHal();
}

}  // namespace

BENCHMARK(BM_Exchange_MinimalBridge)->UseManualTime()->Iterations(2000)->Repetitions(kRepetitions);
BENCHMARK(BM_Exchange_BridgeWithLibraryCalls)
        ->ArgNames({"engine", "pump"})
        ->Args({1, 0})
        ->Args({0, 1})
        ->Args({1, 1})
        ->Args({2, 1})
        ->UseManualTime()
        ->Iterations(2000)
        ->Repetitions(kRepetitions);
BENCHMARK(BM_Exchange_Library)
        ->ArgName("log")
        ->Arg(1)
        ->Arg(0)
        ->UseManualTime()
        ->Iterations(2000)
        ->Repetitions(kRepetitions);
