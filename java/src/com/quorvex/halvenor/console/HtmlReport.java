// The run as one self-contained HTML page for a test record: the setup, every step with the
// controller's answers, the receiver results drawn as inline SVG, and the decoded HCI trace
// folded away. Written from the same steps as the JSON, whichever thread finishes the run.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.io.InputStream;
import java.net.InetAddress;
import java.nio.file.Files;
import java.nio.file.Path;
import java.security.MessageDigest;
import java.security.NoSuchAlgorithmException;
import java.time.Instant;
import java.time.ZoneId;
import java.time.ZonedDateTime;
import java.time.format.DateTimeFormatter;
import java.util.ArrayList;
import java.util.HexFormat;
import java.util.List;
import java.util.Locale;
import java.util.TreeSet;

final class HtmlReport {
    /** A long Device Under Test hold can carry a tester's traffic; the page keeps the start of it. */
    private static final int MAX_TRACE_PACKETS = 5000;
    // Okabe-Ito colours, told apart with every common colour vision deficiency; the
    // series differ in marker shape too.
    private static final String BLUE = "#0072B2";
    private static final String ORANGE = "#E69F00";
    private static final int W = 640;
    private static final int H = 320;
    private static final int LEFT = 64;
    private static final int RIGHT = 16;
    private static final int TOP = 16;
    private static final int BOTTOM = 56;

    private final StringBuilder b = new StringBuilder();

    private HtmlReport() {}

    /** The page of the run; `outcome` is its summary line, `ok` whether it exits 0. */
    static String page(Options o, List<Step> steps, String json, Path capture, String outcome, boolean ok) {
        HtmlReport r = new HtmlReport();
        r.build(o, steps, json, capture, outcome.startsWith("interrupted") ? "INTERRUPTED: " + outcome : outcome, ok);
        return r.b.toString();
    }

    private void build(Options o, List<Step> steps, String json, Path capture, String verdict, boolean ok) {
        boolean interrupted = steps.stream().anyMatch(s -> s.interrupted);
        b.append("<!DOCTYPE html>\n<html lang=\"en\"><head><meta charset=\"utf-8\">")
         .append("<meta name=\"viewport\" content=\"width=device-width, initial-scale=1\">")
         .append("<title>halvenor ").append(esc(o.command)).append(": ").append(esc(verdict)).append("</title>")
         .append("<style>").append(STYLE).append("</style></head><body>\n");
        b.append("<h1>halvenor ").append(esc(o.command)).append("</h1>\n");
        b.append("<p class=\"verdict ").append(ok ? "ok" : "bad").append("\" id=\"verdict\">").append(esc(verdict));
        if (!ok) {
            b.append(interrupted ? ": the run was stopped before its end; the steps below are those it reached"
                                 : ": see the steps marked FAILED, FAIL or INCONCLUSIVE and why");
        }
        b.append("</p>\n");
        setup(o);
        steps(steps);
        chart(steps, o.limit());
        transmissions(steps);
        trace(capture);
        b.append("<script type=\"application/json\" id=\"results\">").append(json.replace("</", "<\\/"))
         .append("</script>\n</body></html>\n");
    }

    private void setup(Options o) {
        b.append("<h2>Setup</h2>\n<dl class=\"setup\">");
        item("Controller", o.hci);
        item("Bluetooth HAL", o.hal.toUpperCase(Locale.ROOT));
        item("Date and time", ZonedDateTime.now().format(DateTimeFormatter.ofPattern("yyyy-MM-dd HH:mm:ss z")));
        item("Host", hostName());
        item("Library build", build(Path.of(System.getProperty("java.library.path", ".")).resolve("libhalvenor.so")));
        String version = HtmlReport.class.getPackage().getImplementationVersion();
        item("Console version", (version == null ? "unknown" : version) + ", " + build(consoleJar()));
        item("Command line", "./halvenor " + String.join(" ", o.arguments));
        if (o.btsnoop != null) {
            item("Capture", o.btsnoop);
        }
        item("Verdicts", String.format(Locale.ROOT, "PASS when PER's 95 %% interval lies below %.1f %%, FAIL above it;"
                                       + " at least %d packets expected", o.limit() * 100, o.minPackets()));
        if (!o.simulator.isEmpty()) {
            item("Simulated controller", "loss " + o.simulator.get("loss") + ", reference transmitter "
                 + (o.simulator.get("reftx").equals("1") ? "on" : "off") + ", loss bursts " + o.simulator.get("burst")
                 + ", seed " + o.simulator.get("seed") + ", processing delay " + o.simulator.get("delay") + " s");
        }
        b.append("</dl>\n");
    }

    private void item(String term, String value) {
        b.append("<dt>").append(esc(term)).append("</dt><dd>").append(esc(value)).append("</dd>");
    }

    private void steps(List<Step> steps) {
        b.append("<h2>Steps</h2>\n<div class=\"wide\"><table id=\"steps\"><thead><tr>");
        for (String h : List.of("Step", "Setting", "Duration", "Received", "Expected", "PER [95 % CI]",
                                "Controller's answers", "Verdict", "Result")) {
            b.append("<th scope=\"col\">").append(h).append("</th>");
        }
        b.append("</tr></thead><tbody>\n");
        for (int i = 0; i < steps.size(); i++) {
            Step s = steps.get(i);
            synchronized (s) {  // a signal's hook may be finishing the step
                row(i, s);
            }
        }
        b.append("</tbody></table></div>\n");
    }

    private void row(int i, Step s) {
        b.append("<tr data-step=\"").append(i).append("\">");
        cell(s.name);
        cell(s.setting);
        cell(Double.isNaN(s.seconds) ? "-" : String.format(Locale.ROOT, "%.2f s", s.seconds));
        cell(s.received == null ? "-" : s.received + (s.windows.size() > 1 ? " (" + s.windows.size() + " windows)" : ""));
        cell(s.expected == null ? "-" : s.expected + (s.expectedGiven != null ? " (given)" : ""));
        cell(s.per == null ? "-" : s.per.percent());
        b.append("<td class=\"wrap\"><ul class=\"answers\">");
        for (Observer.Exchange e : s.commands) {
            b.append("<li title=\"").append(esc(Hci.commandLabel(e.opcode()))).append("\">")
             .append(esc(Hci.commandName(e.opcode()))).append(": ").append(esc(e.statusText())).append("</li>");
        }
        b.append("</ul></td><td class=\"").append(s.verdict == null ? "" : s.verdict == Step.Verdict.PASS ? "ok" : "bad")
         .append("\">").append(s.verdict == null ? "-" : s.verdict.toString());
        if (s.verdictWhy != null) {
            b.append("<br>").append(esc(s.verdictWhy));
        }
        b.append("</td><td class=\"").append(s.ok ? "ok" : "bad").append("\">")
         .append(s.ok ? "ok" : s.interrupted ? "INTERRUPTED" : "FAILED");
        if (s.error != null) {
            b.append("<br>").append(esc(s.error));
        }
        b.append("</td></tr>\n");
    }

    private void cell(String text) {
        b.append("<td>").append(esc(text)).append("</td>");
    }

    // PER of each receiver step by channel, one series per PHY, the interval as whiskers.
    private void chart(List<Step> steps, double limit) {
        List<Step> rx = steps.stream().filter(HtmlReport::charted).toList();
        b.append("<h2>Packet error rate</h2>\n");
        if (rx.isEmpty()) {
            b.append("<p>No receiver test of this run has a packet error rate.</p>\n");
            return;
        }
        double top = niceTop(rx.stream().mapToDouble(s -> s.per.high()).max().orElse(0));
        List<Integer> mhz = new TreeSet<>(rx.stream().map(s -> s.band.mhz).toList()).stream().toList();
        b.append("<figure><svg id=\"per-chart\" viewBox=\"0 0 ").append(W).append(' ').append(H)
         .append("\" role=\"img\" aria-labelledby=\"per-caption\" xmlns=\"http://www.w3.org/2000/svg\">");
        axes(top, mhz);
        String label = String.format(Locale.ROOT, "%.1f %%", limit * 100);
        if (limit <= top) {
            double y = y(limit, top);
            b.append(String.format(Locale.ROOT, "<line class=\"limit\" x1=\"%d\" x2=\"%d\" y1=\"%.1f\" y2=\"%.1f\"/>",
                                   LEFT, W - RIGHT, y, y));
            b.append(String.format(Locale.ROOT, "<text x=\"%d\" y=\"%.1f\" class=\"limit-label\">%s</text>",
                                   W - RIGHT - 4, y - 4, label));
        }
        for (int i = 0; i < steps.size(); i++) {
            if (charted(steps.get(i))) {
                point(i, steps.get(i), top, mhz);
            }
        }
        List<String> keys = new ArrayList<>();
        if (rx.stream().anyMatch(s -> s.phy == Phy.LE_1M)) {
            keys.add("<span class=\"key\" style=\"color:" + BLUE + "\">&#9679; LE 1M</span>");
        }
        if (rx.stream().anyMatch(s -> s.phy == Phy.LE_2M)) {
            keys.add("<span class=\"key\" style=\"color:" + ORANGE + "\">&#9632; LE 2M</span>");
        }
        b.append("</svg><figcaption id=\"per-caption\">PER per channel with its 95 % interval: ")
         .append(String.join(", ", keys)).append(". ")
         .append(limit <= top ? "The dashed line is the PER limit of the verdicts, " + label + "."
                              : "The PER limit of the verdicts, " + label + ", lies above this chart's range.")
         .append(" The values are those of the table above.</figcaption></figure>\n");
    }

    private static boolean charted(Step s) {
        return s.per != null && s.band != null;
    }

    private void axes(double top, List<Integer> mhz) {
        b.append("<g class=\"axis\">");
        for (int t = 0; t <= 4; t++) {
            double v = top * t / 4;
            double y = y(v, top);
            b.append(String.format(Locale.ROOT, "<line class=\"grid\" x1=\"%d\" x2=\"%d\" y1=\"%.1f\" y2=\"%.1f\"/>",
                                   LEFT, W - RIGHT, y, y));
            b.append(String.format(Locale.ROOT, "<text x=\"%d\" y=\"%.1f\" text-anchor=\"end\">%s %%</text>",
                                   LEFT - 6, y + 4, trim(v * 100)));
        }
        for (int m : mhz) {
            b.append(String.format(Locale.ROOT, "<text x=\"%.1f\" y=\"%d\" text-anchor=\"middle\">%d MHz (ch %d)</text>",
                                   x(m, 0, mhz), H - BOTTOM + 20, m, (m - 2402) / 2));
        }
        b.append(String.format(Locale.ROOT, "<text x=\"%d\" y=\"%d\" text-anchor=\"middle\">LE channel</text>",
                               (LEFT + W - RIGHT) / 2, H - 10));
        b.append("</g>");
    }

    private void point(int index, Step s, double top, List<Integer> mhz) {
        boolean twoM = s.phy == Phy.LE_2M;
        double x = x(s.band.mhz, twoM ? 14 : -14, mhz);
        double y = y(s.per.rate(), top);
        double low = y(s.per.low(), top);
        double high = y(s.per.high(), top);
        String colour = twoM ? ORANGE : BLUE;
        b.append("<g class=\"point\" data-step=\"").append(index).append("\" data-frequency=\"").append(s.band.mhz)
         .append("\" data-phy=\"").append(s.phy.name).append("\" data-per=\"").append(Report.num(s.per.rate()))
         .append("\" data-low=\"").append(Report.num(s.per.low())).append("\" data-high=\"")
         .append(Report.num(s.per.high())).append("\"><title>").append(esc(s.setting)).append(": PER ")
         .append(esc(s.per.percent())).append("</title>");
        b.append(String.format(Locale.ROOT, "<path stroke=\"%s\" class=\"whisker\" d=\"M%.1f %.1fV%.1fM%.1f %.1fh10M%.1f %.1fh10\"/>",
                               colour, x, low, high, x - 5, low, x - 5, high));
        if (twoM) {
            b.append(String.format(Locale.ROOT, "<rect x=\"%.1f\" y=\"%.1f\" width=\"10\" height=\"10\" fill=\"%s\"/>",
                                   x - 5, y - 5, colour));
        } else {
            b.append(String.format(Locale.ROOT, "<circle cx=\"%.1f\" cy=\"%.1f\" r=\"5.5\" fill=\"%s\"/>", x, y, colour));
        }
        b.append("</g>");
    }

    private static double x(int mhz, double offset, List<Integer> all) {
        double band = (double) (W - LEFT - RIGHT) / all.size();
        return LEFT + band * (all.indexOf(mhz) + 0.5) + offset;
    }

    private static double y(double per, double top) {
        return TOP + (H - TOP - BOTTOM) * (1 - per / top);
    }

    /** The axis reaches a round number a little above the highest interval, 1 % at least. */
    static double niceTop(double highest) {
        double wanted = Math.max(0.01, highest * 1.1);
        for (double step : new double[] {0.01, 0.02, 0.05, 0.1, 0.2, 0.35, 0.5, 1.0}) {
            if (wanted <= step) {
                return step;
            }
        }
        return 1.0;
    }

    private void transmissions(List<Step> steps) {
        List<Step> tx = steps.stream().filter(s -> s.name.equals("tx") || s.name.equals("cw")).toList();
        if (tx.isEmpty()) {
            return;
        }
        b.append("<h2>Transmissions</h2>\n<ul id=\"transmissions\">");
        for (Step s : tx) {
            String what = s.name.equals("tx") ? "LE Transmitter Test, 37-byte payload, pattern 0x00, " + s.setting
                                              : "vendor continuous wave, " + s.setting;
            b.append("<li>").append(esc(what)).append(String.format(Locale.ROOT, ", for %.2f s: ", s.seconds))
             .append(s.ok ? "ok" : esc(s.error == null ? "FAILED" : s.error)).append("</li>");
        }
        b.append("</ul>\n");
    }

    private void trace(Path capture) {
        List<Capture.Packet> packets;
        try {
            packets = new Capture(capture).readNew();
        } catch (IOException e) {
            b.append("<p>The HCI trace could not be read: ").append(esc(e.getMessage())).append("</p>\n");
            return;
        }
        b.append("<details id=\"trace\"><summary>HCI trace (").append(packets.size()).append(" packets)</summary><pre>");
        long start = packets.isEmpty() ? 0 : packets.get(0).micros();
        for (Capture.Packet p : packets.subList(0, Math.min(packets.size(), MAX_TRACE_PACKETS))) {
            for (String line : Hci.describe(p, p.micros() - start)) {
                b.append(esc(line)).append('\n');
            }
        }
        if (packets.size() > MAX_TRACE_PACKETS) {
            b.append(esc("... " + (packets.size() - MAX_TRACE_PACKETS) + " more packets, in the capture\n"));
        }
        b.append("</pre></details>\n");
    }

    private static Path consoleJar() {
        try {
            return Path.of(HtmlReport.class.getProtectionDomain().getCodeSource().getLocation().toURI());
        } catch (java.net.URISyntaxException | SecurityException e) {
            return Path.of("halvenor.jar");
        }
    }

    private static String hostName() {
        try {
            return InetAddress.getLocalHost().getHostName();
        } catch (IOException e) {
            return System.getenv().getOrDefault("HOSTNAME", "unknown");
        }
    }

    /** A file's build: when it was written and the start of its SHA-256. */
    private static String build(Path file) {
        try (InputStream in = Files.newInputStream(file)) {
            MessageDigest sha = MessageDigest.getInstance("SHA-256");
            byte[] buf = new byte[1 << 16];
            for (int n; (n = in.read(buf)) > 0;) {
                sha.update(buf, 0, n);
            }
            Instant when = Files.getLastModifiedTime(file).toInstant();
            return file.getFileName() + " of " + DateTimeFormatter.ofPattern("yyyy-MM-dd HH:mm")
                    .format(when.atZone(ZoneId.systemDefault())) + ", SHA-256 "
                   + HexFormat.of().formatHex(sha.digest()).substring(0, 16);
        } catch (IOException | NoSuchAlgorithmException e) {
            return file + " (not readable)";
        }
    }

    private static String trim(double v) {
        return String.format(Locale.ROOT, "%.2f", v).replaceAll("\\.?0+$", "");
    }

    static String esc(String s) {
        return s.replace("&", "&amp;").replace("<", "&lt;").replace(">", "&gt;").replace("\"", "&quot;");
    }

    private static final String STYLE = """
        body{font-family:system-ui,sans-serif;margin:1em auto;max-width:62em;padding:0 1em;color:#111;line-height:1.4}
        h1{margin-bottom:.2em}h2{margin-top:1.4em;border-bottom:1px solid #ccc}
        .verdict{font-weight:bold;padding:.5em .8em;border-left:.5em solid}
        .verdict.ok{border-color:#009E73;background:#e6f5f0}.verdict.bad{border-color:#D55E00;background:#fbeee6}
        dl.setup{display:grid;grid-template-columns:max-content 1fr;gap:.2em 1em}dt{font-weight:bold}dd{margin:0}
        .wide{overflow-x:auto}table{border-collapse:collapse;font-size:.88em;width:100%}
        th,td{border:1px solid #bbb;padding:.3em .4em;text-align:left;vertical-align:top;overflow-wrap:anywhere}
        th{background:#eee}td.ok{color:#00664a;font-weight:bold}td.bad{color:#a33d00;font-weight:bold}
        ul.answers{margin:0;padding-left:0;list-style:none;font-size:.92em}
        figure{margin:0}svg{width:100%;max-width:640px;height:auto;font-size:12px}
        .grid{stroke:#ddd}.axis text{fill:#333}.whisker{fill:none;stroke-width:2}
        .limit{stroke:#444;stroke-dasharray:6 4}.limit-label{fill:#444;text-anchor:end}
        details pre{font-size:.8em;overflow-x:auto;background:#f6f6f6;padding:.5em}
        @page{size:A4;margin:15mm}
        @media print{body{max-width:none;margin:0;padding:0;font-size:10pt}.wide{overflow:visible}
        table{font-size:8pt}tr,figure{break-inside:avoid}details{display:none}}
        """;
}
