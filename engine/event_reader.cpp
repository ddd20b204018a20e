// Event reader: reads H4 event packets from the session descriptor, logs each
// and hands the ones it does not handle by name to the Java up-call. Runs on
// the calling Java thread; no single wait lasts longer than the reply time-out.
#include "engine/event_reader.h"

#include <errno.h>
#include <poll.h>
#include <sys/socket.h>
#include <time.h>
#include <unistd.h>

#include "jni/binding.h"
#include "transport/h4.h"
#include "transport/log.h"

enum {
    EVT_INQUIRY_COMPLETE = 0x01,
    EVT_INQUIRY_RESULT = 0x02,
    EVT_CONNECTION_COMPLETE = 0x03,
    EVT_DISCONNECTION_COMPLETE = 0x05,
    EVT_COMMAND_COMPLETE = 0x0E,
    EVT_COMMAND_STATUS = 0x0F,
};

enum EventOutcome { EVENT_ENDS_EXCHANGE, EVENT_READ_ON };

// Wider than any 16-bit opcode: every reply is taken as the awaited one.
// Result of a read that timed out; the time-out has been logged already.
static const ssize_t kTimedOut = -2;
// LE Test End (Core Specification Vol 4, Part E, 7.8.30): its Command Complete
// returns Status and Num_Packets, 6 parameter bytes in all.
static const int kLeTestEndOpcode = 0x201F;
static const int kLeTestEndReplyLen = 6;

static long now_ms() {
    struct timespec ts;
    clock_gettime(CLOCK_MONOTONIC, &ts);
    return ts.tv_sec * 1000L + ts.tv_nsec / 1000000L;
}

// Waits at most until deadline for fd to become readable; false (logged) when
// it does not. A negative descriptor is left to the read to report.
static bool wait_readable(int fd, long deadline, const char* what) {
    for (;;) {
        long left = deadline - now_ms();
        struct pollfd pfd = {fd, POLLIN, 0};
        int rc = fd < 0 ? 1 : poll(&pfd, 1, left > 0 ? static_cast<int>(left) : 0);
        if (rc == -1 && errno == EINTR) continue;
        if (rc != 0) return true;
        LOGE("%s: timed out after %d ms waiting for the %s, return %d", "read_incoming_events",
             HCI_REPLY_TIMEOUT_MS, what, -1);
        return false;
    }
}

// A controller that never answers must not hold the Java thread: no read goes
// past the deadline. The rest of an event arrives with its type byte, so on a
// socket it is taken at once and the wait is paid only when it is not there;
// a type byte is rarely there yet (the controller has just been asked), so it
// is waited for first, as on any other descriptor. A closed or invalid
// descriptor is left to the read to report.
static ssize_t timed_read(int fd, uint8_t* dst, size_t len, const char* what, bool wait_first,
                          long deadline) {
    bool try_first = !wait_first;
    for (;;) {
        if (try_first) {
            ssize_t n = recv(fd, dst, len, MSG_DONTWAIT);
            if (n == -1 && errno == EINTR) continue;
            if (n == -1 && errno == ENOTSOCK) try_first = false;
            else if (n != -1 || (errno != EAGAIN && errno != EWOULDBLOCK)) return n;
        }
        if (!wait_readable(fd, deadline, what)) return kTimedOut;
        ssize_t n = read(fd, dst, len);
        if (n == -1 && errno == EINTR) continue;
        return n;
    }
}

// Reads exactly len bytes; len, or the result of the read that failed.
static ssize_t read_full(int fd, uint8_t* dst, int len, const char* what, long deadline) {
    int done = 0;
    while (done < len) {
        ssize_t n = timed_read(fd, dst + done, len - done, what, false, deadline);
        if (n < 1) return n;
        done += static_cast<int>(n);
    }
    return done;
}

// Parameter byte i of the event in buf (byte 2 is the first), 0 when the
// event is too short to hold it.
static uint8_t param(const uint8_t* buf, int len, int i) { return i < len + 2 ? buf[i] : 0; }

static void dump_event(const uint8_t* buf, int len) {
    for (int i = 0; i < len + 2; ++i) LOGI("[%x]", buf[i]);
    LOGI("\n");
}

// The heading of the event by its code, then its bytes.
static void log_event(const uint8_t* buf, int len) {
    switch (buf[0]) {
        case EVT_INQUIRY_COMPLETE:
            LOGI("INQ COMPLETE EVENT RECEIVED\n");
            LOGI("\n");
            return;
        case EVT_INQUIRY_RESULT:
            LOGI("INQ RESULT EVENT RECEIVED \n");
            break;
        case EVT_CONNECTION_COMPLETE:
            if (buf[2] != 0) {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH ERROR CODE 0x%x \n", buf[2]);
            } else {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x%02x%02x \n",
                     param(buf, len, 4), param(buf, len, 3));
            }
            break;
        case EVT_DISCONNECTION_COMPLETE:
            LOGI("DISCONNECTION COMPLETE EVENT RECEIVED WITH REASON CODE: 0x%x \n",
                 param(buf, len, 5));
            break;
        case EVT_COMMAND_STATUS:
            LOGI("Command Status Received\n");
            dump_event(buf, len);
            if (buf[2] == 0x02) LOGI("\nUnknown connection identifier");
            return;
        default:
            LOGI("Other event received, Breaking\n");
    }
    dump_event(buf, len);
}

// For outside callers, which wait for whatever ends an exchange: Inquiry
// Result and a pending Command Status (0x00) read on; a Command Status with
// any other status is a rejection, after which the controller sends nothing
// more for that command.
static EventOutcome outcome_of(uint8_t* buf, int len) {
    switch (buf[0]) {
        case EVT_INQUIRY_RESULT:
            return EVENT_READ_ON;
        case EVT_COMMAND_STATUS:
            if (buf[2] == 0x00) return EVENT_READ_ON;
            if (buf[2] != 0x02) {
                LOGI("%s: command rejected with status 0x%x", "read_incoming_events", buf[2]);
            }
            return EVENT_ENDS_EXCHANGE;
        case EVT_INQUIRY_COMPLETE:
        case EVT_CONNECTION_COMPLETE:
        case EVT_DISCONNECTION_COMPLETE:
            return EVENT_ENDS_EXCHANGE;
        default:
            onReceivedTestData(buf, len + 2);
            return EVENT_ENDS_EXCHANGE;
    }
}

// The command a Command Complete or Command Status answers, when it holds the
// opcode and a status (Core Specification Vol 4, Part E, 7.7.14 and 7.7.15);
// -1 for every other event.
static int answered_opcode(const uint8_t* buf, int len) {
    if (len < 4) return -1;
    if (buf[0] == EVT_COMMAND_COMPLETE) return buf[3] | (buf[4] << 8);
    if (buf[0] == EVT_COMMAND_STATUS) return buf[4] | (buf[5] << 8);
    return -1;
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

// Reads one event (its type byte already in buf[0]) into buf; 0 or -1.
static int read_event_body(int fd, uint8_t* buf, long deadline) {
    ssize_t n = read_full(fd, buf, 2, "event header", deadline);
    if (n == kTimedOut) return -1;
    if (n < 1) {
        LOGI("read error \n");
        return -1;
    }
    int len = buf[1];
    if (len == 0) {
        LOGI("Zero len , invalid \n");
        return -1;
    }
    n = read_full(fd, buf + 2, len, "event parameters", deadline);
    if (n == kTimedOut) return -1;
    if (n < 1) {
        LOGI("read error :size = %d\n", len);
        return -1;
    }
    return 0;
}

// Reads the next event into buf; false when none could be read.
static bool read_event(int fd, uint8_t* buf, long deadline) {
    if (timed_read(fd, buf, 1, "packet type", true, deadline) < 1) return false;
    if (buf[0] != H4_TYPE_EVENT) return false;
    return read_event_body(fd, buf, deadline) == 0;
}

int read_incoming_events(int fd, uint8_t* buf, int) {
    if (buf == nullptr) {
        LOGE("%s: no reply buffer", "read_incoming_events");
        return -1;
    }
    for (;;) {
        if (!read_event(fd, buf, now_ms() + HCI_REPLY_TIMEOUT_MS)) return -1;
        log_event(buf, buf[1]);
        if (outcome_of(buf, buf[1]) == EVENT_ENDS_EXCHANGE) return 0;
    }
}

// Only the command's own reply decides: whatever else the controller sends
// meanwhile (its own events, a tester's, a late reply to an earlier command)
// is logged and skipped, within one time-out for the whole exchange.
int read_command_reply(int fd, uint8_t* buf, uint16_t opcode) {
    long deadline = now_ms() + HCI_REPLY_TIMEOUT_MS;
    for (;;) {
        if (!read_event(fd, buf, deadline)) return HCI_NOT_ANSWERED;
        int len = buf[1];
        log_event(buf, len);
        if (answered_opcode(buf, len) != opcode) {
            LOGI("%s: event 0x%x does not answer opcode 0x%04x, skipped", "read_incoming_events",
                 buf[0], opcode);
            continue;
        }
        bool complete = buf[0] == EVT_COMMAND_COMPLETE;
        uint8_t status = complete ? buf[5] : buf[2];
        // A pending Command Status is followed by the command's own event.
        if (!complete && status == 0x00) continue;
        if (complete && status == 0x00) hand_on_reply(buf, len, opcode);
        return status;
    }
}
