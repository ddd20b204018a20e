// Sample pool and helpers shared by the benchmarks. Recording takes a lock:
// it happens outside the timed region of every benchmark.
#include "bench/bench_util.h"

#include <dirent.h>
#include <errno.h>
#include <stdlib.h>
#include <sys/syscall.h>
#include <unistd.h>

#include <algorithm>
#include <cmath>
#include <fstream>
#include <iterator>
#include <map>
#include <mutex>
#include <sstream>

#include <android/log.h>

namespace {

std::mutex& poolLock() {
    static auto* lock = new std::mutex;
    return *lock;
}

std::map<std::string, std::vector<double>>& pool() {
    static auto* series = new std::map<std::string, std::vector<double>>;
    return *series;
}

}  // namespace

void recordSample(const std::string& series, double value) {
    std::lock_guard<std::mutex> guard(poolLock());
    pool()[series].push_back(value);
}

std::vector<double> samplesOf(const std::string& series) {
    std::lock_guard<std::mutex> guard(poolLock());
    auto it = pool().find(series);
    return it == pool().end() ? std::vector<double>() : it->second;
}

double quantile(std::vector<double> values, double p) {
    if (values.empty()) return 0;
    size_t rank = static_cast<size_t>(std::ceil(p * values.size()));
    size_t index = rank == 0 ? 0 : std::min(rank - 1, values.size() - 1);
    std::nth_element(values.begin(), values.begin() + index, values.end());
    return values[index];
}

void setLibraryLog(bool on) {
    static const int normal = __android_log_get_minimum_priority();
    __android_log_set_minimum_priority(on ? normal : ANDROID_LOG_SILENT);
}

std::string withLog(const std::string& series, bool on) {
    return on ? series : series + " (log raised)";
}

bool writeAll(int fd, const uint8_t* bytes, size_t len) {
    size_t done = 0;
    while (done < len) {
        ssize_t n = write(fd, bytes + done, len - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

bool readExactly(int fd, uint8_t* buf, size_t len) {
    size_t done = 0;
    while (done < len) {
        ssize_t n = read(fd, buf + done, len - done);
        if (n <= 0) return false;
        done += static_cast<size_t>(n);
    }
    return true;
}

std::vector<int> threadIds() {
    std::vector<int> ids;
    DIR* dir = opendir("/proc/self/task");
    if (dir == nullptr) return ids;
    while (struct dirent* e = readdir(dir)) {
        if (e->d_name[0] != '.') ids.push_back(atoi(e->d_name));
    }
    closedir(dir);
    std::sort(ids.begin(), ids.end());
    return ids;
}

int newThread(const std::vector<int>& before, const std::vector<int>& after) {
    std::vector<int> added;
    std::set_difference(after.begin(), after.end(), before.begin(), before.end(),
                        std::back_inserter(added));
    return added.size() == 1 ? added[0] : -1;
}

int currentThreadId() { return static_cast<int>(syscall(SYS_gettid)); }

ThreadCounters readThreadCounters(int tid) {
    ThreadCounters c;
    std::string dir = "/proc/self/task/" + std::to_string(tid);
    std::ifstream status(dir + "/status");
    for (std::string line; std::getline(status, line);) {
        std::istringstream fields(line);
        std::string key;
        fields >> key;
        if (key == "voluntary_ctxt_switches:") fields >> c.voluntary;
        if (key == "nonvoluntary_ctxt_switches:") fields >> c.involuntary;
    }
    std::ifstream schedstat(dir + "/schedstat");
    schedstat >> c.cpu_ns;
    return c;
}
