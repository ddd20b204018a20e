// --trace: every command and event that crosses the HAL, decoded as it passes, on stderr.
// Its own thread follows the console's capture; stop() prints what is left and ends it.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.PrintStream;
import java.nio.file.Path;

final class Trace {
    private static final long POLL_MS = 20;

    private final Capture capture;
    private final PrintStream err;
    private final Thread thread;
    private volatile boolean running = true;
    private long startMicros = -1;

    private Trace(Path file, PrintStream err) {
        this.capture = new Capture(file);
        this.err = err;
        this.thread = new Thread(this::follow, "halvenor-trace");
        thread.setDaemon(true);
    }

    static Trace start(Path file, PrintStream err) {
        Trace t = new Trace(file, err);
        t.thread.start();
        return t;
    }

    /** Prints what has passed so far, so that it comes before a result printed next. */
    void flush() {
        printNew();
    }

    /** Prints the packets not yet shown and ends the thread. */
    void stop() {
        running = false;
        try {
            thread.join(1000);
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
        printNew();
    }

    private void follow() {
        while (running) {
            printNew();
            try {
                Thread.sleep(POLL_MS);
            } catch (InterruptedException e) {
                return;
            }
        }
    }

    private synchronized void printNew() {
        try {
            for (Capture.Packet p : capture.readNew()) {
                if (startMicros < 0) {
                    startMicros = p.micros();
                }
                for (String line : Hci.describe(p, p.micros() - startMicros)) {
                    err.println(line);
                }
            }
            err.flush();
        } catch (IOException e) {
            err.println("halvenor: trace stopped: " + e.getMessage());
            running = false;
        }
    }
}
