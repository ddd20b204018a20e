#include "tests/support/fake_java.h"

#include <cstdarg>
#include <mutex>
#include <thread>

#include "jni/binding.h"

namespace {

std::mutex lock;
std::string calls;
bool throws = false;
bool pending = false;
int live_refs = 0;
int next_object = 0;
std::thread::id attached;

// Any distinct non-null values will do: the library only hands them back.
int objects[64], received_tag, success_tag;
jmethodID const kReceived = reinterpret_cast<jmethodID>(&received_tag);
jmethodID const kSuccess = reinterpret_cast<jmethodID>(&success_tag);
bool with_send = true;

JavaVM* fake_vm();

jint GetJavaVM(JNIEnv*, JavaVM** vm) {
    *vm = fake_vm();
    return JNI_OK;
}
jobject NewGlobalRef(JNIEnv*, jobject obj) {
    std::lock_guard<std::mutex> guard(lock);
    ++live_refs;
    return obj;
}
void DeleteGlobalRef(JNIEnv*, jobject) {
    std::lock_guard<std::mutex> guard(lock);
    --live_refs;
}
jboolean ExceptionCheck(JNIEnv*) {
    std::lock_guard<std::mutex> guard(lock);
    return pending ? JNI_TRUE : JNI_FALSE;
}
void ExceptionClear(JNIEnv*) {
    std::lock_guard<std::mutex> guard(lock);
    pending = false;
}
jmethodID GetMethodID(JNIEnv*, jclass, const char* name, const char*) {
    std::string n(name);
    return n == "onReceivedTestData" ? kReceived : n == "onSendCmdSuccess" && with_send ? kSuccess : nullptr;
}
void CallVoidMethodV(JNIEnv*, jobject, jmethodID method, va_list args) {
    jint value = va_arg(args, jint);
    std::lock_guard<std::mutex> guard(lock);
    calls += (calls.empty() ? "" : ",") + std::string(method == kReceived ? "received " : "success ") +
             std::to_string(value);
    pending = throws;
}

const JNINativeInterface_ kFunctions = [] {
    JNINativeInterface_ f = {};
    f.GetJavaVM = GetJavaVM, f.NewGlobalRef = NewGlobalRef, f.DeleteGlobalRef = DeleteGlobalRef;
    f.ExceptionCheck = ExceptionCheck, f.ExceptionClear = ExceptionClear, f.GetMethodID = GetMethodID;
    f.CallVoidMethodV = CallVoidMethodV;
    return f;
}();
JNIEnv fake_env = {&kFunctions};

// Only the binding thread is attached; others get no environment.
jint GetEnv(JavaVM*, void** env, jint) {
    bool known = std::this_thread::get_id() == attached;
    *env = known ? &fake_env : nullptr;
    return known ? JNI_OK : JNI_EDETACHED;
}
const JNIInvokeInterface_ kInvoke = [] {
    JNIInvokeInterface_ i = {};
    i.GetEnv = GetEnv;
    return i;
}();
JavaVM vm_instance = {&kInvoke};

JavaVM* fake_vm() { return &vm_instance; }

}  // namespace

jobject bindFakeJava(bool withSendCallback) {
    attached = std::this_thread::get_id();
    with_send = withSendCallback;
    classInitNative(&fake_env, nullptr);
    jobject obj = reinterpret_cast<jobject>(&objects[next_object++ % 64]);
    initNative(&fake_env, obj);
    takeJavaCalls();
    return obj;
}

JNIEnv* fakeJavaEnv() { return &fake_env; }

std::string takeJavaCalls() {
    std::lock_guard<std::mutex> guard(lock);
    std::string taken;
    taken.swap(calls);
    return taken;
}

void setJavaThrows(bool t) {
    std::lock_guard<std::mutex> guard(lock);
    throws = t;
}

int liveGlobalRefs() {
    std::lock_guard<std::mutex> guard(lock);
    return live_refs;
}
