// Host stand-in for the NDK backend's IBluetoothHciCallbacks (version 1): the
// class its binders are made with, the local base and the proxy. Any thread.
#include <aidl/android/hardware/bluetooth/BnBluetoothHciCallbacks.h>
#include <aidl/android/hardware/bluetooth/BpBluetoothHciCallbacks.h>
#include <aidl/android/hardware/bluetooth/IBluetoothHciCallbacks.h>

#include "proxy_call.h"

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

namespace {

const AIBinder_Class* callbacksClass() {
    // No transaction code is ever read on a host: proxies call the object directly.
    static const AIBinder_Class* clazz =
            ::ndk::ICInterface::defineClass(IBluetoothHciCallbacks::descriptor, nullptr);
    return clazz;
}

template <typename Call>
::ndk::ScopedAStatus transact(const ::ndk::SpAIBinder& binder, Call call) {
    return ::binder_host::transact<IBluetoothHciCallbacks>(binder, call);
}

}  // namespace

const char* IBluetoothHciCallbacks::descriptor = "android.hardware.bluetooth.IBluetoothHciCallbacks";

// Always a proxy: on a device the client that made the callbacks is in another process.
std::shared_ptr<IBluetoothHciCallbacks> IBluetoothHciCallbacks::fromBinder(const ::ndk::SpAIBinder& binder) {
    if (!AIBinder_associateClass(binder.get(), callbacksClass())) return nullptr;
    return ::ndk::SharedRefBase::make<BpBluetoothHciCallbacks>(binder);
}

::ndk::SpAIBinder BnBluetoothHciCallbacks::createBinder() {
    return ::ndk::SpAIBinder(AIBinder_new(callbacksClass(), static_cast<::ndk::ICInterface*>(this)));
}

::ndk::ScopedAStatus BnBluetoothHciCallbacks::getInterfaceVersion(int32_t* _aidl_return) {
    *_aidl_return = IBluetoothHciCallbacks::version;
    return ::ndk::ScopedAStatus::ok();
}

::ndk::ScopedAStatus BnBluetoothHciCallbacks::getInterfaceHash(std::string* _aidl_return) {
    *_aidl_return = IBluetoothHciCallbacks::hash;
    return ::ndk::ScopedAStatus::ok();
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::aclDataReceived(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.aclDataReceived(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::hciEventReceived(const std::vector<uint8_t>& in_event) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.hciEventReceived(in_event); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::initializationComplete(Status in_status) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.initializationComplete(in_status); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::isoDataReceived(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.isoDataReceived(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::scoDataReceived(const std::vector<uint8_t>& in_data) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.scoDataReceived(in_data); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::getInterfaceVersion(int32_t* _aidl_return) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.getInterfaceVersion(_aidl_return); });
}

::ndk::ScopedAStatus BpBluetoothHciCallbacks::getInterfaceHash(std::string* _aidl_return) {
    return transact(asBinder(), [&](IBluetoothHciCallbacks& cb) { return cb.getInterfaceHash(_aidl_return); });
}

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
