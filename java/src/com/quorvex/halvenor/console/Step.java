// One line of the results: what ran, with which settings, what the controller reported.
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
    final List<Integer> windows = new ArrayList<>();
    Long received;
    Long expected;
    boolean expectedGiven;
    Per per;
    /** Every command of the step, with the controller's answer. */
    final List<Observer.Exchange> commands = new ArrayList<>();
    volatile boolean ok;
    volatile String error;
    /** Nothing reached a controller: later steps would fail the same way. */
    boolean unreachable;
    volatile boolean interrupted;

    Step(String name, String setting) {
        this.name = name;
        this.setting = setting;
    }

    // A signal's hook interrupts the step while the main thread may still be settling
    // it: once interrupted, nothing the main thread finds afterwards changes the result.
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
}
