// A scriptable IBluetoothHci for tests: answers initialize as told, records
// every packet it is sent, delivers packets through the callbacks, and can
// die at any call as a HAL process does.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <mutex>
#include <thread>
#include <vector>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

struct SentPacket {
    uint8_t type;  // H4 type: 1 command, 2 ACL, 3 SCO
    std::vector<uint8_t> bytes;
};

class FakeHal : public android::hardware::bluetooth::V1_0::IBluetoothHci {
  public: using Status = android::hardware::bluetooth::V1_0::Status;
    using Callbacks = android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
    template <typename T>
    using Return = android::hardware::Return<T>;
    using Bytes = std::vector<uint8_t>;

    enum class InitMode { Sync, Async, Never };
    // The call at which the HAL dies: that call and every later one fail with
    // a transport error, and death recipients are told.
    enum class Call { None, LinkToDeath, Initialize, Send, Close };

    FakeHal(InitMode mode = InitMode::Sync, Status status = Status::SUCCESS);
    ~FakeHal() override;

    // Registers this fake as the "default" service / removes it.
    void registerDefault();
    static void unregisterDefault();

    Return<void> initialize(const android::sp<Callbacks>& callback) override;
    Return<void> sendHciCommand(const android::hardware::hidl_vec<uint8_t>& p) override;
    Return<void> sendAclData(const android::hardware::hidl_vec<uint8_t>& p) override;
    Return<void> sendScoData(const android::hardware::hidl_vec<uint8_t>& p) override;
    Return<void> close() override;
    Return<bool> linkToDeath(const android::sp<android::hardware::hidl_death_recipient>& recipient,
                             uint64_t cookie) override;

    // Called (on the pump thread) for every packet sent; may answer through callbacks().
    std::function<void(FakeHal&, const SentPacket&)> onSend;
    void dieAt(Call call);
    // Dies now, between calls.
    void die();

    android::sp<Callbacks> callbacks() { return locked(callbacks_); }
    std::vector<SentPacket> sent() { return locked(sent_); }
    bool waitForSent(size_t count, int timeout_ms = 5000);
    bool waitForInitialize(int timeout_ms = 5000);
    int initializeCalls() { return locked(initializeCalls_); }
    int closeCalls() { return locked(closeCalls_); }
    // True if any packet reached this HAL between a close() and the next initialize().
    bool sentAfterClose() { return locked(sentAfterClose_); }

    void deliverEvent(const Bytes& event);
    void deliverAcl(const Bytes& data);
    void deliverSco(const Bytes& data);

  private: Return<void> record(uint8_t type, const android::hardware::hidl_vec<uint8_t>& p);
    // True when `call` finds the HAL dead, or kills it.
    bool diesAt(Call call);
    template <typename T>
    T locked(const T& field) {
        std::lock_guard<std::mutex> guard(lock_);
        return field;
    }
    bool waitFor(const std::function<bool()>& condition, int timeout_ms);

    InitMode mode_;
    Status status_;
    std::mutex lock_;
    std::condition_variable changed_;
    android::sp<Callbacks> callbacks_;
    std::vector<SentPacket> sent_;
    std::vector<std::thread> threads_;
    int initializeCalls_ = 0;
    int closeCalls_ = 0;
    bool sentAfterClose_ = false;
    bool closed_ = false;
    Call dieAt_ = Call::None;
    bool dead_ = false;
};
