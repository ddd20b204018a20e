// A Java VM without a JVM, for suites that check what reaches Java: binds the
// library to fake TestModeUtils objects and records every callback made on
// them; a callback can be made to throw, and only the thread that bound the
// objects is attached to the VM.
#pragma once

#include <jni.h>

#include <string>

// classInitNative on a class with both callbacks (or without onSendCmdSuccess),
// then initNative on a fresh object, which is returned.
jobject bindFakeJava(bool withSendCallback = true);
JNIEnv* fakeJavaEnv();
// The callbacks since the last call, in order: "received N" for
// onReceivedTestData, "success N" for onSendCmdSuccess, comma-separated.
std::string takeJavaCalls();
// From now on every callback leaves an exception pending (or none).
void setJavaThrows(bool throws);
// Global references the library holds: made and not yet deleted.
int liveGlobalRefs();
