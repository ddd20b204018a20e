// IBluetoothHci on a simulated controller in this process. Commands are
// handled and answered on the service's own event thread, as a real HAL
// answers from its own threads.
#pragma once

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "host/hal/sim_controller.h"

// A new service with its own controller on the process's shared air.
android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> create_sim_hci(
        SimControllerSettings settings);
