// Host stand-in for the NDK backend's proxy of IBluetoothHci (version 1): a
// call reaches the service unless its process died. Any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/IBluetoothHci.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class BpBluetoothHci : public ::ndk::BpCInterface<IBluetoothHci> {
  public:
    explicit BpBluetoothHci(const ::ndk::SpAIBinder& binder) : BpCInterface(binder) {}
    virtual ~BpBluetoothHci() = default;

    ::ndk::ScopedAStatus close() override;
    ::ndk::ScopedAStatus initialize(const std::shared_ptr<IBluetoothHciCallbacks>& in_callback) override;
    ::ndk::ScopedAStatus sendAclData(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus sendHciCommand(const std::vector<uint8_t>& in_command) override;
    ::ndk::ScopedAStatus sendIsoData(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus sendScoData(const std::vector<uint8_t>& in_data) override;
    ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) override;
    ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) override;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
