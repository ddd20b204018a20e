// Bounded waits on a condition, for things other processes and threads bring about.
package com.quorvex.halvenor;

import java.util.function.BooleanSupplier;

public final class Wait {
    private Wait() {}

    /** True once {@code condition} holds, false if it still does not after {@code seconds}. */
    public static boolean until(BooleanSupplier condition, double seconds) {
        long deadline = System.nanoTime() + (long) (seconds * 1e9);
        while (!condition.getAsBoolean()) {
            if (System.nanoTime() > deadline) {
                return false;
            }
            pause();
        }
        return true;
    }

    static void pause() {
        try {
            Thread.sleep(10);
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
    }
}
