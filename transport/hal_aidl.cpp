// The AIDL Bluetooth HAL (android.hardware.bluetooth V1, instance "default"),
// through the NDK binder: the service, the callback object handed to it and
// its death notice. Opening and closing run on the calling Java thread, sends
// on the pump thread, callbacks on binder threads.
#include <dlfcn.h>

#include <atomic>
#include <memory>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/BnBluetoothHciCallbacks.h>
#include <aidl/android/hardware/bluetooth/IBluetoothHci.h>
#include <android/binder_manager.h>

#include "transport/h4.h"
#include "transport/hal.h"
#include "transport/log.h"

using aidl::android::hardware::bluetooth::BnBluetoothHciCallbacks;
using aidl::android::hardware::bluetooth::IBluetoothHci;
using aidl::android::hardware::bluetooth::Status;
using ndk::ScopedAStatus;

namespace {

const std::string& instance() {
    static const std::string name = std::string(IBluetoothHci::descriptor) + "/default";
    return name;
}

// The service of the current session; the pump uses it only while the session
// is open, and every session change joins the pump first.
std::shared_ptr<IBluetoothHci> service;
ndk::ScopedAIBinder_DeathRecipient death;
void* death_cookie = nullptr;  // the link's cookie, which its unlink must name again
// The last answer said another client holds the HAL: it must not be closed.
std::atomic<bool> in_use{false};

const char* describe(Status status) {
    switch (status) {
        case Status::ALREADY_INITIALIZED:
            return "ALREADY_INITIALIZED: the HAL is in use, usually by the phone's own Bluetooth: turn "
                   "Bluetooth off and try again";
        case Status::UNABLE_TO_OPEN_INTERFACE:
            return "UNABLE_TO_OPEN_INTERFACE: the HAL cannot open its interface to the controller";
        case Status::HARDWARE_INITIALIZATION_ERROR:
            return "HARDWARE_INITIALIZATION_ERROR: the controller failed to initialize";
        default:
            return "UNKNOWN";
    }
}

class AidlCallbacks : public BnBluetoothHciCallbacks {
  public:
    ScopedAStatus initializationComplete(Status status) override {
        bool ok = status == Status::SUCCESS;
        if (!ok) {
            LOGE("%s: the AIDL HAL failed to initialize: %s", "initializationComplete", describe(status));
            in_use = status == Status::ALREADY_INITIALIZED;
        }
        session_initialized(this, ok);
        return ScopedAStatus::ok();
    }
    ScopedAStatus hciEventReceived(const std::vector<uint8_t>& event) override {
        return deliver(H4_TYPE_EVENT, event, "hciEventReceived");
    }
    ScopedAStatus aclDataReceived(const std::vector<uint8_t>& data) override {
        return deliver(H4_TYPE_ACL, data, "aclDataReceived");
    }
    ScopedAStatus scoDataReceived(const std::vector<uint8_t>& data) override {
        return deliver(H4_TYPE_SCO, data, "scoDataReceived");
    }
    ScopedAStatus isoDataReceived(const std::vector<uint8_t>& data) override {
        return deliver(H4_TYPE_ISO, data, "isoDataReceived");
    }

  private:
    static ScopedAStatus deliver(uint8_t type, const std::vector<uint8_t>& packet, const char* callback) {
        session_deliver(type, packet.data(), packet.size(), callback);
        return ScopedAStatus::ok();
    }
};

void service_died(void* cookie) { session_hal_died(reinterpret_cast<uintptr_t>(cookie)); }

bool open_aidl(uint64_t cookie) {
    LOGI("%s: the AIDL Bluetooth HAL is declared: using it", "hidl_client_initialize");
    in_use = false;
    ndk::SpAIBinder binder(AServiceManager_getService(instance().c_str()));
    service = IBluetoothHci::fromBinder(binder);
    if (service == nullptr) {
        LOGE("%s: the AIDL Bluetooth HAL %s is declared but not running", "hidl_client_initialize",
             instance().c_str());
        return false;
    }
    if (death.get() == nullptr) death = ndk::ScopedAIBinder_DeathRecipient(AIBinder_DeathRecipient_new(service_died));
    death_cookie = reinterpret_cast<void*>(static_cast<uintptr_t>(cookie));
    binder_status_t linked = AIBinder_linkToDeath(service->asBinder().get(), death.get(), death_cookie);
    if (linked != STATUS_OK) {
        LOGE("%s: the AIDL HAL died before initialize: status %d", "hidl_client_initialize", linked);
        service.reset();
        return false;
    }
    return true;
}

bool initialize_aidl() {
    std::shared_ptr<AidlCallbacks> callbacks = ndk::SharedRefBase::make<AidlCallbacks>();
    session_expect_initialized(callbacks.get());
    ScopedAStatus started = service->initialize(callbacks);
    if (started.isOk()) return true;
    LOGE("%s: AIDL initialize failed: %s", "hidl_client_initialize", started.getDescription().c_str());
    return false;
}

// Any failed send ends the bridge: the waiting exchange then fails at once
// with this line's cause instead of waiting out its time-out.
HalSend send_aidl(uint8_t type, const uint8_t* packet, size_t len) {
    std::vector<uint8_t> data(packet, packet + len);
    ScopedAStatus sent = type == H4_TYPE_COMMAND ? service->sendHciCommand(data)
                         : type == H4_TYPE_ACL   ? service->sendAclData(data)
                         : type == H4_TYPE_SCO   ? service->sendScoData(data)
                                                 : service->sendIsoData(data);
    if (sent.isOk()) return HAL_SENT;
    LOGE("%s: the AIDL HAL refused packet type %d: %s", "process_tool_data", type, sent.getDescription().c_str());
    return HAL_DEAD;
}

bool takes_aidl(uint8_t type) { return (type >= H4_TYPE_COMMAND && type <= H4_TYPE_SCO) || type == H4_TYPE_ISO; }

void release_aidl(const char* caller) {
    if (service == nullptr) return;
    AIBinder_unlinkToDeath(service->asBinder().get(), death.get(), death_cookie);
    if (!in_use) {
        ScopedAStatus closed = service->close();
        if (!closed.isOk() && caller != nullptr) {
            LOGI("%s: the AIDL HAL's close failed: %s", caller, closed.getDescription().c_str());
        }
    }
    service.reset();
}

}  // namespace

// The service manager of API 31 says whether the HAL is declared; an older
// one lacks the call, which is looked up at run time so that one library
// loads on every release.
bool aidl_hal_declared() {
    using IsDeclared = bool (*)(const char*);
    static const IsDeclared is_declared =
            reinterpret_cast<IsDeclared>(dlsym(RTLD_DEFAULT, "AServiceManager_isDeclared"));
    return is_declared != nullptr && is_declared(instance().c_str());
}

const HalAdapter aidl_hal = {
        "%s: the AIDL HAL failed to initialize, sending invalid FD to tool",
        "%s: AIDL = true",
        open_aidl,
        initialize_aidl,
        send_aidl,
        takes_aidl,
        release_aidl,
};
