// Log hook for the fuzz targets: keeps the library's many log lines off
// stderr and lets a harness wait for, or look up, the lines it checks.
#pragma once

#include <string>
#include <vector>

// Installs the hook (once) and forgets earlier lines.
void fuzz_log_reset();
// True when a line equal to `text` has been logged since the last reset.
bool fuzz_log_seen(const std::string& text);
// Waits up to timeout_ms for a line equal to `text`.
bool fuzz_log_wait(const std::string& text, int timeout_ms);
// Every line logged since the last reset.
std::vector<std::string> fuzz_log_lines();
