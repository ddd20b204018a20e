// Command framing against a scripted HAL: the bytes each form writes, its log
// lines, what it refuses to send, and how its result follows the reply.
#include "engine/hci_cmd.h"

#include <android/log.h>
#include <fcntl.h>
#include <poll.h>
#include <signal.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <termios.h>
#include <unistd.h>

#include <algorithm>
#include <string>
#include <thread>
#include <vector>

#include "tests/engine/hal_session.h"
#include "tests/support/process.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

class HciCmdTest : public HalSessionTest {
  protected: void SetUp() override {
        HalSessionTest::SetUp();
        hidl_client_init();
        ASSERT_GE(bt_fd, 0);
    }
    HciReply rawcmd(const std::vector<std::string>& tokens) {
        std::vector<const char*> argv;
        for (const std::string& t : tokens) argv.push_back(t.c_str());
        return cmd_rawcmd(bt_fd, static_cast<int>(argv.size()), argv.data());
    }
};

TEST_F(HciCmdTest, BothFormsFrameTheCommandByteExact) {
    const struct {
        std::vector<std::string> tokens;
        Bytes atHal;
    } lists[] = {
            {{"rawcmd", "0x08", "0x001F"}, {0x1F, 0x20, 0x00}},
            // Each parameter keeps its low byte; text without digits is 0.
            {{"rawcmd", "0x08", "0x001E", "0x1FF", "zz", "25"}, {0x1E, 0x20, 0x03, 0xFF, 0x00, 0x25}},
            // OCF bits 8 and 9 land in the opcode's high byte.
            {{"rawcmd", "0x3F", "0x0304", "0x01"}, {0x04, 0xFF, 0x01, 0x01}},
    };
    for (const auto& c : lists) {
        EXPECT_EQ(rawcmd(c.tokens).status, 0) << c.tokens[2];
        EXPECT_EQ(commandsSent(*hal_).back(), c.atHal) << c.tokens[2];
    }
    char params[] = {2, 0, static_cast<char>(0xF2)};
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0005, 3, params), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x05, 0x0C, 0x03, 0x02, 0x00, 0xF2}));
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x3F, 0x0304, 0, nullptr), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x04, 0xFF, 0x00}));
}

// The token form shows the low bytes of OGF and OCF, the binary form the
// whole fields and the descriptor; both show parameters as unsigned bytes.
TEST_F(HciCmdTest, EachFormLogsItsFieldsAndParameters) {
    rawcmd({"rawcmd", "0x3F", "0x0104", "0xF7"});
    char params[] = {static_cast<char>(0xF0)};
    hci_send_cmd_rawcmd(bt_fd, 0x3F, 0x0104, 1, params);
    rawcmd({"rawcmd", "0x03", "0x0003"});
    // The engine's own lines, without the pump's, which it logs on its own thread.
    std::vector<std::string> lines;
    for (const LogLine& line : log_.lines()) {
        if (line.text.find("process_tool_data") == std::string::npos && line.text.rfind("PACKET_TYPE", 0) != 0 &&
            line.text.rfind("safe_read", 0) != 0) {
            lines.push_back(line.text);
        }
    }
    auto after = [&](const std::string& first, size_t n) {
        auto at = std::find(lines.begin(), lines.end(), first);
        return at + n >= lines.end() ? std::vector<std::string>() : std::vector<std::string>(at + 1, at + 1 + n);
    };
    EXPECT_EQ(after("ogf 0x3f ocf 0x4 \nParams: ", 3), (std::vector<std::string>{"0xf7 ", "\n", "Raw HCI command\n"}));
    EXPECT_EQ(after("ogf 0x3f ocf 0x104 \nParams: ", 4),
              (std::vector<std::string>{"dev_id = " + std::to_string(bt_fd) + ": ", "0xf0 ", "\n", "Raw HCI command\n\n"}));
    EXPECT_EQ(after("ogf 0x3 ocf 0x3 \nParams: ", 1), std::vector<std::string>{"\n"});
}

TEST_F(HciCmdTest, CommandsThatDoNotFitAreNotSent) {
    std::vector<std::string> full = {"rawcmd", "0x3F", "0x0001"};
    full.resize(3 + 252, "0xAB");
    EXPECT_EQ(rawcmd(full).status, 0);
    EXPECT_EQ(commandsSent(*hal_).back().size(), 3u + 252u);
    full.push_back("0xCD");
    EXPECT_EQ(rawcmd(full).status, HCI_NOT_ANSWERED);
    HciReply nothing = rawcmd({"rawcmd", "0x03"});  // no OCF: no opcode either
    EXPECT_TRUE(nothing.status == HCI_NOT_ANSWERED && nothing.opcode == 0);
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0005, 3, nullptr), -1);
    EXPECT_EQ(hci_send_cmd(bt_fd, 0x03, 0x0005, 3, nullptr), -1);
    EXPECT_TRUE(log_.contains(ERROR, "cmd_rawcmd: 253 parameters do not fit one command (at most 252), nothing sent"));
    EXPECT_FALSE(hal_->waitForSent(2, 300));
}

// The exported form's result says whether a reply came, whatever its status;
// the status itself goes to the library's own callers.
TEST_F(HciCmdTest, ReplyOrNoneDecidesTheExportedResult) {
    answerWith([](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C22) return std::vector<Bytes>{commandStatus(opcode, 0x01)};
        if (opcode == 0x0C03) return std::vector<Bytes>{};
        return std::vector<Bytes>{commandComplete(opcode, {0x0C})};
    });
    char off[] = {0};
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0022, 1, off), 0);
    EXPECT_EQ(hci_cmd_exchange(bt_fd, 0x03, 0x0020, 1, off).status, 0x0C);
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_TRUE(log_.contains(ERROR, "read_incoming_events: timed out after 2000 ms waiting for the packet type, return -1"));
}

// An outside caller may hand a serial line instead of the socket: what waits
// on it before the command is dropped, and nothing when nothing waits.
TEST_F(HciCmdTest, SerialLineDropsOnlyTheStaleBytesThatWait) {
    int controller = posix_openpt(O_RDWR | O_NOCTTY);
    ASSERT_TRUE(controller >= 0 && grantpt(controller) == 0 && unlockpt(controller) == 0);
    int line = open(ptsname(controller), O_RDWR | O_NOCTTY);
    struct termios raw;
    ASSERT_EQ(tcgetattr(line, &raw), 0);
    cfmakeraw(&raw);
    ASSERT_EQ(tcsetattr(line, TCSANOW, &raw), 0);
    for (size_t stale : {3, 0}) {
        log_.clear();
        ASSERT_EQ(write(controller, "\x04\x04\x04", stale), static_cast<ssize_t>(stale));
        struct pollfd waiting = {line, POLLIN, 0};
        ASSERT_EQ(poll(&waiting, 1, stale ? 1000 : 0), stale ? 1 : 0);
        std::thread answer([controller] {
            EXPECT_EQ(readBytes(controller, 4, 1000), (Bytes{0x01, 0x03, 0x0C, 0x00}));
            EXPECT_EQ(write(controller, "\x04\x0e\x04\x01\x03\x0c\x00", 7), 7);
        });
        EXPECT_EQ(hci_send_cmd_rawcmd(line, 0x03, 0x0003, 0, nullptr), 0);
        answer.join();
        EXPECT_EQ(log_.containsFragment("stale bytes"), stale > 0);
        EXPECT_EQ(log_.count(INFO, "hci_send_cmd_rawcmd: dropped 3 stale bytes before the command"), stale ? 1 : 0);
    }
    close(line);
    close(controller);
}

// With SIGPIPE at its default action, a write that raised it would end the
// test binary instead of failing.
TEST(HciSendCmdTest, WritesWholePacketsAndFailsWithoutSigpipeWhenThePeerLeft) {
    struct sigaction dfl = {}, old = {};
    dfl.sa_handler = SIG_DFL;
    sigaction(SIGPIPE, &dfl, &old);
    int fds[2];
    ASSERT_EQ(pipe(fds), 0);
    uint8_t params[] = {0x02, 0x00, 0x02};
    EXPECT_EQ(hci_send_cmd(fds[1], 0x03, 0x0005, 3, params), 0);
    EXPECT_EQ(readBytes(fds[0], 7, 1000), (Bytes{0x01, 0x05, 0x0C, 0x03, 0x02, 0x00, 0x02}));
    close(fds[0]);
    close(fds[1]);
    ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds), 0);
    close(fds[1]);
    EXPECT_EQ(hci_send_cmd(fds[0], 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_EQ(hci_send_cmd_rawcmd(fds[0], 0x03, 0x0003, 0, nullptr), -1);
    close(fds[0]);
    sigaction(SIGPIPE, &old, nullptr);
}

}  // namespace
