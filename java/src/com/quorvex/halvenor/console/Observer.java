// What the controller answered to each command, read on the host side of the HAL from the
// console's own capture, and why a session could not open or a command went unanswered, read
// from the process's log. The main thread, the progress wait and the interrupt hook use it,
// one at a time.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.RandomAccessFile;
import java.nio.charset.StandardCharsets;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

final class Observer {
    /** The library's reply time-out: a command unanswered by then has no reply. */
    static final int REPLY_TIMEOUT_MS = 2000;
    /** Read Local Version Information: the library's sync after an unanswered command. */
    static final int SYNC = 0x1001;
    private static final int HARDWARE_ERROR = 0x10;
    /** The cause that is the reply time-out itself. */
    private static final String TIMED_OUT = "timed out";

    /**
     * A command the library sent, when it was captured, and the controller's status (NO_REPLY
     * for none) with the capture time of that reply (-1 for none).
     */
    record Exchange(int opcode, int status, long sentMicros, long repliedMicros) {
        static final int NO_REPLY = -1;

        boolean accepted() {
            return status == 0;
        }

        String statusText() {
            return status == NO_REPLY ? "no reply" : String.format("0x%02x %s", status, Hci.statusName(status));
        }

        String refusal() {
            return Hci.commandLabel(opcode) + " refused: " + statusText();
        }
    }

    /** A place in what has been observed; a step or a window looks at what comes after it. */
    record Mark(int packet, int line) {}

    private static final String HAL_DIED_LINE = "E halvenor: serviceDied: the Bluetooth HAL died";
    private static final String HAL_DIED = "the Bluetooth HAL died";
    // Library and host lines that say in a person's words why a command went unanswered.
    private static final String[][] CAUSES = {
        {"E halvenor: Unable to initialize the HIDL", "no Bluetooth HAL service"},
        {HAL_DIED_LINE, HAL_DIED},
        {"E halvenor: hidl_client_initialize: no answer from the HAL", "the Bluetooth HAL did not finish initializing"},
        {"E halvenor: Error in HIDL initialization", "the Bluetooth HAL failed to initialize"},
        // A cause ending in ": " takes the rest of the line: the AIDL HAL's status, in words.
        {"E halvenor: initializationComplete: the AIDL HAL failed to initialize: ", "the Bluetooth HAL failed to initialize: "},
        {"E halvenor: hidl_client_initialize: AIDL initialize failed: ", "the Bluetooth HAL failed to initialize: "},
        {"E halvenor: hidl_client_initialize: the AIDL HAL died before initialize", HAL_DIED},
        {" is declared but not running", "the AIDL Bluetooth HAL is declared but not running"},
        {"E halvenor: read_incoming_events: timed out after 2000 ms waiting for the packet type", TIMED_OUT},
        {"E halvenor: read_incoming_events: timed out after 2000 ms waiting for the ",
         "the reply was cut off: its rest did not come within 2000 ms"},
        {"E halvenor: read_incoming_events: byte ", "the library could not follow the controller's stream: a byte"
                                                    + " that starts no HCI packet"},
        {"E halvenor: hciEventReceived: packet of ", "the library dropped an event whose length disagrees with its header"},
        {"no command credit from the controller within 2000 ms", "the controller gave no command credit within 2000 ms"
                                                                 + " (its last reply allowed no more commands)"},
        {"the controller did not answer the sync either", "the controller did not answer Read Local Version"
                                                          + " Information, sent to get back in step after an unanswered command"},
    };
    private static final Pattern HOST_LINE = Pattern.compile("E halvenor-host: (?:h4: )?(?:cannot reach |cannot take )?(.*)");
    // The host could not take the machine's adapter: the user's setup, not the controller, is at fault.
    private static final String SETUP_LINE = "E halvenor-host: h4: cannot take ";

    private final Capture capture;
    private final Path logFile;
    private long logPosition;
    private final List<Capture.Packet> packets = new ArrayList<>();
    private final List<String> logLines = new ArrayList<>();
    // Packets and lines before these were dropped: no mark in use reaches back to them.
    private int packetBase;
    private int lineBase;

    Observer(Path capture, Path logFile) {
        this.capture = new Capture(capture);
        this.logFile = logFile;
    }

    /** Here, now: what is captured or logged from now on comes after this mark. */
    synchronized Mark mark() {
        read();
        return new Mark(packetBase + packets.size(), lineBase + logLines.size());
    }

    /** Nothing before this mark is looked at again. */
    synchronized void forgetBefore(Mark m) {
        int p = Math.min(m.packet() - packetBase, packets.size());
        int l = Math.min(m.line() - lineBase, logLines.size());
        packets.subList(0, Math.max(0, p)).clear();
        logLines.subList(0, Math.max(0, l)).clear();
        packetBase += Math.max(0, p);
        lineBase += Math.max(0, l);
    }

    /**
     * The commands sent since the mark, in order, each with the status of its own reply: the
     * Command Complete naming its opcode, or a Command Status refusing it. Replies are matched
     * as the library matches them: once it sends its sync, the commands before it are given up,
     * and their late replies are nobody's. The sync itself is not one of the step's commands.
     */
    synchronized List<Exchange> exchanges(Mark from) {
        read();
        List<Exchange> done = new ArrayList<>();
        List<int[]> pending = new ArrayList<>(); // {index in done, or -1 for the sync; opcode}
        for (Capture.Packet p : since(from)) {
            if (p.isCommand() && p.opcode() == SYNC) {
                pending.clear();
                pending.add(new int[] {-1, SYNC});
            } else if (p.isCommand()) {
                pending.add(new int[] {done.size(), p.opcode()});
                done.add(new Exchange(p.opcode(), Exchange.NO_REPLY, p.micros(), -1));
            } else {
                answer(p, pending, done);
            }
        }
        return done;
    }

    private static void answer(Capture.Packet p, List<int[]> pending, List<Exchange> done) {
        int answers = p.answers();
        if (answers < 0 || (p.eventCode() == 0x0f && p.status() == 0)) {
            return; // not a reply, or a pending Command Status: the command's own event follows
        }
        for (int i = 0; i < pending.size(); i++) {
            int[] open = pending.get(i);
            if (open[1] != answers) {
                continue;
            }
            if (open[0] >= 0) {
                Exchange e = done.get(open[0]);
                done.set(open[0], new Exchange(e.opcode(), p.status(), e.sentMicros(), p.micros()));
            }
            pending.remove(i);
            return;
        }
    }

    /** The first Hardware Error the controller reported since the mark, in words; else null. */
    synchronized String hardwareError(Mark from) {
        read();
        for (Capture.Packet p : since(from)) {
            if (p.eventCode() == HARDWARE_ERROR && p.bytes().length >= 3) {
                return String.format("the controller reported Hardware Error 0x%02x during the step", p.bytes()[2] & 0xff);
            }
        }
        return null;
    }

    /**
     * Why the step's commands failed, or null when they did not: the first command the
     * controller did not accept (unless it may refuse it), else the first required command
     * that was never sent, with the cause the log gives.
     */
    synchronized String failure(Mark from, List<Exchange> exchanges, List<Integer> required, List<Integer> mayRefuse) {
        for (Exchange e : exchanges) {
            if (e.status() == Exchange.NO_REPLY) {
                String cause = cause(from);
                return TIMED_OUT.equals(cause) ? "no reply within " + REPLY_TIMEOUT_MS + " ms to " + Hci.commandName(e.opcode())
                                               : Hci.commandName(e.opcode()) + " not answered" + (cause == null ? "" : ": " + cause);
            }
            if (!e.accepted() && !mayRefuse.contains(e.opcode())) {
                return e.refusal();
            }
        }
        for (int opcode : required) {
            if (exchanges.stream().noneMatch(e -> e.opcode() == opcode)) {
                String cause = cause(from);
                String what = exchanges.isEmpty() ? "no controller reachable" : Hci.commandName(opcode) + " not sent";
                return what + (cause == null || TIMED_OUT.equals(cause) ? "" : ": " + cause);
            }
        }
        return null;
    }

    /** Whether, since the mark, the host could not take the machine's adapter (hci:N) as set up. */
    synchronized boolean setupRefused(Mark from) {
        return linesSince(from).stream().anyMatch(l -> l.startsWith(SETUP_LINE));
    }

    /** Why the controller is gone, once the host layer or the library has said so since the mark; else null. */
    synchronized String lost(Mark from) {
        read();
        for (String line : linesSince(from)) {
            Matcher host = HOST_LINE.matcher(line);
            if (line.startsWith("E halvenor-host: h4: ") && host.matches()) {
                return host.group(1);
            }
            if (line.equals(HAL_DIED_LINE)) {
                return HAL_DIED;
            }
        }
        return null;
    }

    // The first cause logged since the mark: what went wrong first, not what followed from it
    // (a controller that closed its connection, then cannot be reached again). A host-layer
    // error names its own cause and comes before the library's words.
    private String cause(Mark from) {
        String library = null;
        for (String line : linesSince(from)) {
            Matcher host = HOST_LINE.matcher(line);
            if (host.matches()) {
                return host.group(1);
            }
            for (String[] c : CAUSES) {
                int at = line.indexOf(c[0]);
                if (library == null && at >= 0) {
                    library = c[1].endsWith(": ") ? c[1] + line.substring(at + c[0].length()) : c[1];
                }
            }
        }
        return library;
    }

    private List<Capture.Packet> since(Mark from) {
        return packets.subList(Math.max(0, Math.min(from.packet() - packetBase, packets.size())), packets.size());
    }

    private List<String> linesSince(Mark from) {
        read();
        return logLines.subList(Math.max(0, Math.min(from.line() - lineBase, logLines.size())), logLines.size());
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
