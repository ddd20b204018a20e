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
#include "fuzz/h4_reference.h"
#include "tests/support/log_capture.h"
#include "tests/support/fake_hal.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

namespace {

// Keeps the library's many lines off stderr and lets the checks look them up.
LogCapture g_log;

// Bytes that may follow an unsupported type byte: few enough to fit the
// socket buffer whether or not the pump still reads.
const size_t kTailAfterStop = 64;
// Generous: on a loaded machine a sanitized pump can lag far behind the writer.
const int kBoundMs = 20000;

// What the pump must do with a stream: forward its whole packets of types 1
// to 3 and consume everything up to and including a bad type byte.
struct Expected {
    std::vector<SentPacket> forwarded;
    size_t stop = 0;
    bool bad_type = false;
};

Expected expected_of(const Bytes& s) {
    ReferenceReading r = read_h4_reference(s);
    Expected e;
    for (const auto& p : r.packets) {
        if (p.type != 4) e.forwarded.push_back({p.type, p.bytes});
    }
    e.bad_type = r.bad_type;
    e.stop = r.bad_type ? r.bad_at + 1 : s.size();
    return e;
}

// Writes everything, in chunks of `chunk` bytes (0: at once); a pump that
// stopped reading turns into a failed check, not a hang. A pump that ended
// shuts its end, so the rest cannot be written: the bytes written are returned.
size_t write_stream(int fd, const Bytes& s, size_t chunk) {
    fcntl(fd, F_SETFL, fcntl(fd, F_GETFL) | O_NONBLOCK);
    size_t done = 0;
    while (done < s.size()) {
        size_t want = chunk == 0 ? s.size() - done : std::min(chunk, s.size() - done);
        ssize_t n = send(fd, s.data() + done, want, MSG_NOSIGNAL);
        if (n > 0) {
            done += static_cast<size_t>(n);
            continue;
        }
        if (n < 0 && errno == EPIPE) {
            FUZZ_CHECK(g_log.waitFor(ANDROID_LOG_ERROR, "Process tool OUT !!!", kBoundMs), "tool end shut, pump running");
            return done;
        }
        FUZZ_CHECK(n < 0 && errno == EAGAIN, "write to the tool end failed: %s", strerror(errno));
        struct pollfd pfd = {fd, POLLOUT, 0};
        FUZZ_CHECK(poll(&pfd, 1, kBoundMs) == 1,
                   "the pump stopped reading after %zu of %zu bytes (pump ended: %d)", done, s.size(),
                   g_log.contains(ANDROID_LOG_ERROR, "Process tool OUT !!!"));
    }
    return done;
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
    Expected want = expected_of(stream);
    Bytes written(stream.begin(), stream.begin() + std::min(stream.size(), want.stop + kTailAfterStop));

    g_log.clear();
    android::sp<FakeHal> hal = new FakeHal();
    hal->registerDefault();
    hidl_client_init();
    FUZZ_CHECK(bt_fd >= 0, "no session opened");

    written.resize(write_stream(bt_fd, written, chunk));
    FUZZ_CHECK(written.size() >= std::min(stream.size(), want.stop), "the pump ended before the stop");
    hidl_client_close_tool_end();
    FUZZ_CHECK(g_log.waitFor(ANDROID_LOG_ERROR, "Process tool OUT !!!", kBoundMs), "the pump did not end");

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
        FUZZ_CHECK(g_log.contains(ANDROID_LOG_ERROR, "process_tool_data: Unsupported preamble_len packet type " +
                                 std::to_string(stream[want.stop - 1])),
                   "no unsupported-type line");
    }

    hidl_client_close();
    FUZZ_CHECK(!hal->sentAfterClose(), "a packet reached the HAL after its close");
    FakeHal::unregisterDefault();
    return 0;
}
