// Host stand-in for the NDK backend's class of the frozen Bluetooth HAL's
// IBluetoothHci (version 1): the calls a client makes, from any thread.
#pragma once

#include <cstdint>
#include <memory>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/IBluetoothHciCallbacks.h>
#include <android/binder_auto_utils.h>
#include <android/binder_interface_utils.h>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

class IBluetoothHci : public ::ndk::ICInterface {
  public:
    // The service's name is std::string(descriptor) + "/default".
    static const char* descriptor;
    static inline const int32_t version = 1;
    // The frozen interface's own hash is not at hand on a host: a string of its form stands in.
    static inline const std::string hash = "0000000000000000000000000000000000000000";

    IBluetoothHci() = default;
    virtual ~IBluetoothHci() = default;

    // A proxy for the binder, or null when it is not of this interface.
    static std::shared_ptr<IBluetoothHci> fromBinder(const ::ndk::SpAIBinder& binder);

    virtual ::ndk::ScopedAStatus close() = 0;
    virtual ::ndk::ScopedAStatus initialize(const std::shared_ptr<IBluetoothHciCallbacks>& in_callback) = 0;
    virtual ::ndk::ScopedAStatus sendAclData(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus sendHciCommand(const std::vector<uint8_t>& in_command) = 0;
    virtual ::ndk::ScopedAStatus sendIsoData(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus sendScoData(const std::vector<uint8_t>& in_data) = 0;
    virtual ::ndk::ScopedAStatus getInterfaceVersion(int32_t* _aidl_return) = 0;
    virtual ::ndk::ScopedAStatus getInterfaceHash(std::string* _aidl_return) = 0;
};

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
