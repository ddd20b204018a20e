// Interop with BlueZ's controller emulator (btvirt, which nobody here wrote):
// the library enters and leaves Device Under Test mode against its BR/EDR
// controller through HALVENOR_HCI=unix:/tmp/bt-server-bredr.
#include <stdio.h>
#include <stdlib.h>
#include <sys/socket.h>
#include <sys/un.h>
#include <unistd.h>

#include <chrono>
#include <future>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "engine/test_mode.h"
#include "transport/session.h"


namespace {

const char* const kBredr = "/tmp/bt-server-bredr";
const char* const kSockets[] = {"/tmp/bt-server-bredr", "/tmp/bt-server-bredrle", "/tmp/bt-server-le",
                                "/tmp/bt-server-amp", "/tmp/bt-server-mon"};

bool connectable(const char* path) {
    int fd = socket(AF_UNIX, SOCK_STREAM | SOCK_CLOEXEC, 0);
    struct sockaddr_un addr = {};
    addr.sun_family = AF_UNIX;
    snprintf(addr.sun_path, sizeof(addr.sun_path), "%s", path);
    bool ok = connect(fd, reinterpret_cast<sockaddr*>(&addr), sizeof(addr)) == 0;
    close(fd);
    return ok;
}

class BtvirtInteropTest : public ::testing::Test {
  protected:
    void SetUp() override {
        ASSERT_EQ(0u, geteuid()) << "btvirt needs root";
        ASSERT_EQ(0, system("command -v btvirt >/dev/null")) << "btvirt missing: install bluez-test-tools";
        for (const char* s : kSockets) unlink(s);  // btvirt leaves its sockets behind
        emulator = spawnChild({"btvirt", "-s", "-l0"});
        ASSERT_GT(emulator.pid, 0);
        ASSERT_TRUE(waitUntil([] { return connectable(kBredr); }, 10000))
                << "btvirt did not serve " << kBredr;
        setenv("HALVENOR_HCI", (std::string("unix:") + kBredr).c_str(), 1);
    }
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        stopChild(emulator);
        for (const char* s : kSockets) unlink(s);
        unsetenv("HALVENOR_HCI");
    }
    Child emulator;
    LogCapture log;
};

// The library's own entry points; btvirt rejects Write Encryption Mode with a
// Command Status, which the entry must get past without a time-out.
TEST_F(BtvirtInteropTest, EntersAndLeavesDeviceUnderTestMode) {
    auto entered = std::async(std::launch::async, [] { return hci_enable_device_under_test_mode(); });
    if (entered.wait_for(std::chrono::seconds(10)) != std::future_status::ready) {
        shutdown(bt_fd, SHUT_RDWR);  // unblocks the reader so the test can end
        FAIL() << "the entry is still waiting for an answer";
    }
    EXPECT_EQ(0, entered.get());
    EXPECT_TRUE(log.containsFragment("h4: connected to unix:/tmp/bt-server-bredr"));
    // Four Command Completes, then Write Encryption Mode's Command Status.
    EXPECT_EQ(4, log.count(ANDROID_LOG_INFO, "Other event received, Breaking\n"));
    EXPECT_EQ(1, log.count(ANDROID_LOG_INFO, "Command Status Received\n"));
    EXPECT_EQ(0, hci_disable_device_under_test_mode());
    EXPECT_EQ(5, log.count(ANDROID_LOG_INFO, "Other event received, Breaking\n")) << "Reset answered";
    EXPECT_EQ(-1, bt_fd);
    EXPECT_FALSE(log.containsFragment("lost connection")) << "btvirt stayed up until the close";
}

}  // namespace
