// Host stand-in for the NDK binder object: reference counted, with death
// notices. Every binder here plays an object in another process. Any thread.
#pragma once

#include <stdint.h>

#include <android/binder_status.h>

#ifdef __cplusplus
extern "C" {
#endif

typedef uint32_t transaction_code_t;
#define FIRST_CALL_TRANSACTION 0x00000001
#define LAST_CALL_TRANSACTION 0x00ffffff

struct AIBinder;
typedef struct AIBinder AIBinder;
struct AIBinder_Weak;
typedef struct AIBinder_Weak AIBinder_Weak;
struct AIBinder_Class;
typedef struct AIBinder_Class AIBinder_Class;
struct AIBinder_DeathRecipient;
typedef struct AIBinder_DeathRecipient AIBinder_DeathRecipient;
struct AParcel;
typedef struct AParcel AParcel;

typedef void* (*AIBinder_Class_onCreate)(void* args);
typedef void (*AIBinder_Class_onDestroy)(void* userData);
typedef binder_status_t (*AIBinder_Class_onTransact)(AIBinder* binder, transaction_code_t code,
                                                     const AParcel* in, AParcel* out);
typedef void (*AIBinder_DeathRecipient_onBinderDied)(void* cookie);

// Lives as long as the process. On a host no call is marshalled, so onTransact is never called.
AIBinder_Class* AIBinder_Class_define(const char* interfaceDescriptor, AIBinder_Class_onCreate onCreate,
                                      AIBinder_Class_onDestroy onDestroy, AIBinder_Class_onTransact onTransact);
// A new binder with one strong reference, owned by the caller; its user data is onCreate(args).
AIBinder* AIBinder_new(const AIBinder_Class* clazz, void* args);
// True when the binder is of clazz's interface, compared by descriptor.
bool AIBinder_associateClass(AIBinder* binder, const AIBinder_Class* clazz);
const AIBinder_Class* AIBinder_getClass(AIBinder* binder);
void* AIBinder_getUserData(AIBinder* binder);

bool AIBinder_isAlive(const AIBinder* binder);
// STATUS_DEAD_OBJECT once the binder's process died.
binder_status_t AIBinder_ping(AIBinder* binder);

void AIBinder_incStrong(AIBinder* binder);
void AIBinder_decStrong(AIBinder* binder);

AIBinder_Weak* AIBinder_Weak_new(AIBinder* binder);
void AIBinder_Weak_delete(AIBinder_Weak* weakBinder);
// A strong reference the caller owns, or null once the last strong one went.
AIBinder* AIBinder_Weak_promote(AIBinder_Weak* weakBinder);

AIBinder_DeathRecipient* AIBinder_DeathRecipient_new(AIBinder_DeathRecipient_onBinderDied onBinderDied);
// A deleted recipient is told of no later death.
void AIBinder_DeathRecipient_delete(AIBinder_DeathRecipient* recipient);
// Each link is told once, with its cookie, when the binder's process dies.
// STATUS_DEAD_OBJECT when it is dead already.
binder_status_t AIBinder_linkToDeath(AIBinder* binder, AIBinder_DeathRecipient* recipient, void* cookie);
// Removes one link of that recipient and cookie: STATUS_NAME_NOT_FOUND when there is none,
// STATUS_DEAD_OBJECT once the binder died.
binder_status_t AIBinder_unlinkToDeath(AIBinder* binder, AIBinder_DeathRecipient* recipient, void* cookie);

#ifdef __cplusplus
}
#endif
