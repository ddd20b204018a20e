#include "tests/support/log_capture.h"

#include <chrono>
#include <condition_variable>
#include <cstdio>
#include <cstdlib>
#include <mutex>

namespace {

// Leaked on purpose: log lines may come from threads still running at exit,
// and captures may be made before this file's globals would be.
struct Store {
    std::mutex lock;
    std::condition_variable changed;
    std::vector<LogLine> lines;
};
Store& the() {
    static Store* store = new Store;
    return *store;
}

void record(const struct __android_logger_data* data, const char* message) {
    static const bool echo = getenv("HALVENOR_TEST_LOG") != nullptr;
    if (echo) fprintf(stderr, "[%d] %s\n", data->priority, message);
    std::lock_guard<std::mutex> guard(the().lock);
    the().lines.push_back({data->priority, message});
    the().changed.notify_all();
}

}  // namespace

LogCapture::LogCapture() {
    static const bool installed = (__android_log_set_logger(record), true);
    (void)installed;
    clear();
}

std::vector<LogLine> LogCapture::lines() const {
    std::lock_guard<std::mutex> guard(the().lock);
    return the().lines;
}

void LogCapture::clear() {
    std::lock_guard<std::mutex> guard(the().lock);
    the().lines.clear();
}

int LogCapture::count(int priority, const std::string& text) const {
    int n = 0;
    for (const auto& line : lines()) n += line.priority == priority && line.text == text;
    return n;
}

bool LogCapture::containsFragment(const std::string& fragment) const {
    for (const auto& line : lines()) {
        if (line.text.find(fragment) != std::string::npos) return true;
    }
    return false;
}

bool LogCapture::waitFor(int priority, const std::string& text, int timeout_ms) const {
    std::unique_lock<std::mutex> guard(the().lock);
    return the().changed.wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] {
        for (const auto& line : the().lines) {
            if (line.priority == priority && line.text == text) return true;
        }
        return false;
    });
}
