// A simulated controller: answers the HCI commands of the test modes as the
// Bluetooth Core Specification prescribes and runs LE tests on a SimAir. Not
// thread-safe: one thread at a time hands it commands.
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

#include "host/hal/sim_air.h"

struct SimControllerSettings {
    // A reference transmitter that follows every receiver test of this
    // controller (its channel and PHY, 37-byte payloads), as the far-end
    // tester of a bench would.
    bool reference_tx = false;
    // Fraction (0..1) of the packets on the air that the receiver misses, at
    // random; in bursts of this mean length (1: each packet on its own); from
    // this seed (0: a seed of its own).
    double loss = 0.0;
    double burst = 1.0;
    uint64_t seed = 0;
    // Seconds the controller takes to process each command before it acts on
    // it and answers, as a busy controller does.
    double delay_s = 0.0;
};

class SimController {
  public:
    using Event = std::vector<uint8_t>;  // an HCI event without its H4 type byte

    SimController(SimAir& air, SimControllerSettings settings);
    ~SimController();
    SimController(const SimController&) = delete;
    SimController& operator=(const SimController&) = delete;

    // One HCI command packet (opcode, length, parameters) in, its events out.
    std::vector<Event> command(const uint8_t* packet, size_t len);
    // What Reset does to a running test; also on disconnect.
    void endTests();

  private:
    friend struct SimCommands;  // the command table's handlers
    uintptr_t id() const { return reinterpret_cast<uintptr_t>(this); }  // its name on the air

    enum class Test { NONE, TX, RX };
    SimAir& air_;
    SimControllerSettings settings_;
    SimLoss loss_;
    Test test_ = Test::NONE;
    uint8_t rx_channel_ = 0;
    uint8_t rx_phy_ = LE_PHY_1M;
    int64_t rx_start_ = 0;
};

// HCI error codes the simulated controller answers with (Vol 1, Part F).
enum : uint8_t {
    HCI_SUCCESS = 0x00,
    HCI_UNKNOWN_COMMAND = 0x01,
    HCI_COMMAND_DISALLOWED = 0x0C,
    HCI_INVALID_PARAMETERS = 0x12,
};
