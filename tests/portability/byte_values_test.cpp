// Bytes of 0x80 and above through the whole library, both ways, which a signed
// char (x86-64) would sign-extend and an unsigned one (Arm) not: parameters,
// lengths, opcodes, counts. The test thread, the pump and the fake HAL run it.
#include <iterator>
#include <mutex>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "engine/hci_cmd.h"
#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;
using Bytes = std::vector<uint8_t>;

namespace {

// Every byte value from `first` up, `count` of them, wrapping past 0xFF.
Bytes run(uint8_t first, size_t count) {
    Bytes bytes(count);
    for (size_t i = 0; i < count; ++i) bytes[i] = static_cast<uint8_t>(first + i);
    return bytes;
}

Bytes concat(Bytes head, const Bytes& tail) {
    head.insert(head.end(), tail.begin(), tail.end());
    return head;
}

class ByteValuesTest : public ::testing::Test {
  protected:
    void SetUp() override {
        hal_ = new FakeHal();
        // Each command is answered by a Command Complete for its opcode
        // carrying the return parameters the test chose.
        hal_->onSend = [this](FakeHal& h, const SentPacket& p) {
            if (p.type != 1 || p.bytes.size() < 2) return;
            Bytes returned = returnParameters();
            Bytes event = {0x0E, static_cast<uint8_t>(3 + returned.size()), 0x01, p.bytes[0], p.bytes[1]};
            h.deliverEvent(concat(event, returned));
        };
        hal_->registerDefault();
        hidl_client_init();
        ASSERT_GE(bt_fd, 0);
        log_.clear();
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
    }

    void answerWith(const Bytes& returned) {
        std::lock_guard<std::mutex> guard(lock_);
        returned_ = returned;
    }
    Bytes returnParameters() {
        std::lock_guard<std::mutex> guard(lock_);
        return returned_;
    }
    bool loggedSignExtension() const { return log_.containsFragment("ffffff"); }

    sp<FakeHal> hal_;
    LogCapture log_;
    std::mutex lock_;
    Bytes returned_ = {0x00};
};

TEST_F(ByteValuesTest, BinaryParametersAndOpcodeKeepTheirValueOnTheWayOut) {
    Bytes params = run(0x80, 128);  // 0x80..0xFF, and a length byte of 0x80
    ASSERT_EQ(0, hci_send_cmd_rawcmd(bt_fd, 0x3F, 0x3FF, static_cast<uint8_t>(params.size()),
                                     reinterpret_cast<char*>(params.data())));
    ASSERT_TRUE(hal_->waitForSent(1));
    EXPECT_EQ(concat({0xFF, 0xFF, 0x80}, params), hal_->sent()[0].bytes);
    EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "0x80 "));
    EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "0xff "));
    EXPECT_FALSE(loggedSignExtension());
}

TEST_F(ByteValuesTest, TokenParametersKeepTheirValueOnTheWayOut) {
    const char* tokens[] = {"rawcmd", "0x3F", "0x03FF", "0x80", "0xff", "0xFE", "0x7F"};
    ASSERT_EQ(0, cmd_rawcmd(bt_fd, 7, tokens).status);
    ASSERT_TRUE(hal_->waitForSent(1));
    EXPECT_EQ((Bytes{0xFF, 0xFF, 0x04, 0x80, 0xFF, 0xFE, 0x7F}), hal_->sent()[0].bytes);
    EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "0xfe "));
    EXPECT_FALSE(loggedSignExtension());
}

// The reply is the longest event there is (255 parameter bytes): LE Test
// End's status and the count that goes to Java, then bytes of 0x80 and up.
TEST_F(ByteValuesTest, CountsInTheLongestEventComeBackUnsigned) {
    const struct {
        uint8_t low, high;
        const char* value;
    } cases[] = {{0x80, 0x00, "128"}, {0xFF, 0x7F, "32767"}, {0x00, 0x80, "32768"}, {0xFE, 0xFF, "65534"}};
    const char* tokens[] = {"rawcmd", "0x08", "0x001F"};
    for (const auto& c : cases) {
        log_.clear();
        answerWith(concat({0x00, c.low, c.high}, run(0x80, 249)));
        ASSERT_EQ(0, cmd_rawcmd(bt_fd, 3, tokens).status) << c.value;
        EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, std::string("onReceivedTestData() value: ") + c.value));
        EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "[ff]")) << "the event's length byte";
        EXPECT_FALSE(loggedSignExtension()) << c.value;
    }
}

// Lengths whose byte, or whose high byte, is 0x80 or above frame the packet.
TEST_F(ByteValuesTest, LongPacketsFromTheToolReachTheHalWhole) {
    const struct {
        const char* name;
        Bytes preamble;
        size_t payload;
    } cases[] = {
            {"acl 128", {0x02, 0xFF, 0xFF, 0x80, 0x00}, 0x80},
            {"acl 32768", {0x02, 0x01, 0x20, 0x00, 0x80}, 0x8000},
            {"sco 255", {0x03, 0x80, 0x80, 0xFF}, 0xFF},
    };
    for (const auto& c : cases) writeAll(bt_fd, concat(c.preamble, run(0x80, c.payload)));
    ASSERT_TRUE(hal_->waitForSent(std::size(cases), 10000));
    std::vector<SentPacket> sent = hal_->sent();
    for (size_t i = 0; i < std::size(cases); ++i) {
        const Bytes& preamble = cases[i].preamble;
        EXPECT_EQ(preamble[0], sent[i].type) << cases[i].name;
        EXPECT_EQ(concat(Bytes(preamble.begin() + 1, preamble.end()), run(0x80, cases[i].payload)),
                  sent[i].bytes)
                << cases[i].name;
    }
}

TEST_F(ByteValuesTest, EventsFromTheHalReachTheToolUnchanged) {
    Bytes event = concat({0xFF, 0xFF}, run(0x80, 255));
    hal_->deliverEvent(event);
    EXPECT_EQ(concat({0x04}, event), readBytes(bt_fd, event.size() + 1));
}

}  // namespace
