// Fuzz target for the event reader: arbitrary controller replies on the
// session descriptor, with and without a test end pending, and with or without
// an awaited opcode. The result and the up-call's value must match a
// reference reading, and every byte after the event that ends the exchange
// must still be unread in the socket.
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <string>
#include <vector>

#include "engine/event_reader.h"
#include "fuzz/fuzz_check.h"
#include "tests/support/log_capture.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Keeps the library's many lines off stderr and lets the checks look them up.
LogCapture g_log;

// Whatever fits the socket buffer at once: the reader runs after the write.
const size_t kMaxStream = 32768;

struct Expected {
    int result = -1;
    size_t consumed = 0;
    bool upcall = false;  // onReceivedTestData is called with `value`
    int value = 0;
    bool zero_len = false;
};

// Command Complete names its opcode in parameters 1-2, Command Status in 2-3
// (Core Specification Vol 4, Part E, 7.7.14/7.7.15); -1 when too short.
int answered_opcode(uint8_t code, const Bytes& p) {
    if (code == 0x0E) return p.size() >= 3 ? p[1] | (p[2] << 8) : -1;
    return p.size() >= 4 ? p[2] | (p[3] << 8) : -1;
}

// Reference reading: events only; Inquiry Result and a pending Command Status
// (status 0) read on; any other event ends the exchange, and those without a
// name of their own go to the up-call with their last two bytes as the value.
// With an awaited opcode, a Command Complete/Status for another one is skipped.
Expected reference_read(const Bytes& s, int opcode) {
    Expected e;
    size_t at = 0;
    for (;;) {
        if (at >= s.size()) break;
        if (s[at++] != 4) {
            e.consumed = at;
            return e;
        }
        if (at + 2 > s.size()) break;
        uint8_t code = s[at], len = s[at + 1];
        at += 2;
        if (len == 0) {
            e.zero_len = true;
            e.consumed = at;
            return e;
        }
        if (at + len > s.size()) break;
        Bytes p(s.begin() + at, s.begin() + at + len);
        at += len;
        if (opcode >= 0 && (code == 0x0E || code == 0x0F) && answered_opcode(code, p) != opcode) continue;
        if (code == 0x02 || (code == 0x0F && p[0] == 0x00)) continue;
        e.result = 0;
        e.consumed = at;
        if (code != 0x01 && code != 0x03 && code != 0x05 && code != 0x0F) {
            e.upcall = true;
            uint8_t before_last = len >= 2 ? p[len - 2] : len;
            e.value = before_last + 256 * p[len - 1];
        }
        return e;
    }
    e.consumed = s.size();
    return e;
}

Bytes drain(int fd) {
    Bytes rest;
    uint8_t buf[512];
    ssize_t n;
    while ((n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT)) > 0) rest.insert(rest.end(), buf, buf + n);
    return rest;
}

int count_upcalls() {
    int n = 0;
    for (const auto& line : g_log.lines()) n += line.text.rfind("onReceivedTestData() value: ", 0) == 0;
    return n;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 3 || size - 3 > kMaxStream) return 0;
    bool test_end_pending = data[0] & 1;
    int opcode = (data[0] & 2) ? data[1] | (data[2] << 8) : -1;
    Bytes stream(data + 3, data + size);
    Expected want = reference_read(stream, opcode);

    int fds[2];
    FUZZ_CHECK(socketpair(AF_UNIX, SOCK_STREAM, 0, fds) == 0, "socketpair");
    if (!stream.empty()) {
        FUZZ_CHECK(write(fds[1], stream.data(), stream.size()) == static_cast<ssize_t>(stream.size()),
                   "stream not written");
    }
    shutdown(fds[1], SHUT_WR);

    g_log.clear();
    cmd_test_end_flag = test_end_pending ? 1 : 0;
    uint8_t buf[260] = {0};
    int rc = opcode >= 0 ? read_command_reply(fds[0], buf, static_cast<uint16_t>(opcode))
                         : read_incoming_events(fds[0], buf, 0);

    FUZZ_CHECK(rc == want.result, "result %d, expected %d", rc, want.result);
    Bytes unread = drain(fds[0]);
    Bytes tail(stream.begin() + want.consumed, stream.end());
    FUZZ_CHECK(unread == tail, "%zu bytes unread, %zu expected", unread.size(), tail.size());
    FUZZ_CHECK(count_upcalls() == (want.upcall ? 1 : 0), "%d up-calls", count_upcalls());
    if (want.upcall) {
        FUZZ_CHECK(g_log.contains(ANDROID_LOG_INFO, "onReceivedTestData() value: " + std::to_string(want.value)),
                   "up-call value is not %d", want.value);
    }
    FUZZ_CHECK(want.zero_len == g_log.contains(ANDROID_LOG_INFO, "Zero len , invalid \n"), "zero-length line");
    // No Java is bound here, so nothing may consume the pending test end.
    FUZZ_CHECK(cmd_test_end_flag == (test_end_pending ? 1 : 0), "test-end flag changed");

    close(fds[0]);
    close(fds[1]);
    return 0;
}
