// The test procedures against a scripted controller: the bytes each sends,
// and what reaches Java for every way the controller can answer.
#include "engine/test_mode.h"

#include <android/log.h>

#include <string>
#include <vector>

#include "tests/engine/hal_session.h"
#include "jni/binding.h"
#include "tests/support/fake_java.h"
#include "tests/support/process.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

class TestModeTest : public HalSessionTest {
  protected: void SetUp() override {
        HalSessionTest::SetUp();
        bindFakeJava();
        threads_ = countThreads();
    }
    // The commands the HAL received since `from`.
    std::vector<Bytes> sentSince(size_t from) {
        std::vector<Bytes> all = commandsSent(*hal_);
        return std::vector<Bytes>(all.begin() + static_cast<long>(std::min(from, all.size())), all.end());
    }
    int threads_ = 0;
};

Bytes event(uint8_t code, const Bytes& params) {
    Bytes e(2 + params.size());  // sized first, as commandComplete is
    e[0] = code;
    e[1] = static_cast<uint8_t>(params.size());
    std::copy(params.begin(), params.end(), e.begin() + 2);
    return e;
}

struct BleCase {
    int code;
    bool enhanced;
    Bytes atHal;
};

TEST_F(TestModeTest, EveryTestCodeSendsItsCommandByteExact) {
    const BleCase cases[] = {
            {12402, false, {0x1E, 0x20, 0x03, 0x00, 0x25, 0x00}},
            {12440, false, {0x1E, 0x20, 0x03, 0x13, 0x25, 0x00}},
            {12480, false, {0x1E, 0x20, 0x03, 0x27, 0x25, 0x00}},
            {12402, true, {0x34, 0x20, 0x04, 0x00, 0x25, 0x00, 0x02}},
            {12440, true, {0x34, 0x20, 0x04, 0x13, 0x25, 0x00, 0x02}},
            {12480, true, {0x34, 0x20, 0x04, 0x27, 0x25, 0x00, 0x02}},
            {22402, false, {0x1D, 0x20, 0x01, 0x00}},
            {22440, false, {0x1D, 0x20, 0x01, 0x13}},
            {22480, false, {0x1D, 0x20, 0x01, 0x27}},
            {22402, true, {0x33, 0x20, 0x03, 0x00, 0x02, 0x00}},
            {22440, true, {0x33, 0x20, 0x03, 0x13, 0x02, 0x00}},
            {22480, true, {0x33, 0x20, 0x03, 0x27, 0x02, 0x00}},
            {3000, false, {0x1F, 0x20, 0x00}},
            {3000, true, {0x1F, 0x20, 0x00}},
    };
    for (const BleCase& c : cases) {
        sendBleTestCommand(c.code, c.enhanced ? 0x80 : 0);  // any non-zero byte selects LE 2M
        EXPECT_EQ(commandsSent(*hal_).back(), c.atHal) << c.code << " enhanced " << c.enhanced;
        EXPECT_EQ(takeJavaCalls(), "success " + std::to_string(c.code));
    }
    EXPECT_EQ(commandsSent(*hal_).size(), sizeof(cases) / sizeof(cases[0]));
    EXPECT_EQ(hal_->initializeCalls(), 1);  // one session, kept open across calls
}

// Controllers that are not scripted by the test never answer what they did not expect.
const Bytes kHardwareError = event(0x10, {0x01});
const Bytes kVendor = event(0xFF, {0x2A, 0x00});
const Bytes kLeMeta = event(0x3E, {0x01, 0x2A, 0x00});
const Bytes kCompletedPackets = event(0x13, {0x01, 0x40, 0x00, 0x2A, 0x00});
const Bytes kConnection = event(0x03, {0x00, 0x40, 0x00, 1, 2, 3, 4, 5, 6, 0x01, 0x00});
const Bytes kDisconnection = event(0x05, {0x00, 0x40, 0x00, 0x13});
const Bytes kInquiryComplete = event(0x01, {0x00});
const Packet kSco(3, {0x01, 0x00, 0x02, 0x0E, 0x0E});
const Packet kAcl(2, [] {
    Bytes acl = {0x01, 0x20, 0x2C, 0x01};  // 300 bytes of data that look like replies
    for (int i = 0; i < 300; ++i) acl.push_back(i % 2 ? 0x0E : 0x04);
    return acl;
}());

struct ReplyCase {
    const char* name;
    int code;
    Packets reply;  // what the controller sends after the command
    std::string java;          // the callbacks that must reach Java, in order
    std::string line;          // a line that must be logged at error priority, if any
};

// Java hears of a command only from its own reply: success when the
// controller accepted it, a count only from LE Test End's accepted Command
// Complete, and nothing from any other event however it looks.
TEST_F(TestModeTest, OnlyTheCommandsOwnAcceptedReplyReachesJava) {
    const ReplyCase cases[] = {
            {"accepted", 22440, {commandComplete(0x2033)}, "success 22440", ""},
            {"refused by its Command Complete", 22440, {commandComplete(0x2033, {0x11})}, "",
             "sendBleTestCommand, command 22440 (opcode 0x2033) refused with status 0x11 return!!!"},
            {"refused by a Command Status", 12402, {commandStatus(0x201E, 0x01)}, "",
             "sendBleTestCommand, command 12402 (opcode 0x201e) refused with status 0x01 return!!!"},
            {"pending, then complete", 12402, {commandStatus(0x201E, 0x00), commandComplete(0x201E)},
             "success 12402", ""},
            {"count", 3000, {commandComplete(0x201F, {0x00, 0x2A, 0x00})}, "received 42,success 3000", ""},
            {"largest count", 3000, {commandComplete(0x201F, {0x00, 0xFF, 0xFF})}, "received 65535,success 3000", ""},
            {"count after trailing bytes", 3000, {commandComplete(0x201F, {0x00, 0x2A, 0x00, 0x07, 0x07})},
             "received 42,success 3000", ""},
            {"test end refused", 3000, {commandComplete(0x201F, {0x0C, 0x2A, 0x00})}, "",
             "sendBleTestCommand, command 3000 (opcode 0x201f) refused with status 0x0c return!!!"},
            {"test end without a count", 3000, {commandComplete(0x201F)}, "success 3000",
             "read_incoming_events: LE Test End answered without Num_Packets"},
            {"events before and between the replies", 3000,
             {kHardwareError, kVendor, kLeMeta, kCompletedPackets, commandComplete(0x201D, {0x00, 0x07, 0x00}),
              kConnection, commandStatus(0x201F, 0x00), kDisconnection, kInquiryComplete,
              commandComplete(0x201F, {0x00, 0x2A, 0x00})},
             "received 42,success 3000", ""},
            {"only other events", 3000, {kLeMeta, commandComplete(0x201D, {0x00, 0x2A, 0x00})}, "",
             "sendBleTestCommand, command 3000 not answered return!!!"},
            // Legal traffic beside a reply: data packets, longer than the reply buffer too,
            // and an event without parameters.
            {"data and empty events beside the replies", 3000,
             {kAcl, kSco, event(0xFF, {}), commandStatus(0x201F, 0x00), kAcl, commandComplete(0x201F, {0x00, 0x2A, 0x00})},
             "received 42,success 3000", ""},
    };
    for (const ReplyCase& c : cases) {
        // After an unanswered row the library syncs first: the controller answers that too.
        answerWith([&c](const Bytes& command) {
            return opcodeOf(command) == 0x1001 ? Packets{commandComplete(0x1001)} : c.reply;
        });
        log_.clear();
        sendBleTestCommand(c.code, c.code == 22440 ? 1 : 0);
        EXPECT_EQ(takeJavaCalls(), c.java) << c.name;
        if (!c.line.empty()) {
            EXPECT_TRUE(log_.contains(ERROR, c.line)) << c.name << ": no line " << c.line;
        }
        EXPECT_EQ(cmd_test_end_flag, 0) << c.name;
    }
}

TEST_F(TestModeTest, UnknownCodeOrNoSessionSendsNothingAndReportsNothing) {
    sendBleTestCommand(0, 0);
    sendBleTestCommand(12441, 1);
    EXPECT_EQ(log_.count(ERROR, "sendBleTestCommand, command not support return!!!"), 2);
    EXPECT_EQ(hal_->initializeCalls(), 0);
    withoutController();
    sendBleTestCommand(12440, 0);
    EXPECT_TRUE(log_.contains(ERROR, "sendBleTestCommand, init smd error return!!!"));
    EXPECT_TRUE(commandsSent(*hal_).empty());
    EXPECT_EQ(takeJavaCalls(), "");
    EXPECT_EQ(bt_fd, -1);
}

// Opening a session clears the pending test end: a count from a session that
// did not start the test is not reported.
TEST_F(TestModeTest, TestEndThatOpensTheSessionReportsNoCount) {
    ASSERT_EQ(bt_fd, -1);
    answerWith([](const Bytes& command) {
        return Packets{commandComplete(opcodeOf(command), {0x00, 0x2A, 0x00})};
    });
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x1F, 0x20, 0x00}));
    EXPECT_EQ(takeJavaCalls(), "success 3000");
}

const std::vector<Bytes> kDutEntry = {
        {0x03, 0x18, 0x00},
        {0x05, 0x0C, 0x03, 0x02, 0x00, 0x02},
        {0x1A, 0x0C, 0x01, 0x03},
        {0x20, 0x0C, 0x01, 0x00},
        {0x22, 0x0C, 0x01, 0x00},
};
const Bytes kReset = {0x03, 0x0C, 0x00};

// Enable Device Under Test Mode, Set Event Filter and Write Scan Enable make
// the mode; Write Authentication Enable and Write Encryption Mode only turn
// off what is off by default, and many controllers refuse the latter.
TEST_F(TestModeTest, DeviceUnderTestEntryIsAllOrNothing) {
    const struct {
        uint16_t opcode;
        Bytes refusal;
        bool entered;
        std::string line;
    } cases[] = {
            {0x1803, commandComplete(0x1803, {0x01}), false,
             "enterTestMode, command 0x1803 refused with status 0x01 return!!!"},
            {0x0C05, commandComplete(0x0C05, {0x12}), false,
             "enterTestMode, command 0x0c05 refused with status 0x12 return!!!"},
            {0x0C1A, commandStatus(0x0C1A, 0x0C), false,
             "enterTestMode, command 0x0c1a refused with status 0x0c return!!!"},
            {0x0C20, commandComplete(0x0C20, {0x11}), true,
             "enterTestMode, command 0x0c20 refused with status 0x11, not needed, going on"},
            {0x0C22, commandStatus(0x0C22, 0x01), true,
             "enterTestMode, command 0x0c22 refused with status 0x01, not needed, going on"},
    };
    for (const auto& c : cases) {
        answerWith([&c](const Bytes& command) {
            uint16_t opcode = opcodeOf(command);
            return Packets{opcode == c.opcode ? c.refusal : commandComplete(opcode)};
        });
        size_t before = commandsSent(*hal_).size();
        int closes = hal_->closeCalls();
        log_.clear();
        EXPECT_EQ(hci_enable_device_under_test_mode(), c.entered ? 0 : -1) << c.line;
        EXPECT_TRUE(log_.contains(c.entered ? INFO : ERROR, c.line)) << c.line;
        std::vector<Bytes> sent = sentSince(before);
        if (c.entered) {
            EXPECT_EQ(sent, kDutEntry) << c.line;
            EXPECT_GE(bt_fd, 0);
            EXPECT_TRUE(log_.contains(ERROR, "start send com to bt device!!!\n"));
            EXPECT_TRUE(log_.contains(INFO, "enterTestMode, hci_enable_device_under_test_mode OUT!!!\n"));
            hci_disable_device_under_test_mode();
            continue;
        }
        // Nothing after the refused command but a Reset, and no session left.
        ASSERT_FALSE(sent.empty());
        EXPECT_EQ(sent.back(), kReset) << c.line;
        EXPECT_EQ(opcodeOf(sent[sent.size() - 2]), c.opcode) << c.line;
        EXPECT_EQ(bt_fd, -1) << c.line;
        EXPECT_EQ(hal_->closeCalls(), closes + 1) << c.line;
    }
}

// Quitting and destroying each end the session once, as late as it is; the
// next procedure opens another.
TEST_F(TestModeTest, QuitAndDestroyEachEndTheSessionOnce) {
    int fds = countOpenFds();
    EXPECT_EQ(hci_disable_device_under_test_mode(), 0);  // no session: the write on -1 fails, nothing is read
    EXPECT_TRUE(log_.contains(ERROR, "quitTestMode, hci_disable_device_under_test_mode IN.\nbt_fd = -1"));
    EXPECT_FALSE(log_.containsFragment("read_incoming_events"));
    sendBleTestCommand(22402, 0);
    EXPECT_EQ(hci_disable_device_under_test_mode(), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), kReset);
    EXPECT_TRUE(log_.contains(INFO, "quitTestMode, hci_disable_device_under_test_mode OUT!!!\n"));
    sendBleTestCommand(22440, 1);
    destoryNative(nullptr, nullptr);
    EXPECT_TRUE(bt_fd == -1 && client_fd == -1 && server_fd == -1 && btHci == nullptr);
    EXPECT_TRUE(log_.contains(INFO, "BLE close HIDL!"));
    destoryNative(nullptr, nullptr);
    hci_disable_device_under_test_mode();
    EXPECT_EQ(hal_->closeCalls(), 2);
    EXPECT_EQ(countOpenFds(), fds);
    EXPECT_TRUE(waitUntil([&] { return countThreads() <= threads_; }));
    sendBleTestCommand(22440, 1);
    EXPECT_EQ(hal_->initializeCalls(), 3);
    EXPECT_EQ(takeJavaCalls(), "success 22402,success 22440,success 22440");
}

TEST_F(TestModeTest, ContinuousWaveCommandCarriesChannelPowerAndType) {
    answerWith([](const Bytes& command) {
        uint8_t status = command[4] == 0xFF ? 0x12 : 0x00;  // a vendor refusing channel 255
        return Packets{commandComplete(opcodeOf(command), {status})};
    });
    sendCwtxCommandNative(nullptr, nullptr, 1, 9, 4);
    sendCwtxCommandNative(nullptr, nullptr, 255, 0, 255);
    std::vector<Bytes> expected = {
            {0x04, 0xFC, 0x09, 0x05, 0x01, 0x09, 0x04, 0x20, 0x00, 0x00, 0x00, 0x00},
            {0x04, 0xFC, 0x09, 0x05, 0xFF, 0x00, 0xFF, 0x20, 0x00, 0x00, 0x00, 0x00},
    };
    EXPECT_EQ(commandsSent(*hal_), expected);
    EXPECT_TRUE(log_.contains(INFO, "sendCwtxCommandNative channel= 1, power= 9, type= 4"));
    EXPECT_EQ(log_.count(ERROR, "sendCwtxCommandNative, command 0xfc04 refused with status 0x12 return!!!"), 1);
    EXPECT_EQ(takeJavaCalls(), "");
    // Values outside a byte are refused before anything is sent.
    for (const auto& c : {std::vector<int>{256, 0, 0}, {0, -1, 0}, {0, 0, 0x1000}, {-2147483647 - 1, 0, 0}}) {
        sendCwtxCommandNative(nullptr, nullptr, c[0], c[1], c[2]);
    }
    EXPECT_EQ(log_.count(ERROR, "sendCwtxCommandNative, channel, power and type must be 0 to 255 return!!!"), 4);
    EXPECT_EQ(commandsSent(*hal_).size(), 2u);
}

// A HAL process can die at any call. The step that meets it fails with its
// line, the process goes on (an unchecked failed call would abort it), and
// the next procedure opens a session on the HAL that took its place.
TEST_F(TestModeTest, HalDyingAtAnyCallFailsOnlyThatStep) {
    const struct {
        FakeHal::Call call;
        const char* line;
    } cases[] = {
            {FakeHal::Call::LinkToDeath, "hidl_client_initialize: the HAL died before initialize: "},
            {FakeHal::Call::Initialize, "hidl_client_initialize: initialize failed: "},
            {FakeHal::Call::Send, "serviceDied: the Bluetooth HAL died"},
            {FakeHal::Call::Close, "hidl_client_close: HIDL daemon is dead"},
    };
    for (const auto& c : cases) {
        android::sp<FakeHal> dying = new FakeHal();
        dying->onSend = hal_->onSend;
        dying->dieAt(c.call);
        dying->registerDefault();
        log_.clear();
        sendBleTestCommand(22440, 1);
        hci_disable_device_under_test_mode();
        EXPECT_TRUE(log_.containsFragment(c.line)) << c.line;
        EXPECT_EQ(takeJavaCalls(), c.call == FakeHal::Call::Close ? "success 22440" : "") << c.line;

        hal_->registerDefault();
        sendBleTestCommand(22440, 1);
        EXPECT_EQ(takeJavaCalls(), "success 22440") << c.line;
        hci_disable_device_under_test_mode();
    }
}

// A HAL that dies while a session is open is noticed at the next procedure,
// which opens a new session instead of failing.
TEST_F(TestModeTest, DeathBetweenProceduresIsFollowedByANewSession) {
    android::sp<FakeHal> first = hal_;
    sendBleTestCommand(22440, 1);
    ASSERT_EQ(takeJavaCalls(), "success 22440");
    hal_ = new FakeHal();
    hal_->onSend = first->onSend;
    hal_->registerDefault();
    first->die();
    sendBleTestCommand(3000, 0);
    EXPECT_TRUE(log_.contains(ERROR, "sendBleTestCommand: the controller session had ended, opening a new one"));
    EXPECT_EQ(takeJavaCalls(), "success 3000");
    EXPECT_EQ(hal_->initializeCalls(), 1);
}

}  // namespace
