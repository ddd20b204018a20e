// Host stand-in for android.hidl.base@1.0::IBase, the root of every HIDL
// interface: reference counted through android::sp.
#pragma once

#include <string>

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
};

}  // namespace V1_0
}  // namespace base
}  // namespace hidl
}  // namespace android
