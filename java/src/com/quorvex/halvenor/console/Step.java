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
    boolean ok;
    String error;
    /** Nothing reached a controller: later steps would fail the same way. */
    boolean unreachable;
    boolean interrupted;

    Step(String name, String setting) {
        this.name = name;
        this.setting = setting;
    }

    Step fail(String why) {
        ok = false;
        error = why;
        return this;
    }

    Step pass() {
        ok = true;
        error = null;
        return this;
    }
}
