#include "engine/hci_cmd.h"

#include <android/log.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <vector>

#include "tests/engine/hal_session.h"
#include "tests/support/process.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

class HciCmdTest : public HalSessionTest {
  protected:
    int openSession() {
        hidl_client_init();
        return bt_fd;
    }

    int rawcmd(const std::vector<std::string>& tokens) {
        std::vector<const char*> argv;
        for (const std::string& t : tokens) argv.push_back(t.c_str());
        return cmd_rawcmd(bt_fd, static_cast<int>(argv.size()), argv.data()).status;
    }

    static long elapsedMs(std::chrono::steady_clock::time_point since) {
        return static_cast<long>(std::chrono::duration_cast<std::chrono::milliseconds>(
                std::chrono::steady_clock::now() - since).count());
    }
};

struct TokenCase {
    std::vector<std::string> tokens;
    Bytes atHal;
};

TEST_F(HciCmdTest, TokenListsAreFramedByteExact) {
    const TokenCase cases[] = {
            {{"rawcmd", "0x08", "0x001F"}, {0x1F, 0x20, 0x00}},
            {{"rawcmd", "0x08", "0x0033", "0x13", "0x02", "0x00"}, {0x33, 0x20, 0x03, 0x13, 0x02, 0x00}},
            // Each parameter keeps its low byte; text without digits is 0.
            {{"rawcmd", "0x08", "0x001E", "0x1FF", "zz", "25"}, {0x1E, 0x20, 0x03, 0xFF, 0x00, 0x25}},
            // OCF bits 8 and 9 land in the opcode's high byte.
            {{"rawcmd", "0x3F", "0x0104", "0x01"}, {0x04, 0xFD, 0x01, 0x01}},
            {{"rawcmd", "0x3F", "0x0004", "0x05", "0x01", "0x09", "0x04", "0x20", "0x00", "0x00",
              "0x00", "0x00"},
             {0x04, 0xFC, 0x09, 0x05, 0x01, 0x09, 0x04, 0x20, 0x00, 0x00, 0x00, 0x00}},
    };
    ASSERT_GE(openSession(), 0);
    for (const TokenCase& c : cases) {
        EXPECT_EQ(rawcmd(c.tokens), 0) << c.tokens[2];
        EXPECT_EQ(commandsSent(*hal_).back(), c.atHal) << c.tokens[2];
    }
    EXPECT_EQ(commandsSent(*hal_).size(), sizeof(cases) / sizeof(cases[0]));
}

TEST_F(HciCmdTest, TokenFormLogsLowBytesOfOgfAndOcf) {
    ASSERT_GE(openSession(), 0);
    rawcmd({"rawcmd", "0x3F", "0x0104", "0x7"});
    int first = lineIndex("ogf 0x3f ocf 0x4 \nParams: ");
    ASSERT_GE(first, 0);
    std::vector<std::string> lines = engineLog();
    ASSERT_GT(lines.size(), first + 3u);
    EXPECT_EQ(lines[first + 1], "0x7 ");
    EXPECT_EQ(lines[first + 2], "\n");
    EXPECT_EQ(lines[first + 3], "Raw HCI command\n");
}

TEST_F(HciCmdTest, ThreeTokensSendNoParameters) {
    ASSERT_GE(openSession(), 0);
    EXPECT_EQ(rawcmd({"rawcmd", "0x03", "0x0003"}), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x03, 0x0C, 0x00}));
    int first = lineIndex("ogf 0x3 ocf 0x3 \nParams: ");
    ASSERT_GE(first, 0);
    EXPECT_EQ(engineLog()[first + 1], "\n");
}

TEST_F(HciCmdTest, FewerThanThreeTokensSendNothing) {
    ASSERT_GE(openSession(), 0);
    EXPECT_EQ(rawcmd({"rawcmd", "0x03"}), -1);
    EXPECT_TRUE(staysQuiet(bt_fd, 100));
    EXPECT_TRUE(commandsSent(*hal_).empty());
}

TEST_F(HciCmdTest, MoreThan252ParametersAreRefusedWhole) {
    ASSERT_GE(openSession(), 0);
    std::vector<std::string> full = {"rawcmd", "0x3F", "0x0001"};
    full.resize(3 + 252, "0xAB");
    EXPECT_EQ(rawcmd(full), 0);
    ASSERT_EQ(commandsSent(*hal_).size(), 1u);
    EXPECT_EQ(commandsSent(*hal_)[0].size(), 3u + 252u);
    EXPECT_EQ(commandsSent(*hal_)[0][2], 252);

    full.push_back("0xCD");
    log_.clear();
    EXPECT_EQ(rawcmd(full), -1);
    EXPECT_TRUE(log_.contains(ERROR, "cmd_rawcmd: 253 parameters do not fit one command (at most 252), nothing sent"));
    EXPECT_FALSE(log_.containsFragment("Raw HCI command"));
    EXPECT_FALSE(hal_->waitForSent(2, 300));
}

struct BinaryCase {
    uint16_t ogf;
    uint16_t ocf;
    Bytes params;
    Bytes atHal;
};

TEST_F(HciCmdTest, BinaryFieldsAreFramedByteExact) {
    const BinaryCase cases[] = {
            {0x06, 0x0003, {}, {0x03, 0x18, 0x00}},
            {0x03, 0x0005, {0x02, 0x00, 0x02}, {0x05, 0x0C, 0x03, 0x02, 0x00, 0x02}},
            {0x3F, 0x0304, {0xF0}, {0x04, 0xFF, 0x01, 0xF0}},
    };
    ASSERT_GE(openSession(), 0);
    for (const BinaryCase& c : cases) {
        Bytes params = c.params;
        EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, c.ogf, c.ocf, static_cast<uint8_t>(params.size()),
                                      reinterpret_cast<char*>(params.data())),
                  0);
        EXPECT_EQ(commandsSent(*hal_).back(), c.atHal);
    }
}

TEST_F(HciCmdTest, BinaryFormLogsFullFieldsDescriptorAndUnsignedBytes) {
    ASSERT_GE(openSession(), 0);
    char params[] = {static_cast<char>(0xF0)};
    hci_send_cmd_rawcmd(bt_fd, 0x3F, 0x0104, 1, params);
    int first = lineIndex("ogf 0x3f ocf 0x104 \nParams: ");
    ASSERT_GE(first, 0);
    std::vector<std::string> lines = engineLog();
    ASSERT_GT(lines.size(), first + 4u);
    EXPECT_EQ(lines[first + 1], "dev_id = " + std::to_string(bt_fd) + ": ");
    EXPECT_EQ(lines[first + 2], "0xf0 ");
    EXPECT_EQ(lines[first + 3], "\n");
    EXPECT_EQ(lines[first + 4], "Raw HCI command\n\n");
}

TEST_F(HciCmdTest, FailedWriteReadsNothingAndReturnsFailure) {
    EXPECT_EQ(hci_send_cmd_rawcmd(-1, 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_EQ(cmd_rawcmd(-1, 3, std::vector<const char*>{"rawcmd", "0x03", "0x0003"}.data()).status, -1);
    EXPECT_EQ(log_.count(INFO, "Raw HCI command\n\n"), 1);
    EXPECT_EQ(log_.count(INFO, "\n"), 4);  // each form: after the parameters and at the end
    EXPECT_FALSE(log_.containsFragment("event"));
}

TEST_F(HciCmdTest, ControllerStatusDoesNotChangeTheResult) {
    answerWith([](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C22) return std::vector<Bytes>{commandStatus(opcode, 0x01)};
        return std::vector<Bytes>{commandComplete(opcode, {0x0C})};
    });
    ASSERT_GE(openSession(), 0);
    auto start = std::chrono::steady_clock::now();
    char off[] = {0};
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0022, 1, off), 0);  // rejected: Command Status 0x01
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0020, 1, off), 0);  // Command Complete, status 0x0C
    EXPECT_LT(elapsedMs(start), 1500);  // well inside the reply time-out
    EXPECT_FALSE(log_.containsFragment("timed out"));
}

TEST_F(HciCmdTest, UnansweredCommandTimesOutWithFailure) {
    answerWith([](const Bytes&) { return std::vector<Bytes>{}; });
    ASSERT_GE(openSession(), 0);
    auto start = std::chrono::steady_clock::now();
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), -1);
    long ms = elapsedMs(start);
    EXPECT_GE(ms, 1900);
    EXPECT_LT(ms, 6000);
    EXPECT_TRUE(log_.contains(ERROR, "read_incoming_events: timed out after 2000 ms waiting for the "
                                     "packet type, return -1"));
}

// A reply that comes after its command timed out belongs to that command,
// whether it lands before the next command is written or while the next
// command waits for its own reply.
TEST_F(HciCmdTest, LateReplyIsNeverTakenForTheNextCommand) {
    const Bytes lateReset = commandComplete(0x0C03, {0x00, 0x11, 0x11});  // value 4369
    answerWith([lateReset](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C03) return std::vector<Bytes>{};
        if (opcode == 0x201F) return std::vector<Bytes>{lateReset, commandComplete(opcode, {0x00, 0x2A, 0x00})};
        return std::vector<Bytes>{commandComplete(opcode, {0x00, 0x22, 0x22})};  // value 8738
    });
    ASSERT_GE(openSession(), 0);

    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), -1);
    hal_->deliverEvent(lateReset);  // lands before the next command is written
    EXPECT_EQ(rawcmd({"rawcmd", "0x08", "0x001D", "0x13"}), 0);
    EXPECT_TRUE(log_.contains(INFO, "onReceivedTestData() value: 8738"));
    EXPECT_FALSE(log_.containsFragment("value: 4369"));

    log_.clear();
    EXPECT_EQ(rawcmd({"rawcmd", "0x08", "0x001F"}), 0);  // stale reply arrives first here
    EXPECT_EQ(log_.count(INFO, "onReceivedTestData() value: 42"), 1);
    EXPECT_FALSE(log_.containsFragment("value: 4369"));
    EXPECT_TRUE(log_.contains(INFO, "read_incoming_events: event 0xe does not answer opcode 0x201f, skipped"));
}

TEST(HciSendCmdTest, WritesTheWholeH4PacketAndReadsNothing) {
    int fds[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds), 0);
    uint8_t params[] = {0x02, 0x00, 0x02};
    EXPECT_EQ(hci_send_cmd(fds[0], 0x03, 0x0005, 3, params), 0);
    EXPECT_EQ(readBytes(fds[1], 7, 1000), (Bytes{0x01, 0x05, 0x0C, 0x03, 0x02, 0x00, 0x02}));
    close(fds[0]);
    close(fds[1]);
}

TEST(HciSendCmdTest, WritesToAPipeToo) {
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    EXPECT_EQ(hci_send_cmd(fds[1], 0x06, 0x0003, 0, nullptr), 0);
    EXPECT_EQ(readBytes(fds[0], 4, 1000), (Bytes{0x01, 0x03, 0x18, 0x00}));
    close(fds[0]);
    close(fds[1]);
}

// With SIGPIPE at its default action, a write that raised it would end the
// test binary instead of failing.
TEST(HciSendCmdTest, PeerGoneFailsWithoutSigpipe) {
    struct sigaction dfl = {}, old = {};
    dfl.sa_handler = SIG_DFL;
    sigaction(SIGPIPE, &dfl, &old);
    int fds[2];
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds), 0);
    close(fds[1]);
    EXPECT_EQ(hci_send_cmd(fds[0], 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_EQ(hci_send_cmd_rawcmd(fds[0], 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_EQ(cmd_rawcmd(fds[0], 3, std::vector<const char*>{"rawcmd", "0x08", "0x001F"}.data()).status, -1);
    close(fds[0]);
    sigaction(SIGPIPE, &old, nullptr);
}

TEST(HciSendCmdTest, MissingParametersAreRefused) {
    EXPECT_EQ(hci_send_cmd(-1, 0x03, 0x0005, 3, nullptr), -1);
    EXPECT_EQ(hci_send_cmd_rawcmd(-1, 0x03, 0x0005, 3, nullptr), -1);
}

}  // namespace
