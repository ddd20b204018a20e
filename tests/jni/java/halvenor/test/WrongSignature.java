package halvenor.test;

/** The seven natives, but sendTestCommandNative takes two ints. */
public class WrongSignature {
    public static native void classInitNative();
    public native void initNative();
    public native int enterTestModeNative();
    public native int quitTestModeNative();
    public native void sendTestCommandNative(int code, int enhanced);
    public native void destoryNative();
    public native void sendCwtxCommandNative(int channel, int power, int type);
}
