// Java object binding and up-calls: the class's callback methods, the bound
// object, and the release of both and of the controller session. Runs on the
// Java thread of a native method; the pump and HAL threads never enter here.
#include "jni/binding.h"

#include <string.h>

#include "transport/log.h"
#include "transport/session.h"

static JavaVM* sJavaVM = nullptr;
static jobject sTestModeObject = nullptr;
static jmethodID sOnReceivedTestDataMethod = nullptr;
static jmethodID sOnSendCmdSuccessMethod = nullptr;
static char sDevicePath[15] = {0};

// Logged by classInitNative only; nothing opens it.
static char kDevicePath[10] = "/dev/smd3";

// The messages of one up-call when Java cannot be reached.
struct UpCall {
    const char* no_vm;
    const char* no_env;
    const char* unbound;
    const char* threw;
};

static const UpCall kSendCmdSuccess = {
        "onSendCmdSuccess, JavaVM is NULL return!!!",
        "onSendCmdSuccess, GetEnv error return!!!",
        "onSendCmdSuccess, object or method not bound return!!!",
        "onSendCmdSuccess, Java exception thrown and cleared!!!",
};

static const UpCall kReceivedTestData = {
        "onReceivedTestData, JavaVM is NULL return!!!",
        "onReceivedTestData, GetEnv error return!!!",
        "onReceivedTestData, object or method not bound return!!!",
        "onReceivedTestData, Java exception thrown and cleared!!!",
};

// The environment of this thread when the callbacks can be called on the
// bound object, else null after the up-call's message. Never attaches the
// thread: up-calls come from the Java thread inside a native method.
static JNIEnv* reach_java(const UpCall& call) {
    if (sJavaVM == nullptr) {
        LOGE("%s", call.no_vm);
        return nullptr;
    }
    JNIEnv* env = nullptr;
    sJavaVM->GetEnv(reinterpret_cast<void**>(&env), JNI_VERSION_1_6);
    if (env == nullptr) {
        LOGE("%s", call.no_env);
        return nullptr;
    }
    if (sTestModeObject == nullptr || sOnReceivedTestDataMethod == nullptr ||
        sOnSendCmdSuccessMethod == nullptr) {
        LOGE("%s", call.unbound);
        return nullptr;
    }
    return env;
}

// A callback that throws must not leave the exception pending for the next
// JNI call of the native method that is still running.
static void call_java(JNIEnv* env, const UpCall& call, jmethodID method, jint value) {
    env->CallVoidMethod(sTestModeObject, method, value);
    if (env->ExceptionCheck()) {
        env->ExceptionClear();
        LOGE("%s", call.threw);
    }
}

void onSendCmdSuccess(int command) {
    LOGI("onSendCmdSuccess() command: %d", command);
    JNIEnv* env = reach_java(kSendCmdSuccess);
    if (env == nullptr) return;
    call_java(env, kSendCmdSuccess, sOnSendCmdSuccessMethod, command);
}

void onReceivedTestData(uint8_t* event, int size) {
    if (event == nullptr || size < 2) {
        LOGE("onReceivedTestData, event too short return!!!");
        return;
    }
    int value = event[size - 2] | (event[size - 1] << 8);
    LOGI("onReceivedTestData() value: %d", value);
    JNIEnv* env = reach_java(kReceivedTestData);
    if (env == nullptr) return;
    LOGI("Receive cmd_test_end_flag = %s", cmd_test_end_flag != 0 ? "true" : "false");
    if (cmd_test_end_flag != 1) return;
    // Cleared before the call: one test end is reported at most once.
    cmd_test_end_flag = 0;
    call_java(env, kReceivedTestData, sOnReceivedTestDataMethod, value);
}

// A failed lookup leaves NoSuchMethodError pending, which must be cleared
// before any further JNI call; the caller logs the failure.
static jmethodID find_callback(JNIEnv* env, jclass clazz, const char* name) {
    jmethodID method = env->GetMethodID(clazz, name, "(I)V");
    if (env->ExceptionCheck()) env->ExceptionClear();
    return method;
}

void classInitNative(JNIEnv* env, jclass clazz) {
    LOGI("classInitNative()");
    sOnReceivedTestDataMethod = find_callback(env, clazz, "onReceivedTestData");
    sOnSendCmdSuccessMethod = find_callback(env, clazz, "onSendCmdSuccess");
    if (sOnReceivedTestDataMethod == nullptr || sOnSendCmdSuccessMethod == nullptr) {
        LOGE("classInitNative, GetMethodID error return!!!");
        return;
    }
    size_t len = strnlen(kDevicePath, sizeof(kDevicePath));
    if (len > sizeof(sDevicePath) - 1) len = sizeof(sDevicePath) - 1;
    memcpy(sDevicePath, kDevicePath, len);
    LOGI("classInitNative, PATH: %s", sDevicePath);
}

void initNative(JNIEnv* env, jobject obj) {
    LOGI("initNative()");
    env->GetJavaVM(&sJavaVM);
    if (sJavaVM == nullptr) {
        LOGE("initNative, GetJavaVM error return!!!");
        return;
    }
    jobject ref = env->NewGlobalRef(obj);
    // A second binding replaces the first; its reference would otherwise leak.
    if (sTestModeObject != nullptr) env->DeleteGlobalRef(sTestModeObject);
    sTestModeObject = ref;
    if (sTestModeObject == nullptr) LOGE("initNative, object is null return!!!");
}

void destoryNative(JNIEnv* env, jobject) {
    LOGI("destoryNative()");
    bt_fd = -1;
    if (sTestModeObject != nullptr && env != nullptr) {
        LOGI("destoryNative, Delete global ref sTestModeObject");
        env->DeleteGlobalRef(sTestModeObject);
        sTestModeObject = nullptr;
    } else {
        LOGE("destoryNative, error happened!!!");
    }
    LOGI("BLE close HIDL!");
    session_end("destoryNative");
}
