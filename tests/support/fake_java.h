// A Java VM without a JVM, for suites that check what reaches Java: binds the
// library to a fake TestModeUtils object and records every callback made on it.
#pragma once

#include <string>

// classInitNative and initNative on the fake class and object.
void bindFakeJava();
// The callbacks since the last call, in order: "received N" for
// onReceivedTestData, "success N" for onSendCmdSuccess, comma-separated.
std::string takeJavaCalls();
