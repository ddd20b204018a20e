// Parsing of the console's numbers; each gives null for a text outside its range, and the
// option's table row names the valid values.
package com.quorvex.halvenor.console;

final class Numbers {
    private Numbers() {}

    /** Seconds as "1.5", "1.5s" or "500ms", from min to max (more than 0 when min is 0 and max above 10). */
    static Double seconds(String text, double min, double max) {
        String t = text.trim().toLowerCase();
        double scale = 1;
        if (t.endsWith("ms")) {
            scale = 1e-3;
            t = t.substring(0, t.length() - 2);
        } else if (t.endsWith("s")) {
            t = t.substring(0, t.length() - 1);
        }
        Double v = decimal(t, min / scale, max / scale);
        return v == null ? null : v * scale;
    }

    /** A decimal number from min to max. */
    static Double decimal(String text, double min, double max) {
        try {
            double v = Double.parseDouble(text.trim());
            return v >= min && v <= max ? v : null;
        } catch (NumberFormatException e) {
            return null;
        }
    }

    /** A whole number from min to max, decimal or (when hex) 0x hexadecimal. */
    static Integer whole(String text, int min, int max, boolean hex) {
        long v = parse(text.trim(), hex);
        return v >= min && v <= max ? (int) v : null;
    }

    /** A packet count: 1 or more. */
    static Long count(String text) {
        long v = parse(text.trim(), true);
        return v >= 1 ? v : null;
    }

    private static long parse(String t, boolean hex) {
        try {
            if (hex && (t.startsWith("0x") || t.startsWith("0X"))) {
                return Long.parseLong(t.substring(2), 16);
            }
            return t.matches("[0-9]+") ? Long.parseLong(t) : -1;
        } catch (NumberFormatException e) {
            return -1;
        }
    }

    static String fmt(double seconds) {
        return seconds == Math.rint(seconds) ? Long.toString((long) seconds) : Double.toString(seconds);
    }
}
