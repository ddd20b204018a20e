// Packet error rate of a receiver test with its 95 % Wilson score interval.
package com.quorvex.halvenor.console;

record Per(long received, long expected, double rate, double low, double high) {

    private static final double Z95 = 1.959963984540054;

    /** Null when nothing was expected; more packets than expected count as no errors. */
    static Per of(long received, long expected) {
        if (expected <= 0) {
            return null;
        }
        long errors = Math.max(0, expected - received);
        double n = expected;
        double p = errors / n;
        double z2 = Z95 * Z95;
        double denominator = 1 + z2 / n;
        double centre = (p + z2 / (2 * n)) / denominator;
        double half = Z95 / denominator * Math.sqrt(p * (1 - p) / n + z2 / (4 * n * n));
        // Rounding can put a bound a hair past the rate itself at 0 or 1 errors.
        return new Per(received, expected, p, Math.min(p, Math.max(0, centre - half)), Math.max(p, Math.min(1, centre + half)));
    }

    String percent() {
        return String.format("%.2f %% [%.2f-%.2f %%]", rate * 100, low * 100, high * 100);
    }
}
