// Lifecycle soak from C++: cycles of open, exchange and close through the
// engine's entry points against a scripted controller, ending each session by
// quitTestModeNative's path, destoryNative's, or both in either order.
// Measures descriptors, threads and resident memory after a warm-up and at
// the end; exits 1 when a cycle misbehaves or any of them grew.
//   lifecycle_soak [cycles]   (default 10000)
#include <android/log.h>
#include <stdio.h>
#include <stdlib.h>

#include <atomic>
#include <chrono>
#include <fstream>
#include <string>
#include <vector>

#include "engine/test_mode.h"
#include "jni/binding.h"
#include "tests/support/fake_hal.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;

namespace {

const int kWarmUpCycles = 100;
// Allocator caches and sanitizer quarantines settle slowly; past this the
// resident set counts as grown.
const long kRssSlackKb = 8 * 1024;

// A sanitizer keeps freed memory in quarantine and maps shadow memory, so the
// resident set of an instrumented build says nothing about the library's.
#if defined(__SANITIZE_ADDRESS__) || defined(__SANITIZE_THREAD__)
const bool kRssMeaningful = false;
#elif defined(__has_feature)
#if __has_feature(address_sanitizer) || __has_feature(thread_sanitizer)
const bool kRssMeaningful = false;
#else
const bool kRssMeaningful = true;
#endif
#else
const bool kRssMeaningful = true;
#endif

std::atomic<long> g_lines{0};
std::atomic<long> g_counts{0};  // "onReceivedTestData() value: 42" lines

// The library's log is counted, not printed: a soak logs millions of lines.
void count_line(const struct __android_logger_data*, const char* message) {
    ++g_lines;
    if (std::string(message) == "onReceivedTestData() value: 42") ++g_counts;
}

long rss_kb() {
    std::ifstream status("/proc/self/status");
    std::string key;
    while (status >> key) {
        if (key == "VmRSS:") {
            long kb = 0;
            status >> kb;
            return kb;
        }
        status.ignore(4096, '\n');
    }
    return -1;
}

struct Counts {
    int fds;
    int threads;
    long rss;
};

Counts measure(int threads_hint) {
    return {countOpenFds(), settledThreadCount(threads_hint, 2000), rss_kb()};
}

// Answers every command with a Command Complete; LE Test End's counts 42.
void answer(FakeHal& hal, const SentPacket& p) {
    if (p.type != 1) return;
    std::vector<uint8_t> e = {0x0E, 0x04, 0x01, p.bytes[0], p.bytes[1], 0x00};
    if (p.bytes[0] == 0x1F && p.bytes[1] == 0x20) e = {0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 42, 0};
    hal.deliverEvent(e);
}

// One session: DUT entry (5 commands), LE receiver test and its end, closed
// in one of four ways. True when every command was sent and answered.
bool cycle(int n) {
    sp<FakeHal> hal = new FakeHal();
    hal->onSend = answer;
    hal->registerDefault();
    long counts_before = g_counts;
    bool ok = hci_enable_device_under_test_mode() == 0;
    sendBleTestCommand(22440, 1);
    sendBleTestCommand(3000, 0);
    ok = ok && g_counts == counts_before + 1;
    size_t sent = 8;
    switch (n % 4) {
        case 0: hci_disable_device_under_test_mode(); sent = 8; break;
        case 1: destoryNative(nullptr, nullptr); sent = 7; break;
        case 2: destoryNative(nullptr, nullptr); hci_disable_device_under_test_mode(); sent = 7; break;
        case 3: hci_disable_device_under_test_mode(); destoryNative(nullptr, nullptr); sent = 8; break;
    }
    ok = ok && hal->sent().size() == sent && !hal->sentAfterClose() && hal->closeCalls() == 1;
    ok = ok && bt_fd == -1 && client_fd == -1 && btHci == nullptr;
    FakeHal::unregisterDefault();
    return ok;
}

}  // namespace

int main(int argc, char** argv) {
    int cycles = argc > 1 ? atoi(argv[1]) : 10000;
    if (cycles <= kWarmUpCycles) {
        fprintf(stderr, "usage: %s [cycles > %d]\n", argv[0], kWarmUpCycles);
        return 2;
    }
    __android_log_set_logger(count_line);

    int failed = 0;
    for (int i = 0; i < kWarmUpCycles; ++i) failed += !cycle(i);
    Counts start = measure(countThreads());
    auto t0 = std::chrono::steady_clock::now();
    for (int i = kWarmUpCycles; i < cycles; ++i) {
        failed += !cycle(i);
        if ((i + 1) % 1000 == 0) printf("cycle %d, failed %d\n", i + 1, failed);
    }
    double secs = std::chrono::duration<double>(std::chrono::steady_clock::now() - t0).count();
    Counts end = measure(start.threads);

    printf("cycles: %d (%d warm-up), failed: %d, %.1f s after warm-up, %ld log lines\n", cycles,
           kWarmUpCycles, failed, secs, g_lines.load());
    printf("descriptors: start %d end %d\n", start.fds, end.fds);
    printf("threads:     start %d end %d\n", start.threads, end.threads);
    printf("RSS (kB):    start %ld end %ld%s\n", start.rss, end.rss,
           kRssMeaningful ? "" : " (sanitizer build: not checked)");
    bool grew = end.fds > start.fds || end.threads > start.threads ||
                (kRssMeaningful && end.rss > start.rss + kRssSlackKb);
    if (failed != 0 || grew) {
        printf("soak FAILED\n");
        return 1;
    }
    printf("soak passed\n");
    return 0;
}
