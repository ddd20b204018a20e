// Host stand-in for the NDK backend's IBluetoothHci (version 1): the class its
// binders are made with, the local base and the proxy. Any thread.
#include <aidl/android/hardware/bluetooth/BnBluetoothHci.h>
#include <aidl/android/hardware/bluetooth/BpBluetoothHci.h>
#include <aidl/android/hardware/bluetooth/IBluetoothHci.h>

#include "proxy_call.h"

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

namespace {

const AIBinder_Class* hciClass() {
    // No transaction code is ever read on a host: proxies call the object directly.
    static const AIBinder_Class* clazz = ::ndk::ICInterface::defineClass(IBluetoothHci::descriptor, nullptr);
    return clazz;
}

template <typename Call>
::ndk::ScopedAStatus transact(const ::ndk::SpAIBinder& binder, Call call) {
    return ::binder_host::transact<IBluetoothHci>(binder, call);
}

}  // namespace

const char* IBluetoothHci::descriptor = "android.hardware.bluetooth.IBluetoothHci";

// Always a proxy: on a device the HAL is in another process, and a proxy is where its death shows.
std::shared_ptr<IBluetoothHci> IBluetoothHci::fromBinder(const ::ndk::SpAIBinder& binder) {
    if (!AIBinder_associateClass(binder.get(), hciClass())) return nullptr;
    return ::ndk::SharedRefBase::make<BpBluetoothHci>(binder);
}

::ndk::SpAIBinder BnBluetoothHci::createBinder() {
    return ::ndk::SpAIBinder(AIBinder_new(hciClass(), static_cast<::ndk::ICInterface*>(this)));
}

::ndk::ScopedAStatus BnBluetoothHci::getInterfaceVersion(int32_t* _aidl_return) {
    *_aidl_return = IBluetoothHci::version;
    return ::ndk::ScopedAStatus::ok();
}

::ndk::ScopedAStatus BnBluetoothHci::getInterfaceHash(std::string* _aidl_return) {
    *_aidl_return = IBluetoothHci::hash;
    return ::ndk::ScopedAStatus::ok();
}

::ndk::ScopedAStatus BpBluetoothHci::close() {
    return transact(asBinder(), [](IBluetoothHci& hci) { return hci.close(); });
}

::ndk::ScopedAStatus BpBluetoothHci::initialize(const std::shared_ptr<IBluetoothHciCallbacks>& in_callback) {
    // The service gets a proxy of its own for the callbacks, as across processes: it holds the
    // client's object alive, and fails its calls once the client died.
    std::shared_ptr<IBluetoothHciCallbacks> callback;
    if (in_callback != nullptr) callback = IBluetoothHciCallbacks::fromBinder(in_callback->asBinder());
    return transact(asBinder(), [&](IBluetoothHci& hci) {
        if (callback == nullptr) return ::ndk::ScopedAStatus::fromStatus(STATUS_UNEXPECTED_NULL);
        return hci.initialize(callback);
    });
}

::ndk::ScopedAStatus BpBluetoothHci::sendAclData(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.sendAclData(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHci::sendHciCommand(const std::vector<uint8_t>& in_command) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.sendHciCommand(in_command); });
}

::ndk::ScopedAStatus BpBluetoothHci::sendIsoData(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.sendIsoData(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHci::sendScoData(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.sendScoData(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHci::getInterfaceVersion(int32_t* _aidl_return) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.getInterfaceVersion(_aidl_return); });
}

::ndk::ScopedAStatus BpBluetoothHci::getInterfaceHash(std::string* _aidl_return) {
    return transact(asBinder(), [&](IBluetoothHci& hci) { return hci.getInterfaceHash(_aidl_return); });
}

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
