// The console's help, made from the option table: an overview, and a page per command
// ("./halvenor help rx", "rx --help", "help dut" for both of dut's pages).
package com.quorvex.halvenor.console;

import java.util.ArrayList;
import java.util.List;

final class Usage {
    private static final int WIDTH = 78;
    // Keeps an option and its value on one line of a synopsis.
    private static final char NBSP = '\u00a0';

    private Usage() {}

    private static final String OUTCOME = """
        A step is ok when the library and the controller agree that it succeeded: every native
        it called reported success and the controller accepted every command (Command Complete
        or Command Status with status 0x00). A receiver step's verdict compares the 95 % interval
        of its PER with the limit (--limit, default 30.8 %): PASS below it, FAIL above it,
        INCONCLUSIVE when the interval straddles it, when fewer packets than --min-packets
        (default 1500) were expected, or when the timing was too uncertain to judge.
        Exit status: 0 when every step was ok and every verdict PASS; 1 when a step could not
        run; 2 for a bad command line; 3 when a measurement failed its limit; 4 when a verdict
        was inconclusive; 129, 130 or 143 when stopped by SIGHUP, SIGINT (Ctrl-C) or SIGTERM
        (the running test is ended first). With several outcomes, the most severe: a signal,
        then 1, then 3, then 4.
        """;

    /** The overview, or the page of a command ("dut" and "sweep" give both of theirs). */
    static String text(String topic) {
        if (topic == null || topic.equals("help")) {
            return overview();
        }
        List<String> names = switch (topic) {
            case "dut" -> List.of("dut on", "dut off");
            case "sweep" -> List.of("sweep rx", "sweep tx");
            default -> List.of(topic);
        };
        StringBuilder b = new StringBuilder();
        for (String name : names) {
            b.append(page(Option.command(name))).append('\n');
        }
        return topic.equals("sim") ? b.toString() : b + globals() + "\n";
    }

    private static String overview() {
        StringBuilder b = new StringBuilder("usage: ./halvenor [global options] COMMAND [options]\n\n");
        b.append("Commands (./halvenor help COMMAND for one of them):\n");
        for (Option.Command c : Option.COMMANDS) {
            b.append(wrap(synopsis(c), "  ", "      "));
            b.append(wrap(c.summary(), "        ", "        "));
        }
        return b.append('\n').append(globals()).append("\n\n").append(OUTCOME).toString();
    }

    private static String page(Option.Command c) {
        StringBuilder b = new StringBuilder(wrap("usage: ./halvenor " + synopsis(c), "", "    "));
        b.append(wrap(c.page(), "", ""));
        for (Option o : Option.ALL) {
            if (o.commands().contains(c.name()) && !global(o)) {
                b.append(line(o.usage(), o.help()));
            }
        }
        return b.toString();
    }

    private static String globals() {
        StringBuilder b = new StringBuilder("Global options (every command but sim):\n");
        for (Option o : Option.ALL) {
            if (global(o)) {
                b.append(line(o.usage(), o.help()));
            }
        }
        b.append(line("-h, --help", "help (after a command: that command's page)"));
        return b.append(line("--version", "the console's version and the commit the library was built from"))
                .toString().stripTrailing();
    }

    /** "rx --freq F --phy P [--duration S] ...": the command's own options, required first. */
    static String synopsis(Option.Command c) {
        StringBuilder b = new StringBuilder(c.synopsis());
        for (Option o : Option.ALL) {
            if (o.requiredBy().contains(c.name())) {
                b.append(' ').append(o.usage().replace(' ', NBSP));
            }
        }
        for (Option o : Option.ALL) {
            if (o.commands().contains(c.name()) && !o.requiredBy().contains(c.name()) && !global(o)) {
                b.append(" [").append(o.usage().replace(' ', NBSP)).append(']');
            }
        }
        return b.toString();
    }

    static boolean global(Option o) {
        return o.commands().equals(Option.RUNS);
    }

    private static String line(String left, String help) {
        String head = "  " + left;
        return head.length() < 20 ? wrap(help, String.format("%-20s", head), " ".repeat(20))
                                  : head + "\n" + wrap(help, " ".repeat(20), " ".repeat(20));
    }

    // Words filled into lines of WIDTH columns, the first line after `first`, the others after `rest`.
    private static String wrap(String text, String first, String rest) {
        List<String> lines = new ArrayList<>();
        StringBuilder line = new StringBuilder(first);
        for (String word : text.split(" +")) {
            boolean fresh = line.toString().isBlank() || line.charAt(line.length() - 1) == ' ';
            if (!fresh && line.length() + 1 + word.length() > WIDTH) {
                lines.add(line.toString());
                line = new StringBuilder(rest);
                fresh = true;
            }
            line.append(fresh ? "" : " ").append(word);
        }
        lines.add(line.toString());
        return String.join("\n", lines).replace(NBSP, ' ') + "\n";
    }
}
