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
    /** A receiver verdict against the PER limit. */
    enum Verdict { PASS, FAIL, INCONCLUSIVE }

    /** One counting window: the controller's count, and its window as timed, at its shortest and longest. */
    record Window(int count, long micros, long shortestMicros, long longestMicros, long startMicros) {}

    /** Each receiver window, in order. */
    final List<Window> windows = new ArrayList<>();
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
    Verdict verdict;
    String verdictWhy;        // why a verdict is not PASS, or null
    /** When the step began, from the wall clock. */
    final long startMillis = System.currentTimeMillis();
    /** Every command of the step, with the controller's answer. */
    List<Observer.Exchange> commands = List.of();
    volatile boolean ok;
    volatile String error;
    /** Nothing reached a controller: later steps would fail the same way. */
    boolean unreachable;
    /** The machine's adapter could not be taken as it is set up (down, permissions): the user's to fix. */
    boolean setupRefused;
    volatile boolean interrupted;

    Step(String name, String setting) {
        this.name = name;
        this.setting = setting;
    }

    /** The setting as the 80-column table shows it. */
    String label() {
        if (band != null) {
            return band.mhz + " MHz LE " + phy.name;
        }
        if (wave != null) {
            return "ch " + wave[0] + " pw " + wave[1] + " type " + wave[2];
        }
        return name.equals("dut on") ? "DUT mode" : setting;
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
