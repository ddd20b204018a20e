// Host service manager: the calls every API level has, and the host's hooks
// for stopping a service and for its manifest. Any thread.
#include <string>
#include <vector>

#include <android/binder_host.h>
#include <android/binder_manager.h>

#include "service_registry.h"

namespace binder_host {

Registry& registry() {
    // Never destroyed: a service may be looked up from another static's destructor.
    static Registry* r = new Registry();
    return *r;
}

AIBinder* lookUpLocked(Registry& r, const std::string& instance) {
    auto it = r.services.find(instance);
    if (it == r.services.end()) return nullptr;
    AIBinder_incStrong(it->second);
    return it->second;
}

AIBinder* makeService(const std::string& instance) {
    AIBinder* (*make)() = nullptr;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        auto it = r.makers.find(instance);
        if (it != r.makers.end()) make = it->second;
    }
    return make != nullptr ? make() : nullptr;
}

void forgetService(AIBinder* binder) {
    std::vector<AIBinder*> dropped;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        for (auto it = r.services.begin(); it != r.services.end();) {
            if (it->second != binder) {
                ++it;
                continue;
            }
            dropped.push_back(it->second);
            it = r.services.erase(it);
        }
    }
    registry().changed.notify_all();
    // Outside the lock: the last reference may destroy an object whose destructor looks services up.
    for (AIBinder* b : dropped) AIBinder_decStrong(b);
}

}  // namespace binder_host

using binder_host::Registry;
using binder_host::registry;

binder_exception_t AServiceManager_addService(AIBinder* binder, const char* instance) {
    if (binder == nullptr || instance == nullptr || *instance == '\0') return EX_ILLEGAL_ARGUMENT;
    // A dead process registers nothing.
    if (!AIBinder_isAlive(binder)) return EX_TRANSACTION_FAILED;
    AIBinder_incStrong(binder);
    AIBinder* replaced = nullptr;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        AIBinder*& slot = r.services[instance];
        replaced = slot;
        slot = binder;
    }
    registry().changed.notify_all();
    AIBinder_decStrong(replaced);
    return EX_NONE;
}

AIBinder* AServiceManager_checkService(const char* instance) {
    if (instance == nullptr) return nullptr;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        AIBinder* found = binder_host::lookUpLocked(r, instance);
        if (found != nullptr) return found;
    }
    return binder_host::makeService(instance);
}

AIBinder* AServiceManager_getService(const char* instance) { return AServiceManager_checkService(instance); }

namespace ndk {
namespace host {

bool removeService(const char* instance) {
    if (instance == nullptr) return false;
    AIBinder* removed = nullptr;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        auto it = r.services.find(instance);
        if (it == r.services.end()) return false;
        removed = it->second;
        r.services.erase(it);
    }
    registry().changed.notify_all();
    AIBinder_decStrong(removed);
    return true;
}

void setServiceMaker(const char* instance, AIBinder* (*make)()) {
    if (instance == nullptr) return;
    Registry& r = registry();
    std::lock_guard<std::mutex> guard(r.lock);
    if (make != nullptr) {
        r.makers[instance] = make;
    } else {
        r.makers.erase(instance);
    }
}

void setDeclared(const char* instance, bool declared) {
    if (instance == nullptr) return;
    {
        Registry& r = registry();
        std::lock_guard<std::mutex> guard(r.lock);
        if (declared) {
            r.declared.insert(instance);
        } else {
            r.declared.erase(instance);
        }
    }
    // A wait for a name no longer declared ends, empty-handed.
    registry().changed.notify_all();
}

}  // namespace host
}  // namespace ndk
