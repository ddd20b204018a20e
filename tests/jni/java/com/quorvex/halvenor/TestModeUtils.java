package com.quorvex.halvenor;

import java.util.ArrayList;
import java.util.List;

/**
 * Test stand-in for the application class: the seven natives as the library
 * registers them, and callbacks that record each call (and can be told to throw).
 */
public class TestModeUtils {
    private static final List<String> calls = new ArrayList<>();
    public static volatile boolean throwFromCallbacks = false;

    public static native void classInitNative();
    public native void initNative();
    public native int enterTestModeNative();
    public native int quitTestModeNative();
    public native void sendTestCommandNative(int code, boolean enhanced);
    public native void destoryNative();
    public native void sendCwtxCommandNative(int channel, int power, int type);

    public void onReceivedTestData(int value) {
        record("received " + value);
    }

    public void onSendCmdSuccess(int code) {
        record("success " + code);
    }

    private static void record(String call) {
        synchronized (calls) {
            calls.add(call);
        }
        if (throwFromCallbacks) throw new IllegalStateException("callback failed: " + call);
    }

    /** The calls recorded since the last take, comma-separated, oldest first. */
    public static String takeCalls() {
        synchronized (calls) {
            String all = String.join(",", calls);
            calls.clear();
            return all;
        }
    }
}
