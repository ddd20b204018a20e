// Host service manager: the calls API 31 added, in a library of their own; a
// process without it plays an older device. Any thread; waitForService blocks its caller.
#include <mutex>
#include <string>

#include <android/binder_manager.h>

#include "service_registry.h"

AIBinder* AServiceManager_waitForService(const char* instance) {
    if (instance == nullptr) return nullptr;
    binder_host::Registry& r = binder_host::registry();
    const std::string name(instance);
    {
        std::lock_guard<std::mutex> guard(r.lock);
        AIBinder* found = binder_host::lookUpLocked(r, name);
        if (found != nullptr) return found;
    }
    AIBinder* made = binder_host::makeService(name);
    if (made != nullptr) return made;
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
