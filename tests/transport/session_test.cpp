// HAL client session against a scripted HAL: opening and its failures, the
// callbacks' bytes on the tool end, closing and reopening.
#include "transport/session.h"

#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <map>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"

using android::sp;
using Bytes = std::vector<uint8_t>;
using HalStatus = android::hardware::bluetooth::V1_0::Status;

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

class SessionTest : public ::testing::Test {
  protected: void SetUp() override {
        fds_before = countOpenFds();
        threads_before = countThreads();
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
        EXPECT_EQ(fds_before, countOpenFds());
        EXPECT_LE(settledThreadCount(threads_before), threads_before);
    }
    sp<FakeHal> installHal(FakeHal::InitMode mode = FakeHal::InitMode::Sync, HalStatus status = HalStatus::SUCCESS) {
        sp<FakeHal> hal = new FakeHal(mode, status);
        hal->registerDefault();
        return hal;
    }

    LogCapture log;
    int fds_before = 0;
    int threads_before = 0;
};

TEST_F(SessionTest, OpeningHandsOutTheToolEndAndCallbacksWriteTypedPackets) {
    sp<FakeHal> hal = installHal(FakeHal::InitMode::Async);
    cmd_test_end_flag = 1;
    hidl_client_init();

    ASSERT_GE(bt_fd, 0);
    EXPECT_EQ(bt_fd, client_fd);
    EXPECT_NE(server_fd, client_fd);
    EXPECT_EQ(0, cmd_test_end_flag);
    for (const char* line : {"hidl_client_init: use HIDL", "hidl_client_initialize: HIDL = true"}) {
        EXPECT_TRUE(log.contains(ERROR, line)) << line;
    }
    EXPECT_TRUE(log.contains(INFO, "init cmd_test_end_flag = false"));
    EXPECT_TRUE(log.contains(ERROR, "Server FD=" + std::to_string(server_fd) + "  Client FD: " +
                                            std::to_string(client_fd) + "\n"));
    // Between them, packets whose size disagrees with their own header: each would
    // shift every packet after it, so each is dropped with its line.
    hal->deliverEvent({0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00});
    hal->deliverEvent({0x0E, 0x06, 0x01, 0x03, 0x0C, 0x00});
    hal->deliverEvent({});
    hal->deliverAcl({0x01, 0x20, 0x01, 0x00, 0xAA});
    hal->deliverAcl({0x01, 0x20, 0x05, 0x00, 0xAA});
    hal->deliverSco({0x01, 0x00, 0x01});
    hal->deliverSco({0x01, 0x00, 0x01, 0x99});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00, 0x02, 0x01, 0x20, 0x01, 0x00, 0xAA, 0x03, 0x01,
                     0x00, 0x01, 0x99}),
              readBytes(bt_fd, 18));
    EXPECT_TRUE(staysQuiet(bt_fd, 50));
    for (const char* line : {"hciEventReceived: packet of 6 bytes disagrees with its header, dropped",
                             "hciEventReceived: packet of 0 bytes disagrees with its header, dropped",
                             "aclDataReceived: packet of 5 bytes disagrees with its header, dropped",
                             "scoDataReceived: packet of 3 bytes disagrees with its header, dropped"}) {
        EXPECT_TRUE(log.contains(ERROR, line)) << line;
    }
}

// A failed opening leaves nothing open: no session, and no initialised HAL.
TEST_F(SessionTest, FailedOpeningsLeaveNoSessionAndNoHal) {
    for (auto mode : {FakeHal::InitMode::Sync, FakeHal::InitMode::Async}) {  // answered on either thread
        log.clear();
        sp<FakeHal> hal = installHal(mode, HalStatus::INITIALIZATION_ERROR);
        hidl_client_init();
        EXPECT_EQ(-1, bt_fd);
        EXPECT_EQ(-1, server_fd);
        EXPECT_TRUE(log.contains(ERROR, "Error in HIDL initialization"));
        EXPECT_TRUE(log.contains(ERROR, "hidl_client_initialize: HIDL failed to initialize, sending invalid FD to tool"));
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(nullptr, btHci.get());
        log.clear();
        hidl_client_close();
        EXPECT_EQ(1u, log.lines().size()) << "only: Hidl init = false";
    }
}

// A HAL that never answers must not hang the opening, which then gives the
// HAL back; its late answer must not complete a later opening.
TEST_F(SessionTest, LateAnswerToAnAbandonedOpeningIsIgnored) {
    sp<FakeHal> first = installHal(FakeHal::InitMode::Never);
    hidl_client_init();  // gives up after its 10 s bound
    EXPECT_TRUE(log.contains(ERROR, "hidl_client_initialize: no answer from the HAL within 10000 ms"));
    EXPECT_EQ(1, first->closeCalls());
    EXPECT_EQ(nullptr, btHci.get());
    sp<FakeHal> next = installHal(FakeHal::InitMode::Never);
    int fd = -1;
    bool opened = true;
    std::thread opener([&] { opened = hidl_client_initialize(0, &fd); });
    ASSERT_TRUE(next->waitForInitialize());
    first->callbacks()->initializationComplete(HalStatus::SUCCESS);
    EXPECT_TRUE(log.waitFor(ERROR, "initializationComplete: answer to an abandoned opening ignored"));
    next->callbacks()->initializationComplete(HalStatus::INITIALIZATION_ERROR);
    opener.join();
    EXPECT_FALSE(opened);
}

// Events from several HAL threads at once: each arrives whole, and each
// thread's events keep their order.
TEST_F(SessionTest, ConcurrentCallbacksNeverInterleavePackets) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);
    const int kThreads = 4, kEvents = 300;
    std::map<int, int> next_seq;
    int bad = 0, total = 0;
    std::thread reader([&] {
        for (; total < kThreads * kEvents; ++total) {
            Bytes head = readBytes(bt_fd, 3);
            Bytes body = head.size() == 3 ? readBytes(bt_fd, head[2]) : Bytes();
            if (head.size() != 3 || head[0] != 0x04 || body.size() != head[2]) return (void)++bad;
            for (size_t i = 3; i < body.size(); ++i) bad += body[i] != body[0];
            bad += (body[1] | (body[2] << 8)) != next_seq[body[0]]++;
        }
    });
    std::vector<std::thread> senders;
    for (int t = 0; t < kThreads; ++t) {
        senders.emplace_back([&, t] {
            for (int i = 0; i < kEvents; ++i) {
                uint8_t len = static_cast<uint8_t>(3 + (i * 37 + t * 11) % 250);
                Bytes ev(2 + len, static_cast<uint8_t>(t));
                ev[0] = 0xFF;
                ev[1] = len;
                ev[3] = static_cast<uint8_t>(i & 0xFF);
                ev[4] = static_cast<uint8_t>(i >> 8);
                hal->deliverEvent(ev);
            }
        });
    }
    for (auto& s : senders) s.join();
    reader.join();
    EXPECT_EQ(0, bad);
    EXPECT_EQ(kThreads * kEvents, total);
}

// A late callback must not write into whatever took over the number of the
// closed bridge end.
TEST_F(SessionTest, LateCallbackNeverWritesIntoAReusedDescriptor) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    int old_server = server_fd;
    sp<FakeHal::Callbacks> callbacks = hal->callbacks();
    hidl_client_close_tool_end();
    hidl_client_close();
    int reused[2];
    ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, reused));
    ASSERT_TRUE(reused[0] == old_server || reused[1] == old_server);
    callbacks->hciEventReceived(android::hardware::hidl_vec<uint8_t>(Bytes{0x0E, 0x01, 0x00}));
    EXPECT_TRUE(staysQuiet(reused[0] == old_server ? reused[1] : reused[0], 50));
    EXPECT_TRUE(log.contains(ERROR, "hciEventReceived: failed to write event to tool socket"));
    close(reused[0]);
    close(reused[1]);
}

// Closing while the engine writes: the pump is joined before the service is
// closed, so nothing reaches a closed service; a second close does nothing.
TEST_F(SessionTest, CloseJoinsThePumpBeforeTheServiceIsClosed) {
    for (int round = 0; round < 20; ++round) {
        sp<FakeHal> hal = installHal();
        hidl_client_init();
        ASSERT_GE(client_fd, 0);
        std::atomic<bool> stop{false};
        int tool = client_fd;
        std::thread writer([&] {
            const uint8_t reset[] = {0x01, 0x03, 0x0C, 0x00};
            while (!stop && send(tool, reset, sizeof(reset), MSG_DONTWAIT | MSG_NOSIGNAL) >= 0) {
            }
        });
        ASSERT_TRUE(hal->waitForSent(3));
        hidl_client_close();
        stop = true;
        writer.join();
        hidl_client_close();
        EXPECT_FALSE(hal->sentAfterClose());
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(-1, server_fd);
        EXPECT_EQ(nullptr, btHci.get());
        hidl_client_close_tool_end();
    }
    EXPECT_TRUE(log.contains(INFO, "hidl_client_close: Close HIDL with Mode BT"));
}

TEST_F(SessionTest, ReopeningEndsTheEarlierSessionFirst) {
    sp<FakeHal> first = installHal();
    hidl_client_init();
    int fds_open = countOpenFds();
    sp<FakeHal> second = installHal();
    int tool = -1;
    ASSERT_TRUE(hidl_client_initialize(0, &tool));
    EXPECT_EQ(1, first->closeCalls());
    EXPECT_EQ(fds_open, countOpenFds());
    EXPECT_EQ(-1, bt_fd);  // the earlier tool end is gone
    second->deliverEvent({0x0E, 0x01, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x01, 0x00}), readBytes(tool, 4));
}

}  // namespace
