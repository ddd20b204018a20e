// The simulated air: which LE test transmitters send on which channel and PHY,
// and how many of their packets a receiver test catches. Shared by every
// simulated controller on it; any thread (one lock).
#pragma once

#include <cstdint>
#include <functional>
#include <mutex>
#include <random>
#include <vector>

// LE PHYs as the LE Transmitter/Receiver Test commands number them; a
// receiver on LE Coded (3) hears both S=8 (3) and S=2 (4) transmitters.
enum : uint8_t {
    LE_PHY_1M = 1,
    LE_PHY_2M = 2,
    LE_PHY_CODED_S8 = 3,
    LE_PHY_CODED_S2 = 4,
};

class SimAir {
  public:
    using Clock = std::function<int64_t()>;  // microseconds, monotonic

    explicit SimAir(Clock clock = nullptr);

    int64_t now() const { return clock_(); }

    // Transmitter tests, keyed by an id the controller picks (its address).
    void startTransmitter(uintptr_t owner, uint8_t channel, uint8_t phy, uint8_t length);
    void stopTransmitter(uintptr_t owner);
    // Packets that other owners' transmitters sent on channel/phy during
    // [from, to), before loss; the receiver's own owner is not heard.
    uint64_t packetsHeard(uintptr_t receiver, uint8_t channel, uint8_t phy, int64_t from,
                          int64_t to);
    // A receiver test runs from `since`: keeps the history it will need.
    void holdHistory(uintptr_t receiver, int64_t since);
    void releaseHistory(uintptr_t receiver);

  private:
    struct Burst {
        uintptr_t owner;
        uint8_t channel;
        uint8_t phy;
        int64_t interval_us;
        int64_t start;
        int64_t end;  // INT64_MAX while the transmitter runs
    };
    struct Hold {
        uintptr_t receiver;
        int64_t since;
    };
    void pruneLocked();

    Clock clock_;
    std::mutex lock_;
    std::vector<Burst> bursts_;
    std::vector<Hold> holds_;
};

// Airtime in microseconds of one LE test packet with `length` payload bytes.
int64_t le_packet_airtime_us(uint8_t phy, uint8_t length);
// Interval between LE test packets: I(L) = ceil((L + 249) / 625) * 625 us,
// L the packet's airtime (Core Specification, Vol 6, Part F, 4.1.6).
int64_t le_test_interval_us(uint8_t phy, uint8_t length);
// Packets sent at start, start + interval, ... that fall in [from, to).
uint64_t packets_in_window(int64_t start, int64_t interval, int64_t from, int64_t to);
// Which packets a receiver misses, as on a real channel: each is lost at
// random with the set probability; with bursts longer than 1, losses come in
// bursts of that mean length (a two-state Gilbert channel) at the same
// overall rate. Seeded, so that a run can be repeated. One thread at a time.
class SimLoss {
  public:
    // seed 0: a seed of its own, different for every channel.
    SimLoss(double loss, double burst, uint64_t seed);
    // How many of `sent` packets arrive.
    uint64_t received(uint64_t sent);

  private:
    double loss_;
    double burst_;
    std::mt19937_64 rng_;
    bool in_burst_ = false;
};
