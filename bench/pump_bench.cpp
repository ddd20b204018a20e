// Pump throughput: ACL packets written to the tool end as fast as the writer
// can, counted at the HAL; against the same bytes over a bare socket pair
// read in large chunks. The benchmark thread is the writer.
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <string>
#include <thread>
#include <vector>

#include <benchmark/benchmark.h>

#include "bench/bench_hal.h"
#include "bench/bench_util.h"
#include "transport/session.h"

namespace {

const int kBatch = 1000;  // packets per iteration

// One H4 ACL packet (type, handle, length low byte first, data) of `data` bytes.
std::vector<uint8_t> aclPacket(int data) {
    std::vector<uint8_t> packet = {0x02, 0x01, 0x20, static_cast<uint8_t>(data & 0xFF),
                                   static_cast<uint8_t>(data >> 8)};
    for (int i = 0; i < data; ++i) packet.push_back(static_cast<uint8_t>(i));
    return packet;
}

bool writeBatch(int fd, const std::vector<uint8_t>& packet) {
    for (int i = 0; i < kBatch; ++i) {
        if (!writeAll(fd, packet.data(), packet.size())) return false;
    }
    return true;
}

void drainCounting(int fd, Tally* bytes, std::atomic<int>* tid) {
    tid->store(currentThreadId());
    std::vector<uint8_t> chunk(64 * 1024);
    for (;;) {
        ssize_t n = read(fd, chunk.data(), chunk.size());
        if (n <= 0) return;
        bytes->add(static_cast<uint64_t>(n));
    }
}

// The calls the pump made per packet before it took waiting packets in one
// read, without the library: a look for a waiting type byte (a wait only when
// there is none), the preamble read, the payload read.
void readLikePump(int fd, Tally* packets, std::atomic<int>* tid) {
    tid->store(currentThreadId());
    std::vector<uint8_t> payload(65536);
    uint8_t type, preamble[4];
    for (;;) {
        if (recv(fd, &type, 1, MSG_DONTWAIT) != 1) {
            struct pollfd pfd = {fd, POLLIN, 0};
            if (poll(&pfd, 1, 500) != 1 || !readExactly(fd, &type, 1)) return;
        }
        if (!readExactly(fd, preamble, 4)) return;
        size_t len = preamble[2] | (preamble[3] << 8);
        if (!readExactly(fd, payload.data(), len)) return;
        packets->add(1);
    }
}

void reportRate(benchmark::State& state, const std::string& series, double seconds,
                size_t packet_bytes, double receiver_cpu_ns) {
    double packets = static_cast<double>(state.iterations()) * kBatch;
    state.SetItemsProcessed(static_cast<int64_t>(packets));
    state.SetBytesProcessed(static_cast<int64_t>(packets * packet_bytes));
    state.counters["receiver_cpu_us_per_packet"] = receiver_cpu_ns / 1e3 / packets;
    if (seconds <= 0) return;
    recordSample(series, packets / seconds);
    recordSample(series + " [receiver CPU us/packet]", receiver_cpu_ns / 1e3 / packets);
}

std::string seriesName(const char* what, int data) {
    return std::string("throughput ") + std::to_string(data) + " B: " + what;
}

// Bare socket pair; the receiving side reads in large chunks (0) or makes
// the pump's calls for every packet (1).
void BM_Throughput_RawSocketPair(benchmark::State& state) {
    int data = static_cast<int>(state.range(0));
    bool pump_calls = state.range(1) != 0;
    auto packet = aclPacket(data);
    int fds[2];
    if (socketpair(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0, fds) == -1) {
        state.SkipWithError("socketpair failed");
        return;
    }
    Tally received;
    std::atomic<int> reader_tid{-1};
    std::thread reader(pump_calls ? readLikePump : drainCounting, fds[1], &received, &reader_tid);
    while (reader_tid.load() == -1) std::this_thread::yield();
    ThreadCounters before = readThreadCounters(reader_tid.load());
    uint64_t expected = 0;
    auto start = BenchClock::now();
    for (auto _ : state) {
        expected += pump_calls ? kBatch : static_cast<uint64_t>(kBatch) * packet.size();
        if (!writeBatch(fds[0], packet) || !received.waitFor(expected)) {
            state.SkipWithError("bytes lost");
            break;
        }
    }
    double seconds = microsSince(start) / 1e6;
    ThreadCounters after = readThreadCounters(reader_tid.load());
    reportRate(state, seriesName(pump_calls ? "raw socket pair, pump's calls" : "raw socket pair", data),
               seconds, packet.size(), after.cpu_ns - before.cpu_ns);
    shutdown(fds[0], SHUT_RDWR);
    reader.join();
    close(fds[0]);
    close(fds[1]);
}

void BM_Throughput_Pump(benchmark::State& state) {
    int data = static_cast<int>(state.range(0));
    bool log = state.range(1) != 0;
    auto packet = aclPacket(data);
    auto hal = registerBenchHal();
    auto threads = threadIds();
    hidl_client_init();
    int pump = newThread(threads, threadIds());
    if (bt_fd < 0 || pump < 0) {
        state.SkipWithError("no session or no pump thread found");
        unregisterBenchHal();
        return;
    }
    setLibraryLog(log);
    ThreadCounters before = readThreadCounters(pump);
    uint64_t expected = 0;
    auto start = BenchClock::now();
    for (auto _ : state) {
        expected += kBatch;
        if (!writeBatch(bt_fd, packet) || !hal->aclPackets().waitFor(expected)) {
            state.SkipWithError("packets lost");
            break;
        }
    }
    double seconds = microsSince(start) / 1e6;
    ThreadCounters after = readThreadCounters(pump);
    setLibraryLog(true);
    reportRate(state, withLog(seriesName("pump", data), log), seconds, packet.size(),
               after.cpu_ns - before.cpu_ns);
    hidl_client_close_tool_end();
    hidl_client_close();
    unregisterBenchHal();
}

}  // namespace

BENCHMARK(BM_Throughput_RawSocketPair)
        ->ArgNames({"acl", "pump_calls"})
        ->ArgsProduct({{27, 251, 1021}, {0, 1}})
        ->UseRealTime()
        ->Iterations(20)
        ->Repetitions(kRepetitions);
BENCHMARK(BM_Throughput_Pump)
        ->ArgNames({"acl", "log"})
        ->ArgsProduct({{27, 251, 1021}, {1, 0}})
        ->UseRealTime()
        ->Iterations(20)
        ->Repetitions(kRepetitions);
