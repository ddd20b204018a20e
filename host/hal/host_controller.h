// A controller behind a host HAL service, whichever interface serves it (HIDL
// or AIDL): a session started with a client that hears the controller's
// answers, packets sent to it, and a stop. A controller that goes away tells
// its client, whose service then dies, as a phone's HAL process does. Any
// thread may send; the client is called on the controller's own thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <memory>
#include <string>

// What a controller reports to the service that serves it.
class ControllerClient {
  public:
    virtual ~ControllerClient() = default;
    // Once per start: whether the controller can be reached.
    virtual void initialized(bool ok) = 0;
    // One packet from the controller: events, ACL, SCO or ISO data.
    virtual void received(uint8_t type, const uint8_t* packet, size_t len) = 0;
    // The controller went away: nothing more will reach it.
    virtual void gone() = 0;
};

class HostController {
  public:
    virtual ~HostController() = default;
    // Begins a session (ending one that runs); the client hears initialized() once.
    virtual void start(std::shared_ptr<ControllerClient> client) = 0;
    // One packet from the library with its H4 type; false once the controller is gone.
    virtual bool send(uint8_t type, const uint8_t* packet, size_t len) = 0;
    // Ends the session, if one runs; called again freely.
    virtual void stop() = 0;
};

// The controller HALVENOR_HCI names (sim, unix:, tcp:, tty:), or null for
// "none": a device without a Bluetooth HAL. A value that cannot be used gives
// a controller whose every start fails, after one log line naming it.
std::unique_ptr<HostController> controller_from_environment();
