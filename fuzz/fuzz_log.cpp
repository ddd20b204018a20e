// Log hook for the fuzz targets; lines arrive on any thread (pump, HAL).
#include "fuzz/fuzz_log.h"

#include <android/log.h>

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <mutex>

namespace {

std::mutex& lock() {
    static auto* m = new std::mutex;
    return *m;
}
std::condition_variable& changed() {
    static auto* cv = new std::condition_variable;
    return *cv;
}
std::vector<std::string>& store() {
    static auto* lines = new std::vector<std::string>;
    return *lines;
}

void record(const struct __android_logger_data*, const char* message) {
    static const bool echo = getenv("HALVENOR_FUZZ_LOG") != nullptr;
    if (echo) fprintf(stderr, "%s\n", message);
    std::lock_guard<std::mutex> guard(lock());
    store().push_back(message);
    changed().notify_all();
}

}  // namespace

void fuzz_log_reset() {
    static const bool installed = [] {
        __android_log_set_logger(record);
        return true;
    }();
    (void)installed;
    std::lock_guard<std::mutex> guard(lock());
    store().clear();
}

bool fuzz_log_seen(const std::string& text) {
    std::lock_guard<std::mutex> guard(lock());
    for (const auto& line : store()) {
        if (line == text) return true;
    }
    return false;
}

bool fuzz_log_wait(const std::string& text, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock());
    return changed().wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] {
        for (const auto& line : store()) {
            if (line == text) return true;
        }
        return false;
    });
}

std::vector<std::string> fuzz_log_lines() {
    std::lock_guard<std::mutex> guard(lock());
    return store();
}
