#include "tests/support/fake_hal.h"

#include <chrono>

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Void;
using TransportStatus = android::hardware::Status;

static TransportStatus deadObject() {
    return TransportStatus::fromExceptionCode(TransportStatus::EX_TRANSACTION_FAILED);
}

FakeHal::FakeHal(InitMode mode, FakeHal::Status status) : mode_(mode), status_(status) {}

FakeHal::~FakeHal() {
    for (auto& t : threads_) t.join();
}

void FakeHal::registerDefault() { registerAsService("default"); }

void FakeHal::unregisterDefault() { IBluetoothHci::unregisterService("default"); }

void FakeHal::dieAt(Call call) {
    std::lock_guard<std::mutex> guard(lock_);
    dieAt_ = call;
}

void FakeHal::die() {
    {
        std::lock_guard<std::mutex> guard(lock_);
        dead_ = true;
    }
    notifyServiceDied();
}

bool FakeHal::diesAt(Call call) {
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (dead_) return true;
        if (call != dieAt_) return false;
    }
    die();
    return true;
}

FakeHal::Return<bool> FakeHal::linkToDeath(const sp<android::hardware::hidl_death_recipient>& recipient,
                                           uint64_t cookie) {
    if (diesAt(Call::LinkToDeath)) return deadObject();
    return IBluetoothHci::linkToDeath(recipient, cookie);
}

FakeHal::Return<void> FakeHal::initialize(const sp<Callbacks>& callback) {
    if (diesAt(Call::Initialize)) return deadObject();
    {
        std::lock_guard<std::mutex> guard(lock_);
        callbacks_ = callback;
        closed_ = false;
        ++initializeCalls_;
        changed_.notify_all();
    }
    if (mode_ == InitMode::Sync) {
        callback->initializationComplete(status_);
    } else if (mode_ == InitMode::Async) {
        std::lock_guard<std::mutex> guard(lock_);
        FakeHal::Status status = status_;
        // Earlier answers have long finished; reap them so cycles don't pile up threads.
        for (auto& t : threads_) t.join();
        threads_.clear();
        threads_.emplace_back([callback, status] { callback->initializationComplete(status); });
    }
    return Void();
}

FakeHal::Return<void> FakeHal::record(uint8_t type, const hidl_vec<uint8_t>& p) {
    if (diesAt(Call::Send)) return deadObject();
    SentPacket packet{type, Bytes(p.begin(), p.end())};
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (closed_) sentAfterClose_ = true;
        sent_.push_back(packet);
        changed_.notify_all();
    }
    if (onSend) onSend(*this, packet);
    return Void();
}

FakeHal::Return<void> FakeHal::sendHciCommand(const hidl_vec<uint8_t>& p) { return record(1, p); }
FakeHal::Return<void> FakeHal::sendAclData(const hidl_vec<uint8_t>& p) { return record(2, p); }
FakeHal::Return<void> FakeHal::sendScoData(const hidl_vec<uint8_t>& p) { return record(3, p); }

FakeHal::Return<void> FakeHal::close() {
    {
        std::lock_guard<std::mutex> guard(lock_);
        ++closeCalls_;
        closed_ = true;
        changed_.notify_all();
    }
    if (diesAt(Call::Close)) return deadObject();
    return Void();
}

bool FakeHal::waitFor(const std::function<bool()>& condition, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms), condition);
}

bool FakeHal::waitForSent(size_t count, int timeout_ms) {
    return waitFor([&] { return sent_.size() >= count; }, timeout_ms);
}

bool FakeHal::waitForInitialize(int timeout_ms) {
    return waitFor([&] { return initializeCalls_ > 0; }, timeout_ms);
}

void FakeHal::deliverEvent(const Bytes& event) { callbacks()->hciEventReceived(hidl_vec<uint8_t>(event)); }
void FakeHal::deliverAcl(const Bytes& data) { callbacks()->aclDataReceived(hidl_vec<uint8_t>(data)); }
void FakeHal::deliverSco(const Bytes& data) { callbacks()->scoDataReceived(hidl_vec<uint8_t>(data)); }
