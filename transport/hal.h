// The Bluetooth HAL a session reaches the controller through: the HIDL HAL
// (android.hardware.bluetooth@1.0) or the AIDL HAL (android.hardware.bluetooth
// V1, phones launched on Android 15 and later). Each adapter finds its
// service, initialises it with callbacks of its own, sends packets and closes
// it; the session drives it on the opening and closing thread, the pump sends
// through it, and its callbacks call back into the session on HAL threads.
#pragma once

#include <cstddef>
#include <cstdint>

// What became of a packet handed to the HAL.
enum HalSend {
    HAL_SENT,
    HAL_REFUSED,  // the call failed, logged; the service may still take the next packet
    HAL_DEAD,     // the service is gone or failed for good, logged: nothing more can reach it
};

struct HalAdapter {
    // The session's lines, with the opening function's name, when the
    // service's initialisation failed and when it succeeded.
    const char* failed_line;
    const char* ready_line;
    // Finds the service and links a death notice naming the session by
    // `cookie`; false (logged) when there is none or it died already. Every
    // line of the HIDL adapter is the one the library always logged.
    bool (*open)(uint64_t cookie);
    // Hands the service a new callback object, announced to the session
    // first with session_expect_initialized(). False (logged) when the call
    // itself failed; the answer comes through session_initialized().
    bool (*initialize)();
    HalSend (*send)(uint8_t type, const uint8_t* packet, size_t len);
    // Whether the service takes packets of this H4 type from the library.
    bool (*takes)(uint8_t type);
    // Closes the service and releases it; a failed close is logged with
    // `caller`, when given. A service that answered it is held by another
    // client is never closed: that would take the HAL from a running
    // Bluetooth stack.
    void (*release)(const char* caller);
};

extern const HalAdapter hidl_hal;
extern const HalAdapter aidl_hal;

// Whether the platform declares the AIDL HAL: the platform's own Bluetooth
// stack chooses so. False where the service manager cannot say (before API
// 31), so the HIDL HAL is used there.
bool aidl_hal_declared();

// What adapters call, from any thread.
//
// The next answer to initialize comes to the callback object `waiter`: it may
// come before initialize returns, on the calling thread.
void session_expect_initialized(const void* waiter);
// The initialisation that `waiter` answers has ended, successfully or not.
void session_initialized(const void* waiter, bool ok);
// The HAL whose death notice names `cookie` has died.
void session_hal_died(uint64_t cookie);
// One packet from the HAL for the engine, written to the bridge end with its
// H4 type; `callback` names the callback in a failed write's line.
void session_deliver(uint8_t type, const uint8_t* packet, size_t len, const char* callback);
