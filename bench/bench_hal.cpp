// The benchmarks' HAL: immediate answers, no recording, no allocation beyond
// the reply. Runs on the opening thread (initialize, close) and the pump.
#include "bench/bench_hal.h"

#include <chrono>

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::Status;

void Tally::add(uint64_t n) {
    uint64_t now = total_.fetch_add(n, std::memory_order_acq_rel) + n;
    if (now < target_.load(std::memory_order_acquire)) return;
    // Taking the lock orders the notify after the waiter has started waiting.
    std::lock_guard<std::mutex> guard(lock_);
    reached_.notify_all();
}

bool Tally::waitFor(uint64_t target, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    target_.store(target, std::memory_order_release);
    bool reached = reached_.wait_for(guard, std::chrono::milliseconds(timeout_ms),
                                     [&] { return total() >= target; });
    target_.store(UINT64_MAX, std::memory_order_release);
    return reached;
}

BenchHal::Return<void> BenchHal::initialize(const sp<Callbacks>& callback) {
    callbacks_ = callback;
    callback->initializationComplete(Status::SUCCESS);
    return Void();
}

// Command Complete for the opcode sent, status success (Core Specification
// Vol 4, Part E, 7.7.14): what a controller answers to Reset.
BenchHal::Return<void> BenchHal::sendHciCommand(const Bytes& command) {
    if (command.size() < 2 || callbacks_ == nullptr) return Void();
    uint8_t reply[] = {0x0E, 0x04, 0x01, command[0], command[1], 0x00};
    hidl_vec<uint8_t> event;
    event.setToExternal(reply, sizeof(reply));
    callbacks_->hciEventReceived(event);
    return Void();
}

BenchHal::Return<void> BenchHal::sendAclData(const Bytes&) {
    acl_packets_.add(1);
    return Void();
}

BenchHal::Return<void> BenchHal::sendScoData(const Bytes&) { return Void(); }

BenchHal::Return<void> BenchHal::close() { return Void(); }

sp<BenchHal> registerBenchHal() {
    sp<BenchHal> hal = new BenchHal();
    hal->registerAsService("default");
    return hal;
}

void unregisterBenchHal() { BenchHal::unregisterService("default"); }
