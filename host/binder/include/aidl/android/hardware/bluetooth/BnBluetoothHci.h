// Host stand-in for the NDK backend's local base of IBluetoothHci (version 1):
// the service's side, on the threads its clients call from. Made with ndk::SharedRefBase::make.
#pragma once

#include <cstdint>
#include <string>

#include <aidl/android/hardware/bluetooth/IBluetoothHci.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class BnBluetoothHci : public ::ndk::BnCInterface<IBluetoothHci> {
  public:
    BnBluetoothHci() = default;
    virtual ~BnBluetoothHci() = default;

    ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) final;
    ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) final;

  protected:
    ::ndk::SpAIBinder createBinder() override;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
