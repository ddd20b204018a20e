// The console's one TestModeUtils object: serialises the native calls of the main thread
// and of the shutdown hook, and turns the library's callbacks into step outcomes.
package com.quorvex.halvenor.console;

import com.quorvex.halvenor.TestModeUtils;
import java.util.ArrayList;
import java.util.List;

final class Bench implements TestModeUtils.Listener {

    /** What the controller is doing on the console's behalf, so an interrupt can end it. */
    enum Activity { IDLE, LE_TEST, CONTINUOUS_WAVE, DEVICE_UNDER_TEST }

    /** Thrown on the main thread once the shutdown hook has taken the controller over. */
    static final class Closed extends RuntimeException {
        private static final long serialVersionUID = 1L;
    }

    /** The outcome of an LE Test End: confirmed by the library, and the count it reported (or null). */
    record End(boolean confirmed, Integer packets) {}

    /** What an interrupt did to stop the controller, and the Test End it sent (or null). */
    record Stop(String what, End end) {}

    private final Object lock = new Object();
    private final TestModeUtils radio;
    private final Observer observer;
    // Callbacks arrive on the thread inside the native call, which holds the lock.
    private final List<String> events = new ArrayList<>();
    private boolean closed;
    private boolean sessionOpen;
    private Activity activity = Activity.IDLE;

    Bench(Observer observer) {
        this.observer = observer;
        radio = new TestModeUtils(this);
        radio.initNative();
    }

    @Override
    public void onReceivedTestData(int packets) {
        events.add("count:" + packets);
    }

    @Override
    public void onSendCmdSuccess(int code) {
        events.add("sent:" + code);
    }

    /** Starts an LE test; true when the library confirmed that the controller accepted it. */
    boolean startLeTest(int code, boolean enhanced) {
        synchronized (lock) {
            checkOpen();
            events.clear();
            // Unconfirmed, the test may still have started (its reply came late): it is
            // ended like a confirmed one.
            activity = Activity.LE_TEST;
            Observer.Mark before = observer.mark();
            radio.sendTestCommandNative(code, enhanced);
            boolean confirmed = events.equals(List.of("sent:" + code));
            sessionOpen = confirmed || !observer.exchanges(before).isEmpty();
            return confirmed;
        }
    }

    /** Ends the running LE test and collects the count the controller reported with it. */
    End endLeTest() {
        synchronized (lock) {
            checkOpen();
            return endLocked();
        }
    }

    /** Enters Device Under Test mode; false when the controller is not in it (no session is left then). */
    boolean enterDeviceUnderTest() {
        synchronized (lock) {
            checkOpen();
            boolean entered = radio.enterTestModeNative() == 0;
            sessionOpen = entered;
            if (entered) {
                activity = Activity.DEVICE_UNDER_TEST;
            }
            return entered;
        }
    }

    /**
     * Leaves Device Under Test mode with a Reset. The library sends it only on an open
     * session, so a fresh process first opens one; false when no controller answered.
     */
    boolean leaveDeviceUnderTest() {
        synchronized (lock) {
            checkOpen();
            if (!sessionOpen && !openSession()) {
                return false;
            }
            return quitLocked();
        }
    }

    /** Sends the continuous-wave command; false when no session could be opened for it. */
    boolean startContinuousWave(int channel, int power, int type) {
        synchronized (lock) {
            checkOpen();
            if (!sessionOpen && !openSession()) {
                return false;
            }
            activity = Activity.CONTINUOUS_WAVE;
            radio.sendCwtxCommandNative(channel, power, type);
            return true;
        }
    }

    /** Stops a continuous-wave transmission (or anything else) with a Reset. */
    boolean reset() {
        synchronized (lock) {
            checkOpen();
            return quitLocked();
        }
    }

    /**
     * Runs from the shutdown hook: ends whatever the controller is doing for the console,
     * releases the library and keeps the main thread from sending anything afterwards.
     * Returns what it did, or null when nothing was running.
     */
    Stop interrupt() {
        synchronized (lock) {
            if (closed) {
                return new Stop(null, null);
            }
            Stop done = stopActivityLocked();
            closed = true;
            radio.destoryNative();
            return done;
        }
    }

    /** Releases the library at the end of a run. */
    void close() {
        synchronized (lock) {
            if (!closed) {
                closed = true;
                radio.destoryNative();
            }
        }
    }

    private Stop stopActivityLocked() {
        switch (activity) {
            case LE_TEST: {
                End end = endLocked();
                if (!end.confirmed()) {
                    quitLocked();
                    return new Stop("sent LE Test End, then HCI Reset as it was not confirmed", end);
                }
                return new Stop(end.packets() == null ? "sent LE Test End"
                                : "sent LE Test End (" + end.packets() + " packets received)", end);
            }
            case CONTINUOUS_WAVE:
            case DEVICE_UNDER_TEST:
                quitLocked();
                return new Stop("sent HCI Reset", null);
            default:
                return new Stop(null, null);
        }
    }

    // The count is reported before the end's own confirmation, and exactly once.
    private End endLocked() {
        events.clear();
        activity = Activity.IDLE;
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        String done = "sent:" + TestModeUtils.TEST_END;
        if (!events.contains(done)) {
            return new End(false, null);
        }
        if (events.size() == 2 && events.get(1).equals(done) && events.get(0).startsWith("count:")) {
            return new End(true, Integer.parseInt(events.get(0).substring(6)));
        }
        return new End(true, null);
    }

    // An LE Test End is harmless when no test runs. A controller without LE refuses it, but
    // it was sent all the same, and a session is all it is for.
    private boolean openSession() {
        events.clear();
        Observer.Mark before = observer.mark();
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        sessionOpen = observer.exchanges(before).stream().anyMatch(e -> e.opcode() == Runner.LE_TEST_END);
        return sessionOpen;
    }

    private boolean quitLocked() {
        activity = Activity.IDLE;
        sessionOpen = false;
        return radio.quitTestModeNative() == 0;
    }

    private void checkOpen() {
        if (closed) {
            throw new Closed();
        }
    }
}
