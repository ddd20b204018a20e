// btsnoop writer: each record goes out in one write to a file opened with
// O_APPEND, so captures of several backends, even of several processes, can
// share a file. Any thread.
#include "host/hal/btsnoop.h"

#include <errno.h>
#include <fcntl.h>
#include <stdlib.h>
#include <string.h>
#include <sys/file.h>
#include <sys/stat.h>
#include <sys/time.h>
#include <time.h>
#include <unistd.h>

#include <atomic>
#include <vector>

#include "host/hal/h4_stream.h"
#include "host/hal/host_log.h"
#include "transport/h4_frame.h"

// Microseconds from 0 AD (the btsnoop epoch) to the Unix epoch.
static const uint64_t kBtsnoopEpochDelta = 0x00DCDDB30F2F8000ULL;
static const uint32_t kDatalinkH4 = 1002;

static void put32(std::vector<uint8_t>& out, uint32_t v) {
    for (int shift = 24; shift >= 0; shift -= 8) out.push_back(static_cast<uint8_t>(v >> shift));
}

static void put64(std::vector<uint8_t>& out, uint64_t v) {
    put32(out, static_cast<uint32_t>(v >> 32));
    put32(out, static_cast<uint32_t>(v));
}

static bool write_all(int fd, const std::vector<uint8_t>& bytes) {
    size_t done = 0;
    return h4_write_all(fd, bytes.data(), bytes.size(), -1, &done);
}

// The 16-byte file header goes in only while the file is empty; the lock
// keeps two openers from both writing it.
static bool write_header_if_new(int fd) {
    flock(fd, LOCK_EX);
    struct stat st;
    bool ok = fstat(fd, &st) == 0;
    if (ok && st.st_size == 0) {
        std::vector<uint8_t> header = {'b', 't', 's', 'n', 'o', 'o', 'p', 0};
        put32(header, 1);  // version
        put32(header, kDatalinkH4);
        ok = write_all(fd, header);
    }
    flock(fd, LOCK_UN);
    return ok;
}

// A descriptor ready to append records to, or -1 (logged).
int Btsnoop::openFile(const std::string& path) {
    int fd = ::open(path.c_str(), O_WRONLY | O_CREAT | O_APPEND | O_CLOEXEC, 0644);
    if (fd == -1) {
        HLOGE("btsnoop: cannot open %s: %s", path.c_str(), strerror(errno));
        return -1;
    }
    if (!write_header_if_new(fd)) {
        HLOGE("btsnoop: cannot write the header of %s: %s", path.c_str(), strerror(errno));
        close(fd);
        return -1;
    }
    return fd;
}

std::shared_ptr<Btsnoop> Btsnoop::open(const std::string& path, bool steady) {
    int fd = openFile(path);
    if (fd == -1) return nullptr;
    return std::shared_ptr<Btsnoop>(new Btsnoop({{fd, steady}}));
}

std::shared_ptr<Btsnoop> Btsnoop::fromEnvironment() {
    std::vector<File> files;
    for (const char* name : {"HALVENOR_BTSNOOP", "HALVENOR_CONSOLE_CAPTURE"}) {
        const char* path = getenv(name);
        if (path == nullptr || path[0] == '\0') continue;
        int fd = openFile(path);
        if (fd != -1) files.push_back({fd, strcmp(name, "HALVENOR_CONSOLE_CAPTURE") == 0});
    }
    if (files.empty()) return nullptr;
    return std::shared_ptr<Btsnoop>(new Btsnoop(std::move(files)));
}

Btsnoop::~Btsnoop() {
    for (const File& f : files_) close(f.fd);
}

static int64_t system_wall_clock() {
    struct timeval tv;
    gettimeofday(&tv, nullptr);
    return static_cast<int64_t>(tv.tv_sec) * 1000000 + tv.tv_usec;
}

static int64_t monotonic_us() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return static_cast<int64_t>(ts.tv_sec) * 1000000 + ts.tv_nsec / 1000;
}

static std::atomic<Btsnoop::WallClock> wall_clock{system_wall_clock};

void Btsnoop::useWallClock(WallClock clock) { wall_clock = clock != nullptr ? clock : system_wall_clock; }

// The steady stamps of the whole process count from one reading of both clocks.
static int64_t steady_now_us() {
    static const int64_t wall_at_start = wall_clock.load()();
    static const int64_t monotonic_at_start = monotonic_us();
    return wall_at_start + (monotonic_us() - monotonic_at_start);
}

static std::vector<uint8_t> snoop_record(uint8_t type, const uint8_t* packet, size_t len, bool received,
                                         int64_t micros) {
    // Flags: bit 0 direction (1 = received by the host), bit 1 command or event.
    uint32_t flags = (received ? 1u : 0u) | (type == H4_TYPE_COMMAND || type == H4_TYPE_EVENT ? 2u : 0u);
    uint32_t length = static_cast<uint32_t>(len + 1);
    std::vector<uint8_t> rec;
    rec.reserve(24 + length);
    put32(rec, length);  // original length
    put32(rec, length);  // included length
    put32(rec, flags);
    put32(rec, 0);  // cumulative drops
    put64(rec, static_cast<uint64_t>(micros) + kBtsnoopEpochDelta);
    rec.push_back(type);
    rec.insert(rec.end(), packet, packet + len);
    return rec;
}

void Btsnoop::record(uint8_t type, const uint8_t* packet, size_t len, bool received) {
    int64_t wall = wall_clock.load()();
    int64_t steady = steady_now_us();
    std::lock_guard<std::mutex> guard(lock_);
    for (const File& f : files_) {
        std::vector<uint8_t> rec = snoop_record(type, packet, len, received, f.steady ? steady : wall);
        if (!write_all(f.fd, rec)) HLOGE("btsnoop: write failed: %s", strerror(errno));
    }
}
