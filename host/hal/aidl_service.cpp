// The host's AIDL Bluetooth HAL: android.hardware.bluetooth.IBluetoothHci/default,
// declared and started on first lookup when HALVENOR_HAL is aidl, over the
// controller HALVENOR_HCI names. Like a phone's HAL process it stays up,
// registered, until its controller goes away; and like the platform's default
// service it answers a second initialize with close() and ALREADY_INITIALIZED.
// HALVENOR_AIDL_HELD=1 starts it held by another client, as a phone's HAL is
// while the phone's own Bluetooth is on. Calls come on the library's threads,
// callbacks on the controller's.
#include <stdlib.h>
#include <string.h>

#include <atomic>
#include <memory>
#include <mutex>
#include <string>
#include <vector>

#include <aidl/android/hardware/bluetooth/BnBluetoothHci.h>
#include <android/binder_host.h>
#include <android/binder_manager.h>

#include "host/hal/host_controller.h"
#include "host/hal/host_log.h"
#include "transport/h4_frame.h"

using aidl::android::hardware::bluetooth::BnBluetoothHci;
using aidl::android::hardware::bluetooth::IBluetoothHci;
using aidl::android::hardware::bluetooth::IBluetoothHciCallbacks;
using aidl::android::hardware::bluetooth::Status;
using ndk::ScopedAStatus;

namespace {

class AidlHostHci;

// Passes the controller's answers on to the library's callback object.
class AidlClient final : public ControllerClient {
  public:
    AidlClient(std::shared_ptr<IBluetoothHciCallbacks> callbacks, AidlHostHci* service)
        : callbacks_(std::move(callbacks)), service_(service) {}
    void initialized(bool ok) override {
        callbacks_->initializationComplete(ok ? Status::SUCCESS : Status::UNABLE_TO_OPEN_INTERFACE);
    }
    void received(uint8_t type, const uint8_t* packet, size_t len) override {
        std::vector<uint8_t> bytes(packet, packet + len);
        ScopedAStatus delivered = type == H4_TYPE_EVENT ? callbacks_->hciEventReceived(bytes)
                                  : type == H4_TYPE_ACL ? callbacks_->aclDataReceived(bytes)
                                  : type == H4_TYPE_SCO ? callbacks_->scoDataReceived(bytes)
                                                        : callbacks_->isoDataReceived(bytes);
        (void)delivered;  // a client gone away is the client's matter
    }
    void gone() override;

  private:
    std::shared_ptr<IBluetoothHciCallbacks> callbacks_;
    AidlHostHci* service_;  // outlives the client: it stops the controller before it goes
};

// A HAL whose controller is gone dies, as a device's HAL process does: its
// clients are told, and every later call fails with a dead object.
class AidlHostHci final : public BnBluetoothHci {
  public:
    AidlHostHci(std::unique_ptr<HostController> controller, bool held)
        : controller_(std::move(controller)), initialized_(held) {}
    ~AidlHostHci() override { controller_->stop(); }

    ScopedAStatus initialize(const std::shared_ptr<IBluetoothHciCallbacks>& callback) override {
        if (initialized_.exchange(true)) {
            close();
            callback->initializationComplete(Status::ALREADY_INITIALIZED);
            return ScopedAStatus::ok();
        }
        controller_->start(std::make_shared<AidlClient>(callback, this));
        return ScopedAStatus::ok();
    }
    ScopedAStatus close() override {
        controller_->stop();
        initialized_ = false;
        return ScopedAStatus::ok();
    }
    ScopedAStatus sendHciCommand(const std::vector<uint8_t>& p) override { return send(H4_TYPE_COMMAND, p); }
    ScopedAStatus sendAclData(const std::vector<uint8_t>& p) override { return send(H4_TYPE_ACL, p); }
    ScopedAStatus sendScoData(const std::vector<uint8_t>& p) override { return send(H4_TYPE_SCO, p); }
    ScopedAStatus sendIsoData(const std::vector<uint8_t>& p) override { return send(H4_TYPE_ISO, p); }

    void die() {
        if (!died_.exchange(true)) ndk::host::killService(asBinder().get());
    }

  private:
    ScopedAStatus send(uint8_t type, const std::vector<uint8_t>& packet) {
        if (controller_->send(type, packet.data(), packet.size())) return ScopedAStatus::ok();
        die();
        return ScopedAStatus::fromStatus(STATUS_DEAD_OBJECT);
    }

    std::unique_ptr<HostController> controller_;
    std::atomic<bool> initialized_{false};
    std::atomic<bool> died_{false};
};

void AidlClient::gone() { service_->die(); }

const char* instance() {
    static const std::string name = std::string(IBluetoothHci::descriptor) + "/default";
    return name.c_str();
}

// Started by the first lookup, and again by the first after it died.
AIBinder* start_service() {
    std::unique_ptr<HostController> controller = controller_from_environment();
    if (controller == nullptr) return nullptr;
    const char* held = getenv("HALVENOR_AIDL_HELD");
    bool in_use = held != nullptr && strcmp(held, "1") == 0;
    ndk::SpAIBinder binder = ndk::SharedRefBase::make<AidlHostHci>(std::move(controller), in_use)->asBinder();
    if (AServiceManager_addService(binder.get(), instance()) != EX_NONE) {
        HLOGE("aidl: %s could not be registered", instance());
    }
    return binder.release();
}

// Read when the host HAL is loaded, before the library can ask whether the
// AIDL HAL is declared: the console's launcher sets HALVENOR_HAL first.
__attribute__((constructor)) void declare_from_environment() {
    const char* hal = getenv("HALVENOR_HAL");
    const char* hci = getenv("HALVENOR_HCI");
    if (hal == nullptr || strcmp(hal, "aidl") != 0) return;
    if (hci != nullptr && strcmp(hci, "none") == 0) return;  // a device without a Bluetooth HAL
    ndk::host::setDeclared(instance(), true);
    ndk::host::setServiceMaker(instance(), start_service);
}

}  // namespace
