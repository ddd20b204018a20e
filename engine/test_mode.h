// Test procedures: classic Device Under Test mode, the LE direct transmitter
// and receiver tests and their end, and the vendor continuous-wave command.
// Run on the Java thread of the native method that calls them.
#pragma once

#include <cstdint>

#include <jni.h>

#include "transport/export.h"

extern "C" {

// Runs the LE test (or the test end, code 3000) selected by `code`; reports
// the code to Java once the controller has accepted the command.
HALVENOR_EXPORT void sendBleTestCommand(int code, uint8_t enhanced);
// Native "(III)V": vendor continuous-wave transmit with channel, power, type.
HALVENOR_EXPORT void sendCwtxCommandNative(JNIEnv* env, jobject obj, jint channel, jint power,
                                           jint type);
// 0 once the controller is in Device Under Test mode; -1 when it is not, with
// no session left open.
HALVENOR_EXPORT int hci_enable_device_under_test_mode();
// Sends Reset and ends the session; 0 always.
HALVENOR_EXPORT int hci_disable_device_under_test_mode();

}  // extern "C"
