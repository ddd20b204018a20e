// Host service manager's state, shared by its API 29 calls, its API 31 calls
// and the death of a service. Any thread, under the registry's lock.
#pragma once

#include <condition_variable>
#include <map>
#include <mutex>
#include <set>
#include <string>

#include <android/binder_ibinder.h>

namespace binder_host {

struct Registry {
    std::mutex lock;
    std::condition_variable changed;  // a registration came or went, or a declaration changed
    std::map<std::string, AIBinder*> services;  // each holds a strong reference
    std::set<std::string> declared;
    // Names served on demand: a lookup that finds nothing registered makes a new service.
    std::map<std::string, AIBinder* (*)()> makers;
};

Registry& registry();

// A strong reference the caller owns to what is registered under the name, or null. Under the lock.
AIBinder* lookUpLocked(Registry& r, const std::string& instance);

// A new service from the name's maker (a strong reference the caller owns), or null. Not under the lock.
AIBinder* makeService(const std::string& instance);

// Drops every registration of the binder, as servicemanager does when a service's process dies.
void forgetService(AIBinder* binder);

}  // namespace binder_host
