// Creates the test process's Java VM from a GoogleTest environment, so that
// listing the tests starts no VM.
#include "tests/jni/jvm.h"

#include <gtest/gtest.h>

#include <cstdarg>
#include <cstdio>
#include <cstring>
#include <mutex>
#include <string>

#include "tests/support/process.h"

namespace jvm {
namespace {

JavaVM* gVm = nullptr;
JNIEnv* gEnv = nullptr;
jint gOnLoad = 0;
std::mutex gWarningsLock;
std::string gWarnings;

// -Xcheck:jni reports misuse of JNI through the VM's print hook: kept, so a
// test fails on a warning about any JNI call made during it.
jint JNICALL vmPrint(FILE* stream, const char* format, va_list args) {
    char line[1024];
    va_list copy;
    va_copy(copy, args);
    int n = vsnprintf(line, sizeof(line), format, copy);
    va_end(copy);
    if (strstr(line, "WARNING") != nullptr) {
        std::lock_guard<std::mutex> guard(gWarningsLock);
        gWarnings += line;
    }
    vfprintf(stream, format, args);
    return n;
}

// A Java exception still pending after a call from the test is a failure.
void expectNoException(const char* call) {
    if (gEnv->ExceptionCheck()) {
        gEnv->ExceptionDescribe();
        ADD_FAILURE() << "Java exception pending after " << call;
    }
}

class VmEnvironment : public ::testing::Environment {
  public:
    void SetUp() override {
        std::string classpath = std::string("-Djava.class.path=") + HALVENOR_TEST_CLASSES;
        JavaVMOption options[] = {{const_cast<char*>(classpath.c_str()), nullptr},
                                  {const_cast<char*>("-Xcheck:jni"), nullptr},
                                  {const_cast<char*>("vfprintf"), reinterpret_cast<void*>(vmPrint)}};
        JavaVMInitArgs args = {};
        args.version = JNI_VERSION_1_6;
        args.nOptions = sizeof(options) / sizeof(options[0]);
        args.options = options;
        ASSERT_EQ(JNI_CreateJavaVM(&gVm, reinterpret_cast<void**>(&gEnv), &args), JNI_OK);
        gOnLoad = JNI_OnLoad(gVm, nullptr);
    }
};

const auto* const kEnvironment = ::testing::AddGlobalTestEnvironment(new VmEnvironment);

jmethodID method(jobject obj, const char* name, const char* sig) {
    jclass clazz = gEnv->GetObjectClass(obj);
    jmethodID id = gEnv->GetMethodID(clazz, name, sig);
    gEnv->DeleteLocalRef(clazz);
    EXPECT_NE(id, nullptr) << name << sig;
    return id;
}

}  // namespace

JavaVM* vm() { return gVm; }
JNIEnv* env() { return gEnv; }
jint onLoadResult() { return gOnLoad; }

jclass findClass(const char* name) {
    jclass local = gEnv->FindClass(name);
    EXPECT_NE(local, nullptr) << name;
    if (local == nullptr) {
        gEnv->ExceptionClear();
        return nullptr;
    }
    auto global = static_cast<jclass>(gEnv->NewGlobalRef(local));
    gEnv->DeleteLocalRef(local);
    return global;
}

jobject newObject(jclass clazz) {
    jmethodID init = gEnv->GetMethodID(clazz, "<init>", "()V");
    jobject obj = gEnv->NewObject(clazz, init);
    expectNoException("<init>");
    return obj;
}

void callVoid(jobject obj, const char* name, const char* sig, ...) {
    va_list args;
    va_start(args, sig);
    gEnv->CallVoidMethodV(obj, method(obj, name, sig), args);
    va_end(args);
    expectNoException(name);
}

jint callInt(jobject obj, const char* name, const char* sig) {
    jint result = gEnv->CallIntMethod(obj, method(obj, name, sig));
    expectNoException(name);
    return result;
}

void callStaticVoid(jclass clazz, const char* name, const char* sig) {
    gEnv->CallStaticVoidMethod(clazz, gEnv->GetStaticMethodID(clazz, name, sig));
    expectNoException(name);
}

void setStaticBoolean(jclass clazz, const char* name, bool value) {
    gEnv->SetStaticBooleanField(clazz, gEnv->GetStaticFieldID(clazz, name, "Z"), value);
}

std::string takeVmWarnings() {
    std::lock_guard<std::mutex> guard(gWarningsLock);
    std::string all = gWarnings;
    gWarnings.clear();
    return all;
}

bool collected(jweak weak) {
    jclass system = gEnv->FindClass("java/lang/System");
    jmethodID gc = gEnv->GetStaticMethodID(system, "gc", "()V");
    bool gone = waitUntil([&] {
        gEnv->CallStaticVoidMethod(system, gc);
        expectNoException("System.gc");
        return gEnv->IsSameObject(weak, nullptr) == JNI_TRUE;
    }, 10000);
    gEnv->DeleteLocalRef(system);
    return gone;
}

std::string takeCalls() {
    jclass clazz = gEnv->FindClass("com/quorvex/halvenor/TestModeUtils");
    jmethodID take = gEnv->GetStaticMethodID(clazz, "takeCalls", "()Ljava/lang/String;");
    auto text = static_cast<jstring>(gEnv->CallStaticObjectMethod(clazz, take));
    expectNoException("takeCalls");
    const char* chars = gEnv->GetStringUTFChars(text, nullptr);
    std::string calls = chars;
    gEnv->ReleaseStringUTFChars(text, chars);
    gEnv->DeleteLocalRef(text);
    gEnv->DeleteLocalRef(clazz);
    return calls;
}

}  // namespace jvm
