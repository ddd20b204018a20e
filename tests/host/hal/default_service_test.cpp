// getService("default") on a host: HALVENOR_HCI picks the controller; a value
// that cannot be used gives one log line and a failed initialisation; the
// library's own session reaches the simulated controller by default.
#include <hidl/HostServices.h>

#include <stdlib.h>

#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/log_capture.h"
#include "tests/support/process.h"
#include "transport/session.h"

using android::sp;
using android::hardware::bluetooth::V1_0::IBluetoothHci;

namespace {

class DefaultServiceTest : public ::testing::Test {
  protected:
    void TearDown() override {
        hidl_client_close_tool_end();
        hidl_client_close();
        unsetenv("HALVENOR_HCI");
        unsetenv("HALVENOR_SIM_REFTX");
        unsetenv("HALVENOR_SIM_LOSS");
    }
    int linesWith(const std::string& fragment) {
        int n = 0;
        for (const auto& line : log.lines()) n += line.text.find(fragment) != std::string::npos;
        return n;
    }
    LogCapture log;
};

struct BadSetting {
    const char* variable;
    const char* value;
    const char* reason;  // part of the log line
};

const BadSetting kBadSettings[] = {
        {"HALVENOR_HCI", "bogus", "expected sim, none, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD]"},
        {"HALVENOR_HCI", "sim:1", "expected sim, none, unix:PATH"},
        {"HALVENOR_HCI", "unix:", "no path after unix:"},
        {"HALVENOR_HCI", "tcp:localhost", "expected tcp:HOST:PORT"},
        {"HALVENOR_HCI", "tcp:127.0.0.1:0", "port '0' is not in 1..65535"},
        {"HALVENOR_HCI", "tcp:127.0.0.1:70000", "port '70000' is not in 1..65535"},
        {"HALVENOR_HCI", "tcp:127.0.0.1:x1", "port 'x1'"},
        {"HALVENOR_HCI", "tty:", "no device after tty:"},
        {"HALVENOR_HCI", "tty:/dev/ttyS0,12345", "baud rate 12345 is not a standard speed"},
        {"HALVENOR_SIM_LOSS", "2", "expected a fraction from 0 to 1"},
        {"HALVENOR_SIM_LOSS", "lots", "expected a fraction from 0 to 1"},
        {"HALVENOR_SIM_REFTX", "yes", "expected 0 or 1"},
};

TEST_F(DefaultServiceTest, UnusableSettingLogsOnceAndFailsInitialisation) {
    for (const BadSetting& bad : kBadSettings) {
        log.clear();
        unsetenv("HALVENOR_SIM_LOSS");
        unsetenv("HALVENOR_SIM_REFTX");
        unsetenv("HALVENOR_HCI");
        setenv(bad.variable, bad.value, 1);
        sp<IBluetoothHci> hci = IBluetoothHci::getService("default");
        ASSERT_NE(nullptr, hci.get()) << bad.value;
        sp<RecordingCallbacks> cb = new RecordingCallbacks();
        hci->initialize(cb);
        HciStatus status;
        ASSERT_TRUE(cb->waitForInit(&status, 1000)) << bad.value;
        EXPECT_EQ(HciStatus::INITIALIZATION_ERROR, status) << bad.value;
        std::string line = std::string(bad.variable) + "=\"" + bad.value + "\": ";
        EXPECT_EQ(1, linesWith(line)) << line;
        EXPECT_EQ(1, linesWith(bad.reason)) << bad.reason;
        hci->close();
    }
}

TEST_F(DefaultServiceTest, LibrarySessionFailsCleanlyOnUnusableSetting) {
    setenv("HALVENOR_HCI", "serial", 1);
    auto start = std::chrono::steady_clock::now();
    hidl_client_init();
    EXPECT_LT(std::chrono::steady_clock::now() - start, std::chrono::seconds(2));
    EXPECT_EQ(-1, bt_fd);
    EXPECT_EQ(1, linesWith("HALVENOR_HCI=\"serial\""));
    EXPECT_TRUE(log.contains(ANDROID_LOG_ERROR, "Error in HIDL initialization"));
}

TEST_F(DefaultServiceTest, LibrarySessionFailsCleanlyOnUnreachableController) {
    std::string target = "unix:" + tempPath("nobody.sock");
    setenv("HALVENOR_HCI", target.c_str(), 1);
    hidl_client_init();
    EXPECT_EQ(-1, bt_fd);
    EXPECT_EQ(1, linesWith("h4: cannot reach " + target));
}

TEST_F(DefaultServiceTest, OnlyDefaultInstanceExists) {
    EXPECT_EQ(nullptr, IBluetoothHci::getService("other").get());
    setenv("HALVENOR_HCI", "none", 1);
    EXPECT_EQ(nullptr, IBluetoothHci::getService("default").get());
}

// The whole road: the library's session, its pump, the default service, the
// simulated controller and its reference transmitter, about 1600 packets/s.
TEST_F(DefaultServiceTest, LibraryReceiverTestOnDefaultControllerFollowsClock) {
    unsetenv("HALVENOR_HCI");
    hidl_client_init();
    ASSERT_GE(bt_fd, 0);
    int64_t before_start = steadyUs();
    ASSERT_EQ((Bytes{4, 0x0E, 0x04, 0x01, 0x33, 0x20, 0x00}),
              exchange(bt_fd, {0x33, 0x20, 0x03, 0x13, 0x02, 0x00}));
    int64_t after_start = steadyUs();
    std::this_thread::sleep_for(std::chrono::milliseconds(250));  // time on the air, not a sync
    int64_t before_end = steadyUs();
    Bytes end = exchange(bt_fd, {0x1F, 0x20, 0x00});
    int64_t after_end = steadyUs();
    int count = testEndCount(end);
    EXPECT_GE(count, (before_end - after_start) / 625);
    EXPECT_LE(count, (after_end - before_start) / 625 + 1);
}

}  // namespace
