// Process-level observations for tests: open descriptors, threads, and
// bounded waits on descriptors and conditions.
#pragma once

#include <cstdint>
#include <functional>
#include <vector>

int countOpenFds();
int countThreads();
std::vector<int> threadIds();
// Reads exactly n bytes, waiting at most timeout_ms overall; returns what arrived.
std::vector<uint8_t> readBytes(int fd, size_t n, int timeout_ms = 5000);
// True when nothing is readable on fd within timeout_ms.
bool staysQuiet(int fd, int timeout_ms);
void writeAll(int fd, const std::vector<uint8_t>& bytes);
bool waitUntil(const std::function<bool()>& condition, int timeout_ms = 5000);
