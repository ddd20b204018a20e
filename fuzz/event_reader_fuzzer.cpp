// Fuzz target for the event reader as the test procedures use it: an LE test
// command answered by arbitrary controller bytes. What reaches Java (the
// confirmation, the count) must be what a reference reading says the
// controller accepted, whatever else the bytes hold.
#include <sys/socket.h>
#include <unistd.h>

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include "engine/test_mode.h"
#include "fuzz/fuzz_check.h"
#include "tests/support/fake_java.h"
#include "tests/support/log_capture.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Keeps the library's many lines off stderr.
LogCapture g_log;

// Whatever fits the socket buffer at once: nobody need read for the writes to end.
const size_t kMaxStream = 32768;

// Reference: every packet is read whole by its own header (Core Specification
// Vol 4, Part A, 2: command, ACL, SCO, event, ISO); data packets and events
// without parameters are skipped, and a byte that starts no packet ends the
// reading. Only a Command Complete or Command Status that names the command's
// opcode and holds a status answers it (Vol 4, Part E, 7.7.14-15), and a
// pending Command Status reads on. Java hears the code when the status is
// 0x00, and before it LE Test End's Num_Packets (the two bytes after the
// status) when the event holds them.
size_t reference_header(uint8_t type) {
    static const size_t kHeaders[] = {0, 3, 4, 3, 2, 4};
    return type < 6 ? kHeaders[type] : 0;
}

size_t reference_payload(const Bytes& s, size_t at) {
    switch (s[at]) {
        case 2: return s[at + 3] | (s[at + 4] << 8);
        case 4: return s[at + 2];
        case 5: return s[at + 3] | ((s[at + 4] & 0x3F) << 8);
        default: return s[at + 3];
    }
}

std::string reference_java(const Bytes& s, int code, uint16_t opcode) {
    for (size_t at = 0; at < s.size() && reference_header(s[at]) != 0;) {
        size_t header = reference_header(s[at]);
        if (at + 1 + header > s.size()) break;
        size_t len = reference_payload(s, at);
        if (at + 1 + header + len > s.size()) break;
        bool event = s[at] == 4 && len > 0;
        uint8_t code_byte = s[at + 1];
        Bytes p(s.begin() + at + 1 + header, s.begin() + at + 1 + header + len);
        at += 1 + header + len;
        if (!event || len < 4 || (code_byte != 0x0E && code_byte != 0x0F)) continue;
        bool complete = code_byte == 0x0E;
        if ((complete ? p[1] | (p[2] << 8) : p[2] | (p[3] << 8)) != opcode) continue;
        uint8_t status = complete ? p[3] : p[0];
        if (!complete && status == 0x00) continue;
        if (status != 0x00) return "";
        std::string success = "success " + std::to_string(code);
        if (code != 3000 || len < 6) return success;
        return "received " + std::to_string(p[4] | (p[5] << 8)) + "," + success;
    }
    return "";
}

// The controller: once the command has arrived it answers with the stream,
// then closes its side, so a stream without a reply ends the exchange at once.
class Controller {
  public: Controller() : thread_([this] { run(); }) { thread_.detach(); }
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

  private: void run() {
        for (;;) {
            std::unique_lock<std::mutex> guard(lock_);
            changed_.wait(guard, [this] { return stream_ != nullptr; });
            // An earlier input left the link out of step: the library syncs
            // first, with Read Local Version Information, answered as a
            // controller would.
            uint8_t header[4];
            do {
                FUZZ_CHECK(recv(fd_, header, 4, MSG_WAITALL) == 4, "no command written");
                Bytes params(header[3]);
                if (!params.empty()) recv(fd_, params.data(), params.size(), MSG_WAITALL);
                const uint8_t version[] = {0x04, 0x0E, 0x04, 0x01, 0x01, 0x10, 0x00};
                if (header[1] == 0x01 && header[2] == 0x10) send(fd_, version, sizeof(version), MSG_NOSIGNAL);
            } while (header[1] == 0x01 && header[2] == 0x10);
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

}  // namespace

// data[0] picks the command, bit 0 of data[1] its LE 2M variant; the rest is
// what the controller sends back.
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    struct Command {
        int code;
        uint16_t opcode, opcode_2m;
    };
    static const Command kCommands[] = {{3000, 0x201F, 0x201F}, {12402, 0x201E, 0x2034}, {22440, 0x201D, 0x2033}};
    static Controller* controller = new Controller();
    static bool bound = (bindFakeJava(), true);
    (void)bound;
    if (size < 2 || size - 2 > kMaxStream) return 0;
    const Command& c = kCommands[data[0] % 3];
    bool enhanced = data[1] & 1;
    Bytes stream(data + 2, data + size);
    std::string want = reference_java(stream, c.code, enhanced ? c.opcode_2m : c.opcode);

    int fds[2];
    FUZZ_CHECK(socketpair(AF_UNIX, SOCK_STREAM, 0, fds) == 0, "socketpair");
    g_log.clear();
    takeJavaCalls();
    bt_fd = fds[0];
    controller->answer(fds[1], &stream);
    sendBleTestCommand(c.code, enhanced ? 1 : 0);
    controller->waitDone();
    bt_fd = -1;
    close(fds[0]);
    close(fds[1]);
    std::string java = takeJavaCalls();
    FUZZ_CHECK(java == want, "Java heard '%s', the controller said '%s'", java.c_str(), want.c_str());
    FUZZ_CHECK(cmd_test_end_flag == 0, "test-end flag left set");
    return 0;
}
