// Prints the results: a table for people, or one JSON object for scripts.
package com.quorvex.halvenor.console;

import java.io.PrintStream;
import java.util.ArrayList;
import java.util.List;
import java.util.Locale;

final class Report {
    private static final String[] HEADER = {"STEP", "SETTING", "TIME", "RECEIVED", "EXPECTED", "PER [95% CI]", "RESULT"};

    private Report() {}

    static void table(PrintStream out, Options o, List<Step> steps) {
        out.println("halvenor " + o.command + " (controller: " + o.hci + (o.btsnoop == null ? "" : ", capture: " + o.btsnoop) + ")");
        List<String[]> rows = new ArrayList<>();
        rows.add(HEADER);
        for (Step s : steps) {
            rows.add(row(s));
        }
        int[] width = new int[HEADER.length];
        for (String[] r : rows) {
            for (int i = 0; i < r.length; i++) {
                width[i] = Math.max(width[i], r[i].length());
            }
        }
        for (String[] r : rows) {
            StringBuilder line = new StringBuilder();
            for (int i = 0; i < r.length; i++) {
                line.append(i == r.length - 1 ? r[i] : pad(r[i], width[i] + 2));
            }
            out.println(line.toString().stripTrailing());
        }
        for (Step s : steps) {
            if (!s.ok) {
                out.println("FAILED " + s.name + " " + s.setting + ": " + s.error);
            }
        }
        long ok = steps.stream().filter(s -> s.ok).count();
        if (ok < steps.size() && !o.verbose) {
            out.println("run again with --verbose to see the library's log lines");
        }
        out.println(ok == steps.size() ? "all " + ok + " steps ok" : (steps.size() - ok) + " of " + steps.size() + " steps failed");
    }

    private static String[] row(Step s) {
        String time = Double.isNaN(s.seconds) ? "-" : String.format(Locale.ROOT, "%.2f s", s.seconds);
        String received = s.received == null ? "-" : s.received.toString();
        if (s.windows.size() > 1) {
            received += " (" + s.windows.size() + " windows)";
        }
        String expected = s.expected == null ? "-" : s.expected + (s.expectedGiven ? " (given)" : "");
        String per = s.per == null ? "-" : s.per.percent();
        return new String[] {s.name, s.setting, time, received, expected, per, s.ok ? "ok" : "FAILED"};
    }

    private static String pad(String text, int width) {
        return text + " ".repeat(Math.max(0, width - text.length()));
    }

    static void json(PrintStream out, Options o, List<Step> steps) {
        StringBuilder b = new StringBuilder("{");
        b.append("\"command\":").append(quote(o.command));
        b.append(",\"hci\":").append(quote(o.hci));
        b.append(",\"btsnoop\":").append(o.btsnoop == null ? "null" : quote(o.btsnoop));
        b.append(",\"ok\":").append(steps.stream().allMatch(s -> s.ok));
        b.append(",\"steps\":[");
        for (int i = 0; i < steps.size(); i++) {
            b.append(i == 0 ? "" : ",").append(step(steps.get(i)));
        }
        out.println(b.append("]}"));
    }

    private static String step(Step s) {
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
            b.append(",\"expected_given\":").append(s.expectedGiven);
            if (s.per != null) {
                b.append(",\"per\":").append(num(s.per.rate()));
                b.append(",\"per_ci95\":[").append(num(s.per.low())).append(',').append(num(s.per.high())).append(']');
            } else {
                b.append(",\"per\":null,\"per_ci95\":null");
            }
        }
        b.append(",\"ok\":").append(s.ok);
        b.append(",\"error\":").append(s.error == null ? "null" : quote(s.error));
        return b.append('}').toString();
    }

    private static String num(double v) {
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
