// The pump, through an opened session: bytes written to the tool end and
// what the HAL receives; how the pump ends.
#include "transport/pump.h"

#include <fcntl.h>
#include <sys/resource.h>
#include <unistd.h>

#include <fstream>
#include <string>
#include <vector>

#include <gtest/gtest.h>

#include "tests/support/fake_hal.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;
using Bytes = std::vector<uint8_t>;

namespace {

class PumpTest : public ::testing::Test {
  protected:
    void SetUp() override {
        hal = new FakeHal();
        hal->registerDefault();
        threads_before = countThreads();
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        FakeHal::unregisterDefault();
        EXPECT_LE(settledThreadCount(threads_before), threads_before);
    }
    void open() {
        hidl_client_init();
        ASSERT_GE(bt_fd, 0);
    }

    sp<FakeHal> hal;
    LogCapture log;
    int threads_before = 0;
};

struct ForwardCase {
    const char* name;
    Bytes written;
    uint8_t type;
    Bytes received;
};

TEST_F(PumpTest, ForwardsEachPacketWithoutItsTypeByte) {
    Bytes acl256 = {0x02, 0x01, 0x20, 0x00, 0x01};
    Bytes acl256_out = {0x01, 0x20, 0x00, 0x01};
    for (int i = 0; i < 256; ++i) {
        acl256.push_back(static_cast<uint8_t>(i));
        acl256_out.push_back(static_cast<uint8_t>(i));
    }
    const ForwardCase cases[] = {
            {"reset", {0x01, 0x03, 0x0C, 0x00}, 1, {0x03, 0x0C, 0x00}},
            {"le rx 2M", {0x01, 0x33, 0x20, 0x03, 0x13, 0x02, 0x00}, 1, {0x33, 0x20, 0x03, 0x13, 0x02, 0x00}},
            {"acl 5", {0x02, 0x01, 0x20, 0x05, 0x00, 1, 2, 3, 4, 5}, 2, {0x01, 0x20, 0x05, 0x00, 1, 2, 3, 4, 5}},
            {"acl 256 low byte first", acl256, 2, acl256_out},
            {"sco", {0x03, 0x01, 0x00, 0x02, 0xAA, 0xBB}, 3, {0x01, 0x00, 0x02, 0xAA, 0xBB}},
    };
    open();
    for (const auto& c : cases) writeAll(bt_fd, c.written);
    ASSERT_TRUE(hal->waitForSent(std::size(cases)));
    auto sent = hal->sent();
    for (size_t i = 0; i < std::size(cases); ++i) {
        EXPECT_EQ(cases[i].type, sent[i].type) << cases[i].name;
        EXPECT_EQ(cases[i].received, sent[i].bytes) << cases[i].name;
    }
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "safe_read: No data to read"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_INFO, "process_tool_data: Packet type :1"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "PACKET_TYPE = 2"));
}

TEST_F(PumpTest, ReassemblesPacketsWrittenOneByteAtATime) {
    const Bytes stream = {0x01, 0x05, 0x0C, 0x03, 0x02, 0x00, 0x02,        // Set Event Filter
                          0x02, 0x2A, 0x00, 0x03, 0x00, 0xDE, 0xAD, 0xBE,  // ACL, 3 bytes
                          0x01, 0x1F, 0x20, 0x00};                         // LE Test End
    open();
    for (uint8_t b : stream) writeAll(bt_fd, {b});
    ASSERT_TRUE(hal->waitForSent(3));
    auto sent = hal->sent();
    EXPECT_EQ((Bytes{0x05, 0x0C, 0x03, 0x02, 0x00, 0x02}), sent[0].bytes);
    EXPECT_EQ((Bytes{0x2A, 0x00, 0x03, 0x00, 0xDE, 0xAD, 0xBE}), sent[1].bytes);
    EXPECT_EQ((Bytes{0x1F, 0x20, 0x00}), sent[2].bytes);
}

TEST_F(PumpTest, LargestAclPacketArrivesWhole) {
    Bytes packet = {0x02, 0x01, 0x00, 0xFF, 0xFF};
    for (int i = 0; i < 65535; ++i) packet.push_back(static_cast<uint8_t>(i * 13));
    open();
    writeAll(bt_fd, packet);
    ASSERT_TRUE(hal->waitForSent(1, 10000));
    EXPECT_EQ(Bytes(packet.begin() + 1, packet.end()), hal->sent()[0].bytes);
}

TEST_F(PumpTest, EventFromTheToolIsDroppedAndThePumpGoesOn) {
    open();
    writeAll(bt_fd, {0x04, 0x0E, 0x00, 0x01, 0x03, 0x0C, 0x00});
    ASSERT_TRUE(hal->waitForSent(1));
    EXPECT_EQ(1u, hal->sent().size());
    EXPECT_EQ((Bytes{0x03, 0x0C, 0x00}), hal->sent()[0].bytes);
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "process_tool_data: Unsupported packet type: 4"));
}

TEST_F(PumpTest, UnknownTypeByteEndsThePumpUnread) {
    for (uint8_t type : {0, 5}) {
        log.clear();
        open();
        writeAll(bt_fd, {type, 0x01, 0x03, 0x0C, 0x00});
        ASSERT_TRUE(log.waitFor(ANDROID_LOG_ERROR, "Process tool OUT !!!"));
        EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "process_tool_data: Unsupported preamble_len packet type " +
                                                            std::to_string(type)));
        EXPECT_TRUE(hal->sent().empty());
        hidl_client_close_tool_end();
        hidl_client_close();
    }
}

TEST_F(PumpTest, ClosingTheToolEndEndsTheWaitingPump) {
    open();
    ASSERT_TRUE(log.waitFor(ANDROID_LOG_ERROR, "process_tool_data IN!"));
    hidl_client_close_tool_end();
    ASSERT_TRUE(log.waitFor(ANDROID_LOG_ERROR, "Process tool OUT !!!", 2000));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "process_tool_data: failed to read the packet from tools"));
    EXPECT_FALSE(log.contains(ANDROID_LOG_INFO, "Quit test mode!"));
}

TEST_F(PumpTest, ToolEndClosedMidPacketEndsThePumpWithoutForwarding) {
    open();
    writeAll(bt_fd, {0x01, 0x33, 0x20, 0x03, 0x13});
    hidl_client_close_tool_end();
    ASSERT_TRUE(log.waitFor(ANDROID_LOG_ERROR, "Process tool OUT !!!"));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "process_tool_data: failed to read the packet from tool"));
    EXPECT_TRUE(hal->sent().empty());
}

long threadCpuTicks(int tid) {
    std::ifstream stat("/proc/self/task/" + std::to_string(tid) + "/stat");
    std::string line;
    std::getline(stat, line);
    std::string rest = line.substr(line.rfind(')') + 2);
    std::vector<std::string> fields;
    size_t pos = 0;
    while (pos != std::string::npos) {
        size_t next = rest.find(' ', pos);
        fields.push_back(rest.substr(pos, next == std::string::npos ? next : next - pos));
        pos = next == std::string::npos ? next : next + 1;
    }
    return std::stol(fields[11]) + std::stol(fields[12]);  // utime + stime
}

// The wait's time-out must not wear down to zero between packets: an idle
// pump sleeps instead of spinning.
TEST_F(PumpTest, IdlePumpDoesNotSpin) {
    std::vector<int> before = threadIds();
    open();
    int pump = -1;
    for (int tid : threadIds()) {
        if (std::find(before.begin(), before.end(), tid) == before.end()) pump = tid;
    }
    ASSERT_NE(-1, pump);
    long start = threadCpuTicks(pump);
    // Three waits' worth of idling.
    ASSERT_FALSE(log.waitFor(ANDROID_LOG_INFO, "never logged", 1600));
    long used = threadCpuTicks(pump) - start;
    EXPECT_LT(used, sysconf(_SC_CLK_TCK) / 5) << "pump burnt " << used << " ticks while idle";
    EXPECT_EQ(0, timeout.tv_sec);
    EXPECT_EQ(500000, timeout.tv_usec);
}

TEST_F(PumpTest, WorksWithDescriptorsAbove1024) {
    struct rlimit limit;
    getrlimit(RLIMIT_NOFILE, &limit);
    if (limit.rlim_cur < 1100) {
        limit.rlim_cur = std::min<rlim_t>(limit.rlim_max, 2048);
        ASSERT_EQ(0, setrlimit(RLIMIT_NOFILE, &limit));
    }
    ASSERT_GE(limit.rlim_cur, 1100u);
    std::vector<int> fillers;
    int fd;
    while ((fd = ::open("/dev/null", O_RDONLY)) >= 0 && fd < 1030) fillers.push_back(fd);
    if (fd >= 0) fillers.push_back(fd);

    open();
    EXPECT_GE(server_fd, 1024);
    writeAll(bt_fd, {0x01, 0x03, 0x0C, 0x00});
    EXPECT_TRUE(hal->waitForSent(1));
    hal->deliverEvent({0x0E, 0x01, 0x00});
    EXPECT_EQ((Bytes{0x04, 0x0E, 0x01, 0x00}), readBytes(bt_fd, 4));

    hidl_client_close_tool_end();
    hidl_client_close();
    for (int f : fillers) close(f);
}

}  // namespace
