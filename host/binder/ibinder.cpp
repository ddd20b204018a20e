// Host stand-in for the NDK binder object: reference counts, the class a local
// object's binder is made with, and death notices. Any thread.
#include <algorithm>
#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <android/binder_host.h>
#include <android/binder_ibinder.h>

#include "service_registry.h"

struct AIBinder_Class {
    std::string descriptor;
    AIBinder_Class_onCreate onCreate;
    AIBinder_Class_onDestroy onDestroy;
    AIBinder_Class_onTransact onTransact;
};

// Links hold the recipient weakly: once deleted, it hears of no death.
struct AIBinder_DeathRecipient {
    struct Callback {
        AIBinder_DeathRecipient_onBinderDied onBinderDied;
    };
    std::shared_ptr<Callback> callback;
};

namespace {

struct DeathLink {
    std::weak_ptr<AIBinder_DeathRecipient::Callback> recipient;
    void* cookie;
};

}  // namespace

struct AIBinder {
    const AIBinder_Class* clazz;
    void* userData;
    // The memory goes with the last weak reference; the strong ones hold one weak between them.
    std::atomic<int32_t> strong{1};
    std::atomic<int32_t> weak{1};
    mutable std::mutex lock;
    bool dead = false;
    std::vector<DeathLink> links;
};

struct AIBinder_Weak {
    AIBinder* binder;
};

namespace {

void decWeak(AIBinder* binder) {
    if (binder->weak.fetch_sub(1, std::memory_order_acq_rel) == 1) delete binder;
}

bool sameRecipient(const DeathLink& link, const AIBinder_DeathRecipient* recipient, void* cookie) {
    return link.cookie == cookie && link.recipient.lock() == recipient->callback;
}

}  // namespace

AIBinder_Class* AIBinder_Class_define(const char* interfaceDescriptor, AIBinder_Class_onCreate onCreate,
                                      AIBinder_Class_onDestroy onDestroy, AIBinder_Class_onTransact onTransact) {
    if (interfaceDescriptor == nullptr) return nullptr;
    return new AIBinder_Class{interfaceDescriptor, onCreate, onDestroy, onTransact};
}

AIBinder* AIBinder_new(const AIBinder_Class* clazz, void* args) {
    if (clazz == nullptr) return nullptr;
    AIBinder* binder = new AIBinder;
    binder->clazz = clazz;
    binder->userData = clazz->onCreate != nullptr ? clazz->onCreate(args) : args;
    return binder;
}

bool AIBinder_associateClass(AIBinder* binder, const AIBinder_Class* clazz) {
    return binder != nullptr && clazz != nullptr && binder->clazz->descriptor == clazz->descriptor;
}

const AIBinder_Class* AIBinder_getClass(AIBinder* binder) { return binder != nullptr ? binder->clazz : nullptr; }

void* AIBinder_getUserData(AIBinder* binder) { return binder != nullptr ? binder->userData : nullptr; }

bool AIBinder_isAlive(const AIBinder* binder) {
    if (binder == nullptr) return false;
    std::lock_guard<std::mutex> guard(binder->lock);
    return !binder->dead;
}

binder_status_t AIBinder_ping(AIBinder* binder) {
    if (binder == nullptr) return STATUS_UNEXPECTED_NULL;
    return AIBinder_isAlive(binder) ? STATUS_OK : STATUS_DEAD_OBJECT;
}

void AIBinder_incStrong(AIBinder* binder) {
    if (binder != nullptr) binder->strong.fetch_add(1, std::memory_order_relaxed);
}

void AIBinder_decStrong(AIBinder* binder) {
    if (binder == nullptr || binder->strong.fetch_sub(1, std::memory_order_acq_rel) != 1) return;
    // Before the memory goes: the object's destructor may drop a weak reference to this binder.
    if (binder->clazz->onDestroy != nullptr) binder->clazz->onDestroy(binder->userData);
    decWeak(binder);
}

AIBinder_Weak* AIBinder_Weak_new(AIBinder* binder) {
    if (binder == nullptr) return nullptr;
    binder->weak.fetch_add(1, std::memory_order_relaxed);
    return new AIBinder_Weak{binder};
}

void AIBinder_Weak_delete(AIBinder_Weak* weakBinder) {
    if (weakBinder == nullptr) return;
    decWeak(weakBinder->binder);
    delete weakBinder;
}

AIBinder* AIBinder_Weak_promote(AIBinder_Weak* weakBinder) {
    if (weakBinder == nullptr) return nullptr;
    AIBinder* binder = weakBinder->binder;
    // Never from zero: the object behind a binder whose last strong reference went is going or gone.
    int32_t strong = binder->strong.load(std::memory_order_relaxed);
    while (strong > 0) {
        if (binder->strong.compare_exchange_weak(strong, strong + 1, std::memory_order_acquire)) return binder;
    }
    return nullptr;
}

AIBinder_DeathRecipient* AIBinder_DeathRecipient_new(AIBinder_DeathRecipient_onBinderDied onBinderDied) {
    if (onBinderDied == nullptr) return nullptr;
    return new AIBinder_DeathRecipient{std::make_shared<AIBinder_DeathRecipient::Callback>(
            AIBinder_DeathRecipient::Callback{onBinderDied})};
}

void AIBinder_DeathRecipient_delete(AIBinder_DeathRecipient* recipient) { delete recipient; }

binder_status_t AIBinder_linkToDeath(AIBinder* binder, AIBinder_DeathRecipient* recipient, void* cookie) {
    if (binder == nullptr || recipient == nullptr) return STATUS_UNEXPECTED_NULL;
    std::lock_guard<std::mutex> guard(binder->lock);
    if (binder->dead) return STATUS_DEAD_OBJECT;
    auto& links = binder->links;
    links.erase(std::remove_if(links.begin(), links.end(),
                               [](const DeathLink& link) { return link.recipient.expired(); }),
                links.end());
    links.push_back({recipient->callback, cookie});
    return STATUS_OK;
}

binder_status_t AIBinder_unlinkToDeath(AIBinder* binder, AIBinder_DeathRecipient* recipient, void* cookie) {
    if (binder == nullptr || recipient == nullptr) return STATUS_UNEXPECTED_NULL;
    std::lock_guard<std::mutex> guard(binder->lock);
    if (binder->dead) return STATUS_DEAD_OBJECT;
    auto& links = binder->links;
    auto it = std::find_if(links.begin(), links.end(),
                           [&](const DeathLink& link) { return sameRecipient(link, recipient, cookie); });
    if (it == links.end()) return STATUS_NAME_NOT_FOUND;
    links.erase(it);
    return STATUS_OK;
}

namespace ndk {
namespace host {

void killService(AIBinder* binder) {
    if (binder == nullptr) return;
    std::vector<DeathLink> links;
    {
        std::lock_guard<std::mutex> guard(binder->lock);
        if (binder->dead) return;
        binder->dead = true;
        links.swap(binder->links);
    }
    // Held until the recipients are told: the registrations and the recipients may drop the last others.
    AIBinder_incStrong(binder);
    // First the registrations, so a recipient that looks the service up again finds it gone.
    binder_host::forgetService(binder);
    // Outside the lock: a recipient may unlink, or look the binder's state up.
    for (const DeathLink& link : links) {
        std::shared_ptr<AIBinder_DeathRecipient::Callback> recipient = link.recipient.lock();
        if (recipient != nullptr) recipient->onBinderDied(link.cookie);
    }
    AIBinder_decStrong(binder);
}

}  // namespace host
}  // namespace ndk
