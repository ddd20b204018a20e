// The console's command line: a command, its options and the global options, checked
// up front so that a bad argument is reported before the controller is touched.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.List;
import java.util.Map;
import java.util.Set;
import java.util.TreeSet;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

final class Options {
    static final String HCI_VALUES = "sim, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD][,rtscts]";
    static final double MIN_WINDOW_S = 1;
    private static final Pattern HCI = Pattern.compile(
            "sim|none|unix:.+|tcp:[^:]+:([1-9][0-9]{0,4})|tty:([^,]+)((,[^,]+)*)");
    private static final Set<Integer> BAUDS = Set.of(9600, 19200, 38400, 57600, 115200, 230400, 460800, 500000,
                                                     921600, 1000000, 1500000, 2000000, 3000000, 4000000);
    private static final Set<String> FLAGS = Set.of("verbose", "json", "help", "trace");
    private static final Set<String> GLOBAL = Set.of("hci", "btsnoop", "verbose", "json", "help", "trace", "report");
    static final Map<String, Set<String>> COMMAND_OPTIONS = Map.of(
            "demo", Set.of(),
            "help", Set.of(),
            "dut on", Set.of("hold"),
            "dut off", Set.of(),
            "tx", Set.of("freq", "phy", "duration"),
            "rx", Set.of("freq", "phy", "duration", "expected", "window"),
            "sweep rx", Set.of("duration", "expected", "window"),
            "sweep tx", Set.of("duration"),
            "cw", Set.of("channel", "power", "type", "duration"));
    private static final String COMMANDS = "demo, dut on, dut off, tx, rx, cw, sweep or help";

    String command;            // one of the keys of COMMAND_OPTIONS
    String helpFor;            // with command "help": the command asked about, or null
    String hci;                // from the launcher's HALVENOR_HCI, or sim
    String btsnoop;            // from the launcher's HALVENOR_BTSNOOP, or null
    String report;             // the HTML page to write, or null
    List<String> arguments;    // the command line as given
    boolean json;
    boolean verbose;
    boolean trace;
    Band band;
    Phy phy;
    double seconds = 1;
    double holdSeconds;
    double window = Runner.DEFAULT_WINDOW_S;
    Long expected;
    int channel;
    int power;
    int type;

    static Options parse(String[] args) throws UsageException {
        Map<String, String> values = new HashMap<>();
        List<String> words = new ArrayList<>();
        for (int i = 0; i < args.length; i++) {
            String a = args[i];
            if (a.equals("-h")) {
                a = "--help";
            }
            if (!a.startsWith("-") || a.equals("-")) {
                words.add(a);
                continue;
            }
            int eq = a.indexOf('=');
            String name = a.startsWith("--") ? a.substring(2, eq < 0 ? a.length() : eq) : a;
            if (!known(name)) {
                throw new UsageException("unknown option '" + (eq < 0 ? a : a.substring(0, eq)) + "'");
            }
            if (values.containsKey(name)) {
                throw new UsageException("option --" + name + " given twice");
            }
            String value;
            if (FLAGS.contains(name)) {
                if (eq >= 0) {
                    throw new UsageException("option --" + name + " takes no value");
                }
                value = "";
            } else if (eq >= 0) {
                value = a.substring(eq + 1);
            } else if (i + 1 < args.length) {
                value = args[++i];
            } else {
                throw new UsageException("option --" + name + " needs a value");
            }
            values.put(name, value);
        }
        Options o = new Options();
        o.arguments = List.of(args);
        if (words.isEmpty() && values.containsKey("help")) {
            o.command = "help";
            return o;
        }
        o.command = command(words);
        if (o.command.equals("help") || values.containsKey("help")) {
            o.helpFor = o.command.equals("help") ? helpTopic(words) : o.command;
            o.command = "help";
            return o;
        }
        o.apply(values);
        return o;
    }

    private static boolean known(String name) {
        return GLOBAL.contains(name) || COMMAND_OPTIONS.values().stream().anyMatch(s -> s.contains(name));
    }

    private static String command(List<String> words) throws UsageException {
        if (words.isEmpty()) {
            throw new UsageException("no command given: use " + COMMANDS);
        }
        String first = words.get(0);
        String command;
        int used = 1;
        if (first.equals("dut")) {
            if (words.size() < 2 || !(words.get(1).equals("on") || words.get(1).equals("off"))) {
                throw new UsageException("dut needs 'on' or 'off'");
            }
            command = "dut " + words.get(1);
            used = 2;
        } else if (first.equals("sweep")) {
            boolean mode = words.size() > 1 && (words.get(1).equals("rx") || words.get(1).equals("tx"));
            command = "sweep " + (mode ? words.get(1) : "rx");
            used = mode ? 2 : 1;
        } else if (first.equals("help")) {
            return "help";
        } else if (COMMAND_OPTIONS.containsKey(first)) {
            command = first;
        } else {
            throw new UsageException("unknown command '" + first + "': use " + COMMANDS);
        }
        if (words.size() > used) {
            throw new UsageException("unexpected argument '" + words.get(used) + "' after " + command);
        }
        return command;
    }

    // "help", "help rx", "help dut on", "help sweep tx".
    private static String helpTopic(List<String> words) throws UsageException {
        if (words.size() < 2) {
            return null;
        }
        List<String> rest = words.subList(1, words.size());
        String topic = command(rest);
        return topic.equals("help") ? null : topic;
    }

    private void apply(Map<String, String> values) throws UsageException {
        Set<String> allowed = COMMAND_OPTIONS.get(command);
        for (String name : values.keySet()) {
            if (!GLOBAL.contains(name) && !allowed.contains(name)) {
                throw new UsageException("option --" + name + " does not apply to " + command + " (its options: "
                                         + optionList(allowed) + ")");
            }
        }
        json = values.containsKey("json");
        verbose = values.containsKey("verbose");
        trace = values.containsKey("trace");
        hci = values.get("hci");
        if (hci != null) {
            checkHci("--hci", hci);
        }
        btsnoop = values.get("btsnoop");
        report = values.get("report");
        if (report != null) {
            checkReport(report);
        }
        if (command.equals("tx") || command.equals("rx")) {
            band = Band.parse(require(values, "freq", "2402, 2440 or 2480"));
            phy = Phy.parse(require(values, "phy", "1M or 2M"));
        }
        if (values.containsKey("duration")) {
            seconds = Numbers.seconds("--duration", values.get("duration"), 0, 24 * 3600);
        }
        if (values.containsKey("hold")) {
            holdSeconds = Numbers.seconds("--hold", values.get("hold"), 0, 24 * 3600);
        }
        if (values.containsKey("window")) {
            window = Numbers.seconds("--window", values.get("window"), MIN_WINDOW_S, Runner.MAX_WINDOW_S);
        }
        if (values.containsKey("expected")) {
            expected = Numbers.count("--expected", values.get("expected"));
        }
        if (command.equals("cw")) {
            channel = Numbers.octet("--channel", require(values, "channel", "0 to 255"));
            power = Numbers.octet("--power", require(values, "power", "0 to 255"));
            type = Numbers.octet("--type", require(values, "type", "0 to 255"));
        }
    }

    static String optionList(Set<String> options) {
        return options.isEmpty() ? "none besides the global ones" : "--" + String.join(", --", new TreeSet<>(options));
    }

    /** The controller values the host layer takes; `none` stands for a device without the HAL. */
    private static void checkHci(String source, String value) throws UsageException {
        Matcher m = HCI.matcher(value);
        if (!m.matches() || (m.group(1) != null && Integer.parseInt(m.group(1)) > 65535)) {
            throw new UsageException("bad " + source + " '" + value + "': valid values are " + HCI_VALUES);
        }
        String fields = m.group(3);
        if (fields == null || fields.isEmpty()) {
            return;
        }
        for (String field : fields.substring(1).split(",")) {
            if (field.equals("rtscts") || (field.matches("[0-9]{1,7}") && BAUDS.contains(Integer.parseInt(field)))) {
                continue;
            }
            throw new UsageException("bad " + source + " '" + value + "': " + (field.matches("[0-9]+")
                    ? "baud rate " + field + " is not a standard speed (" + standardSpeeds() + ")"
                    : "'" + field + "' is neither a baud rate nor rtscts"));
        }
    }

    private static String standardSpeeds() {
        return String.join(", ", new TreeSet<>(BAUDS).stream().map(String::valueOf).toList());
    }

    private String require(Map<String, String> values, String name, String valid) throws UsageException {
        String v = values.get(name);
        if (v == null) {
            throw new UsageException(command + " needs --" + name + " (" + valid + ")");
        }
        return v;
    }

    /**
     * The library reads HALVENOR_HCI and HALVENOR_BTSNOOP from the process environment,
     * which a running JVM cannot change: the launcher exports them before the JVM starts.
     * Both are checked here whichever way they were given, before anything runs.
     */
    void checkEnvironment(Map<String, String> env) throws UsageException {
        if (env.get("HALVENOR_CONSOLE_CAPTURE") == null || env.get("HALVENOR_LOG_FILE") == null) {
            throw new UsageException("the console runs through its launcher: ./halvenor " + command);
        }
        String envHci = env.getOrDefault("HALVENOR_HCI", "");
        envHci = envHci.isEmpty() ? "sim" : envHci;
        if (hci != null && !hci.equals(envHci)) {
            throw new UsageException("--hci " + hci + " must be given to the ./halvenor launcher, which sets HALVENOR_HCI"
                                     + " (the library sees '" + envHci + "')");
        }
        checkHci(hci != null ? "--hci" : "HALVENOR_HCI", envHci);
        hci = envHci;
        String envSnoop = env.get("HALVENOR_BTSNOOP");
        if (btsnoop != null && !btsnoop.equals(envSnoop)) {
            throw new UsageException("--btsnoop " + btsnoop + " must be given to the ./halvenor launcher,"
                                     + " which sets HALVENOR_BTSNOOP");
        }
        btsnoop = envSnoop == null || envSnoop.isEmpty() ? null : envSnoop;
        if (btsnoop != null) {
            checkCapture(btsnoop);
        }
    }

    /** The page is written at the end of the run, replacing a file of that name. */
    private static void checkReport(String path) throws UsageException {
        Path file = Path.of(path);
        Path dir = file.toAbsolutePath().getParent();
        if (Files.isDirectory(file)) {
            throw new UsageException("bad --report '" + path + "': it is a directory");
        }
        boolean writable = Files.exists(file) ? Files.isWritable(file) : dir != null && Files.isWritable(dir);
        if (!writable) {
            throw new UsageException("bad --report '" + path + "': cannot write there");
        }
    }

    /** Records are appended to an existing capture; anything else in its place is refused. */
    private static void checkCapture(String path) throws UsageException {
        Path file = Path.of(path);
        Path dir = file.toAbsolutePath().getParent();
        try {
            if (Files.isDirectory(file)) {
                throw new UsageException("bad --btsnoop '" + path + "': it is a directory");
            }
            if (Files.exists(file) && !Capture.appendable(file)) {
                throw new UsageException("bad --btsnoop '" + path + "': the file exists and is not a btsnoop capture"
                                         + " (it would be appended to; give a new file)");
            }
            boolean writable = Files.exists(file) ? Files.isWritable(file) : dir != null && Files.isWritable(dir);
            if (!writable) {
                throw new UsageException("bad --btsnoop '" + path + "': cannot write there");
            }
        } catch (IOException e) {
            throw new UsageException("bad --btsnoop '" + path + "': " + e.getMessage());
        }
    }
}
