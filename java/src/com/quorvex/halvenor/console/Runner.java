// Runs each console step against the bench and records what the controller answered to
// every command of it. Main thread only; the shutdown hook reaches the controller through
// the bench and reads the step in progress.
package com.quorvex.halvenor.console;

import java.util.List;

final class Runner {
    /**
     * LE test packets repeat every I(L) = ceil((L + 249) / 625) x 625 us (Core Specification,
     * Vol 6, Part F, 4.1.6). The library's 37-byte payloads last 376 us on LE 1M and 192 us
     * on LE 2M, so both repeat every 625 us: 1600 packets a second.
     */
    static final double PACKET_INTERVAL_US = 625;
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

    private final Bench bench;
    private final Observer observer;
    private final Progress progress;
    private volatile Step current;

    Runner(Bench bench, Observer observer, Progress progress) {
        this.bench = bench;
        this.observer = observer;
        this.progress = progress;
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
        bench.enterDeviceUnderTest();
        if (!settle(s, DUT_ENTRY, DUT_MAY_REFUSE)) {
            return s;
        }
        if (holdSeconds > 0) {
            s.seconds = holdSeconds;
            progress.hold("dut on", holdSeconds, 0, holdSeconds);
            observer.mark();
            bench.reset();
            settle(s, List.of(RESET), List.of());
        }
        return s;
    }

    Step dutOff() {
        Step s = begin(new Step("dut off", "HCI Reset"));
        bench.leaveDeviceUnderTest();
        settle(s, List.of(RESET), PROBE);
        return s;
    }

    Step tx(Band band, Phy phy, double seconds) {
        Step s = begin(leStep("tx", band, phy));
        s.seconds = seconds;
        if (!bench.startLeTest(band.txCode(), phy.enhanced)) {
            settle(s, List.of(phy.txOpcode), List.of());
            return s.ok ? s.fail("LE Transmitter Test not confirmed by the library") : s;
        }
        progress.hold(s.name + " " + s.setting, seconds, 0, seconds);
        bench.endLeTest();
        settle(s, List.of(phy.txOpcode, LE_TEST_END), List.of());
        return s;
    }

    /** An RX test longer than one window runs as several, so the 16-bit count never wraps. */
    Step rx(Band band, Phy phy, double seconds, Long expectedGiven, double window) {
        Step s = begin(leStep("rx", band, phy));
        s.seconds = seconds;
        long received = 0;
        long expectedFromTime = 0;
        double done = 0;
        while (done < seconds - 1e-9) {
            double w = Math.min(window, seconds - done);
            observer.mark();
            if (!bench.startLeTest(band.rxCode(), phy.enhanced)) {
                settle(s, List.of(phy.rxOpcode), List.of());
                return s.ok ? s.fail("LE Receiver Test not confirmed by the library") : s;
            }
            progress.hold(s.name + " " + s.setting, w, done, seconds);
            Bench.End end = bench.endLeTest();
            List<Observer.Exchange> exchanges = observer.exchanges();
            if (!settle(s, List.of(phy.rxOpcode, LE_TEST_END), List.of())) {
                return s;
            }
            if (end.packets() == null) {
                return s.fail("LE Test End accepted without a packet count");
            }
            s.windows.add(end.packets());
            received += end.packets();
            expectedFromTime += windowPackets(exchanges);
            done += w;
        }
        s.received = received;
        s.expectedGiven = expectedGiven != null;
        s.expected = expectedGiven != null ? expectedGiven : expectedFromTime;
        s.per = Per.of(received, s.expected);
        return s;
    }

    /** The carrier is stopped with a Reset, the only way the library has to end it. */
    Step cw(int channel, int power, int type, double seconds) {
        Step s = begin(new Step("cw", String.format("channel 0x%02x power 0x%02x type 0x%02x", channel, power, type)));
        s.wave = new int[] {channel, power, type};
        s.seconds = seconds;
        bench.startContinuousWave(channel, power, type);
        if (!settle(s, List.of(CW), PROBE)) {
            bench.reset();
            return s;
        }
        progress.hold("cw " + s.setting, seconds, 0, seconds);
        observer.mark();
        bench.reset();
        settle(s, List.of(RESET), List.of());
        return s;
    }

    /**
     * Packets a transmitter sending without pause puts in the controller's window, timed from
     * the capture of the start to the capture of the end, both taken as the commands left for
     * the controller, so the delays on the way cancel out. Only whole packet intervals count:
     * a packet at the window's edge that the controller may or may not have heard is never
     * counted as lost, which with windows of at least a second moves PER by at most one
     * packet in 1600 per window.
     */
    private static long windowPackets(List<Observer.Exchange> window) {
        long start = window.get(0).sentMicros();
        long end = window.get(window.size() - 1).sentMicros();
        return (long) Math.floor(Math.max(0, end - start) / PACKET_INTERVAL_US);
    }

    private Step begin(Step s) {
        current = s;
        observer.mark();
        return s;
    }

    // Records the commands since the mark; the step passes only when each required command
    // was sent and the controller accepted every command (or refused one that may be refused).
    private boolean settle(Step s, List<Integer> required, List<Integer> mayRefuse) {
        List<Observer.Exchange> exchanges = observer.exchanges();
        synchronized (s) {  // the report may be printing an interrupted step's commands
            if (s.interrupted) {
                return false;
            }
            s.commands.addAll(exchanges);
            String why = observer.failure(exchanges, required, mayRefuse);
            if (why == null) {
                return s.pass().ok;
            }
            s.unreachable = exchanges.isEmpty();
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
