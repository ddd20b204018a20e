// HAL client session: opens and ends the library's session with the
// Bluetooth HAL and owns the socket pair that bridges it to the engine.
// Opening and closing run on the calling Java thread.
#pragma once

#include <cstdint>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "transport/export.h"

extern "C" {

// Bridge end (pump reads, HAL callbacks write) and tool end of the socket pair.
HALVENOR_EXPORT extern int server_fd;
HALVENOR_EXPORT extern int client_fd;
// HAL service of the current session, empty when there is none.
HALVENOR_EXPORT extern android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> btHci;

// The engine's session descriptor; the same descriptor as client_fd while open.
extern int bt_fd;
// 1 while an LE Test End's packet count is still to be reported to Java.
extern uint8_t cmd_test_end_flag;

HALVENOR_EXPORT bool hidl_client_initialize(int, int* tool_fd);
HALVENOR_EXPORT void hidl_client_init();
HALVENOR_EXPORT void hidl_client_close();

}  // extern "C"

// The pieces of ending a session, for the Java bridge's destroy, which ends a
// session in the same safe order as hidl_client_close.
//
// Closes the tool end once and sets client_fd and bt_fd to -1.
void hidl_client_close_tool_end();
// Wakes the pump, joins it (once) and closes the bridge end.
void hidl_client_stop_bridge();
// Closes and releases btHci, if set; caller names itself in the log line.
void hidl_client_release_service(const char* caller);
