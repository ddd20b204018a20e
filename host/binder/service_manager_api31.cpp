// Host service manager: the calls API 31 added. Left out of binder_host_api29,
// which plays an older device. Any thread; waitForService blocks its caller.
#include <mutex>
#include <string>

#include <android/binder_manager.h>

#include "service_registry.h"

AIBinder* AServiceManager_waitForService(const char* instance) {
    if (instance == nullptr) return nullptr;
    binder_host::Registry& r = binder_host::registry();
    const std::string name(instance);
    std::unique_lock<std::mutex> guard(r.lock);
    r.changed.wait(guard, [&] { return r.services.count(name) != 0 || r.declared.count(name) == 0; });
    return binder_host::lookUpLocked(r, name);
}

bool AServiceManager_isDeclared(const char* instance) {
    if (instance == nullptr) return false;
    binder_host::Registry& r = binder_host::registry();
    std::lock_guard<std::mutex> guard(r.lock);
    return r.declared.count(instance) != 0;
}
