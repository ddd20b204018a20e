#include "engine/event_reader.h"

#include <android/log.h>
#include <gtest/gtest.h>
#include <sys/ioctl.h>
#include <sys/socket.h>
#include <unistd.h>

#include <chrono>
#include <string>
#include <thread>
#include <vector>

#include "tests/support/log_capture.h"
#include "tests/support/process.h"

namespace {

using Bytes = std::vector<uint8_t>;
const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;

// The reader reads from fds_[0]; the test plays the bridge end on fds_[1].
class EventReaderTest : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds_), 0);
        log_.clear();
    }
    void TearDown() override { closeBoth(); }

    void closeBoth() {
        close(fds_[0]);
        if (fds_[1] != -1) close(fds_[1]);
    }
    void freshStream() {
        closeBoth();
        ASSERT_EQ(socketpair(AF_UNIX, SOCK_STREAM, 0, fds_), 0);
        log_.clear();
    }

    int read(const Bytes& stream) {
        writeAll(fds_[1], stream);
        return readEvents();
    }
    int readEvents() { return read_incoming_events(fds_[0], buf_, 0); }
    void closePeer() {
        close(fds_[1]);
        fds_[1] = -1;
    }
    std::vector<std::string> texts() const {
        std::vector<std::string> out;
        for (const LogLine& line : log_.lines()) out.push_back(line.text);
        return out;
    }
    int handedOn() const {
        int n = 0;
        for (const LogLine& line : log_.lines()) n += line.text.rfind("onReceivedTestData() value: ", 0) == 0;
        return n;
    }

    int fds_[2];
    uint8_t buf_[260] = {0};
    LogCapture log_;
};

struct EventCase {
    const char* name;
    Bytes stream;
    std::vector<std::string> lines;  // the whole log, in order
};

const std::string kOther = "Other event received, Breaking\n";
const std::string kJavaVmMissing = "onReceivedTestData, JavaVM is NULL return!!!";

TEST_F(EventReaderTest, EachEventKindIsLoggedAndEndsOrContinuesAsItShould) {
    const EventCase cases[] = {
            {"inquiry complete", {0x04, 0x01, 0x01, 0x00},
             {"INQ COMPLETE EVENT RECEIVED\n", "\n"}},
            {"inquiry result then command complete",
             {0x04, 0x02, 0x02, 0x01, 0xAA, 0x04, 0x0E, 0x04, 0x01, 0x03, 0x0C, 0x00},
             {"INQ RESULT EVENT RECEIVED \n", "[2]", "[2]", "[1]", "[aa]", "\n", kOther, "[e]", "[4]",
              "[1]", "[3]", "[c]", "[0]", "\n", "onReceivedTestData() value: 12", kJavaVmMissing}},
            {"connection complete", {0x04, 0x03, 0x05, 0x00, 0x40, 0x00, 0x01, 0x02},
             {"CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x0040 \n", "[3]", "[5]", "[0]", "[40]",
              "[0]", "[1]", "[2]", "\n"}},
            {"connection failed", {0x04, 0x03, 0x03, 0x04, 0x00, 0x00},
             {"CONNECTION COMPLETE EVENT RECEIVED WITH ERROR CODE 0x4 \n", "[3]", "[3]", "[4]", "[0]",
              "[0]", "\n"}},
            {"disconnection complete", {0x04, 0x05, 0x04, 0x00, 0x40, 0x00, 0x13},
             {"DISCONNECTION COMPLETE EVENT RECEIVED WITH REASON CODE: 0x13 \n", "[5]", "[4]", "[0]",
              "[40]", "[0]", "[13]", "\n"}},
            {"command status unknown connection", {0x04, 0x0F, 0x04, 0x02, 0x01, 0x05, 0x04},
             {"Command Status Received\n", "[f]", "[4]", "[2]", "[1]", "[5]", "[4]", "\n",
              "\nUnknown connection identifier"}},
            {"command status rejected", {0x04, 0x0F, 0x04, 0x0C, 0x01, 0x22, 0x0C},
             {"Command Status Received\n", "[f]", "[4]", "[c]", "[1]", "[22]", "[c]", "\n",
              "read_incoming_events: command rejected with status 0xc"}},
            {"command status pending then complete",
             {0x04, 0x0F, 0x04, 0x00, 0x01, 0x05, 0x04, 0x04, 0x0E, 0x04, 0x01, 0x05, 0x04, 0x00},
             {"Command Status Received\n", "[f]", "[4]", "[0]", "[1]", "[5]", "[4]", "\n", kOther, "[e]",
              "[4]", "[1]", "[5]", "[4]", "[0]", "\n", "onReceivedTestData() value: 4", kJavaVmMissing}},
            {"test end count 42", {0x04, 0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00},
             {kOther, "[e]", "[6]", "[1]", "[1f]", "[20]", "[0]", "[2a]", "[0]", "\n",
              "onReceivedTestData() value: 42", kJavaVmMissing}},
            {"test end count 65535", {0x04, 0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0xFF, 0xFF},
             {kOther, "[e]", "[6]", "[1]", "[1f]", "[20]", "[0]", "[ff]", "[ff]", "\n",
              "onReceivedTestData() value: 65535", kJavaVmMissing}},
            {"LE meta", {0x04, 0x3E, 0x03, 0x01, 0x02, 0x03},
             {kOther, "[3e]", "[3]", "[1]", "[2]", "[3]", "\n", "onReceivedTestData() value: 770",
              kJavaVmMissing}},
    };
    for (const EventCase& c : cases) {
        log_.clear();
        EXPECT_EQ(read(c.stream), 0) << c.name;
        EXPECT_EQ(texts(), c.lines) << c.name;
        EXPECT_TRUE(staysQuiet(fds_[0], 0)) << c.name << ": read past the event";
    }
}

TEST_F(EventReaderTest, ShortEventsAreReadWholeBeforeTheNextTypeByte) {
    // Inquiry Results of one and two parameter bytes, then a Command Complete.
    EXPECT_EQ(read({0x04, 0x02, 0x01, 0x00, 0x04, 0x02, 0x02, 0x01, 0x02, 0x04, 0x0E, 0x04, 0x01,
                    0x1F, 0x20, 0x00}),
              0);
    EXPECT_EQ(log_.count(INFO, "INQ RESULT EVENT RECEIVED \n"), 2);
    EXPECT_TRUE(log_.contains(INFO, "onReceivedTestData() value: 32"));
}

TEST_F(EventReaderTest, ALoneOneByteEventEndsTheExchangeAndLeavesTheRest) {
    EXPECT_EQ(read({0x04, 0x10, 0x01, 0x05, 0x02}), 0);  // Hardware Error, then an ACL type byte
    EXPECT_TRUE(log_.contains(INFO, "onReceivedTestData() value: 1281"));  // last two bytes 01 05
    EXPECT_EQ(readBytes(fds_[0], 1, 1000), Bytes{0x02});
}

struct FailureCase {
    const char* name;
    Bytes stream;
    bool closeAfter;
    std::vector<std::string> lines;
};

TEST_F(EventReaderTest, BrokenStreamsFailWithTheirLogLine) {
    const FailureCase cases[] = {
            {"zero length", {0x04, 0x0E, 0x00}, false, {"Zero len , invalid \n"}},
            {"ACL packet", {0x02, 0x01, 0x20, 0x00, 0x00}, false, {}},
            {"end of stream", {}, true, {}},
            {"end inside the header", {0x04, 0x0E}, true, {"read error \n"}},
            {"end inside the parameters", {0x04, 0x0E, 0x04, 0x01}, true, {"read error :size = 4\n"}},
    };
    for (const FailureCase& c : cases) {
        freshStream();
        writeAll(fds_[1], c.stream);
        if (c.closeAfter) closePeer();
        EXPECT_EQ(readEvents(), -1) << c.name;
        EXPECT_EQ(texts(), c.lines) << c.name;
    }
}

TEST_F(EventReaderTest, SilentControllerTimesOutNamingTheWait) {
    struct {
        Bytes stream;
        const char* wait;
    } cases[] = {{{}, "packet type"}, {{0x04, 0x0E}, "event header"}, {{0x04, 0x0E, 0x04, 0x01}, "event parameters"}};
    for (const auto& c : cases) {
        freshStream();
        writeAll(fds_[1], c.stream);  // the rest never comes, and the peer stays open
        auto start = std::chrono::steady_clock::now();
        EXPECT_EQ(readEvents(), -1) << c.wait;
        auto ms = std::chrono::duration_cast<std::chrono::milliseconds>(std::chrono::steady_clock::now() - start).count();
        EXPECT_GE(ms, 1900) << c.wait;
        EXPECT_LT(ms, 6000) << c.wait;
        EXPECT_TRUE(log_.contains(ERROR, std::string("read_incoming_events: timed out after 2000 ms "
                                                     "waiting for the ") + c.wait + ", return -1"))
                << c.wait;
    }
}

// The bridge end writes the Test End's Command Complete in two slices, split
// at every offset; the second slice goes out only once the reader has taken
// all of the first, so each split is really seen as two reads.
TEST_F(EventReaderTest, ReassemblesAnEventSplitAtEveryOffset) {
    const Bytes event = {0x04, 0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00};
    for (size_t split = 1; split < event.size(); ++split) {
        log_.clear();
        int rc = 99;
        writeAll(fds_[1], Bytes(event.begin(), event.begin() + split));
        std::thread reader([&] { rc = readEvents(); });
        EXPECT_TRUE(waitUntil([&] {
            int pending = 0;
            ioctl(fds_[0], FIONREAD, &pending);
            return pending == 0;
        }));
        writeAll(fds_[1], Bytes(event.begin() + split, event.end()));
        reader.join();
        EXPECT_EQ(rc, 0) << "split at " << split;
        EXPECT_TRUE(log_.contains(INFO, "onReceivedTestData() value: 42")) << "split at " << split;
    }
}

}  // namespace
