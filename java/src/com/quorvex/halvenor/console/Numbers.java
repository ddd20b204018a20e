// Parsing of the console's numeric arguments, each failure naming the valid range.
package com.quorvex.halvenor.console;

final class Numbers {
    private Numbers() {}

    /** Seconds as "1.5", "1.5s" or "500ms": more than 0 (or at least {@code min} when set) and at most {@code max}. */
    static double seconds(String option, String text, double min, double max) throws UsageException {
        String t = text.trim().toLowerCase();
        double scale = 1;
        if (t.endsWith("ms")) {
            scale = 1e-3;
            t = t.substring(0, t.length() - 2);
        } else if (t.endsWith("s")) {
            t = t.substring(0, t.length() - 1);
        }
        double v;
        try {
            v = Double.parseDouble(t) * scale;
        } catch (NumberFormatException e) {
            v = Double.NaN;
        }
        boolean low = min > 0 ? v >= min : v > 0;
        if (!(low && v <= max)) {
            String from = min > 0 ? "at least " + fmt(min) : "more than 0";
            throw new UsageException("bad " + option + " '" + text + "': give seconds, " + from + " and at most "
                                     + fmt(max) + " (for example 2, 0.5 or 500ms)");
        }
        return v;
    }

    /** A byte value, decimal or 0x hexadecimal: 0 to 255. */
    static int octet(String option, String text) throws UsageException {
        long v = parse(text.trim());
        if (v < 0 || v > 255) {
            throw new UsageException("bad " + option + " '" + text + "': valid values are 0 to 255 (or 0x00 to 0xff)");
        }
        return (int) v;
    }

    /** A packet count: 1 or more. */
    static long count(String option, String text) throws UsageException {
        long v = parse(text.trim());
        if (v < 1) {
            throw new UsageException("bad " + option + " '" + text + "': give the number of packets sent, 1 or more");
        }
        return v;
    }

    private static long parse(String t) {
        try {
            if (t.startsWith("0x") || t.startsWith("0X")) {
                return Long.parseLong(t.substring(2), 16);
            }
            return Long.parseLong(t);
        } catch (NumberFormatException e) {
            return -1;
        }
    }

    static String fmt(double seconds) {
        return seconds == Math.rint(seconds) ? Long.toString((long) seconds) : Double.toString(seconds);
    }
}
