// What the controller answered to each command, read on the host side of the HAL from the
// console's own capture, and why a session could not open, read from the process's log.
// The main thread and the interrupt hook use it, one at a time.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.RandomAccessFile;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;

final class Observer {
    /** The library's reply time-out: a command unanswered by then has no reply. */
    static final int REPLY_TIMEOUT_MS = 2000;

    /** A command the library sent, when it was captured, and the controller's status (NO_REPLY for none). */
    record Exchange(int opcode, int status, long sentMicros) {
        static final int NO_REPLY = -1;

        boolean accepted() {
            return status == 0;
        }

        String statusText() {
            return status == NO_REPLY ? "no reply" : String.format("0x%02x %s", status, Hci.statusName(status));
        }

        /** Why the command failed, for a person: refused with the status's name, or not answered. */
        String failure() {
            if (status == NO_REPLY) {
                return "no reply within " + REPLY_TIMEOUT_MS + " ms to " + Hci.commandName(opcode);
            }
            return Hci.commandLabel(opcode) + " refused: " + statusText();
        }
    }

    private final Capture capture;
    private final Path logFile;
    private long logPosition;
    private final List<Capture.Packet> packets = new ArrayList<>();
    private final List<String> logLines = new ArrayList<>();

    Observer(Path capture, Path logFile) {
        this.capture = new Capture(capture);
        this.logFile = logFile;
    }

    /** Starts a new observation: whatever was captured or logged before is left behind. */
    synchronized void mark() {
        read();
        packets.clear();
        logLines.clear();
    }

    /**
     * The commands sent since the mark, in order, each with the status of its own reply:
     * the Command Complete naming its opcode, or a Command Status refusing it.
     */
    synchronized List<Exchange> exchanges() {
        read();
        List<Exchange> done = new ArrayList<>();
        List<int[]> pending = new ArrayList<>(); // {index in done, opcode}
        for (Capture.Packet p : packets) {
            if (p.isCommand()) {
                pending.add(new int[] {done.size(), p.opcode()});
                done.add(new Exchange(p.opcode(), Exchange.NO_REPLY, p.micros()));
                continue;
            }
            int answers = p.answers();
            boolean pendingStatus = p.eventCode() == 0x0f && p.status() == 0;
            for (int i = 0; i < pending.size() && answers >= 0; i++) {
                int[] open = pending.get(i);
                if (open[1] != answers) {
                    continue;
                }
                if (!pendingStatus) {
                    Exchange e = done.get(open[0]);
                    done.set(open[0], new Exchange(e.opcode(), p.status(), e.sentMicros()));
                    pending.remove(i);
                }
                break;
            }
        }
        return done;
    }

    /**
     * Why the step failed, or null when it did not: the first command the controller did
     * not accept (unless it may refuse it), else the first required command that was never
     * sent, with the cause the log gives.
     */
    synchronized String failure(List<Exchange> exchanges, List<Integer> required, List<Integer> mayRefuse) {
        for (Exchange e : exchanges) {
            if (e.status() == Exchange.NO_REPLY && cause() != null) {
                return Hci.commandName(e.opcode()) + " not answered: " + cause();
            }
            if (!e.accepted() && !mayRefuse.contains(e.opcode())) {
                return e.failure();
            }
        }
        for (int opcode : required) {
            if (exchanges.stream().noneMatch(e -> e.opcode() == opcode)) {
                String cause = cause();
                String what = exchanges.isEmpty() ? "no controller reachable" : Hci.commandName(opcode) + " not sent";
                return what + (cause == null ? "" : ": " + cause);
            }
        }
        return null;
    }

    // The first cause logged since the mark: what went wrong first, not what followed from it
    // (a controller that closed its connection, then cannot be reached again).
    private String cause() {
        read();
        String library = null;
        for (String line : logLines) {
            String c = cause(line);
            if (c != null && line.startsWith("E halvenor-host: ")) {
                return c;
            }
            library = library == null ? c : library;
        }
        return library;
    }

    // A host-layer error names its own cause; the library's few lines about the HAL are
    // turned into words. Lines are "E tag: text" as the host layer writes them.
    private static String cause(String line) {
        if (line.startsWith("E halvenor-host: ")) {
            String text = line.substring("E halvenor-host: ".length());
            text = text.startsWith("h4: ") ? text.substring(4) : text;
            return text.startsWith("cannot reach ") ? text.substring("cannot reach ".length()) : text;
        }
        if (line.equals("E halvenor: Unable to initialize the HIDL")) {
            return "no Bluetooth HAL service";
        }
        if (line.equals("E halvenor: serviceDied: the Bluetooth HAL died")) {
            return "the Bluetooth HAL died";
        }
        if (line.startsWith("E halvenor: hidl_client_initialize: no answer from the HAL")) {
            return "the Bluetooth HAL did not finish initializing";
        }
        if (line.equals("E halvenor: Error in HIDL initialization")) {
            return "the Bluetooth HAL failed to initialize";
        }
        return null;
    }

    private void read() {
        try {
            packets.addAll(capture.readNew());
            readLog();
        } catch (IOException e) {
            logLines.add("E halvenor-host: cannot read the console's capture: " + e.getMessage());
        }
    }

    private void readLog() throws IOException {
        try (RandomAccessFile f = new RandomAccessFile(logFile.toFile(), "r")) {
            if (f.length() <= logPosition) {
                return;
            }
            byte[] bytes = new byte[(int) (f.length() - logPosition)];
            f.seek(logPosition);
            f.readFully(bytes);
            int end = bytes.length;
            while (end > 0 && bytes[end - 1] != '\n') {
                end--; // a line still being written waits for the next read
            }
            logPosition += end;
            new String(bytes, 0, end, StandardCharsets.UTF_8).lines().forEach(logLines::add);
        } catch (java.io.FileNotFoundException e) {
            // nothing logged yet
        }
    }
}
