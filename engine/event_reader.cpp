// Event reader: reads H4 packets from the session descriptor, each whole by
// its own header, logs each event and decides which one answers a command;
// data packets and empty events are logged and skipped. Runs on the calling
// Java thread; no single wait lasts longer than the reply time-out.
#include "engine/event_reader.h"

#include <errno.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/stat.h>
#include <time.h>
#include <unistd.h>

#include "engine/event_log.h"
#include "jni/binding.h"
#include "transport/h4_frame.h"
#include "transport/log.h"

enum PacketRead {
    PACKET_EVENT,  // an event with parameters is in buf
    PACKET_OTHER,  // a data packet or an empty event, logged and skipped
    PACKET_NONE,   // nothing arrived by the deadline
    PACKET_ENDED,  // the stream ended or failed
    PACKET_LOST,   // the stream cannot be followed: no packet starts here, or one was cut off
};

// Result of a read that timed out.
static const ssize_t kTimedOut = -2;
// LE Test End (Core Specification Vol 4, Part E, 7.8.30): its Command Complete
// returns Status and Num_Packets, 6 parameter bytes in all.
static const int kLeTestEndOpcode = 0x201F;
static const int kLeTestEndReplyLen = 6;

// Whether the controller's last Command Complete or Command Status withheld
// its command credit, and on which stream: a new session starts with one.
static struct {
    bool withheld;
    dev_t dev;
    ino_t ino;
} credit;

long hci_clock_ms() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec * 1000L + ts.tv_nsec / 1000000L;
}

// Waits at most until deadline for fd to become readable. A negative
// descriptor is left to the read to report.
static bool wait_readable(int fd, long deadline) {
    for (;;) {
        long left = deadline - hci_clock_ms();
        struct pollfd pfd = {fd, POLLIN, 0};
        int rc = fd < 0 ? 1 : poll(&pfd, 1, left > 0 ? static_cast<int>(left) : 0);
        if (rc == -1 && errno == EINTR) continue;
        return rc != 0;
    }
}

// A controller that never answers must not hold the Java thread: no read goes
// past the deadline. The rest of a packet arrives with its type byte, so on a
// socket it is taken at once and the wait is paid only when it is not there;
// a type byte is rarely there yet (the controller has just been asked), so it
// is waited for first, as on any other descriptor.
static ssize_t timed_read(int fd, uint8_t* dst, size_t len, bool wait_first, long deadline) {
    bool try_first = !wait_first;
    for (;;) {
        if (try_first) {
            ssize_t n = recv(fd, dst, len, MSG_DONTWAIT);
            if (n == -1 && errno == EINTR) continue;
            if (n == -1 && errno == ENOTSOCK) try_first = false;
            else if (n != -1 || (errno != EAGAIN && errno != EWOULDBLOCK)) return n;
        }
        if (!wait_readable(fd, deadline)) return kTimedOut;
        ssize_t n = read(fd, dst, len);
        if (n == -1 && errno == EINTR) continue;
        return n;
    }
}

// Reads exactly len bytes; len, or the result of the read that failed.
static ssize_t read_full(int fd, uint8_t* dst, size_t len, long deadline) {
    size_t done = 0;
    while (done < len) {
        ssize_t n = timed_read(fd, dst + done, len - done, false, deadline);
        if (n < 1) return n;
        done += static_cast<size_t>(n);
    }
    return static_cast<ssize_t>(done);
}

static void log_timeout(const char* what) {
    LOGE("%s: timed out after %d ms waiting for the %s, return %d", "read_incoming_events",
         HCI_REPLY_TIMEOUT_MS, what, -1);
}

// Part of a packet that did not arrive: its end, a failure, or the deadline.
static PacketRead cut_off(ssize_t n, const char* what, const char* end_line, int size) {
    if (n == kTimedOut) {
        log_timeout(what);
        return PACKET_LOST;
    }
    LOGI(end_line, size);
    return PACKET_ENDED;
}

// An event without parameters is legal, but answers nothing.
static PacketRead read_event_body(int fd, uint8_t* buf, long deadline) {
    ssize_t n = read_full(fd, buf, 2, deadline);
    if (n < 2) return cut_off(n, "event header", "read error \n", 0);
    int len = buf[1];
    if (len == 0) {
        LOGI("Zero len , invalid \n");
        return PACKET_OTHER;
    }
    n = read_full(fd, buf + 2, len, deadline);
    if (n < len) return cut_off(n, "event parameters", "read error :size = %d\n", len);
    return PACKET_EVENT;
}

// A data packet is read whole, through buf, and dropped: the test modes carry none.
static PacketRead skip_data_packet(int fd, uint8_t type, uint8_t* buf, long deadline) {
    size_t header = h4_header_len(type);
    ssize_t n = read_full(fd, buf, header, deadline);
    if (n < static_cast<ssize_t>(header)) return cut_off(n, "packet header", "read error \n", 0);
    size_t left = h4_payload_len(type, buf);
    size_t size = header + left;
    while (left > 0) {
        size_t chunk = left < 256 ? left : 256;
        n = read_full(fd, buf, chunk, deadline);
        if (n < static_cast<ssize_t>(chunk)) {
            return cut_off(n, "packet data", "read error :size = %d\n", static_cast<int>(size));
        }
        left -= chunk;
    }
    LOGI("%s: %s packet of %zu bytes skipped", "read_incoming_events", h4_type_name(type), size);
    return PACKET_OTHER;
}

// Reads the next packet: its type byte by `first` (nothing waits past it),
// the rest by `deadline`. Nothing is logged when no type byte came.
static PacketRead read_packet(int fd, uint8_t* buf, long first, long deadline) {
    ssize_t n = timed_read(fd, buf, 1, true, first);
    if (n == kTimedOut) return PACKET_NONE;
    if (n < 1) return PACKET_ENDED;
    uint8_t type = buf[0];
    if (type == H4_TYPE_EVENT) return read_event_body(fd, buf, deadline);
    if (h4_header_len(type) != 0) return skip_data_packet(fd, type, buf, deadline);
    LOGE("%s: byte 0x%02x starts no HCI packet, the stream cannot be followed",
         "read_incoming_events", type);
    return PACKET_LOST;
}

// A stream whose framing is lost can carry no more replies: shutting it down
// ends the session, and the next procedure opens a new one.
static void end_lost_stream(int fd, PacketRead read) {
    if (read != PACKET_LOST) return;
    LOGE("%s: the session's stream cannot be followed any more, ending it", "read_incoming_events");
    shutdown(fd, SHUT_RDWR);
}

// Every Command Complete and Command Status says how many commands the
// controller takes now (Core Specification Vol 4, Part E, 4.4).
static void note_credit(int fd, const uint8_t* buf, int len) {
    int credits;
    if (buf[0] == EVT_COMMAND_COMPLETE && len >= 1) credits = buf[2];
    else if (buf[0] == EVT_COMMAND_STATUS && len >= 2) credits = buf[3];
    else return;
    credit.withheld = credits == 0;
    if (!credit.withheld) return;
    struct stat st;
    if (fstat(fd, &st) == 0) {
        credit.dev = st.st_dev;
        credit.ino = st.st_ino;
    }
}

static bool credit_withheld(int fd) {
    if (!credit.withheld) return false;
    struct stat st;
    if (fstat(fd, &st) == 0 && (st.st_dev != credit.dev || st.st_ino != credit.ino)) {
        credit.withheld = false;  // another stream: a new session
    }
    return credit.withheld;
}

// The next packet by the deadline; an event is logged and its credit noted.
static PacketRead next_packet(int fd, uint8_t* buf, long first, long deadline) {
    PacketRead read = read_packet(fd, buf, first, deadline);
    if (read != PACKET_EVENT) return read;
    log_event(buf, buf[1]);
    note_credit(fd, buf, buf[1]);
    return read;
}

int read_incoming_events(int fd, uint8_t* buf, int) {
    if (buf == nullptr) {
        LOGE("%s: no reply buffer", "read_incoming_events");
        return -1;
    }
    for (;;) {
        long deadline = hci_clock_ms() + HCI_REPLY_TIMEOUT_MS;
        PacketRead read = next_packet(fd, buf, deadline, deadline);
        if (read == PACKET_NONE) log_timeout("packet type");
        if (read == PACKET_OTHER) continue;
        if (read != PACKET_EVENT) return -1;
        if (outcome_of(buf, buf[1]) == EVENT_ENDS_EXCHANGE) return 0;
    }
}

// An accepted Command Complete goes to the up-call, which reads its value from
// the last two bytes it is given: LE Test End's is cut right after
// Num_Packets, and one too short to hold the count is not handed on.
static void hand_on_reply(uint8_t* buf, int len, int opcode) {
    if (opcode != kLeTestEndOpcode) {
        onReceivedTestData(buf, len + 2);
        return;
    }
    if (len < kLeTestEndReplyLen) {
        LOGE("%s: LE Test End answered without Num_Packets", "read_incoming_events");
        return;
    }
    onReceivedTestData(buf, kLeTestEndReplyLen + 2);
}

// Only the command's own reply decides: whatever else the controller sends
// meanwhile (its own events, data, a tester's events, a late reply to an
// earlier command) is logged and skipped, within one deadline for the whole
// exchange.
int read_command_reply(int fd, uint8_t* buf, uint16_t opcode, long deadline, bool up_call) {
    for (;;) {
        PacketRead read = next_packet(fd, buf, deadline, deadline);
        if (read == PACKET_OTHER) continue;
        if (read == PACKET_NONE) log_timeout("packet type");
        end_lost_stream(fd, read);
        if (read != PACKET_EVENT) return HCI_NOT_ANSWERED;
        int len = buf[1];
        if (answered_opcode(buf, len) != opcode) {
            LOGI("%s: event 0x%x does not answer opcode 0x%04x, skipped", "read_incoming_events",
                 buf[0], opcode);
            continue;
        }
        bool complete = buf[0] == EVT_COMMAND_COMPLETE;
        uint8_t status = complete ? buf[5] : buf[2];
        // A pending Command Status is followed by the command's own event.
        if (!complete && status == 0x00) continue;
        if (complete && status == 0x00 && up_call) hand_on_reply(buf, len, opcode);
        return status;
    }
}

// Whether a byte waits on fd now, without taking it: the common case before a
// command is that nothing does, and it costs one call.
static bool byte_waiting(int fd) {
    uint8_t byte;
    ssize_t n;
    while ((n = recv(fd, &byte, 1, MSG_PEEK | MSG_DONTWAIT)) == -1 && errno == EINTR) {
    }
    if (n == -1 && errno == ENOTSOCK) {
        struct pollfd pfd = {fd, POLLIN, 0};
        return poll(&pfd, 1, 0) == 1;
    }
    return n != -1 || (errno != EAGAIN && errno != EWOULDBLOCK);  // an end or an error is read next
}

// A controller flooding the stream cannot hold the command back for longer
// than one reply time-out.
bool skip_waiting_packets(int fd, uint8_t* buf, const char* caller) {
    if (!byte_waiting(fd)) return true;
    long give_up = hci_clock_ms() + HCI_REPLY_TIMEOUT_MS;
    for (long now = hci_clock_ms(); now < give_up; now = hci_clock_ms()) {
        PacketRead read = next_packet(fd, buf, now, now + HCI_REPLY_TIMEOUT_MS);
        if (read == PACKET_NONE) return true;
        if (read == PACKET_EVENT) {
            LOGI("%s: event 0x%x came before the command, skipped", caller, buf[0]);
        }
        if (read == PACKET_ENDED || read == PACKET_LOST) {
            end_lost_stream(fd, read);
            return false;
        }
    }
    return true;
}

bool wait_for_command_credit(int fd, uint8_t* buf, long deadline, const char* caller) {
    while (credit_withheld(fd)) {
        PacketRead read = next_packet(fd, buf, deadline, deadline);
        if (read == PACKET_EVENT) {
            LOGI("%s: event 0x%x while waiting for a command credit, skipped", caller, buf[0]);
            continue;
        }
        if (read == PACKET_OTHER) continue;
        end_lost_stream(fd, read);
        if (read == PACKET_NONE) {
            LOGE("%s: no command credit from the controller within %d ms, command not sent", caller,
                 HCI_REPLY_TIMEOUT_MS);
        }
        return false;
    }
    return true;
}
