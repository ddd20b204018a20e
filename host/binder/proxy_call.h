// Host stand-in for a proxy's transaction. Client and service share this
// process, so a call reaches the object behind the binder itself; what is left
// of the transaction is its failure once the service's process died. Any thread.
#pragma once

#include <memory>

#include <android/binder_auto_utils.h>
#include <android/binder_interface_utils.h>

namespace binder_host {

template <typename INTERFACE, typename Call>
::ndk::ScopedAStatus transact(const ::ndk::SpAIBinder& binder, Call call) {
    // Asked on every call: a service that died between two calls fails the second, as on a device.
    if (!AIBinder_isAlive(binder.get())) return ::ndk::ScopedAStatus::fromStatus(STATUS_DEAD_OBJECT);
    auto object = std::static_pointer_cast<INTERFACE>(::ndk::ICInterface::asInterface(binder.get()));
    if (object == nullptr) return ::ndk::ScopedAStatus::fromStatus(STATUS_FAILED_TRANSACTION);
    return call(*object);
}

}  // namespace binder_host
