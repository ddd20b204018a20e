// Host only: what a device's processes and manifest do to the service manager,
// for tests and host services to play. Any thread.
#pragma once

#include <android/binder_ibinder.h>

namespace ndk {
namespace host {

// Drops the registration under the name, as when a service is stopped. False when there was none.
bool removeService(const char* instance);

// Serves the name on demand, as a lazy HAL starts when first looked up: a
// lookup that finds nothing registered gets a new service from make (a strong
// reference it owns). Null stops it.
void setServiceMaker(const char* instance, AIBinder* (*make)());

// Declares the name in the host's manifest, or takes it out: what AServiceManager_isDeclared answers.
void setDeclared(const char* instance, bool declared);

// The process behind the binder has died. On the calling thread, once: its registrations are
// dropped, then every linked death recipient is told with its cookie. From then on every
// transaction on the binder fails with STATUS_DEAD_OBJECT.
void killService(AIBinder* binder);

}  // namespace host
}  // namespace ndk
