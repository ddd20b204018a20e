// Host stand-in for the NDK backend's proxy of IBluetoothHciCallbacks (version 1):
// a call reaches the client unless its process died. Any thread.
#pragma once

#include <cstdint>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/IBluetoothHciCallbacks.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class BpBluetoothHciCallbacks : public ::ndk::BpCInterface<IBluetoothHciCallbacks> {
  public:
    explicit BpBluetoothHciCallbacks(const ::ndk::SpAIBinder& binder) : BpCInterface(binder) {}
    virtual ~BpBluetoothHciCallbacks() = default;

    ::ndk::ScopedAStatus aclDataReceived(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus hciEventReceived(const std::vector<uint8_t>& in_event) override;
    ::ndk::ScopedAStatus initializationComplete(Status in_status) override;
    ::ndk::ScopedAStatus isoDataReceived(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus scoDataReceived(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) override;
    ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) override;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
