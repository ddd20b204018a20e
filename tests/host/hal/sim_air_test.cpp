// The air model: packet intervals by PHY and length, the packet grid of a
// transmitter seen through a receiver's window, and counts on the real clock.
#include "host/hal/sim_air.h"

#include <chrono>
#include <thread>

#include <gtest/gtest.h>

#include "host/hal/sim_controller.h"

namespace {

class SimAirTest : public ::testing::Test {};

int64_t steadyUs() {
    return std::chrono::duration_cast<std::chrono::microseconds>(
                   std::chrono::steady_clock::now().time_since_epoch())
            .count();
}

TEST_F(SimAirTest, IntervalFollowsPacketAirtime) {
    struct {
        uint8_t phy, length;
        int64_t interval;
    } cases[] = {
            {LE_PHY_1M, 37, 625},         {LE_PHY_2M, 37, 625},
            {LE_PHY_1M, 0, 625},          {LE_PHY_1M, 255, 2500},   // 2120 us on air
            {LE_PHY_2M, 255, 1875},       {LE_PHY_CODED_S8, 37, 3750},
            {LE_PHY_CODED_S2, 37, 1875},  {LE_PHY_1M, 47, 1250},    // 456 us: just past one slot
    };
    for (const auto& c : cases) {
        EXPECT_EQ(c.interval, le_test_interval_us(c.phy, c.length))
                << "phy " << int(c.phy) << " length " << int(c.length);
    }
}

TEST_F(SimAirTest, WindowCountsPacketsStartingInside) {
    struct {
        int64_t start, from, to;
        uint64_t packets;
    } cases[] = {
            {0, 0, 625, 1},     {0, 0, 626, 2},     {0, 1, 625, 0},  {0, 1, 626, 1},
            {100, 0, 100, 0},   {100, 0, 101, 1},   {0, 500, 400, 0}, {0, 0, 625000, 1000},
    };
    for (const auto& c : cases) {
        EXPECT_EQ(c.packets, packets_in_window(c.start, 625, c.from, c.to))
                << c.start << " [" << c.from << ", " << c.to << ")";
    }
}

TEST_F(SimAirTest, ReceiverCountFollowsTheClock) {
    SimAir air;
    SimController rx(air, {true, 0.0});
    const uint8_t start[] = {0x1D, 0x20, 0x01, 0x13};
    const uint8_t end[] = {0x1F, 0x20, 0x00};

    int64_t before_start = steadyUs();
    rx.command(start, sizeof(start));
    int64_t after_start = steadyUs();
    std::this_thread::sleep_for(std::chrono::milliseconds(150));  // just lets time pass
    int64_t before_end = steadyUs();
    auto events = rx.command(end, sizeof(end));
    int64_t after_end = steadyUs();

    ASSERT_EQ(1u, events.size());
    ASSERT_EQ(8u, events[0].size());
    int64_t count = events[0][6] | (events[0][7] << 8);
    EXPECT_GE(count, (before_end - after_start) / 625);
    EXPECT_LE(count, (after_end - before_start) / 625 + 1);
}

}  // namespace
