// The pump through an opened session: bytes written to the tool end and what
// the HAL receives; how the pump ends.
#include "transport/pump.h"

#include <fcntl.h>
#include <poll.h>
#include <sys/socket.h>
#include <sys/resource.h>
#include <sys/times.h>
#include <unistd.h>

#include <vector>

#include <gtest/gtest.h>

#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;
using Bytes = std::vector<uint8_t>;

namespace {

const int ERROR = ANDROID_LOG_ERROR;

class PumpTest : public ::testing::Test {
  protected: void SetUp() override {
        hal = new FakeHal();
        hal->registerDefault();
        hidl_client_init();
        ASSERT_GE(bt_fd, 0);
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
    }
    sp<FakeHal> hal;
    LogCapture log;
};

// Written all at once and then a byte at a time: each packet reaches the HAL
// whole, without its type byte, by the send of its type; events are dropped.
TEST_F(PumpTest, ForwardsEachPacketWholeWithoutItsTypeByte) {
    Bytes acl = {0x02, 0x01, 0x20, 0x00, 0x01};
    for (int i = 0; i < 256; ++i) acl.push_back(static_cast<uint8_t>(i));
    const struct {
        Bytes written;
        uint8_t type;
    } cases[] = {
            {{0x01, 0x03, 0x0C, 0x00}, 1}, {{0x04, 0x0E, 0x00}, 0},  // an event from the tool: dropped
            {{0x01, 0x33, 0x20, 0x03, 0x13, 0x02, 0x00}, 1}, {acl, 2}, {{0x03, 0x01, 0x00, 0x02, 0xAA, 0xBB}, 3},
    };
    Bytes stream;
    for (const auto& c : cases) stream.insert(stream.end(), c.written.begin(), c.written.end());
    writeAll(bt_fd, stream);
    for (uint8_t b : stream) writeAll(bt_fd, {b});
    ASSERT_TRUE(hal->waitForSent(8));
    auto sent = hal->sent();
    ASSERT_EQ(8u, sent.size());
    for (size_t i = 0, at = 0; i < 2 * std::size(cases); ++i) {
        const auto& c = cases[i % std::size(cases)];
        if (c.type == 0) continue;
        EXPECT_EQ(c.type, sent[at].type) << i;
        EXPECT_EQ(Bytes(c.written.begin() + 1, c.written.end()), sent[at++].bytes) << i;
    }
    EXPECT_TRUE(log.contains(ERROR, "process_tool_data: Unsupported packet type: 4"));
    EXPECT_TRUE(log.contains(ERROR, "safe_read: No data to read"));
}

// However the pump ends, it says why, forwards no piece of a packet, and
// shuts its end so that the engine sees the end of the stream at once.
TEST_F(PumpTest, EachEndIsLoggedAndShutsTheBridge) {
    const struct {
        Bytes written;
        bool closeToolEnd;
        const char* line;
    } cases[] = {
            {{0x00, 0x01, 0x03, 0x0C, 0x00}, false, "process_tool_data: Unsupported preamble_len packet type 0"},
            {{0x05, 0x01, 0x03, 0x0C, 0x00}, false, "process_tool_data: Unsupported preamble_len packet type 5"},
            {{0x01, 0x33, 0x20, 0x03, 0x13}, true, "process_tool_data: failed to read the packet from tool"},
            {{0x01, 0x33}, true, "process_tool_data: failed to read the packet from tools"},  // cut in its header
            {{}, true, "process_tool_data: failed to read the packet from tools"},
    };
    for (const auto& c : cases) {
        log.clear();
        writeAll(bt_fd, c.written);
        if (c.closeToolEnd) {
            hidl_client_close_tool_end();
        } else {
            struct pollfd pfd = {bt_fd, POLLIN, 0};
            char byte;
            EXPECT_TRUE(poll(&pfd, 1, 2000) == 1 && recv(bt_fd, &byte, 1, MSG_DONTWAIT) == 0) << c.line << ": shut";
        }
        ASSERT_TRUE(log.waitFor(ERROR, "Process tool OUT !!!")) << c.line;
        EXPECT_EQ(log.count(ERROR, c.line), 1) << c.line;
        EXPECT_TRUE(hal->sent().empty()) << c.line;
        hidl_client_close_tool_end();
        hidl_client_close();
        hidl_client_init();
    }
}

// Named for the ThreadSanitizer suppression of this deliberate race.
__attribute__((noinline)) void closeUnderThePump(int fd) { close(fd); }

// A bridge end closed under the pump (its number no longer names a
// descriptor) fails the wait; the pump must not spin on it.
TEST_F(PumpTest, WaitOnAClosedBridgeEndEndsThePump) {
    closeUnderThePump(server_fd);
    EXPECT_TRUE(log.waitFor(ERROR, "Process tool OUT !!!"));
    EXPECT_TRUE(log.contains(ERROR, "select failed, Error: Bad file descriptor (9)\n"));
    server_fd = -1;  // closed above: the session must not close the number again
}

// The wait's time-out must not wear down to zero: an idle pump sleeps, and
// descriptors above select's 1024 work.
TEST_F(PumpTest, IdlesWithoutSpinningOnDescriptorsAbove1024) {
    hidl_client_close_tool_end();
    hidl_client_close();
    struct rlimit limit;
    getrlimit(RLIMIT_NOFILE, &limit);
    limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 2048);
    ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &limit));
    std::vector<int> fillers;
    int fd;
    while ((fd = ::open("/dev/null", O_RDONLY)) >= 0 && fd < 1030) fillers.push_back(fd);
    fillers.push_back(fd);
    hidl_client_init();
    EXPECT_GE(server_fd, 1024);

    struct tms before, after;
    times(&before);
    EXPECT_FALSE(log.waitFor(ANDROID_LOG_INFO, "never logged", 1600));  // three waits' worth of idling
    times(&after);
    EXPECT_LT(after.tms_utime + after.tms_stime - before.tms_utime - before.tms_stime, sysconf(_SC_CLK_TCK) / 5);
    EXPECT_EQ(500000, timeout.tv_usec);
    writeAll(bt_fd, {0x01, 0x03, 0x0C, 0x00});
    EXPECT_TRUE(hal->waitForSent(1));
    hal->deliverEvent({0x0E, 0x01, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x01, 0x00}), readBytes(bt_fd, 4));
    for (int f : fillers) close(f);
}

}  // namespace
