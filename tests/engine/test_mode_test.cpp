#include "engine/test_mode.h"

#include <android/log.h>

#include <chrono>
#include <string>
#include <vector>

#include "tests/engine/hal_session.h"
#include "tests/support/process.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

class TestModeTest : public HalSessionTest {
  protected:
    void SetUp() override {
        HalSessionTest::SetUp();
        threads_ = countThreads();
    }
    // Java is not bound in this suite: an up-call shows only as its first log line.
    int successReports() const {
        int n = 0;
        for (const LogLine& line : log_.lines()) n += line.text.rfind("onSendCmdSuccess() command: ", 0) == 0;
        return n;
    }
    static long msSince(std::chrono::steady_clock::time_point start) {
        return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(
                std::chrono::steady_clock::now() - start).count());
    }
    int threads_ = 0;
};

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
        log_.clear();
        sendBleTestCommand(c.code, c.enhanced ? 1 : 0);
        EXPECT_EQ(commandsSent(*hal_).back(), c.atHal) << c.code << " enhanced " << c.enhanced;
        EXPECT_TRUE(log_.contains(INFO, "onSendCmdSuccess() command: " + std::to_string(c.code)));
    }
    EXPECT_EQ(commandsSent(*hal_).size(), sizeof(cases) / sizeof(cases[0]));
    EXPECT_EQ(hal_->initializeCalls(), 1);  // one session, kept open across calls
}

TEST_F(TestModeTest, AnyNonZeroEnhancedByteSelectsThe2MPhy) {
    sendBleTestCommand(22440, 0x80);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x33, 0x20, 0x03, 0x13, 0x02, 0x00}));
}

TEST_F(TestModeTest, TestEndHandsOnTheCountBeforeReportingSuccess) {
    const struct {
        Bytes count;
        std::string value;
    } cases[] = {{{0x2A, 0x00}, "42"}, {{0xFF, 0xFF}, "65535"}};
    for (const auto& c : cases) {
        answerWith([c](const Bytes& command) {
            Bytes returned = {0x00};
            returned.insert(returned.end(), c.count.begin(), c.count.end());
            return std::vector<Bytes>{commandComplete(opcodeOf(command), returned)};
        });
        log_.clear();
        sendBleTestCommand(3000, 0);
        int count = lineIndex("onReceivedTestData() value: " + c.value);
        int success = lineIndex("onSendCmdSuccess() command: 3000");
        ASSERT_GE(count, 0) << c.value;
        EXPECT_GT(success, count) << c.value;
    }
}

TEST_F(TestModeTest, UnknownCodeSendsNothingAndReportsNothing) {
    sendBleTestCommand(0, 0);
    sendBleTestCommand(12441, 1);
    EXPECT_EQ(log_.count(ERROR, "sendBleTestCommand, command not support return!!!"), 2);
    EXPECT_EQ(hal_->initializeCalls(), 0);
    EXPECT_TRUE(commandsSent(*hal_).empty());
    EXPECT_EQ(successReports(), 0);
    EXPECT_EQ(cmd_test_end_flag, 0);
}

TEST_F(TestModeTest, NoSessionMeansNoCommandAndNoReport) {
    withoutController();
    sendBleTestCommand(12440, 0);
    EXPECT_TRUE(log_.contains(ERROR, "sendBleTestCommand, init smd error return!!!"));
    EXPECT_EQ(successReports(), 0);
    EXPECT_EQ(bt_fd, -1);
}

TEST_F(TestModeTest, UnansweredCommandIsNotReportedAsSuccess) {
    answerWith([](const Bytes&) { return std::vector<Bytes>{}; });
    sendBleTestCommand(12440, 1);
    EXPECT_EQ(commandsSent(*hal_).size(), 1u);
    EXPECT_EQ(successReports(), 0);
    EXPECT_TRUE(log_.contains(ERROR, "sendBleTestCommand, command 12440 not answered return!!!"));
}

// A rejected test end leaves no pending count that the next command's reply
// (here the Device Under Test entry's) could be mistaken for.
TEST_F(TestModeTest, RejectedTestEndLeavesNoCountPending) {
    answerWith([](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x201F) return std::vector<Bytes>{commandStatus(opcode, 0x0C)};
        return std::vector<Bytes>{commandComplete(opcode)};
    });
    sendBleTestCommand(22440, 0);
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(successReports(), 2);  // rejected, but written and answered
    EXPECT_EQ(cmd_test_end_flag, 0);
}

TEST_F(TestModeTest, TestEndWithoutSessionSendsButCountIsNotPending) {
    ASSERT_EQ(bt_fd, -1);
    answerWith([this](const Bytes& command) {
        // The opening cleared the flag before this command went out.
        EXPECT_EQ(cmd_test_end_flag, 0);
        return std::vector<Bytes>{commandComplete(opcodeOf(command), {0x00, 0x2A, 0x00})};
    });
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x1F, 0x20, 0x00}));
    EXPECT_TRUE(log_.contains(INFO, "onSendCmdSuccess() command: 3000"));
}

TEST_F(TestModeTest, DeviceUnderTestEntrySendsTheFiveCommandsInOrder) {
    EXPECT_EQ(hci_enable_device_under_test_mode(), 0);
    const std::vector<Bytes> expected = {
            {0x03, 0x18, 0x00},
            {0x05, 0x0C, 0x03, 0x02, 0x00, 0x02},
            {0x1A, 0x0C, 0x01, 0x03},
            {0x20, 0x0C, 0x01, 0x00},
            {0x22, 0x0C, 0x01, 0x00},
    };
    EXPECT_EQ(commandsSent(*hal_), expected);
    int in = lineIndex("enterTestMode, hci_enable_device_under_test_mode IN.\n");
    int start = lineIndex("start send com to bt device!!!\n");
    int out = lineIndex("enterTestMode, hci_enable_device_under_test_mode OUT!!!\n");
    EXPECT_TRUE(in >= 0 && in < start && start < out);
    EXPECT_TRUE(log_.contains(ERROR, "start send com to bt device!!!\n"));
    EXPECT_EQ(successReports(), 0);
}

// Controllers reject the deprecated Write Encryption Mode with a Command
// Status; no other event follows, so the entry must not wait for one.
TEST_F(TestModeTest, DeviceUnderTestEntryDoesNotWaitAfterARejection) {
    answerWith([](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C22) return std::vector<Bytes>{commandStatus(opcode, 0x01)};
        return std::vector<Bytes>{commandComplete(opcode)};
    });
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(hci_enable_device_under_test_mode(), 0);
    EXPECT_LT(msSince(start), 1500);
}

TEST_F(TestModeTest, DeviceUnderTestEntryFailsAndStopsWhenACommandIsNotAnswered) {
    answerWith([](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C1A) return std::vector<Bytes>{};
        return std::vector<Bytes>{commandComplete(opcode)};
    });
    EXPECT_EQ(hci_enable_device_under_test_mode(), -1);
    EXPECT_EQ(commandsSent(*hal_).size(), 3u);
    EXPECT_TRUE(log_.contains(ERROR, "enterTestMode, command ogf 0x3 ocf 0x1a not answered return!!!"));
}

TEST_F(TestModeTest, DeviceUnderTestEntryWithoutControllerFails) {
    withoutController();
    EXPECT_EQ(hci_enable_device_under_test_mode(), -1);
    EXPECT_EQ(bt_fd, -1);
    EXPECT_TRUE(log_.contains(ERROR, "init bt_fd error return!!!"));
}

TEST_F(TestModeTest, DeviceUnderTestExitSendsResetAndEndsTheSession) {
    int fds = countOpenFds();
    sendBleTestCommand(22402, 0);
    EXPECT_EQ(hci_disable_device_under_test_mode(), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x03, 0x0C, 0x00}));
    EXPECT_EQ(bt_fd, -1);
    EXPECT_EQ(client_fd, -1);
    EXPECT_EQ(hal_->closeCalls(), 1);
    EXPECT_EQ(countOpenFds(), fds);
    EXPECT_TRUE(waitUntil([&] { return countThreads() <= threads_; }));
    EXPECT_TRUE(log_.contains(INFO, "quitTestMode, hci_disable_device_under_test_mode OUT!!!\n"));

    // Quitting again closes nothing twice; the next test opens a new session.
    EXPECT_EQ(hci_disable_device_under_test_mode(), 0);
    EXPECT_EQ(hal_->closeCalls(), 1);
    sendBleTestCommand(22402, 0);
    EXPECT_EQ(hal_->initializeCalls(), 2);
    EXPECT_GE(bt_fd, 0);
}

TEST_F(TestModeTest, DeviceUnderTestExitWithoutSessionStillReturnsZero) {
    EXPECT_EQ(hci_disable_device_under_test_mode(), 0);
    EXPECT_TRUE(log_.contains(ERROR, "quitTestMode, hci_disable_device_under_test_mode IN.\nbt_fd = -1"));
    EXPECT_TRUE(log_.contains(INFO, "Raw HCI command\n\n"));  // the write on -1 fails, nothing is read
    EXPECT_FALSE(log_.containsFragment("read_incoming_events"));
    EXPECT_EQ(hal_->closeCalls(), 0);
}

TEST_F(TestModeTest, ContinuousWaveCommandCarriesChannelPowerAndType) {
    sendCwtxCommandNative(nullptr, nullptr, 1, 9, 4);
    sendCwtxCommandNative(nullptr, nullptr, 255, 0, 255);
    std::vector<Bytes> expected = {
            {0x04, 0xFC, 0x09, 0x05, 0x01, 0x09, 0x04, 0x20, 0x00, 0x00, 0x00, 0x00},
            {0x04, 0xFC, 0x09, 0x05, 0xFF, 0x00, 0xFF, 0x20, 0x00, 0x00, 0x00, 0x00},
    };
    EXPECT_EQ(commandsSent(*hal_), expected);
    EXPECT_TRUE(log_.contains(INFO, "sendCwtxCommandNative channel= 1, power= 9, type= 4"));
    EXPECT_TRUE(log_.contains(INFO, "init bt_fd successful"));
    EXPECT_EQ(successReports(), 0);
}

TEST_F(TestModeTest, ContinuousWaveValuesOutsideAByteSendNothing) {
    const int cases[][3] = {{256, 0, 0}, {0, -1, 0}, {0, 0, 0x1000}, {-2147483647 - 1, 0, 0}};
    for (const auto& c : cases) sendCwtxCommandNative(nullptr, nullptr, c[0], c[1], c[2]);
    EXPECT_EQ(log_.count(ERROR, "sendCwtxCommandNative, channel, power and type must be 0 to 255 return!!!"), 4);
    EXPECT_EQ(hal_->initializeCalls(), 0);
    EXPECT_TRUE(commandsSent(*hal_).empty());
}

}  // namespace
