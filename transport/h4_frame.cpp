// H4 framing: header lengths and packet lengths by type, and the one write
// loop every writer of H4 bytes uses. Pure but for the write; any thread.
#include "transport/h4_frame.h"

#include <errno.h>
#include <poll.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

size_t h4_header_len(uint8_t type) {
    switch (type) {
        case H4_TYPE_COMMAND: return 3;  // opcode (2), parameter total length (1)
        case H4_TYPE_ACL: return 4;      // handle and flags (2), data total length (2)
        case H4_TYPE_SCO: return 3;      // handle and flags (2), data total length (1)
        case H4_TYPE_EVENT: return 2;    // event code (1), parameter total length (1)
        case H4_TYPE_ISO: return 4;      // handle and flags (2), 14-bit data total length (2)
        default: return 0;
    }
}

size_t h4_payload_len(uint8_t type, const uint8_t* header) {
    switch (type) {
        case H4_TYPE_COMMAND:
        case H4_TYPE_SCO: return header[2];
        case H4_TYPE_ACL: return header[2] | (header[3] << 8);
        case H4_TYPE_EVENT: return header[1];
        // The two bits above the length are reserved (Vol 4, Part E, 5.4.5).
        case H4_TYPE_ISO: return header[2] | ((header[3] & 0x3F) << 8);
        default: return 0;
    }
}

size_t h4_packet_len(const uint8_t* bytes, size_t avail) {
    if (avail < 1) return 0;
    size_t header = h4_header_len(bytes[0]);
    if (header == 0 || avail < 1 + header) return 0;
    return 1 + header + h4_payload_len(bytes[0], bytes + 1);
}

bool h4_packet_agrees(uint8_t type, const uint8_t* packet, size_t len) {
    size_t header = h4_header_len(type);
    return header != 0 && len >= header && len == header + h4_payload_len(type, packet);
}

const char* h4_type_name(uint8_t type) {
    switch (type) {
        case H4_TYPE_COMMAND: return "command";
        case H4_TYPE_ACL: return "ACL data";
        case H4_TYPE_SCO: return "SCO data";
        case H4_TYPE_EVENT: return "event";
        case H4_TYPE_ISO: return "ISO data";
        default: return "unknown";
    }
}

static long now_ms() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec * 1000L + ts.tv_nsec / 1000000L;
}

// One write, without SIGPIPE on a socket; other descriptors take write().
static ssize_t write_once(int fd, const uint8_t* buf, size_t len) {
    ssize_t n = send(fd, buf, len, MSG_NOSIGNAL);
    if (n < 0 && errno == ENOTSOCK) n = write(fd, buf, len);
    return n;
}

// Waits until fd takes bytes again or the deadline passes (ETIMEDOUT).
static bool wait_writable(int fd, long deadline) {
    for (;;) {
        long left = deadline - now_ms();
        if (left <= 0) return errno = ETIMEDOUT, false;
        struct pollfd pfd = {fd, POLLOUT, 0};
        int rc = poll(&pfd, 1, static_cast<int>(left));
        if (rc == -1 && errno == EINTR) continue;
        if (rc == -1) return false;
        if (rc == 1) return true;
    }
}

bool h4_write_all(int fd, const uint8_t* buf, size_t len, int timeout_ms, size_t* done) {
    long deadline = timeout_ms >= 0 ? now_ms() + timeout_ms : 0;
    *done = 0;
    while (*done < len) {
        ssize_t n = write_once(fd, buf + *done, len - *done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0 && (errno == EAGAIN || errno == EWOULDBLOCK) && timeout_ms >= 0) {
            if (!wait_writable(fd, deadline)) return false;
            continue;
        }
        if (n <= 0) {
            if (n == 0) errno = 0;
            return false;
        }
        *done += static_cast<size_t>(n);
        // A descriptor that keeps taking bytes gets the whole bound again.
        if (timeout_ms >= 0) deadline = now_ms() + timeout_ms;
    }
    return true;
}
