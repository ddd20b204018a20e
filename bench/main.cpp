// Runs the benchmarks, then prints each figure and its ratio to the baseline
// measured in the same run, against the goals. Single-threaded after the run.
#include <cstdio>
#include <string>

#include <benchmark/benchmark.h>

#include "bench/bench_util.h"

namespace {

const int kAclSizes[] = {27, 251, 1021};

double median(const std::string& series) { return quantile(samplesOf(series), 0.5); }

void printLatency(const char* label, const std::string& series, double baseline) {
    auto values = samplesOf(series);
    if (values.empty()) return;
    double mid = quantile(values, 0.5);
    printf("  %-38s %9.1f %9.1f %8zu", label, mid, quantile(values, 0.99), values.size());
    if (baseline > 0) printf("   %5.2fx", mid / baseline);
    printf("\n");
}

void printExchange() {
    printf("\nExchange latency, us per command and reply   median       p99  samples   vs bridge\n");
    double bridge = median("exchange: minimal bridge");
    printLatency("minimal bridge", "exchange: minimal bridge", 0);
    printLatency("library", withLog("exchange: library", true), bridge);
    printLatency("library, log raised", withLog("exchange: library", false), bridge);
    printf("  where the difference goes, log aside (the library's calls made by bare code):\n");
    printLatency("bridge + engine's calls", "exchange: bridge with the calls of the engine", bridge);
    printLatency("bridge + pump's calls", "exchange: bridge with the calls of the pump", bridge);
    printLatency("bridge + both", "exchange: bridge with the calls of the engine and pump", bridge);
    printLatency("bridge + both, engine waiting once",
                 "exchange: bridge with the calls of the engine waiting once and pump", bridge);
    printf("  goal: library median <= 1.30x the bridge\n");
}

void printRate(const char* label, const std::string& series, int data, double baseline) {
    auto values = samplesOf(series);
    if (values.empty()) return;
    double pps = quantile(values, 0.5);
    double cpu = median(series + " [receiver CPU us/packet]");
    printf("  %-30s %10.0f %9.1f %8.2f", label, pps, pps * (data + 5) / 1e6, cpu);
    if (baseline > 0) printf("   %5.2fx", pps / baseline);
    printf("\n");
}

void printThroughput() {
    printf("\nThroughput, median of repetitions     packets/s  MB/s (H4)  rx us/pkt  vs raw\n");
    for (int data : kAclSizes) {
        std::string size = "throughput " + std::to_string(data) + " B: ";
        double raw = median(size + "raw socket pair");
        std::string label = "ACL " + std::to_string(data) + " B ";
        printRate((label + "raw socket pair").c_str(), size + "raw socket pair", data, 0);
        printRate((label + "pump").c_str(), withLog(size + "pump", true), data, raw);
        printRate((label + "pump, log raised").c_str(), withLog(size + "pump", false), data, raw);
        printRate((label + "bare pump's calls").c_str(), size + "raw socket pair, pump's calls", data, raw);
    }
    printf("  rx us/pkt: CPU time of the receiving thread (pump, or the raw pair's reader) per packet\n");
    printf("  bare pump's calls: the raw pair read with the pump's calls per packet, no library code\n");
    printf("  goal: pump >= 0.80x the raw socket pair at 1021 B\n");
}

void printSession() {
    printf("\nSession, us                                    median       p99  samples\n");
    printLatency("open + close", withLog("session: open + close", true), 0);
    printLatency("open + close, log raised", withLog("session: open + close", false), 0);
    const std::string end = "session: tool end closed to pump joined";
    printLatency("tool end closed -> pump joined", withLog(end, true), 0);
    printLatency("... log raised", withLog(end, false), 0);
    const std::string own = "session: tool end closed to pump ended by itself";
    printLatency("tool end closed -> pump ended alone", withLog(own, true), 0);
    printLatency("... log raised", withLog(own, false), 0);
    printf("  goal: open + close median < 200 us\n");
}

void printIdle() {
    auto wakeups = samplesOf("idle: pump wake-ups per second");
    if (wakeups.empty()) return;
    printf("\nIdle session over %.1f s\n", quantile(samplesOf("idle: run length (s)"), 0.5));
    printf("  pump wake-ups per second       %6.2f   (goal <= 2)\n", wakeups[0]);
    printf("  pump preemptions               %6.0f\n",
           quantile(samplesOf("idle: pump preemptions over the run"), 0.5));
    printf("  pump CPU time                  %6.0f us\n",
           quantile(samplesOf("idle: pump CPU time over the run (us)"), 0.5));
}

void printVerdict(const char* goal, double figure, double limit, bool at_most) {
    if (figure <= 0) return;
    bool met = at_most ? figure <= limit : figure >= limit;
    printf("  %-52s %8.2f  %s\n", goal, figure, met ? "met" : "MISSED");
}

void printLog() {
    printf("\nOne log line of the library (\"[%%x]\", info), us    median\n");
    printf("  %-44s %8.2f\n", "written (liblog to stderr)", median(withLog("log: one line", true)));
    printf("  %-44s %8.2f\n", "skipped (minimum priority raised)", median(withLog("log: one line", false)));
}

void printGoals() {
    printf("\nGoals\n");
    double bridge = median("exchange: minimal bridge");
    double raw = median("throughput 1021 B: raw socket pair");
    if (bridge > 0) {
        printVerdict("exchange median / bridge <= 1.30", median(withLog("exchange: library", true)) / bridge,
                     1.30, true);
        printVerdict("  same, log raised", median(withLog("exchange: library", false)) / bridge, 1.30, true);
    }
    if (raw > 0) {
        printVerdict("pump / raw socket pair at 1021 B >= 0.80",
                     median(withLog("throughput 1021 B: pump", true)) / raw, 0.80, false);
        printVerdict("  same, log raised", median(withLog("throughput 1021 B: pump", false)) / raw, 0.80,
                     false);
    }
    printVerdict("session open + close median < 200 us",
                 median(withLog("session: open + close", true)), 200, true);
    printVerdict("idle pump wake-ups per second <= 2", median("idle: pump wake-ups per second"), 2, true);
}

}  // namespace

int main(int argc, char** argv) {
    benchmark::Initialize(&argc, argv);
    if (benchmark::ReportUnrecognizedArguments(argc, argv)) return 1;
    benchmark::RunSpecifiedBenchmarks();
    printf("\n=== summary: figures of this run, ratios within it ===\n");
    printExchange();
    printThroughput();
    printSession();
    printIdle();
    printLog();
    printGoals();
    benchmark::Shutdown();
    return 0;
}
