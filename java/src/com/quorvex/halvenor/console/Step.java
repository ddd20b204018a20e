// One line of the results: what ran, with which settings, what the controller reported.
// The main thread fills it; the interrupt hook may finish it instead. Every change, and
// every read of its lists, holds the step's lock, and nothing changes it once interrupted.
package com.quorvex.halvenor.console;

import java.util.ArrayList;
import java.util.List;

final class Step {
    final String name;        // "dut on", "dut off", "tx", "rx", "cw"
    final String setting;     // human-readable settings, "" when there are none
    Band band;
    Phy phy;
    int[] wave;               // channel, power, type of a continuous-wave step
    double seconds = Double.NaN;
    /** Where the step began in what the console observed. */
    volatile Observer.Mark mark;
    /** The count of each receiver window, in order. */
    final List<Integer> windows = new ArrayList<>();
    /** The controller's counting windows, summed: as timed, and at their shortest and longest. */
    long windowMicros;
    long shortestMicros;
    long longestMicros;
    Long expectedGiven;       // --expected, or null
    Long received;
    Long expected;
    /** Packets a transmitter sending without pause could have put in the windows, at least and at most. */
    long expectedLow;
    long expectedHigh;
    Per per;
    /** Every command of the step, with the controller's answer. */
    List<Observer.Exchange> commands = List.of();
    volatile boolean ok;
    volatile String error;
    /** Nothing reached a controller: later steps would fail the same way. */
    boolean unreachable;
    volatile boolean interrupted;

    Step(String name, String setting) {
        this.name = name;
        this.setting = setting;
    }

    synchronized Step fail(String why) {
        if (!interrupted) {
            ok = false;
            error = why;
        }
        return this;
    }

    synchronized Step pass() {
        if (!interrupted) {
            ok = true;
            error = null;
        }
        return this;
    }

    synchronized void interrupt(String why) {
        interrupted = true;
        ok = false;
        error = why;
    }

    /** The step's commands so far; false once the step was interrupted. */
    synchronized boolean record(List<Observer.Exchange> all) {
        if (!interrupted) {
            commands = List.copyOf(all);
        }
        return !interrupted;
    }

    /** Timing uncertainty of the windows: how much longer or shorter they may have been. */
    synchronized long uncertaintyMicros() {
        return longestMicros - shortestMicros;
    }

    /** More than 5 % of the window: PER cannot be judged from it. */
    synchronized boolean timingTooUncertain() {
        return received != null && expectedGiven == null && uncertaintyMicros() > 0.05 * windowMicros;
    }
}
