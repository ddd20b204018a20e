// Host stand-ins for what the HIDL runtime does behind every interface: death
// notices and the check of unexamined call results. Any thread.
#include <stdio.h>
#include <stdlib.h>

#include <android/hidl/base/1.0/IBase.h>
#include <hidl/Status.h>

namespace android {
namespace hardware {

std::string Status::description() const {
    switch (mException) {
        case EX_NONE: return "No error";
        case EX_TRANSACTION_FAILED: return "Status(EX_TRANSACTION_FAILED): the service died";
        case EX_ILLEGAL_STATE: return "Status(EX_ILLEGAL_STATE)";
        default: return "Status(" + std::to_string(mException) + ")";
    }
}

namespace details {

void return_status::assertOk() const {
    if (isOk()) return;
    fprintf(stderr, "hidl: the value of a failed HIDL call was read: %s\n", description().c_str());
    abort();
}

void return_status::checkOnRelease() const {
    if (mCheckedStatus || mStatus.isOk()) return;
    fprintf(stderr, "hidl: a failed HIDL call's status was never checked: %s\n", description().c_str());
    abort();
}

}  // namespace details
}  // namespace hardware

namespace hidl {
namespace base {
namespace V1_0 {

using ::android::hardware::hidl_death_recipient;
using ::android::hardware::Return;

Return<bool> IBase::linkToDeath(const sp<hidl_death_recipient>& recipient, uint64_t cookie) {
    if (recipient == nullptr) return false;
    std::lock_guard<std::mutex> guard(mDeathLock);
    mDeathLinks.push_back({recipient, cookie});
    return true;
}

Return<bool> IBase::unlinkToDeath(const sp<hidl_death_recipient>& recipient) {
    std::lock_guard<std::mutex> guard(mDeathLock);
    for (auto it = mDeathLinks.begin(); it != mDeathLinks.end(); ++it) {
        if (it->recipient == recipient) {
            mDeathLinks.erase(it);
            return true;
        }
    }
    return false;
}

void IBase::notifyServiceDied() {
    std::vector<DeathLink> links;
    {
        std::lock_guard<std::mutex> guard(mDeathLock);
        links.swap(mDeathLinks);
    }
    // Outside the lock: a recipient may unlink or release the service.
    wp<IBase> who(this);
    for (const DeathLink& link : links) {
        sp<hidl_death_recipient> recipient = link.recipient.promote();
        if (recipient != nullptr) recipient->serviceDied(link.cookie, who);
    }
}

}  // namespace V1_0
}  // namespace base
}  // namespace hidl
}  // namespace android
