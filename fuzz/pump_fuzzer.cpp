// Fuzz target for the pump: arbitrary bytes written to the tool end of an
// opened session reach a recording HAL. Every packet the HAL gets must be one
// the stream holds, whole and unchanged, in order; the pump must stop at the
// first type byte outside 1..4 and leave what follows it unread.
#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstdint>
#include <cstring>
#include <vector>

#include "fuzz/fuzz_check.h"
#include "fuzz/fuzz_log.h"
#include "tests/support/fake_hal.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Bytes that may follow an unsupported type byte: few enough to fit the
// socket buffer whether or not the pump still reads.
const size_t kTailAfterStop = 64;
// Generous: on a loaded machine a sanitized pump can lag far behind the writer.
const int kBoundMs = 20000;

struct Expected {
    std::vector<SentPacket> forwarded;  // types 1..3, whole, without the type byte
    size_t stop = 0;                    // bytes the pump consumes before it ends
    bool bad_type = false;              // it ends at a type byte outside 1..4
};

// Reference reading of an H4 stream (Bluetooth Core Specification, Vol 4,
// Part A): command 3-byte header with 8-bit length at [2], ACL 4-byte header
// with 16-bit length at [2..3], SCO like command, event 2-byte header with
// length at [1].
Expected reference_parse(const Bytes& s) {
    Expected e;
    size_t at = 0;
    while (at < s.size()) {
        uint8_t type = s[at];
        size_t header = type == 1 ? 3 : type == 2 ? 4 : type == 3 ? 3 : type == 4 ? 2 : 0;
        if (header == 0) {
            e.bad_type = true;
            e.stop = at + 1;
            return e;
        }
        size_t h = at + 1;
        if (h + header > s.size()) break;
        size_t payload = type == 2 ? s[h + 2] + 256u * s[h + 3] : type == 4 ? s[h + 1] : s[h + 2];
        if (h + header + payload > s.size()) break;
        if (type != 4) e.forwarded.push_back({type, Bytes(s.begin() + h, s.begin() + h + header + payload)});
        at = h + header + payload;
    }
    e.stop = s.size();
    return e;
}

// Writes everything, in chunks of `chunk` bytes (0: at once); a pump that
// stopped reading turns into a failed check, not a hang.
void write_stream(int fd, const Bytes& s, size_t chunk) {
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
    size_t done = 0;
    while (done < s.size()) {
        size_t want = chunk == 0 ? s.size() - done : std::min(chunk, s.size() - done);
        ssize_t n = send(fd, s.data() + done, want, MSG_NOSIGNAL);
        if (n > 0) {
            done += static_cast<size_t>(n);
            continue;
        }
        FUZZ_CHECK(n < 0 && errno == EAGAIN, "write to the tool end failed: %s", strerror(errno));
        struct pollfd pfd = {fd, POLLOUT, 0};
        FUZZ_CHECK(poll(&pfd, 1, kBoundMs) == 1,
                   "the pump stopped reading after %zu of %zu bytes (pump ended: %d)", done, s.size(),
                   fuzz_log_seen("Process tool OUT !!!"));
    }
}

Bytes drain(int fd) {
    Bytes rest;
    uint8_t buf[256];
    ssize_t n;
    while ((n = recv(fd, buf, sizeof(buf), MSG_DONTWAIT)) > 0) rest.insert(rest.end(), buf, buf + n);
    return rest;
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) return 0;
    size_t chunk = data[0];
    Bytes stream(data + 1, data + size);
    Expected want = reference_parse(stream);
    Bytes written(stream.begin(), stream.begin() + std::min(stream.size(), want.stop + kTailAfterStop));

    fuzz_log_reset();
    android::sp<FakeHal> hal = new FakeHal();
    hal->registerDefault();
    hidl_client_init();
    FUZZ_CHECK(bt_fd >= 0, "no session opened");

    write_stream(bt_fd, written, chunk);
    hidl_client_close_tool_end();
    FUZZ_CHECK(fuzz_log_wait("Process tool OUT !!!", kBoundMs), "the pump did not end");

    std::vector<SentPacket> got = hal->sent();
    FUZZ_CHECK(got.size() == want.forwarded.size(), "%zu packets forwarded, %zu expected", got.size(),
               want.forwarded.size());
    for (size_t i = 0; i < got.size(); ++i) {
        FUZZ_CHECK(got[i].type == want.forwarded[i].type && got[i].bytes == want.forwarded[i].bytes,
                   "packet %zu differs (type %d, %zu bytes)", i, got[i].type, got[i].bytes.size());
    }
    Bytes unread = drain(server_fd);
    Bytes tail(written.begin() + std::min(written.size(), want.stop), written.end());
    FUZZ_CHECK(unread == tail, "%zu bytes left unread, %zu expected", unread.size(), tail.size());
    if (want.bad_type) {
        FUZZ_CHECK(fuzz_log_seen("process_tool_data: Unsupported preamble_len packet type " +
                                 std::to_string(stream[want.stop - 1])),
                   "no unsupported-type line");
    }

    hidl_client_close();
    FUZZ_CHECK(!hal->sentAfterClose(), "a packet reached the HAL after its close");
    FakeHal::unregisterDefault();
    return 0;
}
