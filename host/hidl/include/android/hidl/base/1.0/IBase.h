// Host stand-in for android.hidl.base@1.0::IBase, the root of every HIDL
// interface: reference counted through android::sp, with death notices.
#pragma once

#include <cstdint>
#include <mutex>
#include <string>
#include <vector>

#include <hidl/HidlSupport.h>
#include <hidl/Status.h>
#include <utils/RefBase.h>

namespace android {
namespace hidl {
namespace base {
namespace V1_0 {

struct IBase : virtual public ::android::RefBase {
    virtual bool isRemote() const { return false; }
    virtual ::android::hardware::Return<void> ping() { return ::android::hardware::Void(); }
    virtual std::string interfaceDescriptor() const { return "android.hidl.base@1.0::IBase"; }

    // As for a service in another process: the recipient is held weakly and
    // told once, with its cookie, when the service dies. False for a null
    // recipient.
    virtual ::android::hardware::Return<bool> linkToDeath(
            const ::android::sp<::android::hardware::hidl_death_recipient>& recipient,
            uint64_t cookie);
    virtual ::android::hardware::Return<bool> unlinkToDeath(
            const ::android::sp<::android::hardware::hidl_death_recipient>& recipient);

    // Host only: the service's process has died. Every linked recipient is
    // told on the calling thread, then forgotten.
    void notifyServiceDied();

  private:
    struct DeathLink {
        ::android::wp<::android::hardware::hidl_death_recipient> recipient;
        uint64_t cookie;
    };
    std::mutex mDeathLock;
    std::vector<DeathLink> mDeathLinks;
};

}  // namespace V1_0
}  // namespace base
}  // namespace hidl
}  // namespace android
