// Faults a HAL or a controller can bring about, through the engine's entry
// points: each must end within its bound with its log line, and leave the
// library usable for the next session. Printed times go to RELIABILITY.md.
#include <sys/socket.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <thread>

#include <gtest/gtest.h>

#include "engine/test_mode.h"
#include "jni/binding.h"
#include "tests/engine/hal_session.h"
#include "tests/support/process.h"

using android::sp;

namespace {

const LogCapture kLog;  // the cases' view of the lines the fixture's capture holds
const Bytes kTestEnd = {0x1F, 0x20, 0x00};
const Bytes kReset = {0x03, 0x0C, 0x00};

struct FaultCase {
    const char* name;
    int bound_ms;
    const char* log_line;  // a line the fault must leave, exactly
    std::function<void(sp<FakeHal>&, std::vector<std::thread>&)> run;
};

class FaultInjectionTest : public HalSessionTest, public ::testing::WithParamInterface<FaultCase> {};

TEST_P(FaultInjectionTest, EndsWithinItsBoundAndLeavesTheLibraryUsable) {
    const FaultCase& c = GetParam();
    std::vector<std::thread> spawned;
    auto start = std::chrono::steady_clock::now();
    c.run(hal_, spawned);
    auto took = std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start);
    for (auto& t : spawned) t.join();
    EXPECT_LE(took.count(), c.bound_ms) << c.name;
    EXPECT_TRUE(log_.containsFragment(c.log_line)) << c.name << ": no line \"" << c.log_line << "\"";
    printf("[ fault    ] %-34s %6lld ms (bound %d ms)\n", c.name, static_cast<long long>(took.count()), c.bound_ms);

    // A well-behaved controller then gets a whole exchange with its count.
    hidl_client_close_tool_end();
    hidl_client_close();
    hal_ = new FakeHal();
    hal_->onSend = [](HalScript& h, const SentPacket& p) {
        uint16_t opcode = opcodeOf(p.bytes);
        h.deliverEvent(opcode == 0x201F ? commandComplete(opcode, {0x00, 0x2A, 0x00}) : commandComplete(opcode));
    };
    hal_->registerDefault();
    log_.clear();
    sendBleTestCommand(22440, 1);
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(1, log_.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42")) << c.name;
    EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 3000")) << c.name;
}

class NoticelessHal : public FakeHal {
  public:
    Return<bool> linkToDeath(const sp<android::hardware::hidl_death_recipient>&, uint64_t) override { return false; }
};

void install(sp<FakeHal>& hal, FakeHal* replacement) {
    replacement->onSend = hal->onSend;
    hal = replacement;
    hal->registerDefault();
}

const FaultCase kFaults[] = {
        // Events the controller sends on its own, every 100 ms, and never the
        // reply: they must not keep the exchange past its time-out.
        {"unsolicited_events_no_reply", 3500, "read_incoming_events: timed out after 2000 ms waiting for the packet type",
         [](sp<FakeHal>& hal, std::vector<std::thread>& spawned) {
             hal->onSend = nullptr;
             auto done = std::make_shared<std::atomic<bool>>(false);
             sp<FakeHal> held = hal;
             spawned.emplace_back([held, done] {
                 held->waitForSent(1);
                 for (int i = 0; i < 50 && !*done; ++i) {
                     held->deliverEvent({0x3E, 0x03, 0x01, 0x2A, 0x00});
                     std::this_thread::sleep_for(std::chrono::milliseconds(100));
                 }
             });
             sendBleTestCommand(3000, 0);
             *done = true;
         }},
        // Events far beyond what the socket holds while nobody reads; the
        // session is then ended under the flood, whose events the Reset's
        // exchange reads and skips for at most one reply time-out.
        {"floods_events_nobody_reads", 5000, "hci_send_cmd_rawcmd: event 0x13 came before the command, skipped",
         [](sp<FakeHal>& hal, std::vector<std::thread>& spawned) {
             ASSERT_EQ(0, hci_enable_device_under_test_mode());
             auto delivered = std::make_shared<std::atomic<int>>(0);
             sp<FakeHal> held = hal;
             spawned.emplace_back([held, delivered] {
                 for (int i = 0; i < 50000; ++i, ++*delivered) held->deliverEvent({0x13, 0x05, 0x01, 0x01, 0x00, 0x01, 0x00});
             });
             ASSERT_TRUE(waitUntil([&] { return *delivered > 100; }));
             hci_disable_device_under_test_mode();
             EXPECT_EQ(commandsSent(*hal).back(), kReset);
         }},
        // A HAL that gives no death notice dies at the send: the pump's end
        // alone must end the exchange at once.
        {"hal_dies_without_notice", 1000, "sendBleTestCommand, command 22440 not answered return!!!",
         [](sp<FakeHal>& hal, std::vector<std::thread>&) {
             install(hal, new NoticelessHal());
             hal->dieAt(FakeHal::Call::Send);
             sendBleTestCommand(22440, 0);
         }},
        // destoryNative from another thread while a test end waits for a reply
        // that never comes: the exchange must end at once, not at its time-out.
        {"destroy_during_exchange", 1000, "sendBleTestCommand, command 3000 not answered return!!!",
         [](sp<FakeHal>& hal, std::vector<std::thread>& spawned) {
             hal->onSend = nullptr;
             spawned.emplace_back([] { sendBleTestCommand(3000, 0); });
             ASSERT_TRUE(hal->waitForSent(1));
             destoryNative(nullptr, nullptr);
             spawned.back().join();
             spawned.clear();
             EXPECT_EQ(commandsSent(*hal), std::vector<Bytes>{kTestEnd});
         }},
};

INSTANTIATE_TEST_SUITE_P(Faults, FaultInjectionTest, ::testing::ValuesIn(kFaults),
                         [](const ::testing::TestParamInfo<FaultCase>& info) { return std::string(info.param.name); });

}  // namespace
