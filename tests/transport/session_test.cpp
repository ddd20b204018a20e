// HAL client session against a scripted HAL: opening, the callbacks' bytes on
// the tool end, failures and time-outs, closing and reopening.
#include "transport/session.h"

#include <poll.h>
#include <stdlib.h>
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

class SessionTest : public ::testing::Test {
  protected:
    void SetUp() override {
        fds_before = countOpenFds();
        threads_before = countThreads();
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        hidl_client_release_service("test");
        FakeHal::unregisterDefault();
        EXPECT_EQ(fds_before, countOpenFds());
        EXPECT_LE(settledThreadCount(threads_before), threads_before);
    }
    sp<FakeHal> installHal(FakeHal::InitMode mode = FakeHal::InitMode::Sync,
                           HalStatus status = HalStatus::SUCCESS) {
        sp<FakeHal> hal = new FakeHal(mode, status);
        hal->registerDefault();
        return hal;
    }

    LogCapture log;
    int fds_before = 0;
    int threads_before = 0;
};

TEST_F(SessionTest, OpeningHandsOutTheToolEnd) {
    sp<FakeHal> hal = installHal();
    cmd_test_end_flag = 1;
    hidl_client_init();

    EXPECT_GE(bt_fd, 0);
    EXPECT_EQ(bt_fd, client_fd);
    EXPECT_GE(server_fd, 0);
    EXPECT_NE(server_fd, client_fd);
    EXPECT_EQ(0, cmd_test_end_flag);
    EXPECT_EQ(1, hal->initializeCalls());
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "hidl_client_init: use HIDL"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "init cmd_test_end_flag = false"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "hidl_client_initialize: Initialize the HIDL with Mode BT"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "hidl_client_initialize: HIDL = true"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "Server FD=" + std::to_string(server_fd) +
                                                        "  Client FD: " + std::to_string(client_fd) + "\n"));
    EXPECT_TRUE(log.containsFragment("IBluetoothHci::getService() returned 0x"));
    EXPECT_TRUE(log.containsFragment("(local)"));
}

TEST_F(SessionTest, NullToolDescriptorAsksForNoService) {
    sp<FakeHal> hal = installHal();
    cmd_test_end_flag = 1;
    EXPECT_FALSE(hidl_client_initialize(0, nullptr));
    EXPECT_EQ(0, cmd_test_end_flag);
    EXPECT_EQ(0, hal->initializeCalls());
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "hidl_client_initialize: Invalid tool FD"));
    EXPECT_EQ(-1, server_fd);
}

TEST_F(SessionTest, MissingServiceLeavesNoSession) {
    setenv("HALVENOR_HCI", "none", 1);  // the host's stand-in for a device without the HAL
    hidl_client_init();
    unsetenv("HALVENOR_HCI");
    EXPECT_EQ(-1, bt_fd);
    EXPECT_EQ(nullptr, btHci.get());
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "Unable to initialize the HIDL"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "hidl_client_init: HIDL client initialization failed \n"));
}

TEST_F(SessionTest, FailedInitialisationFromEitherThreadFailsTheOpening) {
    for (auto mode : {FakeHal::InitMode::Sync, FakeHal::InitMode::Async}) {
        log.clear();
        sp<FakeHal> hal = installHal(mode, HalStatus::INITIALIZATION_ERROR);
        hidl_client_init();
        EXPECT_EQ(-1, bt_fd);
        EXPECT_EQ(-1, server_fd);
        EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "Error in HIDL initialization"));
        EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR,
                                 "hidl_client_initialize: HIDL failed to initialize, sending invalid FD to tool"));
        // The initialised HAL was closed and given back: nothing is left to end.
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(nullptr, btHci.get());

        log.clear();
        hidl_client_close();
        EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "hidl_client_close: Hidl init = false"));
        EXPECT_EQ(1u, log.lines().size());
    }
}

TEST_F(SessionTest, AnswerFromAnotherThreadCompletesTheOpening) {
    sp<FakeHal> hal = installHal(FakeHal::InitMode::Async);
    hidl_client_init();
    EXPECT_GE(bt_fd, 0);
}

// A HAL that never answers must not hang the Java thread, and its late
// answer must not be taken as the answer to a later opening.
TEST_F(SessionTest, UnansweredInitialisationTimesOutAndItsLateAnswerIsIgnored) {
    sp<FakeHal> silent = installHal(FakeHal::InitMode::Never);
    auto start = std::chrono::steady_clock::now();
    hidl_client_init();
    auto waited = std::chrono::steady_clock::now() - start;
    EXPECT_EQ(-1, bt_fd);
    EXPECT_LT(waited, std::chrono::seconds(30));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "hidl_client_initialize: no answer from the HAL within 10000 ms"));
    EXPECT_EQ(1, silent->closeCalls());
    EXPECT_EQ(nullptr, btHci.get());
    sp<FakeHal::Callbacks> stale = silent->callbacks();

    sp<FakeHal> next = installHal(FakeHal::InitMode::Never);
    int fd = -1;
    bool opened = true;
    std::thread opener([&] { opened = hidl_client_initialize(0, &fd); });
    ASSERT_TRUE(next->waitForInitialize());
    stale->initializationComplete(HalStatus::SUCCESS);
    EXPECT_TRUE(log.waitFor(ANDROID_LOG_ERROR, "initializationComplete: answer to an abandoned opening ignored"));
    next->callbacks()->initializationComplete(HalStatus::INITIALIZATION_ERROR);
    opener.join();
    EXPECT_FALSE(opened);
    EXPECT_EQ(-1, fd);
}

TEST_F(SessionTest, CallbacksWriteTypedPacketsToTheToolEnd) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);

    hal->deliverEvent({0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}), readBytes(bt_fd, 7));
    hal->deliverAcl({0x01, 0x20, 0x02, 0x00, 0xAA, 0xBB});
    EXPECT_EQ((Bytes{0x02, 0x01, 0x20, 0x02, 0x00, 0xAA, 0xBB}), readBytes(bt_fd, 7));
    hal->deliverSco({0x01, 0x00, 0x01, 0x99});
    EXPECT_EQ((Bytes{0x03, 0x01, 0x00, 0x01, 0x99}), readBytes(bt_fd, 5));
}

// Events from several HAL threads at once: each arrives whole, and each
// thread's events keep their order.
TEST_F(SessionTest, ConcurrentCallbacksNeverInterleavePackets) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);
    const int kThreads = 4;
    const int kEvents = 300;

    std::map<int, int> next_seq;
    int bad = 0;
    int total = 0;
    std::thread reader([&] {
        while (total < kThreads * kEvents) {
            Bytes head = readBytes(bt_fd, 3);
            if (head.size() != 3 || head[0] != 0x04 || head[1] != 0xFF) { ++bad; return; }
            Bytes body = readBytes(bt_fd, head[2]);
            if (body.size() != head[2]) { ++bad; return; }
            int thread = body[0];
            int seq = body[1] | (body[2] << 8);
            for (size_t i = 3; i < body.size(); ++i) bad += body[i] != static_cast<uint8_t>(thread);
            bad += seq != next_seq[thread]++;
            ++total;
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
                ev[2] = static_cast<uint8_t>(t);
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

TEST_F(SessionTest, CallbackWithoutBridgeLogsTheFailedWrite) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    sp<FakeHal::Callbacks> callbacks = hal->callbacks();
    hidl_client_close_tool_end();
    hidl_client_close();
    log.clear();

    callbacks->hciEventReceived(android::hardware::hidl_vec<uint8_t>(Bytes{0x0E, 0x01, 0x00}));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_write: Write error: (Bad file descriptor)"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "hciEventReceived: failed to write event to tool socket"));
}

// A late callback must not write into whatever descriptor took over the
// number of the closed bridge end.
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
    int other = reused[0] == old_server ? reused[1] : reused[0];
    callbacks->hciEventReceived(android::hardware::hidl_vec<uint8_t>(Bytes{0x0E, 0x01, 0x00}));
    EXPECT_TRUE(staysQuiet(other, 50));
    close(reused[0]);
    close(reused[1]);
}

TEST_F(SessionTest, CloseJoinsThePumpAndReleasesTheService) {
    sp<FakeHal> hal = installHal();
    hidl_client_init();
    log.clear();
    hidl_client_close_tool_end();
    hidl_client_close();

    EXPECT_EQ(-1, server_fd);
    EXPECT_EQ(nullptr, btHci.get());
    EXPECT_EQ(1, hal->closeCalls());
    EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "hidl_client_close: Close HIDL with Mode BT"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "Process tool OUT !!!"));
    EXPECT_FALSE(log.containsFragment("HIDL daemon is dead"));

    // A second close has no pump to join and no service to close.
    hidl_client_close();
    EXPECT_EQ(1, hal->closeCalls());
}

// Closing while the engine is still writing: the pump is joined before the
// service is closed, so nothing reaches a closed service.
TEST_F(SessionTest, CloseDuringTrafficNeverForwardsToAClosedService) {
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
        EXPECT_FALSE(hal->sentAfterClose());
        EXPECT_EQ(1, hal->closeCalls());
        hidl_client_close_tool_end();
    }
}

TEST_F(SessionTest, ReopeningEndsTheEarlierSessionFirst) {
    sp<FakeHal> first = installHal();
    hidl_client_init();
    int fds_open = countOpenFds();
    int threads_open = countThreads();

    sp<FakeHal> second = installHal();
    int tool = -1;
    ASSERT_TRUE(hidl_client_initialize(0, &tool));
    EXPECT_EQ(1, first->closeCalls());
    EXPECT_EQ(fds_open, countOpenFds());
    EXPECT_LE(settledThreadCount(threads_open), threads_open);
    EXPECT_EQ(-1, bt_fd);  // the earlier tool end is gone

    second->deliverEvent({0x0E, 0x01, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x01, 0x00}), readBytes(tool, 4));
}

TEST_F(SessionTest, ThousandCyclesLeaveDescriptorsAndThreadsAsTheyWere) {
    sp<FakeHal> hal = installHal(FakeHal::InitMode::Async);
    for (int i = 0; i < 1000; ++i) {
        hidl_client_init();
        ASSERT_GE(bt_fd, 0) << "cycle " << i;
        hidl_client_close_tool_end();
        hidl_client_close();
    }
    EXPECT_EQ(1000, hal->closeCalls());
}

}  // namespace
