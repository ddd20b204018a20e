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
#include <atomic>
#include <chrono>
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
        if (opcode == 0x0C22) return Packets{commandStatus(opcode, 0x01)};
        if (opcode == 0x0C03) return Packets{};
        return Packets{commandComplete(opcode, {0x0C})};
    });
    char off[] = {0};
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0022, 1, off), 0);
    EXPECT_EQ(hci_cmd_exchange(bt_fd, 0x03, 0x0020, 1, off).status, 0x0C);
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), -1);
    EXPECT_TRUE(log_.contains(ERROR, "read_incoming_events: timed out after 2000 ms waiting for the packet type, return -1"));
}

// An outside caller may hand a serial line instead of the socket. What waits
// on it came before the command: it is read packet by packet and skipped, so
// a stale reply of the same opcode is not taken; nothing is read when
// nothing waits.
TEST_F(HciCmdTest, SerialLineSkipsThePacketsThatWaitBeforeTheCommand) {
    int controller = posix_openpt(O_RDWR | O_NOCTTY);
    ASSERT_TRUE(controller >= 0 && grantpt(controller) == 0 && unlockpt(controller) == 0);
    int line = open(ptsname(controller), O_RDWR | O_NOCTTY);
    struct termios raw;
    ASSERT_EQ(tcgetattr(line, &raw), 0);
    cfmakeraw(&raw);
    ASSERT_EQ(tcsetattr(line, TCSANOW, &raw), 0);
    const Bytes connection = {0x04, 0x03, 0x0B, 0x00, 0x40, 0x00, 1, 2, 3, 4, 5, 6, 0x01, 0x00};
    const Bytes staleReset = {0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00};
    Bytes both = connection;
    both.insert(both.end(), staleReset.begin(), staleReset.end());
    for (const Bytes& stale : {both, Bytes()}) {
        log_.clear();
        writeAll(controller, stale);
        struct pollfd waiting = {line, POLLIN, 0};
        ASSERT_EQ(poll(&waiting, 1, stale.empty() ? 0 : 1000), stale.empty() ? 0 : 1);
        std::thread answer([controller] {
            EXPECT_EQ(readBytes(controller, 4, 1000), (Bytes{0x01, 0x03, 0x0C, 0x00}));
            EXPECT_EQ(write(controller, "\x04\x0e\x04\x01\x03\x0c\x0c", 7), 7);
        });
        EXPECT_EQ(hci_cmd_exchange(line, 0x03, 0x0003, 0, nullptr).status, 0x0C);
        answer.join();
        EXPECT_EQ(log_.containsFragment("came before the command"), !stale.empty());
        EXPECT_EQ(log_.count(INFO, "CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x0040 \n"), stale.empty() ? 0 : 1);
        EXPECT_EQ(log_.count(INFO, "hci_send_cmd_rawcmd: event 0xe came before the command, skipped"), stale.empty() ? 0 : 1);
    }
    close(line);
    close(controller);
}

const Bytes kSync = {0x01, 0x10, 0x00};
const Bytes kReset = {0x03, 0x0C, 0x00};
const std::string kSyncLine = "hci_send_cmd_rawcmd: a command went unanswered, so its reply may still come: syncing "
                              "with Read Local Version Information (0x1001) first";

// HCI replies carry no sequence number. A controller that answered a Reset
// only after the library gave up sends that late reply with the next
// command's; without a sync it would pass for the next Reset's reply. A sync
// that goes unanswered too ends the session, as the HAL's death does, and the
// link stays out of step on the next session, which syncs first.
TEST_F(HciCmdTest, UnansweredCommandIsFollowedByASyncBeforeTheNextOne) {
    int commands = 0;
    answerWith([&commands](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (++commands == 1 || commands > 4) return Packets{};
        Bytes own = commandComplete(opcode, {static_cast<uint8_t>(opcode == 0x1001 ? 0x00 : 0x0C)});
        return commands == 2 ? Packets{commandComplete(0x0C03), own} : Packets{own};
    });
    for (int status : {HCI_NOT_ANSWERED, 0x0C, 0x0C, HCI_NOT_ANSWERED, HCI_NOT_ANSWERED}) {
        EXPECT_EQ(hci_cmd_exchange(bt_fd, 0x03, 0x0003, 0, nullptr).status, status);
    }
    EXPECT_EQ(commandsSent(*hal_), (std::vector<Bytes>{kReset, kSync, kReset, kReset, kReset, kSync}));
    EXPECT_EQ(log_.count(INFO, kSyncLine), 2);
    EXPECT_TRUE(log_.contains(INFO, "read_incoming_events: event 0xe does not answer opcode 0x1001, skipped"));
    EXPECT_TRUE(log_.contains(ERROR, "hci_send_cmd_rawcmd: the controller did not answer the sync either, ending the session"));
    char byte;
    EXPECT_EQ(recv(bt_fd, &byte, 1, MSG_DONTWAIT), 0) << "the session's stream has ended";

    answerWith(nullptr);
    hidl_client_close_tool_end();
    hidl_client_close();
    hidl_client_init();
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), 0);
    EXPECT_EQ(commandsSent(*hal_).size(), 8u) << "a sync, then the Reset";
}

// A reply with Num_HCI_Command_Packets 0 takes the controller's credit: the
// next command waits for an event that gives one back (here the no-op Command
// Complete of opcode 0x0000), and is not sent when none comes. A new session
// starts with a credit.
TEST_F(HciCmdTest, CommandWaitsForTheControllersCredit) {
    std::atomic<bool> granted{false};
    std::atomic<bool> sentBeforeCredit{false};
    std::vector<std::thread> late;
    answerWith([&](const Bytes& command) {
        uint16_t opcode = opcodeOf(command);
        if (opcode == 0x0C03) sentBeforeCredit = sentBeforeCredit || !granted;
        Bytes reply = commandComplete(opcode);
        reply[2] = 0x00;  // no credit
        if (opcode == 0x0C1A) {
            late.emplace_back([this, &granted] {
                std::this_thread::sleep_for(std::chrono::milliseconds(200));
                granted = true;
                hal_->deliverEvent({0x0E, 0x03, 0x01, 0x00, 0x00});
            });
        }
        return Packets{reply};
    });
    char scan[] = {0x03};
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x001A, 1, scan), 0);
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), 0);
    for (auto& t : late) t.join();
    EXPECT_FALSE(sentBeforeCredit);
    EXPECT_EQ(commandsSent(*hal_).size(), 2u);

    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), -1);  // the Reset's reply gave none back
    EXPECT_TRUE(log_.contains(ERROR, "hci_send_cmd_rawcmd: no command credit from the controller within 2000 ms, command not sent"));
    EXPECT_EQ(commandsSent(*hal_).size(), 2u);
    answerWith(nullptr);
    hidl_client_close_tool_end();
    hidl_client_close();
    hidl_client_init();
    EXPECT_EQ(hci_send_cmd_rawcmd(bt_fd, 0x03, 0x0003, 0, nullptr), 0);
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
