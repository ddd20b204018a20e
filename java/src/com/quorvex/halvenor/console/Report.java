// Prints the results: a table for people, 80 columns wide, row by row as each step
// finishes, or one JSON object for scripts; and at the end the CSV and the HTML page when
// asked for. The main thread adds steps; the interrupt hook may finish the report instead,
// with the step it interrupted; whoever finishes first prints the end.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.PrintStream;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;

final class Report {
    static final int EXIT_OK = 0;
    static final int EXIT_FAILED = 1;
    static final int EXIT_USAGE = 2;  // a bad command line, or a setup that keeps the adapter from being taken
    static final int EXIT_LIMIT = 3;
    static final int EXIT_INCONCLUSIVE = 4;
    private static final String[] HEADER = {"STEP", "SETTING", "COUNT", "PER [95% CI]", "VERDICT", "RESULT"};
    private static final int[] WIDTH = {8, 20, 7, 21, 13, 0};

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
            if (!o.flag("json")) {
                out.println("halvenor " + o.command + " (controller: " + o.hci + (o.hal.equals("aidl") ? ", HAL: aidl" : "")
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
            if (!o.flag("json")) {
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
            if (o.flag("json")) {
                out.println(json());
            } else {
                notes();
                out.println(outcome());
            }
            out.flush();
            write("csv", () -> Csv.of(steps, o.limit(), o.minPackets()));
            write("report", () -> HtmlReport.page(o, steps, json(), capture, outcome(), exitStatus() == EXIT_OK));
        }
    }

    /**
     * The most severe outcome: an adapter the setup kept from being taken (as a bad value
     * would), a step that could not run, then a limit failed, then an inconclusive verdict.
     */
    int exitStatus() {
        synchronized (out) {
            if (written && steps.stream().anyMatch(s -> !s.ok && s.setupRefused)) {
                return EXIT_USAGE;
            }
            if (!written || steps.stream().anyMatch(s -> !s.ok)) {
                return EXIT_FAILED;
            }
            if (steps.stream().anyMatch(s -> s.verdict == Step.Verdict.FAIL)) {
                return EXIT_LIMIT;
            }
            return steps.stream().anyMatch(s -> s.verdict == Step.Verdict.INCONCLUSIVE) ? EXIT_INCONCLUSIVE : EXIT_OK;
        }
    }

    interface Content {
        String make() throws IOException;
    }

    // A file asked for and not written is a failure of the run, said in one line.
    private void write(String option, Content content) {
        String file = o.text(option);
        if (file == null) {
            return;
        }
        try {
            Replacement.write(Path.of(file), content.make());
        } catch (IOException e) {
            written = false;
            System.err.println("halvenor: the " + option + " file " + file + " was not written: " + Options.reason(e));
        }
    }

    private void notes() {
        for (Step s : steps) {
            if (!s.ok) {
                out.println((s.interrupted ? "" : "FAILED ") + s.name + " " + s.setting + ": " + s.error);
            } else if (s.verdictWhy != null) {
                out.println(s.verdict + " " + s.name + " " + s.label() + ": " + s.verdictWhy);
            }
        }
    }

    /** "all 9 steps ok (6 PASS)", "2 of 9 steps failed (...)", "interrupted after 1 step ok". */
    String outcome() {
        long ok = steps.stream().filter(s -> s.ok).count();
        Map<Step.Verdict, Integer> counted = verdicts();
        List<String> parts = new ArrayList<>();
        counted.forEach((v, n) -> parts.add(n + " " + v));
        String verdicts = parts.isEmpty() ? "" : " (" + String.join(", ", parts) + ")";
        if (steps.stream().anyMatch(s -> s.interrupted)) {
            return "interrupted after " + plural(ok, "step") + " ok" + verdicts;
        }
        return (ok == steps.size() ? (ok == 1 ? "" : "all ") + plural(ok, "step") + " ok"
                                   : (steps.size() - ok) + " of " + plural(steps.size(), "step") + " failed") + verdicts;
    }

    private Map<Step.Verdict, Integer> verdicts() {
        Map<Step.Verdict, Integer> counted = new LinkedHashMap<>();
        for (Step.Verdict v : Step.Verdict.values()) {
            int n = (int) steps.stream().filter(s -> s.verdict == v).count();
            if (n > 0) {
                counted.put(v, n);
            }
        }
        return counted;
    }

    static String plural(long n, String word) {
        return n + " " + word + (n == 1 ? "" : "s");
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
            String count = s.received == null ? "-" : s.received.toString();
            String per = s.received != null && s.received == 0 ? "no transmitter heard"
                         : s.per == null ? "-" : String.format(Locale.ROOT, "%.1f%% [%.1f-%.1f%%]", s.per.rate() * 100,
                                                               s.per.low() * 100, s.per.high() * 100);
            String verdict = s.verdict == null ? "-" : s.verdict.toString();
            String result = s.ok ? "ok" : s.interrupted ? "INTERRUPTED" : "FAILED";
            return new String[] {s.name, s.label(), count, per, verdict, result};
        }
    }

    private static String pad(String text, int width) {
        return text + " ".repeat(Math.max(1, width - text.length()));
    }

    String json() {
        StringBuilder b = new StringBuilder("{");
        b.append("\"command\":").append(quote(o.command));
        b.append(",\"hci\":").append(quote(o.hci));
        b.append(",\"hal\":").append(quote(o.hal));
        b.append(",\"btsnoop\":").append(o.btsnoop == null ? "null" : quote(o.btsnoop));
        if (!o.simulator.isEmpty()) {
            b.append(",\"simulator\":{");
            o.simulator.forEach((k, v) -> b.append(b.charAt(b.length() - 1) == '{' ? "" : ",").append(quote(k))
                                           .append(':').append(v.matches("[0-9]+(\\.[0-9]+)?") ? v : quote(v)));
            b.append('}');
        }
        b.append(",\"limit\":{\"per\":").append(num(o.limit())).append(",\"min_packets\":").append(o.minPackets()).append('}');
        b.append(",\"ok\":").append(!steps.isEmpty() && steps.stream().allMatch(s -> s.ok));
        b.append(",\"interrupted\":").append(steps.stream().anyMatch(s -> s.interrupted));
        b.append(",\"verdicts\":{");
        verdicts().forEach((v, n) -> b.append(b.charAt(b.length() - 1) == '{' ? "" : ",").append(quote(v.toString()))
                                       .append(':').append(n));
        b.append("},\"steps\":[");
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
            b.append(",\"windows\":").append(s.windows.stream().map(w -> String.valueOf(w.count())).toList()
                                              .toString().replace(" ", ""));
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
            b.append(",\"verdict\":").append(s.verdict == null ? "null" : quote(s.verdict.toString()));
            b.append(",\"verdict_reason\":").append(s.verdictWhy == null ? "null" : quote(s.verdictWhy));
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
