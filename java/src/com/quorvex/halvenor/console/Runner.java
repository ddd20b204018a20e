// Runs each console step against the bench and records what the controller answered to
// every command of it. Main thread only; the shutdown hook reaches the controller through
// the bench and finishes the step in progress with what it measured.
package com.quorvex.halvenor.console;

import java.util.List;

final class Runner {
    /** The controller's count is 16 bits; 40.96 s of packets would wrap it. */
    static final double MAX_WINDOW_S = 40;
    static final double DEFAULT_WINDOW_S = 30;
    static final int LE_TEST_END = 0x201f;
    static final int RESET = 0x0c03;
    static final int CW = 0xfc04;
    private static final List<Integer> DUT_ENTRY = List.of(0x1803, 0x0c05, 0x0c1a, 0x0c20, 0x0c22);
    /** Write Authentication Enable and Write Encryption Mode only turn off what is off by default. */
    private static final List<Integer> DUT_MAY_REFUSE = List.of(0x0c20, 0x0c22);
    /** The LE Test End that opens a session in a fresh process; a controller without LE refuses it. */
    private static final List<Integer> PROBE = List.of(LE_TEST_END);
    /** Cleaning up after a failed start: Test End with nothing running, and the Reset after it. */
    private static final List<Integer> CLEANUP = List.of(LE_TEST_END, RESET);

    private final Bench bench;
    private final Observer observer;
    private final Progress progress;
    private final double limit;
    private final long minPackets;
    private volatile Step current;
    private volatile Observer.Mark window;

    Runner(Bench bench, Observer observer, Progress progress, double limit, long minPackets) {
        this.bench = bench;
        this.observer = observer;
        this.progress = progress;
        this.limit = limit;
        this.minPackets = minPackets;
    }

    /** The step running now, or null between steps. */
    Step current() {
        return current;
    }

    Step run(Plan.Item item) {
        Step s = item.run(this);
        current = null;
        return s;
    }

    Step dutOn(double holdSeconds) {
        Step s = begin(new Step("dut on", "Device Under Test mode"));
        boolean entered = bench.enterDeviceUnderTest();
        if (!settle(s, DUT_ENTRY, DUT_MAY_REFUSE, entered, "Device Under Test mode")) {
            return s;
        }
        if (holdSeconds > 0) {
            s.seconds = holdSeconds;
            String lost = hold(s, "dut on", holdSeconds, 0, holdSeconds);
            bench.reset();
            if (settle(s, List.of(RESET), List.of(), true, null) && lost != null) {
                s.fail(lost);
            }
        }
        return s;
    }

    Step dutOff() {
        Step s = begin(new Step("dut off", "HCI Reset"));
        bench.leaveDeviceUnderTest();
        settle(s, List.of(RESET), PROBE, true, null);
        return s;
    }

    Step tx(Band band, Phy phy, double seconds) {
        Step s = begin(leStep("tx", band, phy));
        s.seconds = seconds;
        boolean started = bench.startLeTest(band.txCode(), phy.enhanced);
        String lost = started ? hold(s, s.name + " " + s.setting, seconds, 0, seconds) : null;
        Bench.End end = stopTest(s.mark);
        if (settle(s, List.of(phy.txOpcode, LE_TEST_END), started ? List.of() : CLEANUP, started && end.confirmed(),
                   started ? "LE Test End" : "LE Transmitter Test") && lost != null) {
            s.fail(lost);
        }
        return s;
    }

    /** An RX test longer than one window runs as several, so the 16-bit count never wraps. */
    Step rx(Band band, Phy phy, double seconds, Long expectedGiven, double windowSeconds) {
        Step s = begin(leStep("rx", band, phy));
        s.seconds = seconds;
        s.expectedGiven = expectedGiven;
        for (double done = 0; done < seconds - 1e-9; done += windowSeconds) {
            double w = Math.min(windowSeconds, seconds - done);
            window = observer.mark();
            boolean started = bench.startLeTest(band.rxCode(), phy.enhanced);
            String lost = started ? hold(s, s.name + " " + s.setting, w, done, seconds) : null;
            Bench.End end = stopTest(window);
            if (!settle(s, List.of(phy.rxOpcode, LE_TEST_END), started ? List.of() : CLEANUP,
                        started && end.confirmed(), started ? "LE Test End" : "LE Receiver Test")) {
                return s;
            }
            if (lost != null) {
                return s.fail(lost);
            }
            if (end.packets() == null) {
                return s.fail("LE Test End accepted without a packet count");
            }
            if (!count(s, window, end.packets())) {
                return s;
            }
        }
        String impossible = Windows.judge(s, limit, minPackets);
        return impossible == null ? s : s.fail(impossible);
    }

    /** The carrier is stopped with a Reset, the only way the library has to end it. */
    Step cw(int channel, int power, int type, double seconds) {
        Step s = begin(new Step("cw", String.format("channel 0x%02x power 0x%02x type 0x%02x", channel, power, type)));
        s.wave = new int[] {channel, power, type};
        s.seconds = seconds;
        bench.startContinuousWave(channel, power, type);
        if (!settle(s, List.of(CW), PROBE, true, null)) {
            bench.reset();
            return s;
        }
        String lost = hold(s, "cw " + s.setting, seconds, 0, seconds);
        bench.reset();
        if (settle(s, List.of(RESET), List.of(), true, null) && lost != null) {
            s.fail(lost);
        }
        return s;
    }

    /**
     * From the interrupt hook, once the bench has stopped the controller: the step keeps its
     * commands, and the count of the window the hook ended when the controller gave one.
     */
    void interrupted(Step s, Bench.End end, String why) {
        synchronized (s) {
            if (s.interrupted) {
                return;
            }
            List<Observer.Exchange> commands = observer.exchanges(s.mark);
            s.record(commands);
            if (end != null && !end.confirmed()) {
                String cause = observer.failure(s.mark, commands, List.of(), List.of());
                why += cause == null ? "" : " (" + cause + ")";
            }
            Observer.Mark w = window;
            if (s.name.equals("rx") && end != null && end.packets() != null && w != null) {
                count(s, w, end.packets());
                Windows.judge(s, limit, minPackets);
            }
            s.interrupt(why);
        }
    }

    // Waits out a test, drawing progress; ends early, with the cause, when the controller goes away.
    private String hold(Step s, String label, double seconds, double doneBefore, double total) {
        String[] lost = new String[1];
        progress.hold(label, seconds, doneBefore, total, () -> (lost[0] = observer.lost(s.mark)) != null);
        return lost[0];
    }

    // LE Test End after every start that reached a controller, confirmed or not; a Reset when
    // the end was not confirmed, so that no test is left running on the controller.
    private Bench.End stopTest(Observer.Mark since) {
        if (observer.exchanges(since).isEmpty()) {
            return new Bench.End(false, null);
        }
        Bench.End end = bench.endLeTest();
        if (!end.confirmed()) {
            bench.reset();
        }
        return end;
    }

    // Adds the window the controller counted, timed from the capture; false (the step failed)
    // when the capture lacks the replies that bound it.
    private boolean count(Step s, Observer.Mark from, int packets) {
        String why = Windows.add(s, observer.exchanges(from), s.phy.rxOpcode, packets);
        if (why != null) {
            s.fail(why);
        }
        return why == null;
    }

    private Step begin(Step s) {
        Observer.Mark m = observer.mark();
        observer.forgetBefore(m);
        s.mark = m;
        window = null;
        current = s;
        return s;
    }

    // Records the step's commands; the step passes only when each required command was sent,
    // the controller accepted every command (or refused one that may be refused) and the
    // library confirmed what it reports. A disagreement between the two says both.
    private boolean settle(Step s, List<Integer> required, List<Integer> mayRefuse, boolean confirmed, String what) {
        List<Observer.Exchange> exchanges = observer.exchanges(s.mark);
        synchronized (s) {  // the report may be printing an interrupted step's commands
            if (!s.record(exchanges)) {
                return false;
            }
            String hardware = observer.hardwareError(s.mark);
            if (hardware != null) {
                s.fail(hardware);
                return false;
            }
            String why = observer.failure(s.mark, exchanges, required, mayRefuse);
            if (why == null && confirmed) {
                return s.pass().ok;
            }
            if (why == null) {
                why = "the controller accepted every command, but the library did not confirm " + what;
            } else if (confirmed && what != null) {
                why += ", though the library confirmed " + what;
            }
            s.unreachable = exchanges.isEmpty();
            s.setupRefused = s.unreachable && observer.setupRefused(s.mark);
            s.fail(why);
            return false;
        }
    }

    private static Step leStep(String name, Band band, Phy phy) {
        Step s = new Step(name, band.label() + " LE " + phy.name);
        s.band = band;
        s.phy = phy;
        return s;
    }
}
