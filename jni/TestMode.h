// Native method table, registration and the thin natives that hand a Java
// call to a test procedure. Runs on the loading thread and the Java threads.
#pragma once

#include <jni.h>

#include "transport/export.h"

extern "C" {

// The seven natives of com/quorvex/halvenor/TestModeUtils.
HALVENOR_EXPORT extern JNINativeMethod gMethods[7];

// 1 when every row of gMethods is registered on the class, else 0.
HALVENOR_EXPORT int registerNatives(JNIEnv* env);
HALVENOR_EXPORT int registerNativeMethods(JNIEnv* env, const char* className,
                                          JNINativeMethod* methods, int numMethods);

// Natives "()I", "()I" and "(IZ)V".
HALVENOR_EXPORT jint enterTestModeNative(JNIEnv* env, jobject obj);
HALVENOR_EXPORT jint quitTestModeNative(JNIEnv* env, jobject obj);
HALVENOR_EXPORT void sendTestCommandNative(JNIEnv* env, jobject obj, jint code, jboolean enhanced);

}  // extern "C"
