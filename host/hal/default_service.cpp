// Picks the controller behind IBluetoothHci "default" on a host. No host
// controller is built yet: unregistered names have no service.
#include <hidl/HostServices.h>

namespace android {
namespace hardware {
namespace host {

sp<bluetooth::V1_0::IBluetoothHci> createDefaultBluetoothHci(const std::string& /*serviceName*/) {
    return nullptr;
}

}  // namespace host
}  // namespace hardware
}  // namespace android
