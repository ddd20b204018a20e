// What the benchmarks share: timings pooled over a run's repetitions, the
// library's log switch, exact writes and one thread's counters. Any benchmark
// thread may record; the summary reads after the run.
#pragma once

#include <chrono>
#include <cstdint>
#include <string>
#include <vector>

using BenchClock = std::chrono::steady_clock;

// Repetitions of every comparison; the script interleaves them at random so
// that a library figure and its baseline meet the same load.
const int kRepetitions = 12;

inline double microsSince(BenchClock::time_point start) {
    return std::chrono::duration<double, std::micro>(BenchClock::now() - start).count();
}

// Adds one value (microseconds, or a rate) to the named series.
void recordSample(const std::string& series, double value);
std::vector<double> samplesOf(const std::string& series);
// The p-quantile (0..1) of the values, nearest rank; 0 for none.
double quantile(std::vector<double> values, double p);

// Log lines of the library at their normal priorities (true), or none at all
// through the log's minimum priority (false).
void setLibraryLog(bool on);
// Series name of a library measurement with the log on or raised.
std::string withLog(const std::string& series, bool on);

// Writes all len bytes; false on failure.
bool writeAll(int fd, const uint8_t* bytes, size_t len);
// Reads exactly len bytes with plain blocking reads; false on failure or end of stream.
bool readExactly(int fd, uint8_t* buf, size_t len);

// Threads of this process, sorted; and the one thread in `after` that is not
// in `before` (-1 unless exactly one).
std::vector<int> threadIds();
int newThread(const std::vector<int>& before, const std::vector<int>& after);
int currentThreadId();

struct ThreadCounters {
    long voluntary = -1;    // switches away to wait: one per wake-up
    long involuntary = -1;  // preemptions
    double cpu_ns = -1;     // time on a CPU
};
ThreadCounters readThreadCounters(int tid);
