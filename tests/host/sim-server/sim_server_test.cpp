// halvenor-sim as a process: it prints where it listens, gives every
// connection its own controller, and all of them share one air.
#include <stdlib.h>
#include <sys/wait.h>
#include <unistd.h>

#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/process.h"
#include "transport/session.h"

namespace {

class SimServerTest : public ::testing::Test {
  protected:
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        for (auto& s : services) s.hci->close();
        services.clear();
        stopChild(server);
        unsetenv("HALVENOR_HCI");
    }
    // Starts halvenor-sim with these arguments; returns its address.
    std::string startServer(const std::vector<std::string>& args) {
        std::vector<std::string> argv = {HALVENOR_SIM_PATH};
        argv.insert(argv.end(), args.begin(), args.end());
        server = spawnChild(argv);
        std::string line = readLine(server.out);
        const std::string prefix = "listening on ";
        if (line.compare(0, prefix.size(), prefix) != 0) return "";
        return line.substr(prefix.size());
    }
    // A started H4 service on the server and its callbacks.
    size_t connect(const std::string& where) {
        services.push_back(startHci(where.c_str()));
        return services.size() - 1;
    }
    Bytes command(size_t i, const Bytes& cmd) { return commandEvent(services[i], cmd); }

    Child server;
    std::vector<StartedHci> services;
};

TEST_F(SimServerTest, TransmitterOnOneConnectionIsCountedOnAnother) {
    std::string where = startServer({"--tcp", "0"});
    ASSERT_EQ(0u, where.find("tcp:127.0.0.1:")) << where;
    size_t tx = connect(where), rx = connect(where);
    ASSERT_EQ((Bytes{0x0E, 0x04, 0x01, 0x34, 0x20, 0x00}),
              command(tx, {0x34, 0x20, 0x04, 0x27, 0x25, 0x00, 0x02}));
    int64_t before_start = steadyUs();
    ASSERT_EQ((Bytes{0x0E, 0x04, 0x01, 0x33, 0x20, 0x00}), command(rx, {0x33, 0x20, 0x03, 0x27, 0x02, 0x00}));
    int64_t after_start = steadyUs();
    std::this_thread::sleep_for(std::chrono::milliseconds(200));  // time on the air, not a sync
    int64_t before_end = steadyUs();
    Bytes end = command(rx, {0x1F, 0x20, 0x00});
    int64_t after_end = steadyUs();
    ASSERT_EQ(8u, end.size());
    int count = end[6] | (end[7] << 8);
    // Round trips to the server widen the window by a packet or two at most.
    EXPECT_GE(count, (before_end - after_start) / 625 - 2);
    EXPECT_LE(count, (after_end - before_start) / 625 + 2);
    EXPECT_EQ((Bytes{0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x00, 0x00}), command(tx, {0x1F, 0x20, 0x00}));
}

TEST_F(SimServerTest, ReceiverHearsNothingWithoutTransmitter) {
    std::string where = startServer({"--tcp", "0"});
    size_t rx = connect(where);
    command(rx, {0x1D, 0x20, 0x01, 0x00});
    std::this_thread::sleep_for(std::chrono::milliseconds(50));  // time on the air, not a sync
    EXPECT_EQ((Bytes{0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x00, 0x00}), command(rx, {0x1F, 0x20, 0x00}));
}

// The library as the receiver, on a unix socket, against an H4 transmitter.
TEST_F(SimServerTest, LibrarySessionCountsOtherConnectionsTransmitter) {
    std::string path = tempPath("sim.sock");
    std::string where = startServer({"--unix", path, "--loss", "0.5"});
    ASSERT_EQ("unix:" + path, where);
    size_t tx = connect(where);
    command(tx, {0x1E, 0x20, 0x03, 0x00, 0x25, 0x00});
    setenv("HALVENOR_HCI", where.c_str(), 1);
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);
    int64_t before_start = steadyUs();
    ASSERT_EQ((Bytes{4, 0x0E, 0x04, 0x01, 0x1D, 0x20, 0x00}), exchange(bt_fd, {0x1D, 0x20, 0x01, 0x00}));
    int64_t after_start = steadyUs();
    std::this_thread::sleep_for(std::chrono::milliseconds(200));  // time on the air, not a sync
    int64_t before_end = steadyUs();
    int count = testEndCount(exchange(bt_fd, {0x1F, 0x20, 0x00}));
    int64_t after_end = steadyUs();
    EXPECT_GE(count, ((before_end - after_start) / 625 - 2) / 2);
    EXPECT_LE(count, ((after_end - before_start) / 625 + 2) / 2 + 1);
}

TEST_F(SimServerTest, RejectsBadArguments) {
    server = spawnChild({HALVENOR_SIM_PATH, "--loss", "3"});
    int status = 0;
    ASSERT_TRUE(waitUntil([&] { return waitpid(server.pid, &status, WNOHANG) == server.pid; }));
    server.pid = -1;
    EXPECT_EQ(2, WEXITSTATUS(status));
}

}  // namespace
