// Host only: the service that getService hands out for a name nobody has
// registered. Implemented by the host HAL layer, which picks a controller.
#pragma once

#include <string>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

namespace android {
namespace hardware {
namespace host {

::android::sp<::android::hardware::bluetooth::V1_0::IBluetoothHci> createDefaultBluetoothHci(
        const std::string& serviceName);

}  // namespace host
}  // namespace hardware
}  // namespace android
