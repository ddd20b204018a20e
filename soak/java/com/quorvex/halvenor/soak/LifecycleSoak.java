// Lifecycle soak in a real JVM: cycles of bind, open, exchange and close
// through TestModeUtils against the host's default controller, closing by
// quitTestModeNative, destoryNative, or both in either order. Measures
// descriptors, threads, resident memory and the objects the library still
// holds through JNI global references, after a warm-up and at the end.
package com.quorvex.halvenor.soak;

import com.quorvex.halvenor.TestModeUtils;

import java.io.IOException;
import java.lang.ref.WeakReference;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.stream.Stream;

public final class LifecycleSoak {

    private static final int WARM_UP_CYCLES = 100;
    // Heap sizing and JIT code settle slowly; past this the resident set counts as grown.
    private static final long RSS_SLACK_KB = 32 * 1024;

    private static final class Counting implements TestModeUtils.Listener {
        int packetCounts;
        int successes;

        @Override
        public void onReceivedTestData(int packets) {
            packetCounts++;
        }

        @Override
        public void onSendCmdSuccess(int code) {
            successes++;
        }
    }

    private record Counts(List<String> fds, long threads, long rssKb, int heldObjects) {}

    private final List<WeakReference<TestModeUtils>> bound = new ArrayList<>();

    /** What each open descriptor refers to: a grown list names what was left open. */
    private static List<String> openDescriptors() throws IOException {
        List<String> open = new ArrayList<>();
        try (Stream<Path> entries = Files.list(Path.of("/proc/self/fd"))) {
            for (Path fd : (Iterable<Path>) entries::iterator) {
                try {
                    open.add(fd.getFileName() + " -> " + Files.readSymbolicLink(fd));
                } catch (IOException gone) {
                    // the listing's own descriptor, closed by now
                }
            }
        }
        return open;
    }

    private static long countEntries(String dir) throws IOException {
        try (Stream<Path> entries = Files.list(Path.of(dir))) {
            return entries.count();
        }
    }

    private static long rssKb() throws IOException {
        for (String line : Files.readAllLines(Path.of("/proc/self/status"))) {
            if (line.startsWith("VmRSS:")) {
                return Long.parseLong(line.replaceAll("[^0-9]", ""));
            }
        }
        return -1;
    }

    /**
     * The library's only JNI global reference is the bound object: once an unbound object's
     * destoryNative has released it, every object bound so far must be collectable. One
     * still reachable after collection is one the library holds.
     */
    private int heldObjects() throws InterruptedException {
        new TestModeUtils().destoryNative();
        for (int i = 0; i < 5; i++) {
            System.gc();
            Thread.sleep(20);
        }
        int held = 0;
        for (WeakReference<TestModeUtils> ref : bound) {
            if (ref.get() != null) {
                held++;
            }
        }
        return held;
    }

    private Counts measure() throws IOException, InterruptedException {
        int held = heldObjects();
        return new Counts(openDescriptors(), countEntries("/proc/self/task"), rssKb(), held);
    }

    /** One session; true when every command reached the controller and was answered. */
    private boolean cycle(int n) {
        Counting listener = new Counting();
        TestModeUtils radio = new TestModeUtils(listener);
        bound.add(new WeakReference<>(radio));
        radio.initNative();
        boolean ok = radio.enterTestModeNative() == 0;
        radio.sendTestCommandNative(TestModeUtils.RX_2440, true);
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        ok &= listener.packetCounts == 1 && listener.successes == 2;
        switch (n % 4) {
            case 0 -> radio.quitTestModeNative();
            case 1 -> radio.destoryNative();
            case 2 -> {
                radio.destoryNative();
                radio.quitTestModeNative();
            }
            default -> {
                radio.quitTestModeNative();
                radio.destoryNative();
            }
        }
        return ok;
    }

    private int run(int cycles) throws IOException, InterruptedException {
        int failed = 0;
        for (int i = 0; i < WARM_UP_CYCLES; i++) {
            failed += cycle(i) ? 0 : 1;
        }
        // The first listing brings up the JDK's own NIO descriptors (a socket pair it keeps);
        // a second one counts only what stays.
        measure();
        Counts start = measure();
        long t0 = System.nanoTime();
        for (int i = WARM_UP_CYCLES; i < cycles; i++) {
            failed += cycle(i) ? 0 : 1;
            if ((i + 1) % 1000 == 0) {
                System.out.printf("cycle %d, failed %d%n", i + 1, failed);
            }
        }
        double secs = (System.nanoTime() - t0) / 1e9;
        Counts end = measure();
        System.out.printf("cycles: %d (%d warm-up), failed: %d, %.1f s after warm-up%n",
                cycles, WARM_UP_CYCLES, failed, secs);
        System.out.printf("descriptors:             start %d end %d%n", start.fds().size(), end.fds().size());
        if (Boolean.getBoolean("soak.fds")) {
            System.out.println("start: " + start.fds() + "\nend:   " + end.fds());
        }
        for (String fd : end.fds()) {
            if (!start.fds().contains(fd)) {
                System.out.println("  opened since the start: " + fd);
            }
        }
        System.out.printf("threads:                 start %d end %d%n", start.threads(), end.threads());
        System.out.printf("RSS (kB):                start %d end %d%n", start.rssKb(), end.rssKb());
        System.out.printf("objects held by the library's global references: start %d end %d (of %d bound)%n",
                start.heldObjects(), end.heldObjects(), bound.size());
        boolean grew = end.fds().size() > start.fds().size() || end.threads() > start.threads()
                || end.rssKb() > start.rssKb() + RSS_SLACK_KB || end.heldObjects() > 0;
        if (failed != 0 || grew) {
            System.out.println("soak FAILED");
            return 1;
        }
        System.out.println("soak passed");
        return 0;
    }

    public static void main(String[] args) throws Exception {
        int cycles = args.length > 0 ? Integer.parseInt(args[0]) : 10000;
        if (cycles <= WARM_UP_CYCLES) {
            System.err.println("usage: LifecycleSoak [cycles > " + WARM_UP_CYCLES + "]");
            System.exit(2);
        }
        System.exit(new LifecycleSoak().run(cycles));
    }
}
