// Scriptable Bluetooth HALs for tests, HIDL and AIDL alike: each answers
// initialize as told, records every packet it is sent, delivers packets
// through the callbacks, and can die at any call as a HAL process does.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <functional>
#include <memory>
#include <mutex>
#include <thread>
#include <vector>

#include <aidl/android/hardware/bluetooth/BnBluetoothHci.h>
#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

struct SentPacket {
    uint8_t type;  // H4 type: 1 command, 2 ACL, 3 SCO, 5 ISO
    std::vector<uint8_t> bytes;
};

// What a test scripts and reads of a HAL, whichever interface it serves.
class HalScript {
  public:
    using Bytes = std::vector<uint8_t>;
    enum class InitMode { Sync, Async, Never };
    // The call at which the HAL dies: that call and every later one fail as
    // calls on a dead service do, and death recipients are told. RefuseSend:
    // every send from then on fails, though the HAL lives.
    enum class Call { None, LinkToDeath, Initialize, Send, Close, RefuseSend };

    virtual ~HalScript();

    // Called (on the pump thread) for every packet sent; may answer through deliver().
    std::function<void(HalScript&, const SentPacket&)> onSend;
    void dieAt(Call call);
    // Dies now, between calls.
    virtual void die() = 0;
    // One packet from the controller through the last callbacks handed over.
    virtual void deliver(uint8_t type, const Bytes& packet) = 0;
    // Answers the last initialize (again) with the interface's own status value.
    virtual void answerInitialize(int status) = 0;

    void deliverEvent(const Bytes& event) { deliver(4, event); }
    void deliverAcl(const Bytes& data) { deliver(2, data); }
    void deliverSco(const Bytes& data) { deliver(3, data); }
    std::vector<SentPacket> sent() { return locked(sent_); }
    bool waitForSent(size_t count, int timeout_ms = 5000);
    bool waitForInitialize(int timeout_ms = 5000);
    int initializeCalls() { return locked(initializeCalls_); }
    int closeCalls() { return locked(closeCalls_); }
    // True if any packet reached this HAL between a close() and the next initialize().
    bool sentAfterClose() { return locked(sentAfterClose_); }

  protected:
    HalScript(InitMode mode, int status) : mode_(mode), status_(status) {}
    // True when `call` finds the HAL dead, or kills it.
    bool diesAt(Call call);
    bool refusesSends();
    void markDead();
    // An initialize that got through: `answer` runs with the scripted status,
    // now, on a thread of its own, or never, as the mode says.
    void initialized(std::function<void(int status)> answer);
    // False when the HAL is dead.
    bool record(uint8_t type, Bytes bytes);
    bool recordClose();

  private:
    template <typename T>
    T locked(const T& field) {
        std::lock_guard<std::mutex> guard(lock_);
        return field;
    }
    bool waitFor(const std::function<bool()>& condition, int timeout_ms);

    InitMode mode_;
    int status_;
    std::mutex lock_;
    std::condition_variable changed_;
    std::vector<SentPacket> sent_;
    std::vector<std::thread> threads_;
    int initializeCalls_ = 0;
    int closeCalls_ = 0;
    bool sentAfterClose_ = false;
    bool closed_ = false;
    Call dieAt_ = Call::None;
    bool dead_ = false;
};

// The HIDL HAL, android.hardware.bluetooth@1.0 "default".
class FakeHal : public android::hardware::bluetooth::V1_0::IBluetoothHci, public HalScript {
  public:
    using Status = android::hardware::bluetooth::V1_0::Status;
    using Callbacks = android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
    template <typename T>
    using Return = android::hardware::Return<T>;

    FakeHal(InitMode mode = InitMode::Sync, Status status = Status::SUCCESS);
    ~FakeHal() override = default;

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

    void die() override;
    void deliver(uint8_t type, const Bytes& packet) override;
    void answerInitialize(int status) override;

  private:
    android::sp<Callbacks> callbacks();
    Return<void> send(uint8_t type, const android::hardware::hidl_vec<uint8_t>& p);

    std::mutex callbacks_lock_;
    android::sp<Callbacks> callbacks_;
};

// The AIDL HAL, android.hardware.bluetooth.IBluetoothHci/default, declared
// while registered. Its death (die, or dieAt) fails every later call with
// STATUS_DEAD_OBJECT; a death at LinkToDeath is not scriptable here.
class FakeAidlHal : public aidl::android::hardware::bluetooth::BnBluetoothHci, public HalScript {
  public:
    using Status = aidl::android::hardware::bluetooth::Status;
    using Callbacks = aidl::android::hardware::bluetooth::IBluetoothHciCallbacks;

    FakeAidlHal(InitMode mode = InitMode::Sync, Status status = Status::SUCCESS);

    void registerDefault();
    static void unregisterDefault();

    ndk::ScopedAStatus initialize(const std::shared_ptr<Callbacks>& callback) override;
    ndk::ScopedAStatus close() override;
    ndk::ScopedAStatus sendHciCommand(const std::vector<uint8_t>& p) override { return send(1, p); }
    ndk::ScopedAStatus sendAclData(const std::vector<uint8_t>& p) override { return send(2, p); }
    ndk::ScopedAStatus sendScoData(const std::vector<uint8_t>& p) override { return send(3, p); }
    ndk::ScopedAStatus sendIsoData(const std::vector<uint8_t>& p) override { return send(5, p); }

    void die() override;
    void deliver(uint8_t type, const Bytes& packet) override;
    void answerInitialize(int status) override;

  private:
    std::shared_ptr<Callbacks> callbacks();
    ndk::ScopedAStatus send(uint8_t type, const std::vector<uint8_t>& p);

    std::mutex callbacks_lock_;
    std::shared_ptr<Callbacks> callbacks_;
};
