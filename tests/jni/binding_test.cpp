// The Java binding in a real VM: callbacks looked up and called on the bound
// object, the one-shot test-end count, and release of the object.
#include "jni/binding.h"

#include <android/log.h>

#include <thread>

#include "engine/test_mode.h"
#include "tests/engine/hal_session.h"
#include "tests/jni/jvm.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;
const char kTestModeUtils[] = "com/quorvex/halvenor/TestModeUtils";

class BindingTest : public HalSessionTest {
  protected:
    void SetUp() override {
        HalSessionTest::SetUp();
        env_ = jvm::env();
        ASSERT_NE(env_, nullptr);
        utils_ = jvm::findClass(kTestModeUtils);
        noSend_ = jvm::findClass("halvenor/test/NoSendCallback");
        // Whatever an earlier test bound is released, and the callback IDs
        // are reset by a lookup on a class that lacks one.
        destoryNative(env_, nullptr);
        classInitNative(env_, noSend_);
        jvm::takeCalls();
        log_.clear();
    }
    void TearDown() override {
        EXPECT_EQ(jvm::takeVmWarnings(), "");
        jvm::setStaticBoolean(utils_, "throwFromCallbacks", false);
        destoryNative(env_, nullptr);
        env_->DeleteGlobalRef(utils_);
        env_->DeleteGlobalRef(noSend_);
        HalSessionTest::TearDown();
    }

    // classInitNative and initNative, as the application calls them.
    jobject bind() {
        jvm::callStaticVoid(utils_, "classInitNative", "()V");
        jobject obj = jvm::newObject(utils_);
        jvm::callVoid(obj, "initNative", "()V");
        return obj;
    }
    void send(jobject obj, int code, bool enhanced = false) {
        jvm::callVoid(obj, "sendTestCommandNative", "(IZ)V", code, enhanced ? JNI_TRUE : JNI_FALSE);
    }
    void answerTestEndWith(uint8_t low, uint8_t high) {
        answerWith([low, high](const Bytes& command) {
            uint16_t opcode = opcodeOf(command);
            Bytes returned = opcode == 0x201F ? Bytes{0x00, low, high} : Bytes{0x00};
            return std::vector<Bytes>{commandComplete(opcode, returned)};
        });
    }

    JNIEnv* env_ = nullptr;
    jclass utils_ = nullptr;
    jclass noSend_ = nullptr;
};

TEST_F(BindingTest, VirtualMachineLoadedTheLibrary) { EXPECT_EQ(jvm::onLoadResult(), JNI_VERSION_1_6); }

TEST_F(BindingTest, CountReachesJavaOncePerTestEndBeforeSuccess) {
    answerTestEndWith(0x2A, 0x00);
    jobject obj = bind();
    send(obj, 22440, true);
    EXPECT_EQ(jvm::takeCalls(), "success 22440");
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "received 42,success 3000");
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "received 42,success 3000");
    // Other exchanges end in a Command Complete too, but report no count.
    EXPECT_EQ(jvm::callInt(obj, "enterTestModeNative", "()I"), 0);
    jvm::callVoid(obj, "sendCwtxCommandNative", "(III)V", 1, 9, 4);
    send(obj, 12402);
    EXPECT_EQ(jvm::takeCalls(), "success 12402");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, CountIsUnsignedUpTo65535) {
    answerTestEndWith(0xFF, 0xFF);
    jobject obj = bind();
    send(obj, 12440);
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "success 12440,received 65535,success 3000");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, TestEndWithoutAnOpenSessionSendsButReportsNoCount) {
    answerTestEndWith(0x2A, 0x00);
    jobject obj = bind();
    ASSERT_EQ(bt_fd, -1);
    send(obj, 3000);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x1F, 0x20, 0x00}));
    EXPECT_EQ(jvm::takeCalls(), "success 3000");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, NothingReachesJavaUntilClassInitAndInitNative) {
    answerTestEndWith(0x2A, 0x00);
    sendBleTestCommand(22440, 0);  // neither class initialised nor object bound
    jvm::callStaticVoid(utils_, "classInitNative", "()V");
    sendBleTestCommand(22440, 0);  // class initialised, no object
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(jvm::takeCalls(), "");

    jobject obj = jvm::newObject(utils_);
    jvm::callVoid(obj, "initNative", "()V");
    send(obj, 22440);
    EXPECT_EQ(jvm::takeCalls(), "success 22440");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, NothingReachesJavaAfterDestroyAndTheObjectIsReleased) {
    answerTestEndWith(0x2A, 0x00);
    jobject obj = bind();
    jweak weak = env_->NewWeakGlobalRef(obj);
    send(obj, 22440);
    EXPECT_EQ(jvm::takeCalls(), "success 22440");

    jvm::callVoid(obj, "destoryNative", "()V");
    EXPECT_TRUE(log_.contains(INFO, "destoryNative, Delete global ref sTestModeObject"));
    send(obj, 22440);
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "");

    env_->DeleteLocalRef(obj);
    EXPECT_TRUE(jvm::collected(weak));
    env_->DeleteWeakGlobalRef(weak);
}

TEST_F(BindingTest, SecondInitNativeReleasesTheFirstObject) {
    jobject first = bind();
    jweak weak = env_->NewWeakGlobalRef(first);
    jobject second = jvm::newObject(utils_);
    jvm::callVoid(second, "initNative", "()V");
    env_->DeleteLocalRef(first);
    EXPECT_TRUE(jvm::collected(weak));
    env_->DeleteWeakGlobalRef(weak);

    send(second, 22402);
    EXPECT_EQ(jvm::takeCalls(), "success 22402");
    env_->DeleteLocalRef(second);
}

TEST_F(BindingTest, ThrowingCallbacksLeaveTheLibraryWorking) {
    answerTestEndWith(0x2A, 0x00);
    jobject obj = bind();
    send(obj, 22440);
    jvm::takeCalls();
    jvm::setStaticBoolean(utils_, "throwFromCallbacks", true);
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "received 42,success 3000");  // both called, though the first threw
    EXPECT_TRUE(log_.contains(ERROR, "onReceivedTestData, Java exception thrown and cleared!!!"));
    EXPECT_TRUE(log_.contains(ERROR, "onSendCmdSuccess, Java exception thrown and cleared!!!"));

    jvm::setStaticBoolean(utils_, "throwFromCallbacks", false);
    send(obj, 22440);
    send(obj, 3000);
    EXPECT_EQ(jvm::takeCalls(), "success 22440,received 42,success 3000");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, ClassInitLogsTheDevicePath) {
    jvm::callStaticVoid(utils_, "classInitNative", "()V");
    EXPECT_TRUE(log_.contains(INFO, "classInitNative()"));
    EXPECT_TRUE(log_.contains(INFO, "classInitNative, PATH: /dev/smd3"));
    EXPECT_FALSE(log_.containsFragment("GetMethodID error"));
}

TEST_F(BindingTest, ClassLackingACallbackLogsTheErrorAndNoPath) {
    classInitNative(env_, noSend_);
    EXPECT_FALSE(env_->ExceptionCheck());
    EXPECT_TRUE(log_.contains(ERROR, "classInitNative, GetMethodID error return!!!"));
    EXPECT_FALSE(log_.containsFragment("classInitNative, PATH"));

    // One callback found is not enough to call either.
    jobject obj = jvm::newObject(utils_);
    jvm::callVoid(obj, "initNative", "()V");
    send(obj, 22440);
    EXPECT_EQ(jvm::takeCalls(), "");
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, FlagClearMeansNoCallAndNoChange) {
    jobject obj = bind();
    cmd_test_end_flag = 0;
    uint8_t event[] = {0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00};
    onReceivedTestData(event, sizeof(event));
    EXPECT_TRUE(log_.contains(INFO, "Receive cmd_test_end_flag = false"));
    EXPECT_EQ(jvm::takeCalls(), "");

    cmd_test_end_flag = 1;
    onReceivedTestData(event, sizeof(event));
    onReceivedTestData(event, sizeof(event));  // reported once only
    EXPECT_EQ(jvm::takeCalls(), "received 42");
    EXPECT_EQ(cmd_test_end_flag, 0);
    env_->DeleteLocalRef(obj);
}

TEST_F(BindingTest, UpCallOnAThreadOutsideTheVmLeavesTheCountPending) {
    jobject obj = bind();
    cmd_test_end_flag = 1;
    std::thread other([] {
        uint8_t event[] = {0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00};
        onReceivedTestData(event, sizeof(event));
        onSendCmdSuccess(3000);
    });
    other.join();
    EXPECT_TRUE(log_.contains(ERROR, "onReceivedTestData, GetEnv error return!!!"));
    EXPECT_TRUE(log_.contains(ERROR, "onSendCmdSuccess, GetEnv error return!!!"));
    EXPECT_EQ(cmd_test_end_flag, 1);
    EXPECT_EQ(jvm::takeCalls(), "");
    cmd_test_end_flag = 0;
    env_->DeleteLocalRef(obj);
}

}  // namespace
