// The simulated air: transmitter bursts are kept as time intervals and a
// receiver's count is computed from the clock when its test ends, so no timer
// ticks per packet. Any thread; one lock guards the bursts.
#include "host/hal/sim_air.h"

#include <algorithm>
#include <chrono>
#include <climits>
#include <cmath>

static int64_t steady_now_us() {
    return std::chrono::duration_cast<std::chrono::microseconds>(
                   std::chrono::steady_clock::now().time_since_epoch())
            .count();
}

int64_t le_packet_airtime_us(uint8_t phy, uint8_t length) {
    // Preamble, access address, PDU header, payload, CRC (Vol 6, Part B, 2.1).
    switch (phy) {
        case LE_PHY_2M: return (2 + 4 + 2 + length + 3) * 4;
        case LE_PHY_CODED_S8: return 80 + 256 + 16 + 24 + (16 + length * 8 + 24 + 3) * 8;
        case LE_PHY_CODED_S2: return 80 + 256 + 16 + 24 + (16 + length * 8 + 24 + 3) * 2;
        default: return (1 + 4 + 2 + length + 3) * 8;
    }
}

int64_t le_test_interval_us(uint8_t phy, uint8_t length) {
    int64_t airtime = le_packet_airtime_us(phy, length);
    return (airtime + 249 + 624) / 625 * 625;
}

uint64_t packets_in_window(int64_t start, int64_t interval, int64_t from, int64_t to) {
    from = std::max(from, start);
    if (to <= from) return 0;
    // First packet index k with start + k*interval >= from, and first with >= to.
    int64_t first = (from - start + interval - 1) / interval;
    int64_t last = (to - start + interval - 1) / interval;
    return static_cast<uint64_t>(last - first);
}

SimLoss::SimLoss(double loss, double burst, uint64_t seed)
    : loss_(std::min(1.0, std::max(0.0, loss))),
      burst_(std::max(1.0, burst)),
      rng_(seed != 0 ? seed : std::random_device()()) {}

uint64_t SimLoss::received(uint64_t sent) {
    if (loss_ <= 0.0 || loss_ >= 1.0) return loss_ <= 0.0 ? sent : 0;
    if (burst_ <= 1.0) return std::binomial_distribution<uint64_t>(sent, 1.0 - loss_)(rng_);
    // A burst ends after each lost packet with 1/burst; one starts at the rate
    // that keeps the share of lost packets at loss_.
    std::bernoulli_distribution ends(1.0 / burst_);
    std::bernoulli_distribution starts(loss_ / (burst_ * (1.0 - loss_)));
    uint64_t heard = 0;
    for (uint64_t i = 0; i < sent; ++i) {
        in_burst_ = in_burst_ ? !ends(rng_) : starts(rng_);
        heard += in_burst_ ? 0 : 1;
    }
    return heard;
}

static bool same_phy(uint8_t rx, uint8_t tx) {
    if (rx == LE_PHY_CODED_S8 || rx == LE_PHY_CODED_S2) {
        return tx == LE_PHY_CODED_S8 || tx == LE_PHY_CODED_S2;
    }
    return rx == tx;
}

SimAir::SimAir(Clock clock) : clock_(clock ? std::move(clock) : Clock(steady_now_us)) {}

void SimAir::startTransmitter(uintptr_t owner, uint8_t channel, uint8_t phy, uint8_t length) {
    int64_t t = now();
    std::lock_guard<std::mutex> guard(lock_);
    bursts_.push_back({owner, channel, phy, le_test_interval_us(phy, length), t, INT64_MAX});
}

void SimAir::stopTransmitter(uintptr_t owner) {
    int64_t t = now();
    std::lock_guard<std::mutex> guard(lock_);
    for (auto& b : bursts_) {
        if (b.owner == owner && b.end == INT64_MAX) b.end = t;
    }
    pruneLocked();
}

uint64_t SimAir::packetsHeard(uintptr_t receiver, uint8_t channel, uint8_t phy, int64_t from,
                              int64_t to) {
    std::lock_guard<std::mutex> guard(lock_);
    uint64_t heard = 0;
    for (const auto& b : bursts_) {
        if (b.owner == receiver || b.channel != channel || !same_phy(phy, b.phy)) continue;
        heard += packets_in_window(b.start, b.interval_us, from, std::min(to, b.end));
    }
    return heard;
}

void SimAir::holdHistory(uintptr_t receiver, int64_t since) {
    std::lock_guard<std::mutex> guard(lock_);
    holds_.push_back({receiver, since});
}

void SimAir::releaseHistory(uintptr_t receiver) {
    std::lock_guard<std::mutex> guard(lock_);
    holds_.erase(std::remove_if(holds_.begin(), holds_.end(),
                                [&](const Hold& h) { return h.receiver == receiver; }),
                 holds_.end());
    pruneLocked();
}

// A finished burst matters only to receivers that started before it ended.
void SimAir::pruneLocked() {
    int64_t oldest = INT64_MAX;
    for (const auto& h : holds_) oldest = std::min(oldest, h.since);
    bursts_.erase(std::remove_if(bursts_.begin(), bursts_.end(),
                                 [&](const Burst& b) { return b.end != INT64_MAX && b.end <= oldest; }),
                  bursts_.end());
}
