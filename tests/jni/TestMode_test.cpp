// Registration and the thin natives, in a real VM: JNI_OnLoad's table on the
// application class, refused registrations, and each native called from Java.
#include "jni/TestMode.h"

#include <android/log.h>

#include <thread>

#include "tests/engine/hal_session.h"
#include "tests/jni/jvm.h"

namespace {

const int ERROR = ANDROID_LOG_ERROR;

class TestModeTest : public HalSessionTest {
  protected:
    void SetUp() override {
        HalSessionTest::SetUp();
        env_ = jvm::env();
        ASSERT_NE(env_, nullptr);
        utils_ = jvm::findClass("com/quorvex/halvenor/TestModeUtils");
        obj_ = jvm::newObject(utils_);
    }
    void TearDown() override {
        EXPECT_EQ(jvm::takeVmWarnings(), "");
        env_->DeleteLocalRef(obj_);
        env_->DeleteGlobalRef(utils_);
        HalSessionTest::TearDown();
    }

    JNIEnv* env_ = nullptr;
    jclass utils_ = nullptr;
    jobject obj_ = nullptr;
};

TEST_F(TestModeTest, OnLoadRegistersTheSevenNativesForJni16) {
    EXPECT_EQ(jvm::onLoadResult(), JNI_VERSION_1_6);
    EXPECT_EQ(registerNatives(env_), 1);
    EXPECT_FALSE(log_.containsFragment("registerNativeMethods"));
}

TEST_F(TestModeTest, EnterReturnsZeroWithAControllerAndMinusOneWithout) {
    EXPECT_EQ(jvm::callInt(obj_, "enterTestModeNative", "()I"), 0);
    EXPECT_EQ(commandsSent(*hal_).size(), 5u);
    EXPECT_EQ(jvm::callInt(obj_, "quitTestModeNative", "()I"), 0);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x03, 0x0C, 0x00}));

    withoutController();
    EXPECT_EQ(jvm::callInt(obj_, "enterTestModeNative", "()I"), -1);
    EXPECT_EQ(jvm::callInt(obj_, "quitTestModeNative", "()I"), 0);  // no session: still 0
}

TEST_F(TestModeTest, JavaBooleanSelectsThePhy) {
    jvm::callVoid(obj_, "sendTestCommandNative", "(IZ)V", 12440, JNI_TRUE);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x34, 0x20, 0x04, 0x13, 0x25, 0x00, 0x02}));
    jvm::callVoid(obj_, "sendTestCommandNative", "(IZ)V", 12440, JNI_FALSE);
    EXPECT_EQ(commandsSent(*hal_).back(), (Bytes{0x1E, 0x20, 0x03, 0x13, 0x25, 0x00}));
}

TEST_F(TestModeTest, UnknownCodeReturnsWithNothingSent) {
    jvm::callVoid(obj_, "sendTestCommandNative", "(IZ)V", 0, JNI_FALSE);
    EXPECT_FALSE(env_->ExceptionCheck());
    EXPECT_TRUE(commandsSent(*hal_).empty());
}

TEST_F(TestModeTest, ContinuousWaveTakesChannelPowerTypeInThatOrder) {
    jvm::callVoid(obj_, "sendCwtxCommandNative", "(III)V", 1, 9, 4);
    EXPECT_EQ(commandsSent(*hal_).back(),
              (Bytes{0x04, 0xFC, 0x09, 0x05, 0x01, 0x09, 0x04, 0x20, 0x00, 0x00, 0x00, 0x00}));
}

TEST_F(TestModeTest, DestroyThenATestNativeOpensAFreshSession) {
    jvm::callVoid(obj_, "sendTestCommandNative", "(IZ)V", 22440, JNI_TRUE);
    jvm::callVoid(obj_, "destoryNative", "()V");
    EXPECT_EQ(hal_->closeCalls(), 1);
    jvm::callVoid(obj_, "sendTestCommandNative", "(IZ)V", 22440, JNI_TRUE);
    EXPECT_EQ(hal_->initializeCalls(), 2);
    EXPECT_EQ(commandsSent(*hal_).size(), 2u);
}

TEST_F(TestModeTest, MissingClassIsRefusedWithItsLine) {
    EXPECT_EQ(registerNativeMethods(env_, "halvenor/test/NoSuchClass", gMethods, 7), 0);
    EXPECT_FALSE(env_->ExceptionCheck());
    EXPECT_TRUE(log_.contains(ERROR, "registerNativeMethods unable to find class 'halvenor/test/NoSuchClass'\n"));
}

TEST_F(TestModeTest, ClassThatDoesNotMatchTheTableIsRefused) {
    for (const char* name : {"halvenor/test/MissingNative", "halvenor/test/WrongSignature"}) {
        log_.clear();
        EXPECT_EQ(registerNativeMethods(env_, name, gMethods, 7), 0) << name;
        EXPECT_FALSE(env_->ExceptionCheck()) << name;
        EXPECT_TRUE(log_.contains(ERROR, std::string("registerNativeMethods failed for '") + name + "'\n"))
                << name;
    }
}

TEST_F(TestModeTest, OnLoadFromAThreadOutsideTheVmFails) {
    jint result = 0;
    std::thread loader([&] { result = JNI_OnLoad(jvm::vm(), nullptr); });
    loader.join();
    EXPECT_EQ(result, -1);
    EXPECT_TRUE(log_.contains(ERROR, "ERROR: GetEnv failed\n"));
    EXPECT_FALSE(log_.containsFragment("BinaryDictionary"));
}

}  // namespace
