// Helpers for the host HAL suites: a recording IBluetoothHciCallbacks, the
// service behind getService("default") for a HALVENOR_HCI value, temp paths.
#pragma once

#include <condition_variable>
#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

using Bytes = std::vector<uint8_t>;
using HciStatus = android::hardware::bluetooth::V1_0::Status;

struct Received {
    uint8_t type;  // 2 ACL, 3 SCO, 4 event
    Bytes bytes;
};

class RecordingCallbacks : public android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks {
  public: template <typename T>
    using Return = android::hardware::Return<T>;
    using hidl_bytes = android::hardware::hidl_vec<uint8_t>;

    Return<void> initializationComplete(HciStatus status) override;
    Return<void> hciEventReceived(const hidl_bytes& event) override { return record(4, event); }
    Return<void> aclDataReceived(const hidl_bytes& data) override { return record(2, data); }
    Return<void> scoDataReceived(const hidl_bytes& data) override { return record(3, data); }

    // Waits (bounded) for the first initializationComplete; false if none came.
    bool waitForInit(HciStatus* status, int timeout_ms = 10000);
    bool waitForPackets(size_t count, int timeout_ms = 5000);
    std::vector<Received> packets();

  private: Return<void> record(uint8_t type, const hidl_bytes& bytes);
    std::mutex lock_;
    std::condition_variable changed_;
    std::vector<HciStatus> inits_;
    std::vector<Received> packets_;
};

// Sets HALVENOR_HCI and asks the registry for "default".
android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> serviceFor(const char* hci);
// A fresh path under the test's temp directory (nothing created there).
std::string tempPath(const std::string& name);
// H4 bytes of a packet: type byte then the packet.
Bytes h4(uint8_t type, const Bytes& packet);
