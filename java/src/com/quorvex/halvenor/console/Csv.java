// The run as CSV for a spreadsheet: one row per receiver window and one per step, told apart
// by the kind column; every figure the table abbreviates or drops is here.
package com.quorvex.halvenor.console;

import java.time.Instant;
import java.util.List;
import java.util.Locale;

final class Csv {
    static final String HEADER = "kind,time,step,setting,frequency_mhz,channel,phy,window_s,received,expected,per,"
                                 + "per_low,per_high,verdict,result";

    private Csv() {}

    static String of(List<Step> steps, double limit, long minPackets) {
        StringBuilder b = new StringBuilder(HEADER).append('\n');
        for (Step s : steps) {
            synchronized (s) {
                for (Step.Window w : s.windows) {
                    Windows.Judged j = Windows.judge(w, limit, minPackets);
                    row(b, "window", Instant.ofEpochMilli(w.startMicros() / 1000), s, w.micros(), (long) w.count(),
                        j.expected(), j.per(), j.verdict(), "");
                }
                row(b, "step", Instant.ofEpochMilli(s.startMillis), s, s.received == null ? -1 : s.windowMicros,
                    s.received, s.expected, s.per, s.verdict, s.ok ? "ok" : s.interrupted ? "INTERRUPTED" : "FAILED");
            }
        }
        return b.toString();
    }

    private static void row(StringBuilder b, String kind, Instant time, Step s, long micros, Long received, Long expected,
                            Per per, Step.Verdict verdict, String result) {
        b.append(kind).append(',').append(time).append(',').append(s.name).append(',').append(field(s.setting));
        b.append(',').append(s.band == null ? "" : s.band.mhz).append(',').append(s.band == null ? "" : s.band.channel);
        b.append(',').append(s.phy == null ? "" : s.phy.name);
        b.append(',').append(micros < 0 ? "" : String.format(Locale.ROOT, "%.6f", micros / 1e6));
        b.append(',').append(received == null ? "" : received).append(',').append(expected == null ? "" : expected);
        b.append(',').append(per == null ? "" : Report.num(per.rate())).append(',').append(per == null ? "" : Report.num(per.low()));
        b.append(',').append(per == null ? "" : Report.num(per.high())).append(',').append(verdict == null ? "" : verdict);
        b.append(',').append(field(result)).append('\n');
    }

    // RFC 4180: a field with a comma, a quote or a line break is quoted, its quotes doubled.
    private static String field(String text) {
        return text.matches("[^,\"\r\n]*") ? text : "\"" + text.replace("\"", "\"\"") + "\"";
    }
}
