// The Java binding through the JNI interface: callbacks reach only a bound
// object of a class that has both, a thrown exception is cleared, a thread
// the VM does not know reaches nothing, and every object bound is let go.
#include "jni/binding.h"

#include <android/log.h>

#include <thread>

#include "engine/test_mode.h"
#include "jni/TestMode.h"
#include "tests/engine/hal_session.h"
#include "tests/support/fake_java.h"

namespace {

const int INFO = ANDROID_LOG_INFO;
const int ERROR = ANDROID_LOG_ERROR;
uint8_t kTestEnd42[] = {0x0E, 0x06, 0x01, 0x1F, 0x20, 0x00, 0x2A, 0x00};

class BindingTest : public HalSessionTest {
  protected: void TearDown() override {
        destoryNative(fakeJavaEnv(), nullptr);
        setJavaThrows(false);
        EXPECT_EQ(0, liveGlobalRefs());
        HalSessionTest::TearDown();
    }
};

TEST_F(BindingTest, NothingReachesJavaUnlessAClassWithBothCallbacksAndAnObjectAreBound) {
    bindFakeJava(false);
    EXPECT_TRUE(log_.contains(ERROR, "classInitNative, GetMethodID error return!!!"));
    EXPECT_FALSE(log_.containsFragment("classInitNative, PATH"));
    sendBleTestCommand(22440, 0);  // one callback found is not enough to call either
    EXPECT_EQ(takeJavaCalls(), "");
    bindFakeJava();
    EXPECT_TRUE(log_.contains(INFO, "classInitNative, PATH: /dev/smd3"));
    EXPECT_EQ(1, liveGlobalRefs()) << "the first object let go";
    sendBleTestCommand(22440, 0);
    EXPECT_EQ(takeJavaCalls(), "success 22440");
    EXPECT_EQ(quitTestModeNative(fakeJavaEnv(), nullptr), 0);  // the app's sign that the mode was left

    destoryNative(fakeJavaEnv(), nullptr);
    EXPECT_TRUE(log_.contains(INFO, "destoryNative, Delete global ref sTestModeObject"));
    EXPECT_EQ(0, liveGlobalRefs());
    sendBleTestCommand(22440, 0);
    cmd_test_end_flag = 1;
    onReceivedTestData(kTestEnd42, sizeof(kTestEnd42));
    EXPECT_EQ(takeJavaCalls(), "");
    EXPECT_TRUE(log_.contains(ERROR, "onReceivedTestData, object or method not bound return!!!"));
    cmd_test_end_flag = 0;
}

TEST_F(BindingTest, CountIsReportedOnceAndAFlagClearMeansNoCall) {
    bindFakeJava();
    onReceivedTestData(kTestEnd42, sizeof(kTestEnd42));
    EXPECT_TRUE(log_.contains(INFO, "Receive cmd_test_end_flag = false"));
    cmd_test_end_flag = 1;
    onReceivedTestData(kTestEnd42, sizeof(kTestEnd42));
    onReceivedTestData(kTestEnd42, sizeof(kTestEnd42));
    EXPECT_EQ(takeJavaCalls(), "received 42");
    EXPECT_EQ(cmd_test_end_flag, 0);
}

// A callback that throws leaves the exception for the next JNI call of the
// same native; the library clears it and carries on.
TEST_F(BindingTest, ThrowingCallbacksAreClearedAndTheLibraryGoesOn) {
    bindFakeJava();
    answerWith([](const Bytes& command) {
        return Packets{commandComplete(opcodeOf(command), {0x00, 0x2A, 0x00})};
    });
    sendBleTestCommand(22440, 0);
    setJavaThrows(true);
    sendBleTestCommand(3000, 0);
    EXPECT_EQ(takeJavaCalls(), "success 22440,received 42,success 3000");
    EXPECT_TRUE(log_.contains(ERROR, "onReceivedTestData, Java exception thrown and cleared!!!"));
    EXPECT_TRUE(log_.contains(ERROR, "onSendCmdSuccess, Java exception thrown and cleared!!!"));
}

TEST_F(BindingTest, ThreadOutsideTheVmReachesNothingAndLeavesTheCountPending) {
    bindFakeJava();
    cmd_test_end_flag = 1;
    std::thread other([] {
        onReceivedTestData(kTestEnd42, sizeof(kTestEnd42));
        onSendCmdSuccess(3000);
    });
    other.join();
    EXPECT_TRUE(log_.contains(ERROR, "onReceivedTestData, GetEnv error return!!!"));
    EXPECT_TRUE(log_.contains(ERROR, "onSendCmdSuccess, GetEnv error return!!!"));
    EXPECT_EQ(cmd_test_end_flag, 1);
    EXPECT_EQ(takeJavaCalls(), "");
    cmd_test_end_flag = 0;
}

}  // namespace
