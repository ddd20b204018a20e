// Library entry point: registers the natives of the application's Java class
// when the VM loads the library, and the natives that hand Java calls to the
// test procedures. JNI_OnLoad runs on the loading thread, the natives on the
// calling Java thread.
#include "jni/TestMode.h"

#include "engine/test_mode.h"
#include "jni/binding.h"
#include "transport/log.h"

static const char kClassName[] = "com/quorvex/halvenor/TestModeUtils";

// The commit the library was built from, read from the library file by the host
// console's --version: the library exports only what the app and the platform
// look up. A build without the generated header (the platform's) says unknown.
#if __has_include("halvenor_commit.h")
#include "halvenor_commit.h"
#else
#define HALVENOR_COMMIT "unknown"
#endif
__attribute__((used)) static const char kBuildCommit[] = "halvenor-build-commit:" HALVENOR_COMMIT;

// Writable: JNINativeMethod's fields are plain char pointers.
JNINativeMethod gMethods[7] = {
        {const_cast<char*>("classInitNative"), const_cast<char*>("()V"),
         reinterpret_cast<void*>(classInitNative)},
        {const_cast<char*>("initNative"), const_cast<char*>("()V"),
         reinterpret_cast<void*>(initNative)},
        {const_cast<char*>("enterTestModeNative"), const_cast<char*>("()I"),
         reinterpret_cast<void*>(enterTestModeNative)},
        {const_cast<char*>("quitTestModeNative"), const_cast<char*>("()I"),
         reinterpret_cast<void*>(quitTestModeNative)},
        {const_cast<char*>("sendTestCommandNative"), const_cast<char*>("(IZ)V"),
         reinterpret_cast<void*>(sendTestCommandNative)},
        {const_cast<char*>("destoryNative"), const_cast<char*>("()V"),
         reinterpret_cast<void*>(destoryNative)},
        {const_cast<char*>("sendCwtxCommandNative"), const_cast<char*>("(III)V"),
         reinterpret_cast<void*>(sendCwtxCommandNative)},
};

jint enterTestModeNative(JNIEnv*, jobject) { return hci_enable_device_under_test_mode(); }

jint quitTestModeNative(JNIEnv*, jobject) {
    hci_disable_device_under_test_mode();
    return 0;
}

void sendTestCommandNative(JNIEnv*, jobject, jint code, jboolean enhanced) {
    sendBleTestCommand(code, enhanced);
}

// FindClass and RegisterNatives leave an exception pending when they fail; it
// is cleared so that the VM reports the refused load itself, after our line.
int registerNativeMethods(JNIEnv* env, const char* className, JNINativeMethod* methods,
                          int numMethods) {
    jclass clazz = env->FindClass(className);
    if (clazz == nullptr) {
        env->ExceptionClear();
        LOGE("registerNativeMethods unable to find class '%s'\n", className);
        return 0;
    }
    jint rc = env->RegisterNatives(clazz, methods, numMethods);
    env->DeleteLocalRef(clazz);
    if (rc < 0) {
        env->ExceptionClear();
        LOGE("registerNativeMethods failed for '%s'\n", className);
        return 0;
    }
    return 1;
}

int registerNatives(JNIEnv* env) {
    return registerNativeMethods(env, kClassName, gMethods,
                                 static_cast<int>(sizeof(gMethods) / sizeof(gMethods[0])));
}

// A service still held in btHci when the library is unloaded is released by
// btHci's own destructor, which the loader runs at unload or exit.
jint JNI_OnLoad(JavaVM* vm, void*) {
    JNIEnv* env = nullptr;
    if (vm->GetEnv(reinterpret_cast<void**>(&env), JNI_VERSION_1_6) != JNI_OK) {
        LOGE("ERROR: GetEnv failed\n");
        return -1;
    }
    if (registerNatives(env) == 0) {
        LOGE("ERROR: BinaryDictionary native registration failed\n");
        return -1;
    }
    return JNI_VERSION_1_6;
}
