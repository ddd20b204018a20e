// The HAL the benchmarks drive the library against: answers initialize and
// every command at once through its callbacks, and counts ACL data.
// Called on the opening thread and on the pump thread.
#pragma once

#include <atomic>
#include <condition_variable>
#include <cstdint>
#include <mutex>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

// A running total that one thread raises and another waits on; the waiter
// is woken only when the total reaches its target, not for every step.
class Tally {
  public:
    void add(uint64_t n);
    uint64_t total() const { return total_.load(std::memory_order_acquire); }
    // True once the total has reached `target`, false after timeout_ms.
    bool waitFor(uint64_t target, int timeout_ms = 10000);

  private:
    std::atomic<uint64_t> total_{0};
    std::atomic<uint64_t> target_{UINT64_MAX};
    std::mutex lock_;
    std::condition_variable reached_;
};

class BenchHal : public android::hardware::bluetooth::V1_0::IBluetoothHci {
  public:
    using Callbacks = android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
    template <typename T>
    using Return = android::hardware::Return<T>;
    using Bytes = android::hardware::hidl_vec<uint8_t>;

    Return<void> initialize(const android::sp<Callbacks>& callback) override;
    Return<void> sendHciCommand(const Bytes& command) override;
    Return<void> sendAclData(const Bytes& data) override;
    Return<void> sendScoData(const Bytes& data) override;
    Return<void> close() override;

    // ACL packets received through sendAclData.
    Tally& aclPackets() { return acl_packets_; }

  private:
    // Set by initialize before the pump starts, used by the pump alone after.
    android::sp<Callbacks> callbacks_;
    Tally acl_packets_;
};

// Registers a fresh BenchHal as the "default" service for the session the
// library opens next; unregister when done.
android::sp<BenchHal> registerBenchHal();
void unregisterBenchHal();
