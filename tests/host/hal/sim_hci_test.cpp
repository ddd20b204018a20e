// The in-process simulated controller service: callbacks on its own thread,
// answers in order, settings from the environment, one air per process.
#include "host/hal/sim_hci.h"

#include <stdlib.h>

#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"

using android::sp;
using android::hardware::hidl_vec;

namespace {

class SimHciTest : public ::testing::Test {
  protected:
    void SetUp() override { threads_before = countThreads(); }
    void TearDown() override {
        for (auto& s : services) s.hci->close();
        services.clear();
        unsetenv("HALVENOR_SIM_REFTX");
        unsetenv("HALVENOR_SIM_LOSS");
        EXPECT_LE(settledThreadCount(threads_before), threads_before) << "event threads joined";
    }
    // A started default service (HALVENOR_HCI unset) and its callbacks.
    sp<RecordingCallbacks> start() {
        services.push_back(startHci(nullptr));
        return services.back().callbacks;
    }
    // Sends a command on service i and returns the event it got back.
    Bytes command(size_t i, const Bytes& cmd) { return commandEvent(services[i], cmd); }
    int rxCountOver(size_t i, int ms) {
        command(i, {0x1D, 0x20, 0x01, 0x13});
        std::this_thread::sleep_for(std::chrono::milliseconds(ms));  // time on the air, not a sync
        Bytes end = command(i, {0x1F, 0x20, 0x00});
        return end.size() == 8 ? end[6] | (end[7] << 8) : -1;
    }

    std::vector<StartedHci> services;
    int threads_before = 0;
};

TEST_F(SimHciTest, CallbacksRunOnServiceThreadNotCaller) {
    sp<RecordingCallbacks> cb = start();
    EXPECT_EQ((Bytes{0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00}), command(0, {0x03, 0x0C, 0x00}));
    for (auto id : cb->callbackThreads()) EXPECT_NE(std::this_thread::get_id(), id);
    EXPECT_EQ(1, cb->initCount());
}

TEST_F(SimHciTest, AnswersCommandsInOrder) {
    sp<RecordingCallbacks> cb = start();
    for (int i = 0; i < 50; ++i) {
        services[0].hci->sendHciCommand(hidl_vec<uint8_t>({static_cast<uint8_t>(i), 0x10, 0x00}));
    }
    ASSERT_TRUE(cb->waitForPackets(50));
    auto packets = cb->packets();
    for (int i = 0; i < 50; ++i) EXPECT_EQ(i, packets[i].bytes[3]) << "answer " << i;
}

TEST_F(SimHciTest, ReferenceTransmitterCanBeTurnedOff) {
    setenv("HALVENOR_SIM_REFTX", "0", 1);
    start();
    EXPECT_EQ(0, rxCountOver(0, 50));
}

TEST_F(SimHciTest, FullLossReceivesNothing) {
    setenv("HALVENOR_SIM_LOSS", "1", 1);
    start();
    EXPECT_EQ(0, rxCountOver(0, 50));
}

TEST_F(SimHciTest, ServicesOfOneProcessShareTheAir) {
    setenv("HALVENOR_SIM_REFTX", "0", 1);
    start();
    start();
    command(0, {0x1E, 0x20, 0x03, 0x13, 0x25, 0x00});
    EXPECT_GT(rxCountOver(1, 50), 0);
}

TEST_F(SimHciTest, CloseEndsRunningTransmitter) {
    setenv("HALVENOR_SIM_REFTX", "0", 1);
    start();
    start();
    command(0, {0x1E, 0x20, 0x03, 0x13, 0x25, 0x00});
    services[0].hci->close();
    EXPECT_EQ(0, rxCountOver(1, 50));
}

}  // namespace
