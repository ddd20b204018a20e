// Waits out a test's duration on the main thread, drawing a progress bar when stdout
// is a terminal; the bar is erased before anything else is printed on stdout, by
// whichever thread prints it (each holds the stream's lock).
package com.quorvex.halvenor.console;

import java.io.PrintStream;
import java.util.function.BooleanSupplier;

final class Progress {
    private static final int WIDTH = 30;
    private static final long TICK_MS = 100;

    private final PrintStream out;
    private final boolean enabled;

    Progress(PrintStream out, boolean enabled) {
        this.out = out;
        this.enabled = enabled;
    }

    /** Only a person at a terminal wants a bar; scripts and pipes get plain results. */
    static Progress forConsole(PrintStream out) {
        return new Progress(out, System.console() != null);
    }

    /**
     * Holds the current thread for {@code seconds}, the test running meanwhile, or until
     * {@code stop} (asked every tick) says the wait is pointless.
     */
    void hold(String label, double seconds, double doneBefore, double total, BooleanSupplier stop) {
        long start = System.nanoTime();
        long end = start + (long) (seconds * 1e9);
        for (long now = start; now < end && !stop.getAsBoolean(); now = System.nanoTime()) {
            draw(label, doneBefore + (now - start) / 1e9, total);
            sleepNanos(Math.min(end - now, TICK_MS * 1_000_000));
        }
        clear();
    }

    private void draw(String label, double done, double total) {
        if (!enabled) {
            return;
        }
        int filled = total <= 0 ? WIDTH : (int) Math.min(WIDTH, Math.round(WIDTH * done / total));
        synchronized (out) {
            out.print("\r\033[K" + label + " [" + "#".repeat(filled) + " ".repeat(WIDTH - filled) + "] "
                      + String.format("%.1f/%.1f s", done, total));
            out.flush();
        }
    }

    void clear() {
        if (enabled) {
            synchronized (out) {
                out.print("\r\033[K");
                out.flush();
            }
        }
    }

    private static void sleepNanos(long nanos) {
        try {
            Thread.sleep(nanos / 1_000_000, (int) (nanos % 1_000_000));
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
    }
}
