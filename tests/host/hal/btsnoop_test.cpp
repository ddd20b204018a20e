// btsnoop capture: what the library sends and receives through a host
// backend, decoded by tshark (Wireshark's dissectors, written by nobody here).
#include "host/hal/btsnoop.h"

#include <stdio.h>
#include <stdlib.h>
#include <unistd.h>

#include <chrono>
#include <sstream>
#include <thread>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/process.h"
#include "transport/session.h"

namespace {

// stdout of a shell command; *status gets its exit status.
std::string run(const std::string& command, int* status) {
    std::string out;
    FILE* p = popen(command.c_str(), "r");
    if (p == nullptr) return out;
    char buf[512];
    size_t n;
    while ((n = fread(buf, 1, sizeof(buf), p)) > 0) out.append(buf, n);
    *status = pclose(p);
    return out;
}

std::vector<std::vector<std::string>> rows(const std::string& text) {
    std::vector<std::vector<std::string>> out;
    std::istringstream lines(text);
    std::string line;
    while (std::getline(lines, line)) {
        std::vector<std::string> fields;
        std::istringstream cells(line);
        std::string cell;
        while (std::getline(cells, cell, '\t')) fields.push_back(cell);
        out.push_back(fields);
    }
    return out;
}

class BtsnoopTest : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(0, system("command -v tshark >/dev/null")) << "tshark missing: install tshark";
        capture = tempPath("capture.btsnoop");
        unlink(capture.c_str());
        setenv("HALVENOR_BTSNOOP", capture.c_str(), 1);
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        unsetenv("HALVENOR_BTSNOOP");
        unsetenv("HALVENOR_HCI");
        unlink(capture.c_str());
    }
    // Fields of every frame: direction, H4 type, command opcode, event
    // code, LE Test End's Num_Packets.
    std::vector<std::vector<std::string>> decode() {
        int status = -1;
        std::string out = run("tshark -r '" + capture + "' -T fields -E separator=/t -E occurrence=f "
                              "-e hci_h4.direction -e hci_h4.type -e bthci_cmd.opcode "
                              "-e bthci_evt.code -e bthci_evt.le_num_packets", &status);
        EXPECT_EQ(0, status) << out;
        return rows(out);
    }
    // The library's own session: an LE receiver test, its end, a Reset.
    int librarySession() {
        hidl_client_init();
        EXPECT_GE(bt_fd, 0);
        exchange(bt_fd, {0x1D, 0x20, 0x01, 0x13});
        std::this_thread::sleep_for(std::chrono::milliseconds(20));  // time on the air, not a sync
        int count = testEndCount(exchange(bt_fd, {0x1F, 0x20, 0x00}));
        exchange(bt_fd, {0x03, 0x0C, 0x00});
        hidl_client_close_tool_end();
        hidl_client_close();
        return count;
    }
    std::string capture;
};

void expectSession(const std::vector<std::vector<std::string>>& frames, size_t from, int count) {
    ASSERT_GE(frames.size(), from + 6);
    const char* opcodes[] = {"0x201d", "0x201f", "0x0c03"};
    for (int i = 0; i < 3; ++i) {
        const auto& cmd = frames[from + 2 * i];
        const auto& evt = frames[from + 2 * i + 1];
        ASSERT_GE(cmd.size(), 3u);
        ASSERT_GE(evt.size(), 4u);
        EXPECT_EQ("0x00", cmd[0]) << "command sent by the host";
        EXPECT_EQ("0x01", cmd[1]);
        EXPECT_EQ(opcodes[i], cmd[2]);
        EXPECT_EQ("0x01", evt[0]) << "event received by the host";
        EXPECT_EQ("0x04", evt[1]);
        EXPECT_EQ("0x0e", evt[3]);
    }
    const auto& end = frames[from + 3];
    ASSERT_EQ(5u, end.size());
    EXPECT_EQ(std::to_string(count), end[4]);
}

TEST_F(BtsnoopTest, SimulatedSessionDecodesInTshark) {
    int count = librarySession();
    ASSERT_GT(count, 0);
    auto frames = decode();
    ASSERT_EQ(6u, frames.size());
    expectSession(frames, 0, count);
}

TEST_F(BtsnoopTest, H4SessionsAppendToOneCapture) {
    std::string path = tempPath("snoop-sim.sock");
    Child server = spawnChild({HALVENOR_SIM_PATH, "--unix", path, "--reftx", "1"});
    ASSERT_EQ("listening on unix:" + path, readLine(server.out));
    setenv("HALVENOR_HCI", ("unix:" + path).c_str(), 1);
    int first = librarySession();
    int second = librarySession();
    stopChild(server);
    auto frames = decode();
    ASSERT_EQ(12u, frames.size()) << "one header, then both sessions' frames";
    expectSession(frames, 0, first);
    expectSession(frames, 6, second);
}

}  // namespace
