// The application side of libhalvenor.so: declares the natives the library
// registers and receives its two up-calls on the thread that called a native.
package com.quorvex.halvenor;

/**
 * Drives the Bluetooth controller's radio test modes through {@code libhalvenor.so}.
 *
 * <p>Loading this class loads the library (found through {@code java.library.path}) and
 * looks up the two callbacks. A caller then binds one object with {@link #initNative()},
 * calls the test natives one at a time, and releases everything with
 * {@link #destoryNative()}:
 *
 * <pre>{@code
 * TestModeUtils radio = new TestModeUtils(new TestModeUtils.Listener() {
 *     public void onSendCmdSuccess(int code) { ... }
 *     public void onReceivedTestData(int packets) { ... }
 * });
 * radio.initNative();
 * radio.sendTestCommandNative(TestModeUtils.RX_2440, true);  // LE 2M receiver test
 * radio.sendTestCommandNative(TestModeUtils.TEST_END, false); // count arrives first
 * radio.destoryNative();
 * }</pre>
 *
 * <p>Every call blocks its thread until the controller has answered, and the callbacks run
 * on that thread before the native returns. The library takes no lock: calls must not
 * overlap, and {@link #destoryNative()} must not run while another native is running.
 */
public class TestModeUtils {

    /**
     * Receives what the library reports. Both methods run on the thread inside the native
     * call that caused them; an exception thrown here is handed to the thread's
     * uncaught-exception handler and does not reach the library.
     */
    public interface Listener {
        /** Number of packets an LE test counted (0 to 65535), reported once per Test End. */
        default void onReceivedTestData(int packets) {}

        /** The test command code, after each {@link #sendTestCommandNative} that reached a controller. */
        default void onSendCmdSuccess(int code) {}
    }

    /** Ends the running LE test; its packet count goes to {@link Listener#onReceivedTestData}. */
    public static final int TEST_END = 3000;
    /** LE transmitter tests, named by centre frequency in MHz (channels 0, 19 and 39). */
    public static final int TX_2402 = 12402;
    public static final int TX_2440 = 12440;
    public static final int TX_2480 = 12480;
    /** LE receiver tests, named by centre frequency in MHz (channels 0, 19 and 39). */
    public static final int RX_2402 = 22402;
    public static final int RX_2440 = 22440;
    public static final int RX_2480 = 22480;

    static {
        System.loadLibrary("halvenor");
        classInitNative();
    }

    private volatile Listener listener;

    public TestModeUtils(Listener listener) {
        this.listener = listener;
    }

    public TestModeUtils() {
        this(null);
    }

    /** Replaces the listener; {@code null} drops the callbacks. */
    public void setListener(Listener listener) {
        this.listener = listener;
    }

    /** Looks up {@code onReceivedTestData} and {@code onSendCmdSuccess}; runs once when the class loads. */
    private static native void classInitNative();

    /** Binds this object as the target of the callbacks. */
    public native void initNative();

    /** Enters classic Device Under Test mode: 0 once the sequence was sent, -1 when no controller could be reached. */
    public native int enterTestModeNative();

    /** Leaves Device Under Test mode with an HCI Reset and closes the controller session; always 0. */
    public native int quitTestModeNative();

    /**
     * Starts the LE test selected by {@code code} ({@link #TX_2402} ... {@link #RX_2480}) or ends
     * the running one ({@link #TEST_END}); {@code enhanced} selects the LE 2M PHY.
     */
    public native void sendTestCommandNative(int code, boolean enhanced);

    /** Unbinds this object and closes the controller session (the library's name, spelled so). */
    public native void destoryNative();

    /** Sends the vendor continuous-wave transmit command; each value 0 to 255. */
    public native void sendCwtxCommandNative(int channel, int power, int type);

    /** Called by the library with the packet count of an LE Test End. */
    void onReceivedTestData(int packets) {
        Listener l = listener;
        if (l == null) {
            return;
        }
        try {
            l.onReceivedTestData(packets);
        } catch (RuntimeException e) {
            report(e);
        }
    }

    /** Called by the library after each LE test command. */
    void onSendCmdSuccess(int code) {
        Listener l = listener;
        if (l == null) {
            return;
        }
        try {
            l.onSendCmdSuccess(code);
        } catch (RuntimeException e) {
            report(e);
        }
    }

    // An exception left pending would surface inside the library's next JNI call.
    private static void report(RuntimeException e) {
        Thread t = Thread.currentThread();
        t.getUncaughtExceptionHandler().uncaughtException(t, e);
    }
}
