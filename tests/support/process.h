// Process-level observations for tests: open descriptors, threads, and
// bounded waits on descriptors and conditions.
#pragma once

#include <cstdint>
#include <functional>
#include <vector>

int countOpenFds();
int countThreads();
// countThreads() once it is no more than `expected`, or when timeout_ms has
// passed: a joined thread can stay listed for a moment after pthread_join
// returns, long enough to be seen under qemu-user. For the same reason a
// baseline may include a thread about to vanish, so leak checks compare with
// EXPECT_LE rather than for equality.
int settledThreadCount(int expected, int timeout_ms = 5000);
// Reads exactly n bytes, waiting at most timeout_ms overall; returns what arrived.
std::vector<uint8_t> readBytes(int fd, size_t n, int timeout_ms = 5000);
// True when nothing is readable on fd within timeout_ms.
bool staysQuiet(int fd, int timeout_ms);
void writeAll(int fd, const std::vector<uint8_t>& bytes);
bool waitUntil(const std::function<bool()>& condition, int timeout_ms = 5000);
