// getService on a host: HALVENOR_HCI picks the controller behind "default";
// a value that cannot be used gives one log line and a failed initialisation,
// so the library's session fails cleanly.
#include <stdlib.h>

#include <gtest/gtest.h>

#include "tests/host/host_test_support.h"
#include "tests/support/log_capture.h"
#include "transport/session.h"

using android::sp;
using android::hardware::bluetooth::V1_0::IBluetoothHci;

namespace {

class DefaultServiceTest : public ::testing::Test {
  protected: void TearDown() override {
        for (const char* name : {"HALVENOR_HCI", "HALVENOR_SIM_REFTX", "HALVENOR_SIM_LOSS", "HALVENOR_SIM_DELAY",
                                 "HALVENOR_SIM_BURST", "HALVENOR_SIM_SEED"}) {
            unsetenv(name);
        }
    }
    int linesWith(const std::string& fragment) {
        int n = 0;
        for (const auto& line : log.lines()) n += line.text.find(fragment) != std::string::npos;
        return n;
    }
    LogCapture log;
};

TEST_F(DefaultServiceTest, UnusableSettingLogsOnceAndFailsTheSession) {
    const struct {
        const char* variable;
        const char* value;
        const char* reason;  // part of the log line
    } cases[] = {
            {"HALVENOR_HCI", "bogus", "expected sim, none, unix:PATH, tcp:HOST:PORT, tty:DEVICE[,BAUD][,rtscts] or hci:N"},
            {"HALVENOR_HCI", "unix:", "no path after unix:"}, {"HALVENOR_HCI", "tty:", "no device after tty:"},
            {"HALVENOR_HCI", "tcp:localhost", "expected tcp:HOST:PORT"},
            {"HALVENOR_HCI", "tcp:127.0.0.1:70000", "port '70000' is not in 1..65535"},
            {"HALVENOR_HCI", "tty:/dev/ttyS0,12345", "baud rate 12345 is not a standard speed"},
            {"HALVENOR_SIM_LOSS", "2", "expected a fraction from 0 to 1"}, {"HALVENOR_SIM_REFTX", "yes", "expected 0 or 1"},
            {"HALVENOR_SIM_DELAY", "11", "expected seconds from 0 to 10"},
            {"HALVENOR_SIM_BURST", "0.5", "expected a mean burst length from 1 to 1000 packets"},
            {"HALVENOR_SIM_SEED", "-1", "expected a whole number (0: a seed of its own)"},
    };
    for (const auto& c : cases) {
        log.clear();
        TearDown();
        setenv(c.variable, c.value, 1);
        hidl_client_init();
        EXPECT_EQ(-1, bt_fd) << c.value;
        EXPECT_EQ(1, linesWith(std::string(c.variable) + "=\"" + c.value + "\": ")) << c.value;
        EXPECT_EQ(1, linesWith(c.reason)) << c.reason;
        EXPECT_EQ(1, linesWith("Error in HIDL initialization")) << c.value;
    }
}

TEST_F(DefaultServiceTest, OnlyTheDefaultInstanceExistsAndNoneStandsForNoHal) {
    EXPECT_EQ(nullptr, IBluetoothHci::getService("other").get());
    EXPECT_NE(nullptr, IBluetoothHci::getService("default").get());
    setenv("HALVENOR_HCI", "none", 1);
    EXPECT_EQ(nullptr, IBluetoothHci::getService("default").get());
}

}  // namespace
