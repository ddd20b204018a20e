// The engineering console: one command per test capability, run against the
// controller the launcher chose, with results as a table or JSON.
package com.quorvex.halvenor.console;

import java.io.PrintStream;
import java.util.ArrayList;
import java.util.List;

public final class Main {
    static final int EXIT_OK = 0;
    static final int EXIT_FAILED = 1;
    static final int EXIT_USAGE = 2;
    private static final long INTERRUPT_BOUND_MS = 10_000;

    private Main() {}

    public static void main(String[] args) {
        System.exit(run(args, System.out, System.err));
    }

    static int run(String[] args, PrintStream out, PrintStream err) {
        Options o;
        try {
            o = Options.parse(args);
            o.checkEnvironment(System.getenv());
        } catch (UsageException e) {
            err.println("halvenor: " + e.getMessage());
            err.println("halvenor: run './halvenor help' for the commands and options");
            return EXIT_USAGE;
        }
        if (o.command.equals("help")) {
            out.print(Usage.TEXT);
            return EXIT_OK;
        }
        Bench bench;
        try {
            bench = new Bench();
        } catch (UnsatisfiedLinkError | NoClassDefFoundError e) {
            err.println("halvenor: cannot load libhalvenor.so (" + e + "); java.library.path="
                        + System.getProperty("java.library.path"));
            return EXIT_FAILED;
        }
        Thread hook = new Thread(() -> interrupted(bench, err), "halvenor-interrupt");
        Runtime.getRuntime().addShutdownHook(hook);
        List<Step> steps = new ArrayList<>();
        try {
            perform(o, new Runner(bench, Progress.forConsole(out)), steps);
        } catch (Bench.Closed e) {
            parkUntilExit();
        }
        bench.close();
        try {
            Runtime.getRuntime().removeShutdownHook(hook);
        } catch (IllegalStateException e) {
            parkUntilExit();
        }
        if (o.json) {
            Report.json(out, o, steps);
        } else {
            Report.table(out, o, steps);
        }
        out.flush();
        return steps.stream().allMatch(s -> s.ok) ? EXIT_OK : EXIT_FAILED;
    }

    // Stops at the first failed step: later ones would only meet the same controller.
    private static void perform(Options o, Runner r, List<Step> steps) {
        for (Plan.Item item : Plan.of(o)) {
            Step s = item.run(r);
            steps.add(s);
            if (!s.ok) {
                return;
            }
        }
    }

    /**
     * Runs in the shutdown hook. A controller that stopped answering keeps the native call
     * in progress, and so the bench, busy; the exit then goes ahead after a bound rather
     * than hanging on Ctrl-C.
     */
    private static void interrupted(Bench bench, PrintStream err) {
        String[] done = new String[1];
        Thread stopper = new Thread(() -> done[0] = bench.interrupt(), "halvenor-stop");
        stopper.setDaemon(true);
        stopper.start();
        try {
            stopper.join(INTERRUPT_BOUND_MS);
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
        if (stopper.isAlive()) {
            err.println("halvenor: interrupted: the controller did not answer within "
                        + INTERRUPT_BOUND_MS / 1000 + " s; it may still be running a test");
        } else if (done[0] != null) {
            err.println("halvenor: interrupted: " + done[0] + " before exiting");
        }
        err.flush();
    }

    // The shutdown hook owns the controller now; the JVM halts once it is done.
    private static void parkUntilExit() {
        while (true) {
            try {
                Thread.sleep(Long.MAX_VALUE);
            } catch (InterruptedException e) {
                Thread.currentThread().interrupt();
                return;
            }
        }
    }
}
