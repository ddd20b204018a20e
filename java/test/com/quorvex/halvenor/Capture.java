// The btsnoop file the library writes for this JVM (HALVENOR_BTSNOOP), read as the
// packets added since a mark.
package com.quorvex.halvenor;

import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.List;
import java.util.function.Predicate;

public final class Capture {
    private static final long WAIT_NANOS = 10_000_000_000L;
    private final Path file;
    private int mark;

    public Capture(Path file) {
        this.file = file;
    }

    /** The capture named by HALVENOR_BTSNOOP, emptied before the first session opens. */
    public static Capture fromEnvironment() throws IOException {
        String name = System.getenv("HALVENOR_BTSNOOP");
        if (name == null || name.isEmpty()) {
            throw new IllegalStateException("HALVENOR_BTSNOOP is not set for this suite");
        }
        Path file = Path.of(name);
        Files.createDirectories(file.toAbsolutePath().getParent());
        Files.deleteIfExists(file);
        return new Capture(file);
    }

    public Path file() {
        return file;
    }

    /** Forgets every packet captured so far. */
    public void mark() throws IOException {
        mark = Btsnoop.read(file).size();
    }

    /**
     * The packets captured since the last mark, once {@code done} holds for them; the
     * capture is written by the controller's threads, so a reply may land a moment after
     * the native call that read it has returned.
     */
    public List<Btsnoop.Packet> awaitSinceMark(Predicate<List<Btsnoop.Packet>> done) throws IOException {
        long deadline = System.nanoTime() + WAIT_NANOS;
        List<Btsnoop.Packet> packets = sinceMark();
        while (!done.test(packets) && System.nanoTime() < deadline) {
            Wait.pause();
            packets = sinceMark();
        }
        return packets;
    }

    /** The packets captured since the last mark. */
    public List<Btsnoop.Packet> sinceMark() throws IOException {
        List<Btsnoop.Packet> all = Btsnoop.read(file);
        return all.subList(Math.min(mark, all.size()), all.size());
    }
}
