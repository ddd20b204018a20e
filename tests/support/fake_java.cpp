#include "tests/support/fake_java.h"

#include <jni.h>

#include <cstdarg>
#include <mutex>

#include "jni/binding.h"

namespace {

std::mutex calls_lock;
std::string calls;

// Any distinct non-null values will do: the library only hands them back.
int object_tag, received_tag, success_tag;
jobject const kObject = reinterpret_cast<jobject>(&object_tag);
jmethodID const kReceived = reinterpret_cast<jmethodID>(&received_tag);
jmethodID const kSuccess = reinterpret_cast<jmethodID>(&success_tag);

JavaVM* fake_vm();

jint GetJavaVM(JNIEnv*, JavaVM** vm) {
    *vm = fake_vm();
    return JNI_OK;
}
jobject NewGlobalRef(JNIEnv*, jobject) { return kObject; }
void DeleteGlobalRef(JNIEnv*, jobject) {}
jboolean ExceptionCheck(JNIEnv*) { return JNI_FALSE; }
void ExceptionClear(JNIEnv*) {}
jmethodID GetMethodID(JNIEnv*, jclass, const char* name, const char*) {
    std::string n(name);
    return n == "onReceivedTestData" ? kReceived : n == "onSendCmdSuccess" ? kSuccess : nullptr;
}
void CallVoidMethodV(JNIEnv*, jobject, jmethodID method, va_list args) {
    jint value = va_arg(args, jint);
    std::lock_guard<std::mutex> guard(calls_lock);
    calls += (calls.empty() ? "" : ",") + std::string(method == kReceived ? "received " : "success ") +
             std::to_string(value);
}

JNINativeInterface_ make_functions() {
    JNINativeInterface_ f = {};
    f.GetJavaVM = GetJavaVM;
    f.NewGlobalRef = NewGlobalRef;
    f.DeleteGlobalRef = DeleteGlobalRef;
    f.ExceptionCheck = ExceptionCheck;
    f.ExceptionClear = ExceptionClear;
    f.GetMethodID = GetMethodID;
    f.CallVoidMethodV = CallVoidMethodV;
    return f;
}
const JNINativeInterface_ kFunctions = make_functions();
JNIEnv fake_env = {&kFunctions};

jint GetEnv(JavaVM*, void** env, jint) {
    *env = &fake_env;
    return JNI_OK;
}
JNIInvokeInterface_ make_invoke() {
    JNIInvokeInterface_ i = {};
    i.GetEnv = GetEnv;
    return i;
}
const JNIInvokeInterface_ kInvoke = make_invoke();
JavaVM vm_instance = {&kInvoke};

JavaVM* fake_vm() { return &vm_instance; }

}  // namespace

void bindFakeJava() {
    classInitNative(&fake_env, nullptr);
    initNative(&fake_env, kObject);
    takeJavaCalls();
}

std::string takeJavaCalls() {
    std::lock_guard<std::mutex> guard(calls_lock);
    std::string taken;
    taken.swap(calls);
    return taken;
}
