// What every IBluetoothHci service of the host shares: each packet the library
// sends reaches one hook with its H4 type, and close ends the session through
// the service's own stop. Runs on the library's calling thread.
#pragma once

#include <atomic>
#include <cstdint>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "host/hal/h4_stream.h"

// The HIDL names the service sources of this layer spell; only their .cpp
// files include this header.
using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::IBluetoothHci;
using android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
using android::hardware::bluetooth::V1_0::Status;

class HostHci : public IBluetoothHci {
  public:
    Return<void> sendHciCommand(const hidl_vec<uint8_t>& p) final { return send(H4_TYPE_COMMAND, p); }
    Return<void> sendAclData(const hidl_vec<uint8_t>& p) final { return send(H4_TYPE_ACL, p); }
    Return<void> sendScoData(const hidl_vec<uint8_t>& p) final { return send(H4_TYPE_SCO, p); }
    Return<void> close() final {
        stop();
        if (died_.load()) return deadObject();
        return Void();
    }

  protected:
    // A HAL whose controller is gone dies, as a device's HAL process does:
    // its clients are told, and every later call fails.
    void die() {
        if (!died_.exchange(true)) notifyServiceDied();
    }
    bool hasDied() const { return died_.load(); }
    static android::hardware::Status deadObject() {
        return android::hardware::Status::fromExceptionCode(android::hardware::Status::EX_TRANSACTION_FAILED);
    }

    // One packet from the library; `type` is its H4 packet type.
    virtual Return<void> send(uint8_t type, const hidl_vec<uint8_t>& packet) = 0;
    // Ends the session, if one runs; a service calls it again freely.
    virtual void stop() = 0;

  private:
    std::atomic<bool> died_{false};
};
