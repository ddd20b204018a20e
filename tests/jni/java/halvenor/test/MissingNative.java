package halvenor.test;

/** Six of the seven natives: sendCwtxCommandNative is missing. */
public class MissingNative {
    public static native void classInitNative();
    public native void initNative();
    public native int enterTestModeNative();
    public native int quitTestModeNative();
    public native void sendTestCommandNative(int code, boolean enhanced);
    public native void destoryNative();
}
