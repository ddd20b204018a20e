#include "tests/support/process.h"

#include <dirent.h>
#include <poll.h>
#include <stdlib.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>

static std::vector<int> listDir(const char* path) {
    std::vector<int> entries;
    DIR* dir = opendir(path);
    if (dir == nullptr) return entries;
    while (struct dirent* e = readdir(dir)) {
        if (e->d_name[0] != '.') entries.push_back(atoi(e->d_name));
    }
    closedir(dir);
    return entries;
}

int countOpenFds() { return static_cast<int>(listDir("/proc/self/fd").size()) - 1; }  // less opendir's own
int countThreads() {
    // Sanitizer runtimes start a helper thread at the first thread creation;
    // let that happen before anything is counted.
    static const bool warmed = [] {
        pid_t tid = 0;
        std::thread([&tid] { tid = gettid(); }).join();
        // A joined thread can stay listed for a moment (long enough to be
        // seen under qemu-user): count only once it has gone.
        std::string task = "/proc/self/task/" + std::to_string(tid);
        waitUntil([&task] { return access(task.c_str(), F_OK) != 0; });
        return true;
    }();
    (void)warmed;
    return static_cast<int>(listDir("/proc/self/task").size());
}
int settledThreadCount(int expected, int timeout_ms) {
    waitUntil([expected] { return countThreads() <= expected; }, timeout_ms);
    return countThreads();
}

std::vector<uint8_t> readBytes(int fd, size_t n, int timeout_ms) {
    std::vector<uint8_t> out;
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    while (out.size() < n) {
        auto left = std::chrono::duration_cast<std::chrono::milliseconds>(
                deadline - std::chrono::steady_clock::now()).count();
        if (left <= 0) break;
        struct pollfd pfd = {fd, POLLIN, 0};
        if (poll(&pfd, 1, static_cast<int>(left)) <= 0) continue;
        uint8_t buf[4096];
        size_t want = n - out.size() < sizeof(buf) ? n - out.size() : sizeof(buf);
        ssize_t got = read(fd, buf, want);
        if (got <= 0) break;
        out.insert(out.end(), buf, buf + got);
    }
    return out;
}

bool staysQuiet(int fd, int timeout_ms) {
    struct pollfd pfd = {fd, POLLIN, 0};
    return poll(&pfd, 1, timeout_ms) == 0;
}

void writeAll(int fd, const std::vector<uint8_t>& bytes) {
    size_t done = 0;
    while (done < bytes.size()) {
        ssize_t n = write(fd, bytes.data() + done, bytes.size() - done);
        if (n <= 0) return;
        done += n;
    }
}

bool waitUntil(const std::function<bool()>& condition, int timeout_ms) {
    auto deadline = std::chrono::steady_clock::now() + std::chrono::milliseconds(timeout_ms);
    while (!condition()) {
        if (std::chrono::steady_clock::now() > deadline) return false;
        std::this_thread::yield();
        std::this_thread::sleep_for(std::chrono::milliseconds(1));
    }
    return true;
}
