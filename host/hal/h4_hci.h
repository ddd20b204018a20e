// IBluetoothHci over H4 on a stream: a unix or TCP socket, or a serial line.
// A reader thread per session connects, reports initializationComplete and
// delivers the controller's packets; any thread may send.
#pragma once

#include <string>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "host/hal/h4_target.h"

android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> create_h4_hci(const H4Target& target);
