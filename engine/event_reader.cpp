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
static const int kAnyOpcode = -1;
// Result of a read that timed out; the time-out has been logged already.
static const ssize_t kTimedOut = -2;

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

// A controller that never answers must not hold the Java thread: no read waits
// longer than HCI_REPLY_TIMEOUT_MS. The rest of an event arrives with its type
// byte, so on a socket it is taken at once and the wait is paid only when it
// is not there; a type byte is rarely there yet (the controller has just been
// asked), so it is waited for first, as on any other descriptor. A closed or
// invalid descriptor is left to the read to report.
static ssize_t timed_read(int fd, uint8_t* dst, size_t len, const char* what, bool wait_first) {
    long deadline = now_ms() + HCI_REPLY_TIMEOUT_MS;
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
static ssize_t read_full(int fd, uint8_t* dst, int len, const char* what) {
    int done = 0;
    while (done < len) {
        ssize_t n = timed_read(fd, dst + done, len - done, what, false);
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

// A Command Complete or Command Status names the command it answers
// (Bluetooth Core Specification Vol 4, Part E, 7.7.14 and 7.7.15). One for
// another command is a late answer to an exchange that timed out, and must
// not end this one.
static bool is_late_reply(const uint8_t* buf, int len, int opcode) {
    if (opcode == kAnyOpcode) return false;
    int answered = -1;
    if (buf[0] == EVT_COMMAND_COMPLETE && len >= 3) answered = buf[3] | (buf[4] << 8);
    else if (buf[0] == EVT_COMMAND_STATUS && len >= 4) answered = buf[4] | (buf[5] << 8);
    else if (buf[0] != EVT_COMMAND_COMPLETE && buf[0] != EVT_COMMAND_STATUS) return false;
    if (answered == opcode) return false;
    LOGI("%s: event 0x%x does not answer opcode 0x%04x, skipped", "read_incoming_events", buf[0],
         opcode);
    dump_event(buf, len);
    return true;
}

// Status 0x00 means the command is pending and another event follows; any
// other status is a rejection, after which the controller sends nothing more
// for this command.
static EventOutcome on_command_status(const uint8_t* buf, int len) {
    LOGI("Command Status Received\n");
    dump_event(buf, len);
    uint8_t status = buf[2];
    if (status == 0x00) return EVENT_READ_ON;
    if (status == 0x02) LOGI("\nUnknown connection identifier");
    else LOGI("%s: command rejected with status 0x%x", "read_incoming_events", status);
    return EVENT_ENDS_EXCHANGE;
}

static EventOutcome on_event(uint8_t* buf, int len) {
    switch (buf[0]) {
        case EVT_INQUIRY_COMPLETE:
            LOGI("INQ COMPLETE EVENT RECEIVED\n");
            LOGI("\n");
            return EVENT_ENDS_EXCHANGE;
        case EVT_INQUIRY_RESULT:
            LOGI("INQ RESULT EVENT RECEIVED \n");
            dump_event(buf, len);
            return EVENT_READ_ON;
        case EVT_CONNECTION_COMPLETE:
            if (buf[2] != 0) {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH ERROR CODE 0x%x \n", buf[2]);
            } else {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x%02x%02x \n",
                     param(buf, len, 4), param(buf, len, 3));
            }
            dump_event(buf, len);
            return EVENT_ENDS_EXCHANGE;
        case EVT_DISCONNECTION_COMPLETE:
            LOGI("DISCONNECTION COMPLETE EVENT RECEIVED WITH REASON CODE: 0x%x \n",
                 param(buf, len, 5));
            dump_event(buf, len);
            return EVENT_ENDS_EXCHANGE;
        case EVT_COMMAND_STATUS:
            return on_command_status(buf, len);
        default:
            LOGI("Other event received, Breaking\n");
            dump_event(buf, len);
            onReceivedTestData(buf, len + 2);
            return EVENT_ENDS_EXCHANGE;
    }
}

// Reads one event (its type byte already in buf[0]) into buf; 0 or -1.
static int read_event_body(int fd, uint8_t* buf) {
    ssize_t n = read_full(fd, buf, 2, "event header");
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
    n = read_full(fd, buf + 2, len, "event parameters");
    if (n == kTimedOut) return -1;
    if (n < 1) {
        LOGI("read error :size = %d\n", len);
        return -1;
    }
    return 0;
}

static int read_events(int fd, uint8_t* buf, int opcode) {
    if (buf == nullptr) {
        LOGE("%s: no reply buffer", "read_incoming_events");
        return -1;
    }
    for (;;) {
        if (timed_read(fd, buf, 1, "packet type", true) < 1) return -1;
        if (buf[0] != H4_TYPE_EVENT) return -1;
        if (read_event_body(fd, buf) == -1) return -1;
        int len = buf[1];
        if (is_late_reply(buf, len, opcode)) continue;
        if (on_event(buf, len) == EVENT_ENDS_EXCHANGE) return 0;
    }
}

int read_incoming_events(int fd, uint8_t* buf, int) { return read_events(fd, buf, kAnyOpcode); }

int read_command_reply(int fd, uint8_t* buf, uint16_t opcode) { return read_events(fd, buf, opcode); }
