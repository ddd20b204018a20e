// An application class whose sendTestCommandNative takes two ints instead of (int, boolean):
// the library must refuse to load.
package com.quorvex.halvenor;

public class TestModeUtils {
    static {
        System.loadLibrary("halvenor");
    }

    private static native void classInitNative();

    native void initNative();

    native int enterTestModeNative();

    native int quitTestModeNative();

    native void sendTestCommandNative(int code, int enhanced);

    native void destoryNative();

    native void sendCwtxCommandNative(int channel, int power, int type);

    void onReceivedTestData(int packets) {}

    void onSendCmdSuccess(int code) {}
}
