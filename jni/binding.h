// Java object binding and up-calls: binds the TestModeUtils class and object
// and calls its two callbacks. Runs on the Java thread of a native method.
#pragma once

#include <cstdint>

#include <jni.h>

#include "transport/export.h"

extern "C" {

// Natives "()V": look up the callbacks (static), bind the object, release it
// and end whatever controller session is still open.
HALVENOR_EXPORT void classInitNative(JNIEnv* env, jclass clazz);
HALVENOR_EXPORT void initNative(JNIEnv* env, jobject obj);
HALVENOR_EXPORT void destoryNative(JNIEnv* env, jobject obj);

// Calls Java's onSendCmdSuccess(command) on the bound object.
HALVENOR_EXPORT void onSendCmdSuccess(int command);
// `event` is code, length, parameters (size >= 2); while a test end is pending
// its last two bytes, little-endian, go to Java's onReceivedTestData once.
HALVENOR_EXPORT void onReceivedTestData(uint8_t* event, int size);

}  // extern "C"
