// The engineering console: one command per test capability, run against the
// controller the launcher chose, with results as a table or JSON.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.PrintStream;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Comparator;
import java.util.Map;
import java.util.stream.Stream;

public final class Main {
    static final int EXIT_OK = Report.EXIT_OK;
    static final int EXIT_FAILED = Report.EXIT_FAILED;
    static final int EXIT_USAGE = Report.EXIT_USAGE;
    /** A signal ends the process within 3 s, whatever the controller does. */
    private static final long INTERRUPT_BOUND_MS = 2_500;

    private Main() {}

    public static void main(String[] args) {
        int status = run(args, System.out, System.err);
        removeScratch();
        System.exit(status);
    }

    static int run(String[] args, PrintStream out, PrintStream err) {
        Options o;
        Map<String, String> env = System.getenv();
        try {
            o = Options.parse(args);
            if (o.command.equals("help") || o.command.equals("version")) {
                out.print(o.command.equals("help") ? Usage.text(o.helpFor) : version());
                return EXIT_OK;
            }
            o.checkEnvironment(env);
            o.checkPaths();
        } catch (UsageException e) {
            err.println("halvenor: " + e.getMessage());
            err.println("halvenor: run './halvenor help' for the commands and options");
            return EXIT_USAGE;
        }
        Path capture = Path.of(env.get("HALVENOR_CONSOLE_CAPTURE"));
        Observer observer = new Observer(capture, Path.of(env.get("HALVENOR_LOG_FILE")));
        Bench bench;
        try {
            bench = new Bench(observer);
        } catch (UnsatisfiedLinkError | NoClassDefFoundError e) {
            err.println("halvenor: cannot load libhalvenor.so (" + e + "); java.library.path="
                        + System.getProperty("java.library.path"));
            return EXIT_FAILED;
        }
        Trace trace = o.flag("trace") ? Trace.start(capture, err) : null;
        Progress progress = Progress.forConsole(out);
        Report report = new Report(out, o, progress, capture);
        Runner runner = new Runner(bench, observer, progress, o.limit(), o.minPackets());
        report.start();
        Thread hook = new Thread(() -> interrupted(bench, runner, report, trace, err), "halvenor-interrupt");
        Runtime.getRuntime().addShutdownHook(hook);
        try {
            perform(o, runner, report, trace);
        } catch (Bench.Closed e) {
            parkUntilExit();
        }
        bench.close();
        try {
            Runtime.getRuntime().removeShutdownHook(hook);
        } catch (IllegalStateException e) {
            parkUntilExit();
        }
        if (trace != null) {
            trace.stop();
        }
        report.finish(null, null);
        return report.exitStatus();
    }

    // The console's version, and the commit its library was built from, read from the
    // library file itself: the library exports no more than the app's natives.
    private static String version() {
        String version = Main.class.getPackage().getImplementationVersion();
        Path library = Path.of(System.getProperty("java.library.path", ".")).resolve("libhalvenor.so");
        String commit = "unknown";
        try {
            String bytes = new String(Files.readAllBytes(library), java.nio.charset.StandardCharsets.ISO_8859_1);
            java.util.regex.Matcher m = java.util.regex.Pattern.compile("halvenor-build-commit:([0-9a-f+]{4,41})").matcher(bytes);
            commit = m.find() ? m.group(1) : commit;
        } catch (IOException e) {
            commit = "unknown (" + library + " not readable)";
        }
        return "halvenor " + (version == null ? "unknown" : version) + "\nlibhalvenor.so built from commit " + commit + "\n";
    }

    // A failed step does not stop the run: a sweep goes on to its next setting. Only a
    // controller that nothing reaches ends it, as every later step would meet the same.
    private static void perform(Options o, Runner r, Report report, Trace trace) {
        for (Plan.Item item : Plan.of(o)) {
            Step s = r.run(item);
            if (trace != null) {
                trace.flush();
            }
            report.add(s);
            if (!s.ok && s.unreachable) {
                return;
            }
        }
    }

    /**
     * Runs in the shutdown hook: ends what the controller is doing, then prints the finished
     * steps and the interrupted one. A controller that stopped answering keeps the native
     * call in progress, and so the bench, busy; the exit then goes ahead after a bound rather
     * than hanging on Ctrl-C.
     */
    private static void interrupted(Bench bench, Runner runner, Report report, Trace trace, PrintStream err) {
        Bench.Stop[] done = new Bench.Stop[1];
        Step current = runner.current();
        Thread stopper = new Thread(() -> done[0] = bench.interrupt(), "halvenor-stop");
        stopper.setDaemon(true);
        stopper.start();
        try {
            stopper.join(INTERRUPT_BOUND_MS);
        } catch (InterruptedException e) {
            Thread.currentThread().interrupt();
        }
        boolean answered = !stopper.isAlive();
        String what = answered ? done[0].what()
                : "the controller did not answer within " + INTERRUPT_BOUND_MS / 1000.0 + " s; it may still be running a test";
        if (trace != null) {
            trace.stop();
        }
        if (current != null) {
            runner.interrupted(current, answered ? done[0].end() : null, "interrupted" + (what == null ? "" : ": " + what));
        }
        report.finish(current, what);
        if (what != null) {
            err.println("halvenor: interrupted: " + what + (stopper.isAlive() ? "" : " before exiting"));
        }
        err.flush();
        removeScratch();
    }

    // The launcher's scratch directory: the console's own capture and log.
    private static void removeScratch() {
        String dir = System.getProperty("halvenor.scratch");
        if (dir == null) {
            return;
        }
        try (Stream<Path> files = Files.walk(Path.of(dir))) {
            files.sorted(Comparator.reverseOrder()).forEach(p -> p.toFile().delete());
        } catch (IOException e) {
            // a scratch directory left in the temporary folder harms nobody
        }
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
