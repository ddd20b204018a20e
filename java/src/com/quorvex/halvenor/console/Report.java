// Prints the results: a table for people, row by row as each step finishes, or one JSON
// object for scripts. The main thread adds steps; the interrupt hook may finish the
// report instead, with the step it interrupted; whoever finishes first prints the end.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.PrintStream;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.List;
import java.util.Locale;

final class Report {
    private static final String[] HEADER = {"STEP", "SETTING", "TIME", "RECEIVED", "EXPECTED", "PER [95% CI]", "RESULT"};
    private static final int[] WIDTH = {9, 35, 8, 18, 14, 22, 0};

    private final PrintStream out;
    private final Options o;
    private final Progress progress;
    private final Path capture;
    private final List<Step> steps = new ArrayList<>();
    private boolean finished;
    private boolean written = true;

    Report(PrintStream out, Options o, Progress progress, Path capture) {
        this.out = out;
        this.o = o;
        this.progress = progress;
        this.capture = capture;
    }

    void start() {
        synchronized (out) {
            if (!o.json) {
                out.println("halvenor " + o.command + " (controller: " + o.hci
                            + (o.btsnoop == null ? "" : ", capture: " + o.btsnoop) + ")");
                out.println(line(HEADER));
                out.flush();
            }
        }
    }

    /** A finished step: its row goes out at once. */
    void add(Step s) {
        synchronized (out) {
            if (finished) {
                return;
            }
            steps.add(s);
            if (!o.json) {
                progress.clear();
                out.println(line(row(s)));
                out.flush();
            }
        }
    }

    /** The end of the run; `interrupted` is the step a signal stopped, or null. */
    void finish(Step interrupted, String interruption) {
        synchronized (out) {
            if (finished) {
                return;
            }
            progress.clear();
            // The hook may have taken the step just before the main thread finished and added it.
            if (interrupted != null && !steps.contains(interrupted)) {
                if (!interrupted.interrupted) {
                    interrupted.interrupt("interrupted" + (interruption == null ? "" : ": " + interruption));
                }
                add(interrupted);
            }
            finished = true;
            if (o.json) {
                out.println(json());
            } else {
                summary(interrupted != null);
            }
            out.flush();
            writeHtml();
        }
    }

    /** Every step ok, and the page written when one was asked for. */
    boolean ok() {
        synchronized (out) {
            return written && steps.stream().allMatch(s -> s.ok);
        }
    }

    // A page asked for and not written is a failure of the run, said in one line.
    private void writeHtml() {
        if (o.report == null) {
            return;
        }
        try {
            HtmlReport.write(Path.of(o.report), o, steps, json(), capture);
        } catch (IOException e) {
            written = false;
            System.err.println("halvenor: the report " + o.report + " was not written: " + e.getMessage());
        }
    }

    private void summary(boolean interrupted) {
        for (Step s : steps) {
            if (!s.ok) {
                out.println((s.interrupted ? "" : "FAILED ") + s.name + " " + s.setting + ": " + s.error);
            } else if (s.timingTooUncertain()) {
                out.println(String.format(Locale.ROOT, "%s %s: timing too uncertain to judge PER: the replies took"
                                          + " %.3f s of a %.3f s window", s.name, s.setting,
                                          s.uncertaintyMicros() / 1e6, s.windowMicros / 1e6));
            }
        }
        long ok = steps.stream().filter(s -> s.ok).count();
        if (interrupted) {
            out.println("interrupted after " + ok + " step" + (ok == 1 ? "" : "s") + " ok");
        } else {
            out.println(ok == steps.size() ? "all " + ok + " steps ok" : (steps.size() - ok) + " of " + steps.size() + " steps failed");
        }
    }

    private static String line(String[] cells) {
        StringBuilder b = new StringBuilder();
        for (int i = 0; i < cells.length; i++) {
            b.append(i == cells.length - 1 ? cells[i] : pad(cells[i], WIDTH[i]));
        }
        return b.toString().stripTrailing();
    }

    private static String[] row(Step s) {
        synchronized (s) {
            return rowLocked(s);
        }
    }

    private static String[] rowLocked(Step s) {
        String time = Double.isNaN(s.seconds) ? "-" : String.format(Locale.ROOT, "%.2f s", s.seconds);
        String received = s.received == null ? "-" : s.received.toString();
        if (s.windows.size() > 1) {
            received += " (" + s.windows.size() + " windows)";
        }
        String expected = s.expected == null ? "-" : s.expected + (s.expectedGiven != null ? " (given)" : "");
        String per = s.per == null ? "-" : s.per.percent();
        String result = s.ok ? "ok" : s.interrupted ? "INTERRUPTED" : "FAILED";
        return new String[] {s.name, s.setting, time, received, expected, per, result};
    }

    private static String pad(String text, int width) {
        return text + " ".repeat(Math.max(1, width - text.length()));
    }

    String json() {
        StringBuilder b = new StringBuilder("{");
        b.append("\"command\":").append(quote(o.command));
        b.append(",\"hci\":").append(quote(o.hci));
        b.append(",\"btsnoop\":").append(o.btsnoop == null ? "null" : quote(o.btsnoop));
        b.append(",\"ok\":").append(!steps.isEmpty() && steps.stream().allMatch(s -> s.ok));
        b.append(",\"interrupted\":").append(steps.stream().anyMatch(s -> s.interrupted));
        b.append(",\"steps\":[");
        for (int i = 0; i < steps.size(); i++) {
            b.append(i == 0 ? "" : ",").append(step(steps.get(i)));
        }
        return b.append("]}").toString();
    }

    private static String step(Step s) {
        synchronized (s) {  // a signal's hook may be finishing the step
            return stepLocked(s);
        }
    }

    private static String stepLocked(Step s) {
        StringBuilder b = new StringBuilder("{");
        b.append("\"step\":").append(quote(s.name));
        b.append(",\"setting\":").append(quote(s.setting));
        if (s.band != null) {
            b.append(",\"frequency_mhz\":").append(s.band.mhz);
            b.append(",\"channel\":").append(s.band.channel);
            b.append(",\"phy\":").append(quote(s.phy.name));
        }
        if (s.wave != null) {
            b.append(",\"cw_channel\":").append(s.wave[0]);
            b.append(",\"cw_power\":").append(s.wave[1]);
            b.append(",\"cw_type\":").append(s.wave[2]);
        }
        if (!Double.isNaN(s.seconds)) {
            b.append(",\"duration_s\":").append(num(s.seconds));
        }
        if (s.received != null) {
            b.append(",\"windows\":").append(s.windows);
            b.append(",\"received\":").append(s.received);
            b.append(",\"expected\":").append(s.expected);
            b.append(",\"expected_given\":").append(s.expectedGiven != null);
            b.append(",\"expected_range\":[").append(s.expectedLow).append(',').append(s.expectedHigh).append(']');
            b.append(",\"window_s\":").append(num(s.windowMicros / 1e6));
            b.append(",\"timing_uncertainty_s\":").append(num(s.uncertaintyMicros() / 1e6));
            b.append(",\"timing_too_uncertain\":").append(s.timingTooUncertain());
            if (s.per != null) {
                b.append(",\"per\":").append(num(s.per.rate()));
                b.append(",\"per_ci95\":[").append(num(s.per.low())).append(',').append(num(s.per.high())).append(']');
            } else {
                b.append(",\"per\":null,\"per_ci95\":null");
            }
        }
        b.append(",\"commands\":[");
        for (int i = 0; i < s.commands.size(); i++) {
            Observer.Exchange e = s.commands.get(i);
            b.append(i == 0 ? "" : ",").append("{\"command\":").append(quote(Hci.commandName(e.opcode())));
            b.append(",\"opcode\":").append(quote(String.format("0x%04x", e.opcode())));
            b.append(",\"status\":").append(e.status() == Observer.Exchange.NO_REPLY ? "null" : e.status());
            b.append(",\"status_name\":").append(quote(e.status() == Observer.Exchange.NO_REPLY ? "no reply"
                                                                                                : Hci.statusName(e.status())));
            b.append('}');
        }
        b.append("],\"ok\":").append(s.ok);
        b.append(",\"interrupted\":").append(s.interrupted);
        b.append(",\"error\":").append(s.error == null ? "null" : quote(s.error));
        return b.append('}').toString();
    }

    static String num(double v) {
        return String.format(Locale.ROOT, "%.6g", v).replaceAll("(\\.[0-9]*?)0+(e|$)", "$1$2").replaceAll("\\.(e|$)", "$1");
    }

    static String quote(String s) {
        StringBuilder b = new StringBuilder("\"");
        for (char c : s.toCharArray()) {
            switch (c) {
                case '"': b.append("\\\""); break;
                case '\\': b.append("\\\\"); break;
                case '\n': b.append("\\n"); break;
                case '\t': b.append("\\t"); break;
                default:
                    if (c < 0x20) {
                        b.append(String.format("\\u%04x", (int) c));
                    } else {
                        b.append(c);
                    }
            }
        }
        return b.append('"').toString();
    }
}
