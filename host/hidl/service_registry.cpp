// Host service registry: what hwservicemanager does on a device, for the one
// interface the library uses. Any thread may register or look up.
#include <map>
#include <mutex>
#include <string>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>
#include <hidl/HostServices.h>

namespace android {
namespace hardware {
namespace bluetooth {
namespace V1_0 {

namespace {

std::mutex& registryLock() {
    static std::mutex lock;
    return lock;
}

std::map<std::string, sp<IBluetoothHci>>& registry() {
    static auto* services = new std::map<std::string, sp<IBluetoothHci>>();
    return *services;
}

}  // namespace

sp<IBluetoothHci> IBluetoothHci::getService(const std::string& serviceName, bool /*getStub*/) {
    {
        std::lock_guard<std::mutex> guard(registryLock());
        auto it = registry().find(serviceName);
        if (it != registry().end()) return it->second;
    }
    return ::android::hardware::host::createDefaultBluetoothHci(serviceName);
}

status_t IBluetoothHci::registerAsService(const std::string& serviceName) {
    std::lock_guard<std::mutex> guard(registryLock());
    registry()[serviceName] = this;
    return OK;
}

void IBluetoothHci::unregisterService(const std::string& serviceName) {
    sp<IBluetoothHci> dropped;
    {
        std::lock_guard<std::mutex> guard(registryLock());
        auto it = registry().find(serviceName);
        if (it == registry().end()) return;
        dropped = it->second;
        registry().erase(it);
    }
    // dropped is released here, outside the lock, in case its destructor looks services up.
}

}  // namespace V1_0
}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
