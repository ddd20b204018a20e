// The event reader as outside callers use it, over a socket pair whose far
// end the test plays: what each event logs, which end the exchange, broken
// and silent streams, and events that arrive in pieces.
#include "engine/event_reader.h"

#include <android/log.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <string>
#include <thread>
#include <vector>

#include "tests/support/log_capture.h"
#include "tests/support/process.h"

namespace {

using Bytes = std::vector<uint8_t>;

class EventReaderTest : public ::testing::Test {
  protected: void SetUp() override { fresh(); }
    void TearDown() override { closeBoth(); }
    void closeBoth() {
        for (int& fd : fds_) {
            if (fd != -1) close(fd);
            fd = -1;
        }
    }
    void fresh() {
        closeBoth();
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds_), 0);
        log_.clear();
    }
    int read(const Bytes& stream, bool closeAfter = false) {
        writeAll(fds_[1], stream);
        if (closeAfter) {
            close(fds_[1]);
            fds_[1] = -1;
        }
        return read_incoming_events(fds_[0], buf_, 0);
    }
    std::vector<std::string> texts() const {
        std::vector<std::string> out;
        for (const LogLine& line : log_.lines()) out.push_back(line.text);
        return out;
    }

    int fds_[2] = {-1, -1};
    uint8_t buf_[260] = {0};
    LogCapture log_;
};

const std::string kOther = "Other event received, Breaking\n";
const std::string kNoVm = "onReceivedTestData, JavaVM is NULL return!!!";

TEST_F(EventReaderTest, EachEventIsLoggedAndEndsOrContinuesTheExchange) {
    const struct {
        const char* name;
        Bytes stream;
        std::vector<std::string> lines;  // the whole log, in order
    } cases[] = {
            {"inquiry complete", {0x04, 0x01, 0x01, 0x00}, {"INQ COMPLETE EVENT RECEIVED\n", "\n"}},
            {"inquiry results of 1 and 2 bytes, then a command complete",
             {0x04, 0x02, 0x01, 0xAA, 0x04, 0x02, 0x02, 0x01, 0x02, 0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x80},
             {"INQ RESULT EVENT RECEIVED \n", "[2]", "[1]", "[aa]", "\n", "INQ RESULT EVENT RECEIVED \n", "[2]", "[2]",
              "[1]", "[2]", "\n", kOther, "[e]", "[4]", "[1]", "[3]", "[c]", "[80]", "\n",
              "onReceivedTestData() value: 32780", kNoVm}},
            {"connection complete", {0x04, 0x03, 0x05, 0x00, 0x40, 0x00, 0x01, 0x02},
             {"CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x0040 \n", "[3]", "[5]", "[0]", "[40]", "[0]", "[1]",
              "[2]", "\n"}},
            {"disconnection complete", {0x04, 0x05, 0x04, 0x00, 0x40, 0x00, 0x13},
             {"DISCONNECTION COMPLETE EVENT RECEIVED WITH REASON CODE: 0x13 \n", "[5]", "[4]", "[0]", "[40]", "[0]",
              "[13]", "\n"}},
            {"command status unknown connection", {0x04, 0x0F, 0x04, 0x02, 0x01, 0x05, 0x04},
             {"Command Status Received\n", "[f]", "[4]", "[2]", "[1]", "[5]", "[4]", "\n",
              "\nUnknown connection identifier"}},
            {"command status refused", {0x04, 0x0F, 0x04, 0x0C, 0x01, 0x22, 0x0C},
             {"Command Status Received\n", "[f]", "[4]", "[c]", "[1]", "[22]", "[c]", "\n",
              "read_incoming_events: command rejected with status 0xc"}},
            {"command status pending, then complete",
             {0x04, 0x0F, 0x04, 0x00, 0x01, 0x05, 0x04, 0x04, 0x0E, 0x04, 0x01, 0x05, 0x04, 0x00},
             {"Command Status Received\n", "[f]", "[4]", "[0]", "[1]", "[5]", "[4]", "\n", kOther, "[e]", "[4]", "[1]",
              "[5]", "[4]", "[0]", "\n", "onReceivedTestData() value: 4", kNoVm}},
            {"LE meta ending in ff ff", {0x04, 0x3E, 0x03, 0x01, 0xFF, 0xFF},
             {kOther, "[3e]", "[3]", "[1]", "[ff]", "[ff]", "\n", "onReceivedTestData() value: 65535", kNoVm}},
            // Data and empty events are legal beside a reply: each is read whole and skipped.
            {"ACL, SCO, ISO and an empty event before a command complete",
             {0x02, 0x01, 0x20, 0x02, 0x00, 0x04, 0x04, 0x03, 0x01, 0x00, 0x01, 0x04, 0x05, 0x01, 0x00, 0x01, 0x40,
              0x09, 0x04, 0xFF, 0x00, 0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00},
             {"read_incoming_events: ACL data packet of 6 bytes skipped",
              "read_incoming_events: SCO data packet of 4 bytes skipped",
              "read_incoming_events: ISO data packet of 5 bytes skipped", "Zero len , invalid \n", kOther, "[e]", "[4]",
              "[1]", "[3]", "[c]", "[0]", "\n", "onReceivedTestData() value: 12", kNoVm}},
    };
    for (const auto& c : cases) {
        log_.clear();
        EXPECT_EQ(read(c.stream), 0) << c.name;
        EXPECT_EQ(texts(), c.lines) << c.name;
        EXPECT_TRUE(staysQuiet(fds_[0], 0)) << c.name << ": read past the event";
    }
}

TEST_F(EventReaderTest, BrokenStreamsFailWithTheirLogLine) {
    const struct {
        const char* name;
        Bytes stream;
        std::vector<std::string> lines;
    } cases[] = {
            {"byte that starts no packet", {0x07, 0x0E, 0x04}, {"read_incoming_events: byte 0x07 starts no HCI packet, "
                                                               "the stream cannot be followed"}},
            {"end of stream", {}, {}},
            {"end inside an ACL packet", {0x02, 0x01, 0x20, 0x05, 0x01, 0xAA}, {"read error :size = 265\n"}},
            {"end inside the header", {0x04, 0x0E}, {"read error \n"}},
            {"end inside the parameters", {0x04, 0x0E, 0x04, 0x01}, {"read error :size = 4\n"}},
    };
    for (const auto& c : cases) {
        fresh();
        EXPECT_EQ(read(c.stream, true), -1) << c.name;
        EXPECT_EQ(texts(), c.lines) << c.name;
    }
}

TEST_F(EventReaderTest, SilentControllerTimesOutNamingTheWait) {
    const struct {
        Bytes stream;
        const char* wait;
    } cases[] = {{{0x04, 0x0E}, "event header"}, {{0x04, 0x0E, 0x04, 0x01}, "event parameters"}};
    for (const auto& c : cases) {
        fresh();
        EXPECT_EQ(read(c.stream), -1) << c.wait;  // the rest never comes, and the peer stays open
        EXPECT_TRUE(log_.contains(ANDROID_LOG_ERROR, std::string("read_incoming_events: timed out after 2000 ms "
                                                                 "waiting for the ") + c.wait + ", return -1"));
    }
}

// The second slice goes out only once the reader has taken all of the first,
// so each split is really seen as two reads.
TEST_F(EventReaderTest, ReassemblesAnEventSplitAtEveryOffset) {
    const Bytes event = {0x04, 0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00};
    for (size_t split = 1; split < event.size(); ++split) {
        log_.clear();
        int rc = 99;
        writeAll(fds_[1], Bytes(event.begin(), event.begin() + split));
        std::thread reader([&] { rc = read_incoming_events(fds_[0], buf_, 0); });
        EXPECT_TRUE(waitUntil([&] {
            int pending = 0;
            ioctl(fds_[0], FIONREAD, &pending);
            return pending == 0;
        }));
        writeAll(fds_[1], Bytes(event.begin() + split, event.end()));
        reader.join();
        EXPECT_EQ(rc, 0) << "split at " << split;
        EXPECT_TRUE(log_.contains(ANDROID_LOG_INFO, "onReceivedTestData() value: 42")) << "split at " << split;
    }
}

}  // namespace
