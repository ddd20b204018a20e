// Packet error rate of a receiver test with its 95 % Wilson score interval, widened by how
// many packets the counting window may have held at least and at most.
package com.quorvex.halvenor.console;

record Per(long received, long expected, double rate, double low, double high) {

    private static final double Z95 = 1.959963984540054;

    /** Null when nothing was expected; more packets than expected count as no errors. */
    static Per of(long received, long expected) {
        return of(received, expected, expected, expected);
    }

    /** With the fewest packets the window may have held the rate is lowest, with the most highest. */
    static Per of(long received, long expected, long expectedLow, long expectedHigh) {
        if (expected <= 0) {
            return null;
        }
        double p = errorRate(received, expected);
        double low = expectedLow > 0 ? wilson(received, expectedLow, -1) : 0;
        double high = wilson(received, Math.max(expected, expectedHigh), 1);
        // Rounding can put a bound a hair past the rate itself at 0 or 1 errors.
        return new Per(received, expected, p, Math.min(p, low), Math.max(p, high));
    }

    private static double errorRate(long received, long expected) {
        return Math.max(0, expected - received) / (double) expected;
    }

    // The lower (side -1) or upper (side 1) Wilson score bound.
    private static double wilson(long received, long expected, int side) {
        double n = expected;
        double p = errorRate(received, expected);
        double z2 = Z95 * Z95;
        double denominator = 1 + z2 / n;
        double centre = (p + z2 / (2 * n)) / denominator;
        double half = Z95 / denominator * Math.sqrt(p * (1 - p) / n + z2 / (4 * n * n));
        return Math.max(0, Math.min(1, centre + side * half));
    }

    String percent() {
        return String.format("%.2f %% [%.2f-%.2f %%]", rate * 100, low * 100, high * 100);
    }
}
