// When the console runs the library, its launcher names a log file in
// HALVENOR_LOG_FILE: every log line of the process goes there, where the
// console reads why a step failed, and to stderr only with HALVENOR_VERBOSE=1,
// so quiet output needs no filter outside the process. Any thread.
#include <android/log.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <unistd.h>

#include <string>

namespace {

int log_fd = -1;
bool echo_to_stderr = false;

char priority_letter(int priority) {
    static const char kLetters[] = "??VDIWEF";
    return priority >= 0 && priority < 8 ? kLetters[priority] : '?';
}

// One line per message, "E tag: text", line feeds inside a message written as
// \n, and one write each: O_APPEND keeps lines of several threads whole.
void console_logger(const struct __android_logger_data* data, const char* message) {
    std::string line(1, priority_letter(data->priority));
    line += ' ';
    line += data->tag != nullptr ? data->tag : "";
    line += ": ";
    for (const char* c = message; *c != '\0'; ++c) line += *c == '\n' ? "\\n" : std::string(1, *c);
    line += '\n';
    ssize_t written = write(log_fd, line.data(), line.size());
    (void)written;  // a log line has nowhere else to report its own failure
    if (echo_to_stderr) __android_log_stderr_logger(data, message);
}

__attribute__((constructor)) void install_console_logger() {
    const char* path = getenv("HALVENOR_LOG_FILE");
    if (path == nullptr || path[0] == '\0') return;
    log_fd = open(path, O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0600);
    if (log_fd == -1) return;  // liblog's own logger stays
    const char* verbose = getenv("HALVENOR_VERBOSE");
    echo_to_stderr = verbose != nullptr && strcmp(verbose, "1") == 0;
    __android_log_set_logger(console_logger);
}

}  // namespace
