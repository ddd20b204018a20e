// Host stand-in for the NDK backend's class of the frozen Bluetooth HAL's
// IBluetoothHciCallbacks (version 1): what the HAL calls back with, on its threads.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/Status.h>
#include <android/binder_auto_utils.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class IBluetoothHciCallbacks : public ::ndk::ICInterface {
  public:
    static const char* descriptor;
    static inline const int32_t version = 1;
    // The frozen interface's own hash is not at hand on a host: a string of its form stands in.
    static inline const std::string hash = "0000000000000000000000000000000000000000";

    IBluetoothHciCallbacks() = default;
    virtual ~IBluetoothHciCallbacks() = default;

    // A proxy for the binder, or null when it is not of this interface.
    static std::shared_ptr<IBluetoothHciCallbacks> fromBinder(const ::ndk::SpAIBinder& binder);

    virtual ::ndk::ScopedAStatus aclDataReceived(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus hciEventReceived(const std::vector<uint8_t>& in_event) = 0;
    virtual ::ndk::ScopedAStatus initializationComplete(Status in_status) = 0;
    virtual ::ndk::ScopedAStatus isoDataReceived(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus scoDataReceived(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) = 0;
    virtual ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) = 0;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
