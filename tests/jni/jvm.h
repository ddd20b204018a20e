// A Java VM inside a GoogleTest binary: created once per process with the
// test classes on its class path, the library's natives registered through
// JNI_OnLoad, and small helpers to drive TestModeUtils from C++.
#pragma once

#include <jni.h>

#include <string>

namespace jvm {

JavaVM* vm();
JNIEnv* env();  // of the main thread, which created the VM
jint onLoadResult();

jclass findClass(const char* name);  // a global reference; fails the test when missing
jobject newObject(jclass clazz);     // a local reference
void callVoid(jobject obj, const char* name, const char* sig, ...);
jint callInt(jobject obj, const char* name, const char* sig);
void callStaticVoid(jclass clazz, const char* name, const char* sig);
void setStaticBoolean(jclass clazz, const char* name, bool value);
// Runs a full collection until `weak` is cleared or the bound is reached.
bool collected(jweak weak);
// What -Xcheck:jni warned about since the last take.
std::string takeVmWarnings();
// TestModeUtils.takeCalls().
std::string takeCalls();

}  // namespace jvm
