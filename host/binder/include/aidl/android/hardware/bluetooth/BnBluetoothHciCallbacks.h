// Host stand-in for the NDK backend's local base of IBluetoothHciCallbacks (version 1):
// a client's side, on the threads the HAL calls back on. Made with ndk::SharedRefBase::make.
#pragma once

#include <cstdint>
#include <string>

#include <aidl/android/hardware/bluetooth/IBluetoothHciCallbacks.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class BnBluetoothHciCallbacks : public ::ndk::BnCInterface<IBluetoothHciCallbacks> {
  public:
    BnBluetoothHciCallbacks() = default;
    virtual ~BnBluetoothHciCallbacks() = default;

    ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) final;
    ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) final;

  protected:
    ::ndk::SpAIBinder createBinder() override;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
