// HAL client session: opens and ends the library's session with the
// Bluetooth HAL (HIDL, or AIDL where the platform declares it) and owns the
// socket pair that bridges it to the engine. Opening and closing run on the
// calling Java thread.
#pragma once

#include <cstddef>
#include <cstdint>

#include <android/hardware/bluetooth/1.0/IBluetoothHci.h>

#include "transport/export.h"
#include "transport/hal.h"

extern "C" {

// Bridge end (pump reads, HAL callbacks write) and tool end of the socket pair.
HALVENOR_EXPORT extern int server_fd;
HALVENOR_EXPORT extern int client_fd;
// HIDL HAL service of the current session, empty when there is none (and
// always on the AIDL HAL).
HALVENOR_EXPORT extern android::sp<android::hardware::bluetooth::V1_0::IBluetoothHci> btHci;

// The engine's session descriptor; the same descriptor as client_fd while open.
extern int bt_fd;
// 1 while an LE Test End's packet count is still to be reported to Java.
extern uint8_t cmd_test_end_flag;

HALVENOR_EXPORT bool hidl_client_initialize(int, int* tool_fd);
HALVENOR_EXPORT void hidl_client_init();
HALVENOR_EXPORT void hidl_client_close();

}  // extern "C"

// The one teardown every path ends a session with: the tool end closed, the
// pump joined and the bridge end closed, then the HAL closed and released;
// `caller` names itself in a failed close's line.
void session_end(const char* caller);
// Closes the tool end once and sets client_fd and bt_fd to -1.
void hidl_client_close_tool_end();

// For the pump: hands one packet of this H4 type to the session's HAL, and
// whether that HAL takes the type at all.
HalSend session_send(uint8_t type, const uint8_t* packet, size_t len);
bool session_takes(uint8_t type);
