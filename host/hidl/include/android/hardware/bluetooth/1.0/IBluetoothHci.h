// Host stand-in for android.hardware.bluetooth@1.0::IBluetoothHci. getService
// and registerAsService go through the host service registry instead of
// hwservicemanager.
#pragma once

#include <cstdint>
#include <string>

#include <android/hardware/bluetooth/1.0/IBluetoothHciCallbacks.h>
#include <android/hidl/base/1.0/IBase.h>
#include <hidl/HidlSupport.h>
#include <hidl/Status.h>
#include <utils/Errors.h>
#include <utils/StrongPointer.h>

namespace android {
namespace hardware {
namespace bluetooth {
namespace V1_0 {

struct IBluetoothHci : public ::android::hidl::base::V1_0::IBase {
    std::string interfaceDescriptor() const override {
        return "android.hardware.bluetooth@1.0::IBluetoothHci";
    }
    virtual ::android::hardware::Return<void> initialize(
            const ::android::sp<IBluetoothHciCallbacks>& callback) = 0;
    virtual ::android::hardware::Return<void> sendHciCommand(
            const ::android::hardware::hidl_vec<uint8_t>& command) = 0;
    virtual ::android::hardware::Return<void> sendAclData(
            const ::android::hardware::hidl_vec<uint8_t>& data) = 0;
    virtual ::android::hardware::Return<void> sendScoData(
            const ::android::hardware::hidl_vec<uint8_t>& data) = 0;
    virtual ::android::hardware::Return<void> close() = 0;

    // The argument forms of the platform's generated code.
    static ::android::sp<IBluetoothHci> getService(const std::string& serviceName = "default",
                                                   bool getStub = false);
    static ::android::sp<IBluetoothHci> getService(const char serviceName[], bool getStub = false) {
        return getService(std::string(serviceName != nullptr ? serviceName : ""), getStub);
    }
    static ::android::sp<IBluetoothHci> getService(bool getStub) {
        return getService(std::string("default"), getStub);
    }
    // A later registration under the same name replaces the earlier one.
    ::android::status_t registerAsService(const std::string& serviceName = "default");
    // Host only (tests): forget the service registered under a name.
    static void unregisterService(const std::string& serviceName = "default");
};

}  // namespace V1_0
}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
