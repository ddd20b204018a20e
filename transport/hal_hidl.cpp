// The HIDL Bluetooth HAL (android.hardware.bluetooth@1.0, service "default"):
// the service in btHci, the callback object handed to it and its death
// notice. Opening and closing run on the calling Java thread, sends on the
// pump thread, callbacks on HAL threads.
#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "transport/h4.h"
#include "transport/hal.h"
#include "transport/log.h"
#include "transport/session.h"

using android::sp;
using android::wp;
using android::hardware::hidl_death_recipient;
using android::hardware::hidl_vec;
using android::hardware::Return;
using android::hardware::Void;
using android::hidl::base::V1_0::IBase;
using android::hardware::bluetooth::V1_0::IBluetoothHci;
using android::hardware::bluetooth::V1_0::IBluetoothHciCallbacks;
using android::hardware::bluetooth::V1_0::Status;

sp<IBluetoothHci> btHci;

namespace {

// Told when the HAL's process dies: the session cannot carry anything more.
class HalDeathRecipient : public hidl_death_recipient {
  public:
    void serviceDied(uint64_t cookie, const wp<IBase>&) override { session_hal_died(cookie); }
};

class BluetoothHciCallbacks : public IBluetoothHciCallbacks {
  public:
    ~BluetoothHciCallbacks() override = default;
    Return<void> initializationComplete(Status status) override {
        bool ok = status == Status::SUCCESS;
        if (!ok) LOGE("Error in HIDL initialization");
        session_initialized(this, ok);
        return Void();
    }
    Return<void> hciEventReceived(const hidl_vec<uint8_t>& event) override {
        session_deliver(H4_TYPE_EVENT, event.data(), event.size(), "hciEventReceived");
        return Void();
    }
    Return<void> aclDataReceived(const hidl_vec<uint8_t>& data) override {
        session_deliver(H4_TYPE_ACL, data.data(), data.size(), "aclDataReceived");
        return Void();
    }
    Return<void> scoDataReceived(const hidl_vec<uint8_t>& data) override {
        session_deliver(H4_TYPE_SCO, data.data(), data.size(), "scoDataReceived");
        return Void();
    }
};

// Linked to the service of each session; the cookie names the session.
sp<hidl_death_recipient> hal_death;

// A service that will not give a death notice still works; only its death
// is noticed later, at a send.
bool open_hidl(uint64_t cookie) {
    LOGI("%s: Initialize the HIDL with Mode BT", "hidl_client_initialize");
    btHci = IBluetoothHci::getService("default", false);
    if (btHci == nullptr) {
        LOGE("Unable to initialize the HIDL");
        return false;
    }
    LOGI("%s: IBluetoothHci::getService() returned %p (%s)", "hidl_client_initialize", btHci.get(),
         btHci->isRemote() ? "remote" : "local");
    if (hal_death == nullptr) hal_death = new HalDeathRecipient();
    Return<bool> linked = btHci->linkToDeath(hal_death, cookie);
    if (!linked.isOk()) {
        LOGE("%s: the HAL died before initialize: %s", "hidl_client_initialize", linked.description().c_str());
        btHci.clear();
        return false;
    }
    if (!linked) LOGI("%s: the HAL gives no death notice", "hidl_client_initialize");
    return true;
}

bool initialize_hidl() {
    sp<IBluetoothHciCallbacks> callbacks = new BluetoothHciCallbacks();
    session_expect_initialized(callbacks.get());
    Return<void> started = btHci->initialize(callbacks);
    if (started.isOk()) return true;
    LOGE("%s: initialize failed: %s", "hidl_client_initialize", started.description().c_str());
    return false;
}

// Every session change joins the pump before it touches btHci, so the
// service read here is the one this session opened.
HalSend send_hidl(uint8_t type, const uint8_t* packet, size_t len) {
    hidl_vec<uint8_t> hci;
    hci.setToExternal(const_cast<uint8_t*>(packet), len);
    Return<void> sent = type == H4_TYPE_COMMAND ? btHci->sendHciCommand(hci)
                        : type == H4_TYPE_ACL   ? btHci->sendAclData(hci)
                                                : btHci->sendScoData(hci);
    if (sent.isOk()) return HAL_SENT;
    LOGE("%s: the HAL refused packet type %d: %s", "process_tool_data", type, sent.description().c_str());
    return sent.isDeadObject() ? HAL_DEAD : HAL_REFUSED;
}

bool takes_hidl(uint8_t type) { return type >= H4_TYPE_COMMAND && type <= H4_TYPE_SCO; }

// A dead service's unlink and close fail; there is nothing left to undo then.
void release_hidl(const char* caller) {
    if (btHci == nullptr) return;
    Return<bool> unlinked = btHci->unlinkToDeath(hal_death);
    unlinked.isOk();
    Return<void> closed = btHci->close();
    if (!closed.isOk() && caller != nullptr) LOGI("%s: HIDL daemon is dead", caller);
    btHci.clear();
}

}  // namespace

const HalAdapter hidl_hal = {
        "%s: HIDL failed to initialize, sending invalid FD to tool",
        "%s: HIDL = true",
        open_hidl,
        initialize_hidl,
        send_hidl,
        takes_hidl,
        release_hidl,
};
