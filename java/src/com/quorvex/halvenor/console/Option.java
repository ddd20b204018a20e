// Every command and option of the console, declared once: the parser, the help pages, the
// launcher's environment options and the standalone simulator's options all come from, or
// are checked against, these two tables.
package com.quorvex.halvenor.console;

import java.util.List;

record Option(String name, String value, List<String> commands, List<String> requiredBy, String env, Kind kind,
              double min, double max, String help) {

    /** What an option's value is, and the error that names its valid values. */
    enum Kind { FLAG, HCI, FILE, FREQ, PHY, SECONDS, COUNT, OCTET, PERCENT, PATH, PORT, BIT, FRACTION, BURST, SEED, HAL }

    /** A command: the words that name it, what it does in one line, and its page. */
    record Command(String name, String synopsis, String summary, String page) {}

    static final List<String> RUNS = List.of("demo", "dut on", "dut off", "tx", "rx", "sweep rx", "sweep tx", "cw");
    private static final List<String> RECEIVERS = List.of("demo", "rx", "sweep rx");
    private static final List<String> LE_TESTS = List.of("tx", "rx", "sweep rx", "sweep tx", "cw");
    private static final double DAY_S = 24 * 3600;

    static final List<Command> COMMANDS = List.of(
        new Command("demo", "demo", "tour: Device Under Test mode on and off, a 1 s receiver test on every "
                    + "frequency and PHY with its verdict, a transmitter test, a continuous wave",
                    "Device Under Test mode on, then off; a 1 s receiver test on 2402, 2440 and 2480 MHz, each on LE 1M"
                    + " and LE 2M, with packets received, expected, PER and its verdict; a 0.5 s transmitter test on"
                    + " 2440 MHz LE 2M; the continuous-wave command (channel 1, power 9, type 4) for 0.5 s, stopped with"
                    + " an HCI Reset."),
        new Command("dut on", "dut on", "enter classic Device Under Test mode",
                    "Enters classic Device Under Test mode: Enable Device Under Test Mode, Set Event Filter (auto-accept"
                    + " all connections), Write Scan Enable (inquiry and page scan), Write Authentication Enable (off),"
                    + " Write Encryption Mode (off); the last two may be refused. The controller stays in the mode for a"
                    + " tester, until './halvenor dut off'."),
        new Command("dut off", "dut off", "leave Device Under Test mode (HCI Reset)",
                    "Leaves Device Under Test mode with an HCI Reset (also ends any test left running)."),
        new Command("tx", "tx", "LE transmitter test",
                    "LE transmitter test (37-byte payload, pattern 0x00) for S seconds, then LE Test End."),
        new Command("rx", "rx", "LE receiver test: packets received, expected, PER and its verdict",
                    "LE receiver test for S seconds: packets received (the controller's LE Test End count), expected,"
                    + " the packet error rate with its 95 % interval, and the verdict against the PER limit: PASS when"
                    + " the interval lies below it, FAIL above, INCONCLUSIVE when it straddles it, when fewer packets"
                    + " than --min-packets were expected or when the timing was too uncertain to judge."),
        new Command("sweep rx", "sweep [rx]", "the receiver test on every frequency and PHY",
                    "The receiver test on every frequency and PHY, S seconds each, with the options of rx (--expected"
                    + " counts per step). A step that fails does not stop the sweep."),
        new Command("sweep tx", "sweep tx", "the transmitter test on every frequency and PHY",
                    "The transmitter test on every frequency and PHY, S seconds each."),
        new Command("cw", "cw", "vendor continuous-wave transmission",
                    "The vendor continuous-wave command (0xFC04) with the three bytes given, held for S seconds, then"
                    + " an HCI Reset to stop the carrier."),
        new Command("sim", "sim", "a simulated controller for other processes (halvenor-sim)",
                    "Serves simulated controllers as H4 for other processes, one per connection, all on one air: a"
                    + " transmitter test in one process is counted by a receiver test in another; or, with --vhci,"
                    + " one controller to this machine's kernel, as an adapter hciN. --unix, --tcp and --vhci exclude"
                    + " each other. Prints the value to give --hci. Stop it with Ctrl-C or SIGTERM."),
        new Command("help", "help [COMMAND]", "this text, or a command's page", "Commands and options, or one command's page."));

    static final List<Option> ALL = List.of(
        new Option("hci", "sim|none|unix:PATH|tcp:HOST:PORT|tty:DEVICE[,BAUD][,rtscts]|hci:N", RUNS, List.of(),
                   "HALVENOR_HCI", Kind.HCI, 0, 0, "the controller (default: $HALVENOR_HCI, else sim, the simulated one;"
                   + " none: a device without a Bluetooth HAL); rtscts turns on hardware flow control on a serial line;"
                   + " hci:N is this machine's adapter hciN, taken from the kernel through its HCI user channel"
                   + " (root, adapter down)"),
        new Option("hal", "hidl|aidl", RUNS, List.of(), "HALVENOR_HAL", Kind.HAL, 0, 0,
                   "the host Bluetooth HAL the library reaches the controller through (default: $HALVENOR_HAL, else"
                   + " hidl); a phone chooses for itself"),
        new Option("btsnoop", "FILE", RUNS, List.of(), "HALVENOR_BTSNOOP", Kind.FILE, 0, 0,
                   "also record every HCI packet in FILE (btsnoop, opens in Wireshark); an existing capture is appended to"),
        new Option("report", "FILE.html", RUNS, List.of(), null, Kind.FILE, 0, 0,
                   "also write the run as one HTML page (an existing page is replaced at the end)"),
        new Option("csv", "FILE", RUNS, List.of(), null, Kind.FILE, 0, 0,
                   "also write one row per window and per step as CSV (an existing file is replaced at the end)"),
        new Option("json", null, RUNS, List.of(), null, Kind.FLAG, 0, 0, "print the results as one JSON object"),
        new Option("trace", null, RUNS, List.of(), null, Kind.FLAG, 0, 0, "print each HCI command and event as it passes, decoded"),
        new Option("verbose", null, RUNS, List.of(), "HALVENOR_VERBOSE", Kind.FLAG, 0, 0, "show the library's log lines"),
        new Option("limit", "PERCENT", RECEIVERS, List.of(), null, Kind.PERCENT, 0, 100,
                   "the PER limit of the verdict, percent from 0 to 100 (default 30.8, the receiver sensitivity limit for 37-byte payloads)"),
        new Option("min-packets", "N", RECEIVERS, List.of(), null, Kind.COUNT, 1, Long.MAX_VALUE,
                   "fewest packets expected for a verdict, 1 or more (default 1500, as the RF-PHY tests require)"),
        new Option("freq", "F", List.of("tx", "rx"), List.of("tx", "rx"), null, Kind.FREQ, 0, 0,
                   "2402, 2440 or 2480 (MHz; LE channels 0, 19 and 39)"),
        new Option("phy", "P", List.of("tx", "rx"), List.of("tx", "rx"), null, Kind.PHY, 0, 0,
                   "1M or 2M (2M uses the enhanced test commands)"),
        new Option("duration", "S", LE_TESTS, List.of(), null, Kind.SECONDS, 0.01, DAY_S,
                   "seconds from 0.01 to 86400, e.g. 2, 0.5 or 500ms (default 1)"),
        new Option("hold", "S", List.of("dut on"), List.of(), null, Kind.SECONDS, 0.01, DAY_S,
                   "stay S seconds (0.01 to 86400) in the mode, then leave it with an HCI Reset"),
        new Option("expected", "N", List.of("rx", "sweep rx"), List.of(), null, Kind.COUNT, 1, Long.MAX_VALUE,
                   "packets the tester sent during the whole run, 1 or more (for sweep, during each step; default: the"
                   + " window's length over the 625 us packet interval)"),
        new Option("window", "S", List.of("rx", "sweep rx"), List.of(), null, Kind.SECONDS, 1, Runner.MAX_WINDOW_S,
                   "longest window, 1 to 40 s (default 30): longer runs are split and summed, so the 16-bit count never wraps"),
        new Option("channel", "C", List.of("cw"), List.of("cw"), null, Kind.OCTET, 0, 255, "the channel byte, 0 to 255 (or 0x00 to 0xff)"),
        new Option("power", "P", List.of("cw"), List.of("cw"), null, Kind.OCTET, 0, 255, "the power byte, 0 to 255"),
        new Option("type", "T", List.of("cw"), List.of("cw"), null, Kind.OCTET, 0, 255, "the type byte, 0 to 255"),
        new Option("unix", "PATH", List.of("sim"), List.of(), null, Kind.PATH, 0, 0, "listen on a unix socket"),
        new Option("tcp", "PORT", List.of("sim"), List.of(), null, Kind.PORT, 0, 65535,
                   "listen on 127.0.0.1:PORT, 0 to 65535 (the default; 0 picks a free port)"),
        new Option("vhci", "DEVICE", List.of("sim"), List.of(), null, Kind.PATH, 0, 0,
                   "serve one controller to this machine's kernel through DEVICE (/dev/vhci): it appears as an adapter,"
                   + " for --hci hci:N (Linux, root)"),
        new Option("reftx", "0|1", List.of("sim"), List.of(), null, Kind.BIT, 0, 1,
                   "1: a reference transmitter follows every receiver test (default 0)"),
        new Option("loss", "FRACTION", List.of("sim"), List.of(), null, Kind.FRACTION, 0, 1,
                   "share of packets each receiver misses at random, 0 to 1 (default 0)"),
        new Option("burst", "PACKETS", List.of("sim"), List.of(), null, Kind.BURST, 1, 1000,
                   "mean length of a burst of lost packets, 1 to 1000 (default 1: each on its own)"),
        new Option("seed", "N", List.of("sim"), List.of(), null, Kind.SEED, 0, 0,
                   "seed of the losses, to repeat a run (default 0: a seed of its own)"),
        new Option("delay", "SECONDS", List.of("sim"), List.of(), null, Kind.SECONDS, 0, 10,
                   "seconds each command takes the controller, 0 to 10 (default 0)"));

    static Option named(String name) {
        return ALL.stream().filter(o -> o.name.equals(name)).findFirst().orElse(null);
    }

    static Command command(String name) {
        return COMMANDS.stream().filter(c -> c.name.equals(name)).findFirst().orElse(null);
    }

    boolean flag() {
        return kind == Kind.FLAG;
    }

    /** The valid values, as every "bad" message says them. */
    String range() {
        return switch (kind) {
            case FLAG -> "no value";
            case HCI -> "sim, none, unix:PATH, tcp:HOST:PORT, tty:DEVICE[,BAUD][,rtscts] or hci:N";
            case FILE -> "a file name";
            case FREQ -> "2402 (ch 0), 2440 (ch 19) or 2480 (ch 39)";
            case PHY -> "1M or 2M";
            case SECONDS -> min == 0 ? "seconds from 0 to " + Numbers.fmt(max)
                            : "seconds from " + Numbers.fmt(min) + " to " + Numbers.fmt(max) + " (for example 2, 0.5 or 500ms)";
            case COUNT -> "a whole number of packets, 1 or more";
            case OCTET -> "0 to 255 (or 0x00 to 0xff)";
            case PERCENT -> "a percentage from 0 to 100";
            case PATH -> "a socket path";
            case PORT -> "a port from 0 to 65535 (0: a free one)";
            case BIT -> "0 or 1";
            case FRACTION -> "a fraction from 0 to 1";
            case BURST -> "a mean burst length from 1 to 1000 packets";
            case SEED -> "a whole number (0: a seed of its own)";
            case HAL -> "hidl or aidl";
        };
    }

    /** The value taken from its text, or a UsageException naming the valid values. */
    Object parse(String text) throws UsageException {
        Object v = switch (kind) {
            case FLAG -> Boolean.TRUE;
            case HCI -> Options.checkHci("--" + name, text);
            case FILE, PATH -> text.isEmpty() ? null : text;
            case FREQ -> Band.parse(text);
            case PHY -> Phy.parse(text);
            case SECONDS -> Numbers.seconds(text, min, max);
            case COUNT -> Numbers.count(text);
            case OCTET -> Numbers.whole(text, 0, 255, true);
            case PERCENT -> Numbers.decimal(text, 0, 100);
            case PORT -> Numbers.whole(text, 0, 65535, false);
            case BIT -> text.equals("0") || text.equals("1") ? text : null;
            case FRACTION -> Numbers.decimal(text, 0, 1);
            case BURST -> Numbers.decimal(text, 1, 1000);
            case SEED -> text.matches("[0-9]{1,19}") ? text : null;
            case HAL -> text.equals("hidl") || text.equals("aidl") ? text : null;  // as the host layer reads it
        };
        if (v == null) {
            throw bad(text);
        }
        return v;
    }

    UsageException bad(String text) {
        return new UsageException("bad --" + name + " '" + text + "': expected " + range());
    }

    /** "--freq F", or "--json" for a flag. */
    String usage() {
        return "--" + name + (value == null ? "" : " " + value);
    }
}
