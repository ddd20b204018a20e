// Test fixture base for suites that run the engine over a real HAL session: a
// FakeHal registered as "default" that answers each command as the test's
// script says (a Command Complete with status 0 unless told otherwise), and a
// teardown that ends whatever session the test left open.
#pragma once

#include <gtest/gtest.h>

#include <algorithm>
#include <cstdint>
#include <functional>
#include <mutex>
#include <string>
#include <vector>

#include "tests/support/fake_hal.h"
#include "engine/hci_cmd.h"
#include "tests/support/log_capture.h"
#include "transport/session.h"

using Bytes = std::vector<uint8_t>;

inline uint16_t opcodeOf(const Bytes& command) {
    return command.size() < 2 ? 0 : static_cast<uint16_t>(command[0] | (command[1] << 8));
}

// Command Complete for opcode: one credit, the opcode, then the return parameters.
inline Bytes commandComplete(uint16_t opcode, const Bytes& returned = {0x00}) {
    // Sized first: GCC 12 misreads an insert into a brace-initialised vector as out of bounds.
    Bytes event(5 + returned.size());
    event[0] = 0x0E;
    event[1] = static_cast<uint8_t>(3 + returned.size());
    event[2] = 0x01;
    event[3] = static_cast<uint8_t>(opcode & 0xFF);
    event[4] = static_cast<uint8_t>(opcode >> 8);
    std::copy(returned.begin(), returned.end(), event.begin() + 5);
    return event;
}

inline Bytes commandStatus(uint16_t opcode, uint8_t status) {
    return {0x0F, 0x04, status, 0x01, static_cast<uint8_t>(opcode & 0xFF), static_cast<uint8_t>(opcode >> 8)};
}

// One packet a scripted controller sends: an event unless a type is given.
struct Packet {
    Packet(Bytes event) : type(4), bytes(std::move(event)) {}  // NOLINT(implicit)
    Packet(uint8_t packetType, Bytes packet) : type(packetType), bytes(std::move(packet)) {}
    uint8_t type;  // H4 type: 2 ACL, 3 SCO, 4 event
    Bytes bytes;
};
using Packets = std::vector<Packet>;

// The HCI commands (without H4 type byte) that reached the HAL, in order.
inline std::vector<Bytes> commandsSent(HalScript& hal) {
    std::vector<Bytes> commands;
    for (const SentPacket& p : hal.sent()) {
        if (p.type == 1) commands.push_back(p.bytes);
    }
    return commands;
}

class HalSessionTest : public ::testing::Test {
  protected: using Script = std::function<Packets(const Bytes& command)>;

    void SetUp() override {
        hal_ = new FakeHal();
        hal_->onSend = [this](HalScript& hal, const SentPacket& packet) {
            for (const Packet& p : replyTo(packet.bytes)) hal.deliver(p.type, p.bytes);
        };
        hal_->registerDefault();
        log_.clear();
    }

    void TearDown() override {
        leaveLinkInStep();
        FakeHal::unregisterDefault();
    }

    // A test that left a command unanswered leaves the link out of step, which
    // outlives sessions: one answered command on a fresh session syncs it.
    static void leaveLinkInStep() {
        hidl_client_close_tool_end();
        hidl_client_close();
        android::sp<FakeHal> answering = new FakeHal();
        answering->onSend = [](HalScript& hal, const SentPacket& p) { hal.deliverEvent(commandComplete(opcodeOf(p.bytes))); };
        answering->registerDefault();
        hidl_client_init();
        hci_send_cmd_rawcmd(bt_fd, 0x04, 0x0001, 0, nullptr);
        hidl_client_close_tool_end();
        hidl_client_close();
    }

    // "default" becomes a HAL whose initialisation fails: no session can open.
    void withoutController() {
        unusable_ = new FakeHal(FakeHal::InitMode::Sync, FakeHal::Status::INITIALIZATION_ERROR);
        unusable_->registerDefault();
    }

    // Replaces how the HAL answers; set it before the session opens.
    void answerWith(Script script) {
        std::lock_guard<std::mutex> guard(lock_);
        script_ = std::move(script);
    }

    Packets replyTo(const Bytes& command) {
        std::lock_guard<std::mutex> guard(lock_);
        if (script_) return script_(command);
        return {commandComplete(opcodeOf(command))};
    }

    android::sp<FakeHal> hal_;
    LogCapture log_;

  private: android::sp<FakeHal> unusable_;
    std::mutex lock_;
    Script script_;
};
