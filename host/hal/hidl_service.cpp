// The host's HIDL Bluetooth HAL: IBluetoothHci "default" serving the
// controller HALVENOR_HCI names, as getService hands it out when no service is
// registered under the name. Calls come on the library's threads, callbacks
// on the controller's.
#include <atomic>

#include <hidl/HostServices.h>

#include "host/hal/host_controller.h"
#include "host/hal/host_log.h"
#include "transport/h4_frame.h"

using android::sp;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hardware::bluetooth::V1_0::IBluetoothHci;
using android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
using android::hardware::bluetooth::V1_0::Status;

namespace {

class HidlHostHci;

// Passes the controller's answers on to the library's callback object.
class HidlClient final : public ControllerClient {
  public:
    HidlClient(sp<IBluetoothHciCallbacks> callbacks, HidlHostHci* service)
        : callbacks_(std::move(callbacks)), service_(service) {}
    void initialized(bool ok) override {
        callbacks_->initializationComplete(ok ? Status::SUCCESS : Status::INITIALIZATION_ERROR);
    }
    void received(uint8_t type, const uint8_t* packet, size_t len) override;
    void gone() override;

  private:
    sp<IBluetoothHciCallbacks> callbacks_;
    HidlHostHci* service_;  // outlives the client: it stops the controller before it goes
};

// A HAL whose controller is gone dies, as a device's HAL process does: its
// clients are told, and every later call fails.
class HidlHostHci final : public IBluetoothHci {
  public:
    explicit HidlHostHci(std::unique_ptr<HostController> controller) : controller_(std::move(controller)) {}
    ~HidlHostHci() override { controller_->stop(); }

    Return<void> initialize(const sp<IBluetoothHciCallbacks>& callback) override {
        controller_->start(std::make_shared<HidlClient>(callback, this));
        return Void();
    }
    Return<void> sendHciCommand(const hidl_vec<uint8_t>& p) override { return send(H4_TYPE_COMMAND, p); }
    Return<void> sendAclData(const hidl_vec<uint8_t>& p) override { return send(H4_TYPE_ACL, p); }
    Return<void> sendScoData(const hidl_vec<uint8_t>& p) override { return send(H4_TYPE_SCO, p); }
    Return<void> close() override {
        controller_->stop();
        if (died_.load()) return deadObject();
        return Void();
    }

    void die() {
        if (!died_.exchange(true)) notifyServiceDied();
    }

  private:
    static android::hardware::Status deadObject() {
        return android::hardware::Status::fromExceptionCode(android::hardware::Status::EX_TRANSACTION_FAILED);
    }
    Return<void> send(uint8_t type, const hidl_vec<uint8_t>& packet) {
        if (died_.load()) return deadObject();
        if (controller_->send(type, packet.data(), packet.size())) return Void();
        return deadObject();
    }

    std::unique_ptr<HostController> controller_;
    std::atomic<bool> died_{false};
};

void HidlClient::received(uint8_t type, const uint8_t* packet, size_t len) {
    hidl_vec<uint8_t> bytes;
    bytes.setToExternal(const_cast<uint8_t*>(packet), len);
    switch (type) {
        case H4_TYPE_EVENT: callbacks_->hciEventReceived(bytes); break;
        case H4_TYPE_ACL: callbacks_->aclDataReceived(bytes); break;
        case H4_TYPE_SCO: callbacks_->scoDataReceived(bytes); break;
        default: HLOGE("hidl: %s packet from the controller dropped: the HIDL HAL has no callback for it", h4_type_name(type));
    }
}

void HidlClient::gone() { service_->die(); }

}  // namespace

namespace android {
namespace hardware {
namespace host {

sp<bluetooth::V1_0::IBluetoothHci> createDefaultBluetoothHci(const std::string& serviceName) {
    if (serviceName != "default") return nullptr;
    std::unique_ptr<HostController> controller = controller_from_environment();
    if (controller == nullptr) return nullptr;
    return new HidlHostHci(std::move(controller));
}

}  // namespace host
}  // namespace hardware
}  // namespace android
