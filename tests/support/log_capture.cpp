#include "tests/support/log_capture.h"

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
std::vector<LogLine>& store() {
    static auto* lines = new std::vector<LogLine>;
    return *lines;
}

void record(const struct __android_logger_data* data, const char* message) {
    static const bool echo = getenv("HALVENOR_TEST_LOG") != nullptr;
    if (echo) fprintf(stderr, "[%d] %s\n", data->priority, message);
    std::lock_guard<std::mutex> guard(lock());
    store().push_back({data->priority, message});
    changed().notify_all();
}

}  // namespace

LogCapture::LogCapture() {
    static const bool installed = [] {
        __android_log_set_logger(record);
        return true;
    }();
    (void)installed;
    clear();
}

std::vector<LogLine> LogCapture::lines() const {
    std::lock_guard<std::mutex> guard(lock());
    return store();
}

void LogCapture::clear() {
    std::lock_guard<std::mutex> guard(lock());
    store().clear();
}

int LogCapture::count(int priority, const std::string& text) const {
    std::lock_guard<std::mutex> guard(lock());
    int n = 0;
    for (const auto& line : store()) n += line.priority == priority && line.text == text;
    return n;
}

bool LogCapture::containsFragment(const std::string& fragment) const {
    std::lock_guard<std::mutex> guard(lock());
    for (const auto& line : store()) {
        if (line.text.find(fragment) != std::string::npos) return true;
    }
    return false;
}

bool LogCapture::waitFor(int priority, const std::string& text, int timeout_ms) const {
    std::unique_lock<std::mutex> guard(lock());
    return changed().wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] {
        for (const auto& line : store()) {
            if (line.priority == priority && line.text == text) return true;
        }
        return false;
    });
}

int LogCapture::indexOf(int priority, const std::string& text, int from) const {
    std::lock_guard<std::mutex> guard(lock());
    for (size_t i = from; i < store().size(); ++i) {
        if (store()[i].priority == priority && store()[i].text == text) return static_cast<int>(i);
    }
    return -1;
}
