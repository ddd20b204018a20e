// Times the library's natives from Java against the controller behind the HAL
// service "default" (the simulated one unless HALVENOR_HCI says otherwise).
// Runs on the main thread; prints one line per figure.
package com.quorvex.halvenor.bench;

import com.quorvex.halvenor.TestModeUtils;
import java.util.Arrays;

public final class JavaBench {

    private static final int BLOCKS = 8;

    private JavaBench() {}

    /** Counts the callbacks, so a run that never reached a controller is seen. */
    private static final class Counts implements TestModeUtils.Listener {
        int sent;
        int counted;

        @Override
        public void onSendCmdSuccess(int code) {
            sent++;
        }

        @Override
        public void onReceivedTestData(int packets) {
            counted++;
        }
    }

    public static void main(String[] args) {
        int perBlock = args.length > 0 ? Integer.parseInt(args[0]) : 50;
        Counts counts = new Counts();
        TestModeUtils radio = new TestModeUtils(counts);
        radio.initNative();

        // Per pair: the first call, the second call, both.
        long[][] dut = new long[3][BLOCKS * perBlock];
        long[][] le = new long[3][BLOCKS * perBlock];
        // Warm-up of both, then blocks of each in turn so both meet the same load.
        dutBlock(radio, new long[3][perBlock], 0, perBlock);
        leBlock(radio, new long[3][perBlock], 0, perBlock);
        for (int b = 0; b < BLOCKS; b++) {
            dutBlock(radio, dut, b * perBlock, perBlock);
            leBlock(radio, le, b * perBlock, perBlock);
        }
        radio.destoryNative();

        report("java: DUT entry, enterTestModeNative", dut[0]);
        report("java: DUT exit, quitTestModeNative", dut[1]);
        report("java: DUT entry + exit", dut[2]);
        report("java: LE test, sendTestCommandNative(22440, true)", le[0]);
        report("java: Test End, sendTestCommandNative(3000, false)", le[1]);
        report("java: LE test + Test End", le[2]);
        int blocks = BLOCKS + 1;
        System.out.printf("java: callbacks onSendCmdSuccess %d, onReceivedTestData %d (expected %d and %d)%n",
                counts.sent, counts.counted, blocks * (2 * perBlock + 1), blocks * perBlock);
    }

    // Each entry opens a session and each exit ends it, so every pair pays both.
    private static void dutBlock(TestModeUtils radio, long[][] out, int from, int n) {
        for (int i = 0; i < n; i++) {
            long start = System.nanoTime();
            int entered = radio.enterTestModeNative();
            long middle = System.nanoTime();
            radio.quitTestModeNative();
            long end = System.nanoTime();
            record(out, from + i, start, middle, end);
            if (entered != 0) {
                throw new IllegalStateException("enterTestModeNative returned " + entered);
            }
        }
    }

    // The session stays open between LE tests: the block's first call opens it
    // untimed, as an application's first test would.
    private static void leBlock(TestModeUtils radio, long[][] out, int from, int n) {
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        for (int i = 0; i < n; i++) {
            long start = System.nanoTime();
            radio.sendTestCommandNative(TestModeUtils.RX_2440, true);
            long middle = System.nanoTime();
            radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
            long end = System.nanoTime();
            record(out, from + i, start, middle, end);
        }
        radio.quitTestModeNative();
    }

    private static void record(long[][] out, int i, long start, long middle, long end) {
        out[0][i] = middle - start;
        out[1][i] = end - middle;
        out[2][i] = end - start;
    }

    private static void report(String what, long[] nanos) {
        long[] sorted = nanos.clone();
        Arrays.sort(sorted);
        double median = sorted[sorted.length / 2] / 1e3;
        double p99 = sorted[Math.min(sorted.length - 1, (int) Math.ceil(0.99 * sorted.length) - 1)] / 1e3;
        System.out.printf("%-55s median %9.1f us   p99 %9.1f us   %d calls%n", what, median, p99, sorted.length);
    }
}
