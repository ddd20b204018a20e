// Records every line the library logs, with its priority, through liblog's
// logger hook, so tests can assert on log lines.
#pragma once

#include <android/log.h>

#include <string>
#include <vector>

struct LogLine {
    int priority;
    std::string text;
};

class LogCapture {
  public:
    LogCapture();  // installs the hook (once per process) and forgets earlier lines

    std::vector<LogLine> lines() const;
    void clear();
    // Lines whose text equals `text` exactly, at `priority`.
    int count(int priority, const std::string& text) const;
    bool contains(int priority, const std::string& text) const { return count(priority, text) > 0; }
    // Any line containing `fragment`, at any priority.
    bool containsFragment(const std::string& fragment) const;
    // Waits up to timeout_ms for a line equal to `text` at `priority`.
    bool waitFor(int priority, const std::string& text, int timeout_ms = 5000) const;
};
