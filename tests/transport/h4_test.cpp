// H4 framing and whole-run stream I/O over real socket pairs.
#include "transport/h4.h"

#include <pthread.h>
#include <signal.h>
#include <sys/socket.h>
#include <unistd.h>

#include <atomic>
#include <thread>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/log_capture.h"
#include "tests/support/process.h"

namespace {

class H4Test : public ::testing::Test {
  protected: void SetUp() override { ASSERT_EQ(0, socketpair(AF_UNIX, SOCK_STREAM, 0, fds)); }
    void TearDown() override {
        for (int fd : fds) close(fd);
    }
    int fds[2] = {-1, -1};
    LogCapture log;
};

TEST_F(H4Test, ReadCollectsPiecesAndFailsWhenThePeerLeavesMidRun) {
    std::thread writer([&] {
        for (uint8_t b = 1; b <= 10; ++b) writeAll(fds[1], {b});
        close(fds[1]);
        fds[1] = -1;
    });
    unsigned char buf[7] = {0};
    EXPECT_EQ(7, safe_read(fds[0], buf, 7));
    EXPECT_EQ(7, buf[6]);
    EXPECT_EQ(-1, safe_read(fds[0], buf, 7));  // 3 bytes, then the end
    writer.join();
    EXPECT_TRUE(log.containsFragment("safe_read: read returned 0, err = "));
    EXPECT_TRUE(log.containsFragment(", read bytes: 3"));
}

TEST_F(H4Test, EmptyNegativeAndMissingBuffersMoveNothing) {
    unsigned char buf[1];
    EXPECT_EQ(0, safe_read(fds[0], buf, 0));
    EXPECT_EQ(0, safe_write(fds[0], buf, 0));
    EXPECT_EQ(0, safe_read(fds[0], buf, -3));
    EXPECT_EQ(0, safe_write(fds[0], buf, -3));
    EXPECT_EQ(-1, safe_write(fds[0], nullptr, 0));
    EXPECT_EQ(-1, safe_read(fds[0], nullptr, 4));
    EXPECT_EQ(-1, safe_read(-1, buf, 1));
    std::vector<std::string> texts;
    for (const LogLine& line : log.lines()) texts.push_back(line.text);
    EXPECT_EQ(texts, (std::vector<std::string>{"safe_read: No data to read", "safe_write: No data to write",
                                               "safe_write: The buffer is NULL", "safe_read: The buffer is NULL",
                                               "safe_read: Read error: (Bad file descriptor)"}));
}

// A HAL may deliver an event after the engine left: the write fails, it
// does not kill the process with SIGPIPE.
TEST_F(H4Test, WriteCompletesLongRunsAndFailsWithoutSignalWhenThePeerLeft) {
    std::vector<unsigned char> big(1 << 20);
    for (size_t i = 0; i < big.size(); ++i) big[i] = static_cast<unsigned char>(i * 7);
    std::vector<uint8_t> got;
    std::thread reader([&] { got = readBytes(fds[1], big.size(), 20000); });
    EXPECT_EQ(static_cast<int>(big.size()), safe_write(fds[0], big.data(), big.size()));
    reader.join();
    EXPECT_TRUE(std::equal(big.begin(), big.end(), got.begin(), got.end()));

    close(fds[1]);
    fds[1] = -1;
    EXPECT_EQ(-1, safe_write(fds[0], big.data(), 3));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_write: Write error: (Broken pipe)"));
}

std::atomic<int> g_signals{0};
void countSignal(int) { g_signals++; }

// A signal that interrupts a blocked read is not a failure: the read resumes.
TEST_F(H4Test, ReadResumesAfterAnInterruptingSignal) {
    struct sigaction sa = {}, old = {};
    sa.sa_handler = countSignal;  // no SA_RESTART: read returns EINTR
    sigaction(SIGUSR1, &sa, &old);
    int result = 0;
    unsigned char buf[2] = {0};
    std::thread reader([&] { result = safe_read(fds[0], buf, 2); });
    // Until the reader is in its read, each signal may come too early: repeat.
    ASSERT_TRUE(waitUntil([&] {
        pthread_kill(reader.native_handle(), SIGUSR1);
        return g_signals > 20;
    }));
    writeAll(fds[1], {0xAB, 0xCD});
    reader.join();
    sigaction(SIGUSR1, &old, nullptr);
    EXPECT_EQ(2, result);
    EXPECT_EQ(0xCD, buf[1]);
    EXPECT_FALSE(log.containsFragment("Read error"));
}

}  // namespace
