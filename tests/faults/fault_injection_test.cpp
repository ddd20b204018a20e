// Fault injection through the engine's entry points against a scripted HAL:
// each fault must end within its bound with its log line, lose or corrupt no
// command that was sent, and leave the library usable for the next session.
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <chrono>
#include <functional>
#include <memory>
#include <mutex>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>
#include <hidl/HostServices.h>

#include "engine/test_mode.h"
#include "jni/binding.h"
#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;
using Bytes = std::vector<uint8_t>;
using HalStatus = android::hardware::bluetooth::V1_0::Status;

// This suite has no platform default service: a name nobody registered has
// no service at all, which is the "no HAL service" fault.
namespace android::hardware::host {
sp<bluetooth::V1_0::IBluetoothHci> createDefaultBluetoothHci(const std::string&) { return nullptr; }
}  // namespace android::hardware::host

namespace {

const uint16_t kTestEndOpcode = 0x201F;
const uint16_t kResetOpcode = 0x0C03;

uint16_t opcodeOf(const SentPacket& p) { return static_cast<uint16_t>(p.bytes[0] | (p.bytes[1] << 8)); }

// Command Complete with one credit and status 0; LE Test End's carries 42 packets.
Bytes commandComplete(uint16_t opcode) {
    Bytes e = {0x0E, 0x04, 0x01, static_cast<uint8_t>(opcode & 0xFF), static_cast<uint8_t>(opcode >> 8), 0x00};
    if (opcode == kTestEndOpcode) {
        e.push_back(42);
        e.push_back(0);
        e[1] = 6;
    }
    return e;
}

Bytes commandStatus(uint16_t opcode, uint8_t status) {
    return {0x0F, 0x04, status, 0x01, static_cast<uint8_t>(opcode & 0xFF), static_cast<uint8_t>(opcode >> 8)};
}

// A controller that answers every command at once.
void answerEveryCommand(FakeHal& hal, const SentPacket& p) {
    if (p.type == 1) hal.deliverEvent(commandComplete(opcodeOf(p)));
}

// What the engine writes for the Device Under Test entry, without type bytes.
const std::vector<Bytes> kDutEntry = {
        {0x03, 0x18, 0x00},
        {0x05, 0x0C, 0x03, 0x02, 0x00, 0x02},
        {0x1A, 0x0C, 0x01, 0x03},
        {0x20, 0x0C, 0x01, 0x00},
        {0x22, 0x0C, 0x01, 0x00},
};
const Bytes kTestEnd = {0x1F, 0x20, 0x00};
const Bytes kReset = {0x03, 0x0C, 0x00};

class FaultInjectionTest;

struct FaultCase {
    const char* name;
    int bound_ms;
    int priority;
    const char* log_line;  // the line the fault must leave, exactly
    std::function<void(FaultInjectionTest&)> run;
};

class FaultInjectionTest : public ::testing::TestWithParam<FaultCase> {
  public:
    sp<FakeHal> installHal(FakeHal::InitMode mode = FakeHal::InitMode::Sync,
                           HalStatus status = HalStatus::SUCCESS) {
        sp<FakeHal> hal = new FakeHal(mode, status);
        hal->registerDefault();
        return hal;
    }
    sp<FakeHal> installAnsweringHal() {
        sp<FakeHal> hal = installHal();
        hal->onSend = answerEveryCommand;
        return hal;
    }
    // The commands the HAL received, whole and in order, are exactly `want`.
    static void expectSent(FakeHal& hal, const std::vector<Bytes>& want) {
        auto sent = hal.sent();
        ASSERT_EQ(want.size(), sent.size());
        for (size_t i = 0; i < want.size(); ++i) {
            EXPECT_EQ(1, sent[i].type) << "packet " << i;
            EXPECT_EQ(want[i], sent[i].bytes) << "packet " << i;
        }
        EXPECT_FALSE(hal.sentAfterClose());
    }
    // A thread the case starts; joined before the library is checked.
    // Any thread may spawn (a HAL answering late does, from the pump).
    void spawn(std::function<void()> body) {
        std::lock_guard<std::mutex> guard(threads_lock_);
        threads_.emplace_back(std::move(body));
    }
    void joinSpawned() {
        std::vector<std::thread> spawned;
        {
            std::lock_guard<std::mutex> guard(threads_lock_);
            spawned.swap(threads_);
        }
        for (auto& t : spawned) t.join();
    }

    LogCapture log;

  protected:
    void SetUp() override {
        FakeHal::unregisterDefault();
        fds_before_ = countOpenFds();
        threads_before_ = countThreads();
    }
    void TearDown() override {
        joinSpawned();
        hidl_client_close_tool_end();
        hidl_client_close();
        hidl_client_release_service("test");
        FakeHal::unregisterDefault();
    }

    // A fresh session against a well-behaved controller does a whole DUT
    // entry, an LE test end with its count, and a DUT exit.
    void expectUsable() {
        sp<FakeHal> hal = installAnsweringHal();
        log.clear();
        EXPECT_EQ(0, hci_enable_device_under_test_mode());
        sendBleTestCommand(3000, 0);
        EXPECT_EQ(0, hci_disable_device_under_test_mode());
        std::vector<Bytes> want = kDutEntry;
        want.push_back(kTestEnd);
        want.push_back(kReset);
        expectSent(*hal, want);
        EXPECT_EQ(1, log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
        EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 3000"));
        EXPECT_EQ(1, hal->closeCalls());
        EXPECT_EQ(-1, bt_fd);
        FakeHal::unregisterDefault();
        EXPECT_EQ(fds_before_, countOpenFds());
        EXPECT_LE(settledThreadCount(threads_before_), threads_before_);
    }

    std::mutex threads_lock_;
    std::vector<std::thread> threads_;
    int fds_before_ = 0;
    int threads_before_ = 0;
};

TEST_P(FaultInjectionTest, EndsWithinItsBoundAndLeavesTheLibraryUsable) {
    const FaultCase& c = GetParam();
    auto start = std::chrono::steady_clock::now();
    c.run(*this);
    joinSpawned();
    auto took = std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start);
    EXPECT_LE(took.count(), c.bound_ms) << c.name;
    EXPECT_TRUE(log.contains(c.priority, c.log_line)) << c.name << ": no line \"" << c.log_line << "\"";
    printf("[ fault    ] %-34s %6lld ms (bound %d ms)\n", c.name, static_cast<long long>(took.count()),
           c.bound_ms);
    expectUsable();
}

// --- the faults ---------------------------------------------------------

void noHalService(FaultInjectionTest&) {
    EXPECT_EQ(-1, hci_enable_device_under_test_mode());
    EXPECT_EQ(-1, bt_fd);
}

void initFailsOn(FaultInjectionTest& t, FakeHal::InitMode mode) {
    sp<FakeHal> hal = t.installHal(mode, HalStatus::INITIALIZATION_ERROR);
    EXPECT_EQ(-1, hci_enable_device_under_test_mode());
    EXPECT_EQ(-1, bt_fd);
    EXPECT_TRUE(t.log.contains(ANDROID_LOG_ERROR, "Error in HIDL initialization"));
    FaultInjectionTest::expectSent(*hal, {});
}

// Answers initialize twice, both times with success.
class TwiceAnsweringHal : public FakeHal {
  public:
    Return<void> initialize(const sp<Callbacks>& callback) override {
        FakeHal::initialize(callback);
        callback->initializationComplete(Status::SUCCESS);
        return android::hardware::Void();
    }
};

void initAnsweredTwice(FaultInjectionTest&) {
    sp<FakeHal> hal = new TwiceAnsweringHal();
    hal->onSend = answerEveryCommand;
    hal->registerDefault();
    EXPECT_EQ(0, hci_enable_device_under_test_mode());
    EXPECT_EQ(0, hci_disable_device_under_test_mode());
    std::vector<Bytes> want = kDutEntry;
    want.push_back(kReset);
    FaultInjectionTest::expectSent(*hal, want);
}

void initNeverAnswered(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal(FakeHal::InitMode::Never);
    EXPECT_EQ(-1, hci_enable_device_under_test_mode());
    EXPECT_EQ(-1, bt_fd);
    EXPECT_EQ(1, hal->initializeCalls());
}

void closeReportsDead(FaultInjectionTest& t, bool by_destroy) {
    sp<FakeHal> hal = t.installAnsweringHal();
    hal->dieAt(FakeHal::Call::Close);
    EXPECT_EQ(0, hci_enable_device_under_test_mode());
    if (by_destroy) destoryNative(nullptr, nullptr);
    else hci_disable_device_under_test_mode();
    EXPECT_EQ(1, hal->closeCalls());
    EXPECT_EQ(nullptr, btHci.get());
    std::vector<Bytes> want = kDutEntry;
    if (!by_destroy) want.push_back(kReset);
    FaultInjectionTest::expectSent(*hal, want);
}

void neverAnswers(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    sendBleTestCommand(22440, 1);
    EXPECT_FALSE(t.log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 22440"));
    destoryNative(nullptr, nullptr);
    FaultInjectionTest::expectSent(*hal, {{0x33, 0x20, 0x03, 0x13, 0x02, 0x00}});
}

// The receiver test is answered 2.5 s late, after its exchange has given up;
// the test end that follows must get its own reply, not the late one.
void answersLate(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    hal->onSend = [&t](FakeHal& h, const SentPacket& p) {
        uint16_t opcode = opcodeOf(p);
        if (opcode != 0x201D) {
            h.deliverEvent(commandComplete(opcode));
            return;
        }
        sp<FakeHal> held = &h;
        t.spawn([held, opcode] {
            std::this_thread::sleep_for(std::chrono::milliseconds(2500));
            held->deliverEvent(commandComplete(opcode));
        });
    };
    sendBleTestCommand(22402, 0);
    t.joinSpawned();
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(1, t.log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
    EXPECT_TRUE(t.log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 3000"));
    hci_disable_device_under_test_mode();
    FaultInjectionTest::expectSent(*hal, {{0x1D, 0x20, 0x01, 0x00}, kTestEnd, kReset});
}

void commandStatusErrors(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    hal->onSend = [](FakeHal& h, const SentPacket& p) { h.deliverEvent(commandStatus(opcodeOf(p), 0x0C)); };
    EXPECT_EQ(-1, hci_enable_device_under_test_mode());
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(0, t.log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
    hci_disable_device_under_test_mode();
    FaultInjectionTest::expectSent(*hal, {kDutEntry[0], kReset, kTestEnd, kReset});
}

// Every command is first answered for the opcode before it.
void completeForAnotherOpcode(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    hal->onSend = [](FakeHal& h, const SentPacket& p) {
        h.deliverEvent(commandComplete(static_cast<uint16_t>(opcodeOf(p) - 1)));
        h.deliverEvent(commandComplete(opcodeOf(p)));
    };
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(1, t.log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
    hci_disable_device_under_test_mode();
    FaultInjectionTest::expectSent(*hal, {kTestEnd, kReset});
}

// The first reply is not an event; later commands are answered normally.
void notAnEventFirst(FaultInjectionTest& t, std::function<void(FakeHal&)> bad_reply) {
    sp<FakeHal> hal = t.installHal();
    auto first = std::make_shared<std::atomic<bool>>(true);
    hal->onSend = [first, bad_reply](FakeHal& h, const SentPacket& p) {
        if (first->exchange(false)) bad_reply(h);
        else answerEveryCommand(h, p);
    };
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(0, t.log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(1, t.log.count(ANDROID_LOG_INFO, "onReceivedTestData() value: 42"));
    EXPECT_TRUE(t.log.containsFragment("stale bytes before the command"));
    hci_disable_device_under_test_mode();
    FaultInjectionTest::expectSent(*hal, {kTestEnd, kTestEnd, kReset});
}

void aclWhereEventExpected(FaultInjectionTest& t) {
    notAnEventFirst(t, [](FakeHal& h) { h.deliverAcl({0x01, 0x20, 0x05, 0x00, 1, 2, 3, 4, 5}); });
}

// A corrupt stream: a type byte no H4 packet has, straight into the bridge end.
void unknownTypeByte(FaultInjectionTest& t) {
    notAnEventFirst(t, [](FakeHal&) {
        unsigned char junk[] = {0x07, 0x0E, 0x04, 0x01, 0x1F, 0x20, 0x00};
        ASSERT_EQ(static_cast<ssize_t>(sizeof(junk)), send(server_fd, junk, sizeof(junk), MSG_NOSIGNAL));
    });
}

// Number of Completed Packets events, far more than the socket holds, while
// nobody reads; the session is then ended under the flood.
void floodsWhileNobodyReads(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installAnsweringHal();
    ASSERT_EQ(0, hci_enable_device_under_test_mode());
    auto delivered = std::make_shared<std::atomic<int>>(0);
    t.spawn([hal, delivered] {
        for (int i = 0; i < 50000; ++i, ++*delivered) hal->deliverEvent({0x13, 0x05, 0x01, 0x01, 0x00, 0x01, 0x00});
    });
    // Past what the socket buffer holds: the flood is blocked in its write.
    ASSERT_TRUE(waitUntil([&] { return *delivered > 100; }));
    hci_disable_device_under_test_mode();
    t.joinSpawned();
    EXPECT_EQ(50000, delivered->load());
    std::vector<Bytes> want = kDutEntry;
    want.push_back(kReset);
    FaultInjectionTest::expectSent(*hal, want);
}

// Half an LE Test End reply, then the controller's side of the stream closes.
void controllerClosesMidPacket(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    hal->onSend = [](FakeHal&, const SentPacket&) {
        unsigned char half[] = {0x04, 0x0E, 0x06, 0x01, 0x1F};
        send(server_fd, half, sizeof(half), MSG_NOSIGNAL);
        shutdown(server_fd, SHUT_WR);
    };
    sendBleTestCommand(3000, 0);
    EXPECT_FALSE(t.log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 3000"));
    hci_disable_device_under_test_mode();
    FaultInjectionTest::expectSent(*hal, {kTestEnd, kReset});
}

// The tool end closes with a command cut short: the HAL must not get a piece.
void toolEndClosedMidPacket(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installAnsweringHal();
    ASSERT_EQ(0, hci_enable_device_under_test_mode());
    unsigned char cut[] = {0x01, 0x05, 0x0C, 0x03, 0x02};
    ASSERT_EQ(static_cast<ssize_t>(sizeof(cut)), write(bt_fd, cut, sizeof(cut)));
    destoryNative(nullptr, nullptr);
    EXPECT_TRUE(t.log.contains(ANDROID_LOG_ERROR, "Process tool OUT !!!"));
    FaultInjectionTest::expectSent(*hal, kDutEntry);
}

// destoryNative from another thread while an LE test end waits for a reply
// that never comes: the waiting exchange must end at once, not at its time-out.
void destroyDuringExchange(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    t.spawn([] { sendBleTestCommand(3000, 0); });
    ASSERT_TRUE(hal->waitForSent(1));
    destoryNative(nullptr, nullptr);
    t.joinSpawned();
    EXPECT_EQ(1, hal->closeCalls());
    FaultInjectionTest::expectSent(*hal, {kTestEnd});
}

// Events the controller sends on its own, every 100 ms, and never the reply:
// they must not keep the exchange waiting past its time-out.
void unsolicitedEventsNoReply(FaultInjectionTest& t) {
    sp<FakeHal> hal = t.installHal();
    auto done = std::make_shared<std::atomic<bool>>(false);
    t.spawn([hal, done] {
        hal->waitForSent(1);
        for (int i = 0; i < 50 && !*done; ++i) {
            hal->deliverEvent({0x3E, 0x03, 0x01, 0x2A, 0x00});
            std::this_thread::sleep_for(std::chrono::milliseconds(100));
        }
    });
    sendBleTestCommand(3000, 0);
    *done = true;
    EXPECT_FALSE(t.log.contains(ANDROID_LOG_INFO, "onSendCmdSuccess() command: 3000"));
    destoryNative(nullptr, nullptr);
    t.joinSpawned();
}

// A HAL that gives no death notice dies at the send: the pump's end alone
// must end the exchange at once.
class NoticelessHal : public FakeHal {
  public:
    Return<bool> linkToDeath(const sp<android::hardware::hidl_death_recipient>&, uint64_t) override {
        return false;
    }
};

void diesWithoutNotice(FaultInjectionTest&) {
    sp<FakeHal> hal = new NoticelessHal();
    hal->dieAt(FakeHal::Call::Send);
    hal->registerDefault();
    sendBleTestCommand(22440, 0);
    hci_disable_device_under_test_mode();
}

const FaultCase kFaults[] = {
        {"no_hal_service", 1000, ANDROID_LOG_ERROR, "Unable to initialize the HIDL", noHalService},
        {"init_fails_on_calling_thread", 1000, ANDROID_LOG_ERROR,
         "hidl_client_initialize: HIDL failed to initialize, sending invalid FD to tool",
         [](FaultInjectionTest& t) { initFailsOn(t, FakeHal::InitMode::Sync); }},
        {"init_fails_on_other_thread", 1000, ANDROID_LOG_ERROR,
         "hidl_client_initialize: HIDL failed to initialize, sending invalid FD to tool",
         [](FaultInjectionTest& t) { initFailsOn(t, FakeHal::InitMode::Async); }},
        {"init_answered_twice", 1000, ANDROID_LOG_ERROR,
         "initializationComplete: answer to an abandoned opening ignored", initAnsweredTwice},
        {"init_never_answered", 12000, ANDROID_LOG_ERROR,
         "hidl_client_initialize: no answer from the HAL within 10000 ms", initNeverAnswered},
        {"close_reports_dead_on_destroy", 1000, ANDROID_LOG_INFO, "destoryNative: HIDL daemon is dead",
         [](FaultInjectionTest& t) { closeReportsDead(t, true); }},
        {"controller_never_answers", 3000, ANDROID_LOG_ERROR,
         "read_incoming_events: timed out after 2000 ms waiting for the packet type, return -1", neverAnswers},
        {"controller_answers_late", 4500, ANDROID_LOG_INFO,
         "cmd_rawcmd: dropped 7 stale bytes before the command", answersLate},
        {"command_status_errors", 1000, ANDROID_LOG_ERROR,
         "sendBleTestCommand, command 3000 (opcode 0x201f) refused with status 0x0c return!!!", commandStatusErrors},
        {"complete_for_another_opcode", 1000, ANDROID_LOG_INFO,
         "read_incoming_events: event 0xe does not answer opcode 0x201f, skipped", completeForAnotherOpcode},
        {"acl_where_event_expected", 1000, ANDROID_LOG_ERROR, "sendBleTestCommand, command 3000 not answered return!!!",
         aclWhereEventExpected},
        {"unknown_type_where_event_expected", 1000, ANDROID_LOG_ERROR,
         "sendBleTestCommand, command 3000 not answered return!!!", unknownTypeByte},
        {"floods_events_nobody_reads", 5000, ANDROID_LOG_ERROR, "hciEventReceived: failed to write event to tool socket",
         floodsWhileNobodyReads},
        {"controller_closes_mid_packet", 1000, ANDROID_LOG_INFO, "read error :size = 6\n", controllerClosesMidPacket},
        {"tool_end_closed_mid_packet", 1000, ANDROID_LOG_ERROR, "process_tool_data: failed to read the packet from tool",
         toolEndClosedMidPacket},
        {"unsolicited_events_no_reply", 3500, ANDROID_LOG_ERROR,
         "read_incoming_events: timed out after 2000 ms waiting for the packet type, return -1",
         unsolicitedEventsNoReply},
        {"hal_dies_without_notice", 1000, ANDROID_LOG_ERROR, "sendBleTestCommand, command 22440 not answered return!!!",
         diesWithoutNotice},
        {"destroy_during_exchange", 1000, ANDROID_LOG_ERROR, "sendBleTestCommand, command 3000 not answered return!!!",
         destroyDuringExchange},
};

INSTANTIATE_TEST_SUITE_P(Faults, FaultInjectionTest, ::testing::ValuesIn(kFaults),
                         [](const ::testing::TestParamInfo<FaultCase>& info) { return std::string(info.param.name); });

}  // namespace
