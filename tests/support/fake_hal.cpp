#include "tests/support/fake_hal.h"

#include <chrono>
#include <string>

#include <android/binder_host.h>
#include <android/binder_manager.h>

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Void;
using ndk::ScopedAStatus;
using TransportStatus = android::hardware::Status;

HalScript::~HalScript() {
    for (auto& t : threads_) t.join();
}

void HalScript::dieAt(Call call) {
    std::lock_guard<std::mutex> guard(lock_);
    dieAt_ = call;
}

void HalScript::markDead() {
    std::lock_guard<std::mutex> guard(lock_);
    dead_ = true;
}

bool HalScript::diesAt(Call call) {
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (dead_) return true;
        if (call != dieAt_) return false;
    }
    die();
    return true;
}

bool HalScript::refusesSends() {
    std::lock_guard<std::mutex> guard(lock_);
    return dieAt_ == Call::RefuseSend;
}

void HalScript::initialized(std::function<void(int status)> answer) {
    std::unique_lock<std::mutex> guard(lock_);
    closed_ = false;
    ++initializeCalls_;
    changed_.notify_all();
    int status = status_;
    if (mode_ == InitMode::Async) {
        // Earlier answers have long finished; reap them so cycles don't pile up threads.
        for (auto& t : threads_) t.join();
        threads_.clear();
        threads_.emplace_back([answer, status] { answer(status); });
    }
    guard.unlock();
    if (mode_ == InitMode::Sync) answer(status);
}

bool HalScript::record(uint8_t type, Bytes bytes) {
    if (diesAt(Call::Send)) return false;
    SentPacket packet{type, std::move(bytes)};
    {
        std::lock_guard<std::mutex> guard(lock_);
        if (closed_) sentAfterClose_ = true;
        sent_.push_back(packet);
        changed_.notify_all();
    }
    if (onSend) onSend(*this, packet);
    return true;
}

bool HalScript::recordClose() {
    {
        std::lock_guard<std::mutex> guard(lock_);
        ++closeCalls_;
        closed_ = true;
        changed_.notify_all();
    }
    return !diesAt(Call::Close);
}

bool HalScript::waitFor(const std::function<bool()>& condition, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms), condition);
}

bool HalScript::waitForSent(size_t count, int timeout_ms) {
    return waitFor([&] { return sent_.size() >= count; }, timeout_ms);
}

bool HalScript::waitForInitialize(int timeout_ms) {
    return waitFor([&] { return initializeCalls_ > 0; }, timeout_ms);
}

// HIDL

static TransportStatus deadObject() {
    return TransportStatus::fromExceptionCode(TransportStatus::EX_TRANSACTION_FAILED);
}

FakeHal::FakeHal(InitMode mode, Status status) : HalScript(mode, static_cast<int>(status)) {}

void FakeHal::registerDefault() { registerAsService("default"); }

void FakeHal::unregisterDefault() { IBluetoothHci::unregisterService("default"); }

void FakeHal::die() {
    markDead();
    notifyServiceDied();
}

sp<FakeHal::Callbacks> FakeHal::callbacks() {
    std::lock_guard<std::mutex> guard(callbacks_lock_);
    return callbacks_;
}

FakeHal::Return<bool> FakeHal::linkToDeath(const sp<android::hardware::hidl_death_recipient>& recipient,
                                           uint64_t cookie) {
    if (diesAt(Call::LinkToDeath)) return deadObject();
    return IBluetoothHci::linkToDeath(recipient, cookie);
}

FakeHal::Return<void> FakeHal::initialize(const sp<Callbacks>& callback) {
    if (diesAt(Call::Initialize)) return deadObject();
    {
        std::lock_guard<std::mutex> guard(callbacks_lock_);
        callbacks_ = callback;
    }
    initialized([callback](int status) { callback->initializationComplete(static_cast<Status>(status)); });
    return Void();
}

FakeHal::Return<void> FakeHal::send(uint8_t type, const hidl_vec<uint8_t>& p) {
    if (refusesSends()) return TransportStatus::fromExceptionCode(TransportStatus::EX_ILLEGAL_STATE);
    if (!record(type, Bytes(p.begin(), p.end()))) return deadObject();
    return Void();
}

FakeHal::Return<void> FakeHal::sendHciCommand(const hidl_vec<uint8_t>& p) { return send(1, p); }
FakeHal::Return<void> FakeHal::sendAclData(const hidl_vec<uint8_t>& p) { return send(2, p); }
FakeHal::Return<void> FakeHal::sendScoData(const hidl_vec<uint8_t>& p) { return send(3, p); }

FakeHal::Return<void> FakeHal::close() {
    if (!recordClose()) return deadObject();
    return Void();
}

void FakeHal::deliver(uint8_t type, const Bytes& packet) {
    hidl_vec<uint8_t> bytes(packet);
    if (type == 2) callbacks()->aclDataReceived(bytes);
    else if (type == 3) callbacks()->scoDataReceived(bytes);
    else callbacks()->hciEventReceived(bytes);
}

void FakeHal::answerInitialize(int status) { callbacks()->initializationComplete(static_cast<Status>(status)); }

// AIDL

static const char* aidlInstance() {
    static const std::string name = std::string(FakeAidlHal::descriptor) + "/default";
    return name.c_str();
}

FakeAidlHal::FakeAidlHal(InitMode mode, Status status) : HalScript(mode, static_cast<int>(status)) {}

void FakeAidlHal::registerDefault() {
    AServiceManager_addService(asBinder().get(), aidlInstance());
    ndk::host::setDeclared(aidlInstance(), true);
}

void FakeAidlHal::unregisterDefault() {
    ndk::host::removeService(aidlInstance());
    ndk::host::setDeclared(aidlInstance(), false);
}

void FakeAidlHal::die() {
    markDead();
    ndk::host::killService(asBinder().get());
}

std::shared_ptr<FakeAidlHal::Callbacks> FakeAidlHal::callbacks() {
    std::lock_guard<std::mutex> guard(callbacks_lock_);
    return callbacks_;
}

ScopedAStatus FakeAidlHal::initialize(const std::shared_ptr<Callbacks>& callback) {
    if (diesAt(Call::Initialize)) return ScopedAStatus::fromStatus(STATUS_DEAD_OBJECT);
    {
        std::lock_guard<std::mutex> guard(callbacks_lock_);
        callbacks_ = callback;
    }
    initialized([callback](int status) { callback->initializationComplete(static_cast<Status>(status)); });
    return ScopedAStatus::ok();
}

ScopedAStatus FakeAidlHal::send(uint8_t type, const std::vector<uint8_t>& p) {
    if (refusesSends()) return ScopedAStatus::fromExceptionCode(EX_ILLEGAL_STATE);
    if (!record(type, p)) return ScopedAStatus::fromStatus(STATUS_DEAD_OBJECT);
    return ScopedAStatus::ok();
}

ScopedAStatus FakeAidlHal::close() {
    if (!recordClose()) return ScopedAStatus::fromStatus(STATUS_DEAD_OBJECT);
    return ScopedAStatus::ok();
}

void FakeAidlHal::deliver(uint8_t type, const Bytes& packet) {
    std::shared_ptr<Callbacks> cb = callbacks();
    if (type == 2) cb->aclDataReceived(packet);
    else if (type == 3) cb->scoDataReceived(packet);
    else if (type == 5) cb->isoDataReceived(packet);
    else cb->hciEventReceived(packet);
}

void FakeAidlHal::answerInitialize(int status) { callbacks()->initializationComplete(static_cast<Status>(status)); }
