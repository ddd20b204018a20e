// An application class that forgot sendCwtxCommandNative: the library must refuse to load.
package com.quorvex.halvenor;

public class TestModeUtils {
    static {
        System.loadLibrary("halvenor");
    }

    private static native void classInitNative();

    native void initNative();

    native int enterTestModeNative();

    native int quitTestModeNative();

    native void sendTestCommandNative(int code, boolean enhanced);

    native void destoryNative();

    void onReceivedTestData(int packets) {}

    void onSendCmdSuccess(int code) {}
}
