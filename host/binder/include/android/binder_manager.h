// Host stand-in for the NDK service manager: services registered by name in
// this process, as servicemanager keeps them on a device. Any thread.
#pragma once

#include <android/binder_ibinder.h>
#include <android/binder_status.h>

#ifdef __cplusplus
extern "C" {
#endif

// Takes a strong reference of its own; a later registration under the name replaces it.
binder_exception_t AServiceManager_addService(AIBinder* binder, const char* instance);
// Each lookup returns a strong reference the caller owns, or null when nothing is registered.
AIBinder* AServiceManager_checkService(const char* instance);
// A device waits a few seconds for a service that is not there yet; a host answers at once.
AIBinder* AServiceManager_getService(const char* instance);

// API 31. Resolve these at run time: binder_host_api29 plays an older device without them.
// Waits while the name is declared and nothing is registered under it; null at once for a
// name that is neither, which a device would wait for without end.
AIBinder* AServiceManager_waitForService(const char* instance);
// Whether the device's manifest declares the name: on a host, what ndk::host::setDeclared set.
bool AServiceManager_isDeclared(const char* instance);

#ifdef __cplusplus
}
#endif
