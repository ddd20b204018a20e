// Tool-data pump: the library's only thread. Reads whole H4 packets from the
// bridge end and hands each, without its type byte, to the HAL.
#include "transport/pump.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include <vector>

#include "transport/h4.h"
#include "transport/log.h"
#include "transport/session.h"

struct timeval timeout;

enum WaitResult { WAIT_READABLE, WAIT_TIMED_OUT, WAIT_FAILED };

// poll rather than select: descriptors of 1024 and above work, and the
// time-out is taken afresh from `timeout` for every wait, never lowered.
static WaitResult wait_for_tool_data(int fd) {
    int ms = static_cast<int>(timeout.tv_sec * 1000 + timeout.tv_usec / 1000);
    struct pollfd pfd = {fd, POLLIN, 0};
    int rc;
    while ((rc = poll(&pfd, 1, ms)) == -1 && errno == EINTR) {
    }
    if (rc == 0) return WAIT_TIMED_OUT;
    if (rc > 0 && (pfd.revents & POLLNVAL)) errno = EBADF;
    if (rc < 0 || (pfd.revents & POLLNVAL)) {
        LOGE("select failed, Error: %s (%d)\n", strerror(errno), errno);
        return WAIT_FAILED;
    }
    return WAIT_READABLE;
}

// Room for the largest packet (type byte, ACL preamble, 65535 data bytes) and
// for many small ones at a time.
static const size_t kBatchBytes = 65536 + 16;

// Copies what is waiting on the stream into batch without taking it, so that
// nothing is consumed before it is known to be a whole, valid packet. Bytes
// copied, or 0 or -1 as recv() gives them; errno is kept for the messages of
// the wait and safe_read that then take over.
static ssize_t peek_waiting(int fd, std::vector<uint8_t>& batch) {
    int saved_errno = errno;
    ssize_t n;
    while ((n = recv(fd, batch.data(), batch.size(), MSG_PEEK | MSG_DONTWAIT)) == -1 &&
           errno == EINTR) {
    }
    if (n <= 0) errno = saved_errno;
    return n;
}

// The types the pump reads: commands, ACL, SCO and events, and ISO data where
// the session's HAL takes it.
static bool pump_reads(uint8_t type) {
    return (type >= H4_TYPE_COMMAND && type <= H4_TYPE_EVENT) || session_takes(type);
}

// Length on the wire, type byte included, of the packet at p, or 0 when its
// type byte is not one the pump reads or the avail bytes end inside it.
static size_t whole_packet_len(const uint8_t* p, size_t avail) {
    if (avail < 1 || !pump_reads(p[0])) return 0;
    size_t len = h4_packet_len(p, avail);
    return len <= avail ? len : 0;
}

// Bytes taken by the whole packets at the head of the peeked bytes.
static size_t whole_packets_len(const uint8_t* p, size_t avail) {
    size_t whole = 0;
    for (size_t len; (len = whole_packet_len(p + whole, avail - whole)) > 0;) whole += len;
    return whole;
}

// Takes the len bytes already peeked into batch, with one read as a rule:
// the pump is the stream's only reader, so they are all there.
static size_t take_peeked(int fd, std::vector<uint8_t>& batch, size_t len) {
    size_t done = 0;
    while (done < len) {
        ssize_t n = read(fd, batch.data() + done, len - done);
        if (n == -1 && errno == EINTR) continue;
        if (n <= 0) {
            LOGE("%s: failed to read the packet from tool", "process_tool_data");
            break;
        }
        done += static_cast<size_t>(n);
    }
    return done;
}

static bool read_type_byte(int fd, uint8_t* type) {
    if (safe_read(fd, type, 1) == -1) {
        LOGE("%s: failed to read the packet from tools", "process_tool_data");
        return false;
    }
    return true;
}

// Reads the rest of the packet whose type byte is in; `packet` receives it
// without the type byte. False ends the pump.
static bool read_packet(int fd, uint8_t* type, std::vector<uint8_t>& packet) {
    LOGI("%s: Packet type :%d", "process_tool_data", *type);
    if (!pump_reads(*type)) {
        LOGE("%s: Unsupported preamble_len packet type %d", "process_tool_data", *type);
        return false;
    }

    uint8_t preamble[H4_MAX_HEADER] = {0};
    int preamble_len = static_cast<int>(h4_header_len(*type));
    if (safe_read(fd, preamble, preamble_len) == -1) {
        LOGE("%s: failed to read the packet from tools", "process_tool_data");
        return false;
    }
    int payload_len = get_payload_len(*type, preamble);
    if (payload_len < 0) {
        LOGE("%s: Invalid payload length ", "process_tool_data");
        return false;
    }

    packet.assign(preamble_len + payload_len, 0);
    memcpy(packet.data(), preamble, preamble_len);
    if (safe_read(fd, packet.data() + preamble_len, payload_len) == -1) {
        LOGE("%s: failed to read the packet from tool", "process_tool_data");
        return false;
    }
    return true;
}

// False when the HAL has died: nothing more can reach the controller.
static bool forward_packet(uint8_t type, uint8_t* packet, size_t len) {
    LOGE("PACKET_TYPE = %d", type);
    if (type == H4_TYPE_EVENT) {
        LOGE("%s: Unsupported packet type: %d", "process_tool_data", type);
        return true;
    }
    return session_send(type, packet, len) != HAL_DEAD;
}

// The packets taken at once are logged as one by one: the lines safe_read and
// read_packet would give for each, in the same order. False when the HAL died.
static bool forward_batch(uint8_t* bytes, size_t len) {
    for (size_t at = 0; at < len;) {
        uint8_t type = bytes[at];
        size_t packet_len = whole_packet_len(bytes + at, len - at);
        if (packet_len == 0) return true;
        LOGI("%s: Packet type :%d", "process_tool_data", type);
        if (packet_len == 1 + h4_header_len(type)) LOGE("%s: No data to read", "safe_read");
        if (!forward_packet(type, bytes + at + 1, packet_len - 1)) return false;
        at += packet_len;
    }
    return true;
}

void* process_tool_data(void*) {
    std::vector<uint8_t> packet;
    std::vector<uint8_t> batch(kBatchBytes);
    timeout.tv_sec = 0;
    timeout.tv_usec = 500000;
    LOGE("process_tool_data IN!");

    // The bridge end does not change while this pump runs: it is closed only
    // after the pump has been joined.
    int fd = server_fd;
    // Set once a wait has found the stream readable though nothing could be
    // peeked: its end or an error, which safe_read then reports.
    bool readable = false;
    for (;;) {
        // A busy tool end has many packets waiting: the whole ones are taken
        // with one read. A bad type byte or a packet not yet whole is left to
        // the reads of one packet at a time, which take nothing past it.
        ssize_t peeked = peek_waiting(fd, batch);
        size_t whole = peeked > 0 ? whole_packets_len(batch.data(), peeked) : 0;
        if (whole > 0) {
            size_t taken = take_peeked(fd, batch, whole);
            if (!forward_batch(batch.data(), taken) || taken < whole) break;
            readable = false;
            continue;
        }
        if (peeked <= 0 && !readable) {
            WaitResult waited = wait_for_tool_data(fd);
            if (waited == WAIT_FAILED) break;
            if (waited == WAIT_READABLE) readable = true;
            else if (__atomic_load_n(&client_fd, __ATOMIC_ACQUIRE) == -1) {
                LOGI("Quit test mode!");
                break;
            }
            continue;
        }
        readable = false;
        uint8_t type = 0;
        if (!read_type_byte(fd, &type)) break;
        if (!read_packet(fd, &type, packet)) break;
        if (!forward_packet(type, packet.data(), packet.size())) break;
    }
    // Whatever ended the pump, the engine must see the bridge end at once
    // rather than wait for replies that can no longer come.
    shutdown(fd, SHUT_RDWR);
    LOGE("Process tool OUT !!!");
    return nullptr;
}
