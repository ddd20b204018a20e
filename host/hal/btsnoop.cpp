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
#include <unistd.h>

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

std::shared_ptr<Btsnoop> Btsnoop::open(const std::string& path) {
    int fd = openFile(path);
    if (fd == -1) return nullptr;
    return std::shared_ptr<Btsnoop>(new Btsnoop({fd}));
}

std::shared_ptr<Btsnoop> Btsnoop::fromEnvironment() {
    std::vector<int> fds;
    for (const char* name : {"HALVENOR_BTSNOOP", "HALVENOR_CONSOLE_CAPTURE"}) {
        const char* path = getenv(name);
        if (path == nullptr || path[0] == '\0') continue;
        int fd = openFile(path);
        if (fd != -1) fds.push_back(fd);
    }
    if (fds.empty()) return nullptr;
    return std::shared_ptr<Btsnoop>(new Btsnoop(std::move(fds)));
}

Btsnoop::~Btsnoop() {
    for (int fd : fds_) close(fd);
}

void Btsnoop::record(uint8_t type, const uint8_t* packet, size_t len, bool received) {
    struct timeval tv;
    gettimeofday(&tv, nullptr);
    uint64_t micros = static_cast<uint64_t>(tv.tv_sec) * 1000000ULL + tv.tv_usec + kBtsnoopEpochDelta;
    // Flags: bit 0 direction (1 = received by the host), bit 1 command or event.
    uint32_t flags = (received ? 1u : 0u) | (type == H4_TYPE_COMMAND || type == H4_TYPE_EVENT ? 2u : 0u);
    uint32_t length = static_cast<uint32_t>(len + 1);

    std::vector<uint8_t> rec;
    rec.reserve(24 + length);
    put32(rec, length);  // original length
    put32(rec, length);  // included length
    put32(rec, flags);
    put32(rec, 0);  // cumulative drops
    put64(rec, micros);
    rec.push_back(type);
    rec.insert(rec.end(), packet, packet + len);

    std::lock_guard<std::mutex> guard(lock_);
    for (int fd : fds_) {
        if (!write_all(fd, rec)) HLOGE("btsnoop: write failed: %s", strerror(errno));
    }
}
