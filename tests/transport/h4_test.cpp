// H4 framing and whole-run stream I/O, exercised over real socket pairs.
#include "transport/h4.h"

#include <fcntl.h>
#include <pthread.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <cstdio>
#include <fstream>
#include <string>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/log_capture.h"
#include "tests/support/process.h"

namespace {

class H4Test : public ::testing::Test {
  protected:
    void SetUp() override { ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, fds)); }
    void TearDown() override {
        for (int fd : fds) {
            if (fd != -1) close(fd);
        }
    }
    void closePeer() {
        close(fds[1]);
        fds[1] = -1;
    }
    int fds[2] = {-1, -1};
    LogCapture log;
};

TEST_F(H4Test, PayloadLengthFollowsEachTypesPreamble) {
    struct Case {
        uint8_t type;
        std::vector<uint8_t> preamble;
        int length;
    } cases[] = {
            {H4_TYPE_ACL, {0x01, 0x20, 0x05, 0x00}, 5},
            {H4_TYPE_ACL, {0x01, 0x20, 0x00, 0x01}, 256},
            {H4_TYPE_ACL, {0x01, 0x20, 0xFF, 0xFF}, 65535},
            {H4_TYPE_EVENT, {0x0E, 0x04}, 4},
            {H4_TYPE_EVENT, {0x0E, 0xFF}, 255},
            {H4_TYPE_COMMAND, {0x03, 0x0C, 0x00}, 0},
            {H4_TYPE_COMMAND, {0x03, 0x0C, 0xFC}, 252},
            {H4_TYPE_SCO, {0x01, 0x00, 0x02}, 2},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(c.length, get_payload_len(c.type, c.preamble.data())) << "type " << int(c.type);
    }
}

TEST_F(H4Test, PayloadLengthRejectsUnknownTypes) {
    uint8_t preamble[4] = {1, 2, 3, 4};
    for (uint8_t type : {0, 5, 0xFF}) {
        log.clear();
        EXPECT_EQ(-1, get_payload_len(type, preamble));
        EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR,
                                 "get_payload_len: Unsupported packet type, failed to get length"));
    }
}

TEST_F(H4Test, ReadCollectsBytesArrivingInPieces) {
    std::thread writer([&] {
        for (uint8_t b = 1; b <= 7; ++b) writeAll(fds[1], {b});
    });
    unsigned char buf[7] = {0};
    EXPECT_EQ(7, safe_read(fds[0], buf, 7));
    writer.join();
    EXPECT_EQ((std::vector<uint8_t>{1, 2, 3, 4, 5, 6, 7}), std::vector<uint8_t>(buf, buf + 7));
}

TEST_F(H4Test, ReadFailsWhenPeerClosesMidRun) {
    writeAll(fds[1], {1, 2, 3});
    closePeer();
    unsigned char buf[7];
    EXPECT_EQ(-1, safe_read(fds[0], buf, 7));
    bool found = false;
    for (const auto& line : log.lines()) {
        found |= line.priority == ANDROID_LOG_ERROR &&
                 line.text.rfind("safe_read: read returned 0, err = ", 0) == 0 &&
                 line.text.find("read bytes: 3") == line.text.size() - 13;
    }
    EXPECT_TRUE(found);
}

TEST_F(H4Test, ZeroAndNegativeLengthsMoveNothing) {
    unsigned char buf[1];
    EXPECT_EQ(0, safe_read(fds[0], buf, 0));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_read: No data to read"));
    EXPECT_EQ(0, safe_write(fds[0], buf, 0));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_write: No data to write"));
    log.clear();
    EXPECT_EQ(0, safe_read(fds[0], buf, -3));
    EXPECT_EQ(0, safe_write(fds[0], buf, -3));
    EXPECT_TRUE(log.lines().empty());
}

TEST_F(H4Test, NullBufferFailsEvenForZeroLength) {
    EXPECT_EQ(-1, safe_write(fds[0], nullptr, 0));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_write: The buffer is NULL"));
    EXPECT_EQ(-1, safe_read(fds[0], nullptr, 4));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_read: The buffer is NULL"));
}

TEST_F(H4Test, ReadOnClosedDescriptorReportsTheError) {
    unsigned char buf[4];
    EXPECT_EQ(-1, safe_read(-1, buf, 4));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_read: Read error: (Bad file descriptor)"));
}

// A write into a socket whose reader has gone must fail, not kill the
// process with SIGPIPE (the HAL may deliver an event after the engine left).
TEST_F(H4Test, WriteToDepartedPeerFailsWithoutSignal) {
    closePeer();
    unsigned char buf[3] = {4, 0x0E, 0};
    EXPECT_EQ(-1, safe_write(fds[0], buf, 3));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_write: Write error: (Broken pipe)"));
}

TEST_F(H4Test, WriteCompletesRunsLargerThanTheSocketBuffer) {
    std::vector<unsigned char> big(1 << 20);
    for (size_t i = 0; i < big.size(); ++i) big[i] = static_cast<unsigned char>(i * 7);
    std::vector<uint8_t> got;
    std::thread reader([&] { got = readBytes(fds[1], big.size(), 20000); });
    EXPECT_EQ(static_cast<int>(big.size()), safe_write(fds[0], big.data(), big.size()));
    reader.join();
    EXPECT_TRUE(std::equal(big.begin(), big.end(), got.begin(), got.end()));
}

std::atomic<int> g_signals{0};
void countSignal(int) { g_signals++; }

char threadState(pid_t tid) {
    std::ifstream stat("/proc/self/task/" + std::to_string(tid) + "/stat");
    std::string line;
    std::getline(stat, line);
    size_t paren = line.rfind(')');
    return paren == std::string::npos || paren + 2 >= line.size() ? '?' : line[paren + 2];
}

// A signal that interrupts a blocked read is not a failure: the read resumes.
TEST_F(H4Test, ReadResumesAfterInterruptingSignal) {
    struct sigaction sa = {};
    struct sigaction old = {};
    sa.sa_handler = countSignal;  // no SA_RESTART: read returns EINTR
    sigaction(SIGUSR1, &sa, &old);

    std::atomic<pid_t> tid{0};
    int result = 0;
    unsigned char buf[2] = {0};
    std::thread reader([&] {
        tid = gettid();
        result = safe_read(fds[0], buf, 2);
    });
    ASSERT_TRUE(waitUntil([&] { return tid != 0 && threadState(tid) == 'S'; }));
    int before = g_signals;
    pthread_kill(reader.native_handle(), SIGUSR1);
    ASSERT_TRUE(waitUntil([&] { return g_signals > before; }));
    writeAll(fds[1], {0xAB, 0xCD});
    reader.join();
    sigaction(SIGUSR1, &old, nullptr);

    EXPECT_EQ(2, result);
    EXPECT_EQ(0xAB, buf[0]);
    EXPECT_EQ(0xCD, buf[1]);
    EXPECT_FALSE(log.containsFragment("Read error"));
}

}  // namespace
