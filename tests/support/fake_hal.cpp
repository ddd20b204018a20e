#include "tests/support/fake_hal.h"

#include <chrono>

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Void;

FakeHal::FakeHal(InitMode mode, FakeHal::Status status) : mode_(mode), status_(status) {}

FakeHal::~FakeHal() {
    for (auto& t : threads_) t.join();
}

void FakeHal::registerDefault() { registerAsService("default"); }

void FakeHal::unregisterDefault() { IBluetoothHci::unregisterService("default"); }

FakeHal::Return<void> FakeHal::initialize(const sp<Callbacks>& callback) {
    {
        std::lock_guard<std::mutex> guard(lock_);
        callbacks_ = callback;
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
    SentPacket packet{type, Bytes(p.begin(), p.end())};
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (closeCalls_ > 0) sentAfterClose_ = true;
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
    std::lock_guard<std::mutex> guard(lock_);
    ++closeCalls_;
    changed_.notify_all();
    using TransportStatus = android::hardware::Status;
    if (closeReportsDead) return TransportStatus::fromExceptionCode(TransportStatus::EX_TRANSACTION_FAILED);
    return Void();
}

sp<FakeHal::Callbacks> FakeHal::callbacks() {
    std::lock_guard<std::mutex> guard(lock_);
    return callbacks_;
}

std::vector<SentPacket> FakeHal::sent() {
    std::lock_guard<std::mutex> guard(lock_);
    return sent_;
}

bool FakeHal::waitForSent(size_t count, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms),
                             [&] { return sent_.size() >= count; });
}

bool FakeHal::waitForInitialize(int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms),
                             [&] { return initializeCalls_ > 0; });
}

int FakeHal::initializeCalls() {
    std::lock_guard<std::mutex> guard(lock_);
    return initializeCalls_;
}

int FakeHal::closeCalls() {
    std::lock_guard<std::mutex> guard(lock_);
    return closeCalls_;
}

bool FakeHal::sentAfterClose() {
    std::lock_guard<std::mutex> guard(lock_);
    return sentAfterClose_;
}

void FakeHal::deliverEvent(const Bytes& event) { callbacks()->hciEventReceived(hidl_vec<uint8_t>(event)); }
void FakeHal::deliverAcl(const Bytes& data) { callbacks()->aclDataReceived(hidl_vec<uint8_t>(data)); }
void FakeHal::deliverSco(const Bytes& data) { callbacks()->scoDataReceived(hidl_vec<uint8_t>(data)); }
