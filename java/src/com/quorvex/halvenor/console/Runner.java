// Runs each console step against the bench and records what the controller reported.
// Main thread only; the shutdown hook reaches the controller through the bench.
package com.quorvex.halvenor.console;

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

    private final Bench bench;
    private final Progress progress;

    Runner(Bench bench, Progress progress) {
        this.bench = bench;
        this.progress = progress;
    }

    Step dutOn(double holdSeconds) {
        Step s = new Step("dut on", "Device Under Test mode");
        if (!bench.enterDeviceUnderTest()) {
            return s.fail("no controller reachable: Device Under Test mode not entered");
        }
        if (holdSeconds > 0) {
            s.seconds = holdSeconds;
            progress.hold("dut on", holdSeconds, 0, holdSeconds);
            bench.reset();
        }
        return s.pass();
    }

    Step dutOff() {
        Step s = new Step("dut off", "HCI Reset");
        if (!bench.leaveDeviceUnderTest()) {
            return s.fail("no controller reachable: Reset not sent");
        }
        return s.pass();
    }

    Step tx(Band band, Phy phy, double seconds) {
        Step s = leStep("tx", band, phy);
        s.seconds = seconds;
        if (!bench.startLeTest(band.txCode(), phy.enhanced)) {
            return s.fail("no controller reachable: LE Transmitter Test not sent");
        }
        progress.hold(s.name + " " + s.setting, seconds, 0, seconds);
        Bench.End end = bench.endLeTest();
        if (end.packets() == null) {
            return s.fail(endFailure(end));
        }
        return s.pass();
    }

    /** An RX test longer than one window runs as several, so the 16-bit count never wraps. */
    Step rx(Band band, Phy phy, double seconds, Long expectedGiven, double window) {
        Step s = leStep("rx", band, phy);
        s.seconds = seconds;
        long received = 0;
        long expectedFromTime = 0;
        double done = 0;
        while (done < seconds - 1e-9) {
            double w = Math.min(window, seconds - done);
            if (!bench.startLeTest(band.rxCode(), phy.enhanced)) {
                return s.fail("no controller reachable: LE Receiver Test not sent");
            }
            long t0 = bench.confirmedAt();
            progress.hold(s.name + " " + s.setting, w, done, seconds);
            long t1 = System.nanoTime();
            Bench.End end = bench.endLeTest();
            if (end.packets() == null) {
                return s.fail(endFailure(end));
            }
            s.windows.add(end.packets());
            received += end.packets();
            // From the start's confirmation to the end's request: the controller's own window
            // is a little longer, by the time the two commands take to reach it.
            expectedFromTime += (long) Math.floor((t1 - t0) / 1e3 / PACKET_INTERVAL_US);
            done += w;
        }
        s.received = received;
        s.expectedGiven = expectedGiven != null;
        s.expected = expectedGiven != null ? expectedGiven : expectedFromTime;
        s.per = Per.of(received, s.expected);
        return s.pass();
    }

    /** The carrier is stopped with a Reset, the only way the library has to end it. */
    Step cw(int channel, int power, int type, double seconds) {
        Step s = new Step("cw", String.format("channel 0x%02x power 0x%02x type 0x%02x", channel, power, type));
        s.wave = new int[] {channel, power, type};
        s.seconds = seconds;
        if (!bench.startContinuousWave(channel, power, type)) {
            return s.fail("no controller reachable: continuous-wave command not sent");
        }
        progress.hold("cw " + s.setting, seconds, 0, seconds);
        bench.reset();
        return s.pass();
    }

    private static Step leStep(String name, Band band, Phy phy) {
        Step s = new Step(name, band.label() + " LE " + phy.name);
        s.band = band;
        s.phy = phy;
        return s;
    }

    private static String endFailure(Bench.End end) {
        return end.sent() ? "LE Test End answered without a packet count (test rejected by the controller?)"
                          : "no controller reachable: LE Test End not sent";
    }
}
