// Fuzz target for the event reader, as outside callers use it and as the test
// procedures do. Outside: arbitrary controller replies on the session
// descriptor, with and without a test end pending; the result and the
// up-call's value must match a reference reading, and every byte after the
// event that ends the exchange must still be unread. Procedures: an LE test
// command answered by arbitrary bytes; what reaches Java (confirmation, count)
// must be what the reference says the controller accepted.
#include <sys/socket.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "engine/event_reader.h"
#include "engine/test_mode.h"
#include "fuzz/fuzz_check.h"
#include "tests/support/fake_java.h"
#include "tests/support/log_capture.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Keeps the library's many lines off stderr and lets the checks look them up.
LogCapture g_log;

// Whatever fits the socket buffer at once: nobody need read for the writes to end.
const size_t kMaxStream = 32768;

struct Expected {
    int result = -1;
    size_t consumed = 0;
    bool upcall = false;  // onReceivedTestData is called with `value`
    int value = 0;
    bool zero_len = false;
};

// One event of the stream at `at`: false (with consumed set) when the stream
// ends or holds something else there.
struct Event {
    uint8_t code = 0;
    Bytes params;
};
bool next_event(const Bytes& s, size_t* at, Event* e, Expected* x) {
    if (*at >= s.size()) return x->consumed = s.size(), false;
    if (s[(*at)++] != 4) return x->consumed = *at, false;
    if (*at + 2 > s.size()) return x->consumed = s.size(), false;
    e->code = s[*at];
    uint8_t len = s[*at + 1];
    *at += 2;
    if (len == 0) return x->zero_len = true, x->consumed = *at, false;
    if (*at + len > s.size()) return x->consumed = s.size(), false;
    e->params.assign(s.begin() + *at, s.begin() + *at + len);
    *at += len;
    return true;
}

// Reference reading for outside callers: Inquiry Result and a pending
// Command Status (status 0) read on; any other event ends the exchange, and
// those without a name of their own go to the up-call with their last two
// bytes as the value.
Expected reference_read(const Bytes& s) {
    Expected x;
    size_t at = 0;
    Event e;
    while (next_event(s, &at, &e, &x)) {
        if (e.code == 0x02 || (e.code == 0x0F && e.params[0] == 0x00)) continue;
        x.result = 0;
        x.consumed = at;
        if (e.code != 0x01 && e.code != 0x03 && e.code != 0x05 && e.code != 0x0F) {
            x.upcall = true;
            size_t len = e.params.size();
            uint8_t before_last = len >= 2 ? e.params[len - 2] : static_cast<uint8_t>(len);
            x.value = before_last + 256 * e.params[len - 1];
        }
        return x;
    }
    return x;
}

// Reference for a procedure: only a Command Complete or Command Status that
// names the command's opcode and holds a status answers it (Core Specification
// Vol 4, Part E, 7.7.14-15); a pending Command Status reads on. Java hears the
// code when the status is 0x00, and before it LE Test End's Num_Packets (the
// two bytes after the status) when the event holds them.
std::string reference_java(const Bytes& s, int code, uint16_t opcode) {
    Expected ignored;
    size_t at = 0;
    Event e;
    while (next_event(s, &at, &e, &ignored)) {
        const Bytes& p = e.params;
        if (p.size() < 4 || (e.code != 0x0E && e.code != 0x0F)) continue;
        bool complete = e.code == 0x0E;
        if ((complete ? p[1] | (p[2] << 8) : p[2] | (p[3] << 8)) != opcode) continue;
        uint8_t status = complete ? p[3] : p[0];
        if (!complete && status == 0x00) continue;
        if (status != 0x00) return "";
        std::string success = "success " + std::to_string(code);
        if (code != 3000 || p.size() < 6) return success;
        return "received " + std::to_string(p[4] | (p[5] << 8)) + "," + success;
    }
    return "";
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

void check_outside_caller(int fds[2], const Bytes& stream, bool test_end_pending) {
    Expected want = reference_read(stream);
    if (!stream.empty()) {
        FUZZ_CHECK(write(fds[1], stream.data(), stream.size()) == static_cast<ssize_t>(stream.size()),
                   "stream not written");
    }
    shutdown(fds[1], SHUT_WR);
    cmd_test_end_flag = test_end_pending ? 1 : 0;
    uint8_t buf[260] = {0};
    int rc = read_incoming_events(fds[0], buf, 0);

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
    bool reported = want.upcall && test_end_pending;
    std::string java = takeJavaCalls();
    FUZZ_CHECK(java == (reported ? "received " + std::to_string(want.value) : ""), "Java heard '%s'", java.c_str());
    FUZZ_CHECK(cmd_test_end_flag == (test_end_pending && !reported ? 1 : 0), "test-end flag");
}

// The controller: once the command has arrived it answers with the stream,
// then closes its side, so a stream without a reply ends the exchange at once.
class Controller {
  public:
    Controller() : thread_([this] { run(); }) { thread_.detach(); }
    void answer(int fd, const Bytes* stream) {
        std::unique_lock<std::mutex> guard(lock_);
        fd_ = fd;
        stream_ = stream;
        changed_.notify_all();
    }
    void waitDone() {
        std::unique_lock<std::mutex> guard(lock_);
        changed_.wait(guard, [this] { return stream_ == nullptr; });
    }

  private:
    void run() {
        for (;;) {
            std::unique_lock<std::mutex> guard(lock_);
            changed_.wait(guard, [this] { return stream_ != nullptr; });
            uint8_t header[4];
            FUZZ_CHECK(recv(fd_, header, 4, MSG_WAITALL) == 4, "no command written");
            Bytes params(header[3]);
            if (!params.empty()) recv(fd_, params.data(), params.size(), MSG_WAITALL);
            if (!stream_->empty()) send(fd_, stream_->data(), stream_->size(), MSG_NOSIGNAL);
            shutdown(fd_, SHUT_WR);
            stream_ = nullptr;
            changed_.notify_all();
        }
    }
    std::mutex lock_;
    std::condition_variable changed_;
    int fd_ = -1;
    const Bytes* stream_ = nullptr;
    std::thread thread_;
};

void check_procedure(int fds[2], const Bytes& stream, uint8_t which, bool enhanced) {
    struct Command {
        int code;
        uint16_t opcode, opcode_2m;
    };
    static const Command kCommands[] = {{3000, 0x201F, 0x201F},  {12402, 0x201E, 0x2034},
                                        {12480, 0x201E, 0x2034}, {22440, 0x201D, 0x2033}};
    static Controller* controller = new Controller();
    const Command& c = kCommands[which % 4];
    std::string want = reference_java(stream, c.code, enhanced ? c.opcode_2m : c.opcode);

    bt_fd = fds[0];
    controller->answer(fds[1], &stream);
    sendBleTestCommand(c.code, enhanced ? 1 : 0);
    controller->waitDone();
    bt_fd = -1;
    std::string java = takeJavaCalls();
    FUZZ_CHECK(java == want, "Java heard '%s', the controller said '%s'", java.c_str(), want.c_str());
    FUZZ_CHECK(cmd_test_end_flag == 0, "test-end flag left set");
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    static bool bound = (bindFakeJava(), true);
    (void)bound;
    if (size < 3 || size - 3 > kMaxStream) return 0;
    Bytes stream(data + 3, data + size);
    int fds[2];
    FUZZ_CHECK(socketpair(AF_UNIX, SOCK_STREAM, 0, fds) == 0, "socketpair");
    g_log.clear();
    takeJavaCalls();
    if (data[0] & 2) check_procedure(fds, stream, data[1], data[2] & 1);
    else check_outside_caller(fds, stream, data[0] & 1);
    close(fds[0]);
    close(fds[1]);
    return 0;
}
