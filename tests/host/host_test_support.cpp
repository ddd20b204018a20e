// Helpers for the host HAL suites; see the header.
#include "tests/host/host_test_support.h"

#include <stdlib.h>
#include <unistd.h>

#include <algorithm>
#include <chrono>

using android::sp;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::IBluetoothHci;

RecordingCallbacks::Return<void> RecordingCallbacks::initializationComplete(HciStatus status) {
    std::lock_guard<std::mutex> guard(lock_);
    inits_.push_back(status);
    changed_.notify_all();
    return Void();
}

RecordingCallbacks::Return<void> RecordingCallbacks::record(uint8_t type, const hidl_bytes& bytes) {
    std::lock_guard<std::mutex> guard(lock_);
    packets_.push_back({type, Bytes(bytes.begin(), bytes.end())});
    changed_.notify_all();
    return Void();
}

bool RecordingCallbacks::waitForInit(HciStatus* status, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    if (!changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] { return !inits_.empty(); })) {
        return false;
    }
    *status = inits_.front();
    return true;
}

bool RecordingCallbacks::waitForPackets(size_t count, int timeout_ms) {
    std::unique_lock<std::mutex> guard(lock_);
    return changed_.wait_for(guard, std::chrono::milliseconds(timeout_ms), [&] { return packets_.size() >= count; });
}

std::vector<Received> RecordingCallbacks::packets() {
    std::lock_guard<std::mutex> guard(lock_);
    return packets_;
}

sp<IBluetoothHci> serviceFor(const char* hci) {
    setenv("HALVENOR_HCI", hci, 1);
    return IBluetoothHci::getService("default");
}

std::string tempPath(const std::string& name) {
    const char* dir = getenv("TMPDIR");
    return std::string(dir != nullptr ? dir : "/tmp") + "/halvenor-" + std::to_string(getpid()) + "-" + name;
}

Bytes h4(uint8_t type, const Bytes& packet) {
    Bytes out(packet.size() + 1, type);
    std::copy(packet.begin(), packet.end(), out.begin() + 1);
    return out;
}
