// The console's command line, parsed by the option table: a command, its options and the
// global ones, checked up front so that a bad argument is reported before the controller is
// touched, and the files it names tried before anything runs.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.nio.file.AccessDeniedException;
import java.nio.file.FileSystemException;
import java.nio.file.Files;
import java.nio.file.NoSuchFileException;
import java.nio.file.NotDirectoryException;
import java.nio.file.Path;
import java.nio.file.StandardOpenOption;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.LinkedHashMap;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.Set;
import java.util.TreeSet;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

final class Options {
    /** The receiver sensitivity limit for 37-byte payloads: PER 30.8 %, a bit error rate of 0.1 %. */
    static final double DEFAULT_LIMIT_PERCENT = 30.8;
    static final long DEFAULT_MIN_PACKETS = 1500;
    private static final Pattern HCI = Pattern.compile(
            "sim|none|unix:.+|tcp:[^:]+:([1-9][0-9]{0,4})|tty:([^,]+)((,[^,]+)*)|hci:([0-9]{1,9})");
    private static final Set<Integer> BAUDS = Set.of(9600, 19200, 38400, 57600, 115200, 230400, 460800, 500000,
                                                     921600, 1000000, 1500000, 2000000, 3000000, 4000000);
    private static final String COMMANDS = "demo, dut on, dut off, tx, rx, sweep, cw, sim or help";

    String command;            // a command of the table, or "help" / "version"
    String helpFor;            // with command "help": the topic asked about, or null
    List<String> arguments;    // the command line as given
    private final Map<String, Object> values = new HashMap<>();
    String hci;                // from the launcher's HALVENOR_HCI, or sim
    String btsnoop;            // from the launcher's HALVENOR_BTSNOOP, or null
    String hal = "hidl";       // from the launcher's HALVENOR_HAL: the host HAL served
    /** The simulated controller's settings, as the host layer reads them, when it is the controller. */
    final Map<String, String> simulator = new LinkedHashMap<>();

    static Options parse(String[] args) throws UsageException {
        Options o = new Options();
        o.arguments = List.of(args);
        Map<String, String> given = new HashMap<>();
        List<String> words = new ArrayList<>();
        for (int i = 0; i < args.length; i++) {
            String a = args[i].equals("-h") ? "--help" : args[i];
            if (!a.startsWith("-") || a.equals("-")) {
                words.add(a);
                continue;
            }
            int eq = a.indexOf('=');
            String name = a.substring(a.startsWith("--") ? 2 : 1, eq < 0 ? a.length() : eq);
            boolean meta = name.equals("help") || name.equals("version");
            Option opt = Option.named(name);
            if (opt == null && !meta) {
                throw new UsageException("unknown option '" + (eq < 0 ? a : a.substring(0, eq)) + "'");
            }
            if (given.containsKey(name)) {
                throw new UsageException("option --" + name + " given twice");
            }
            if ((meta || opt.flag()) && eq >= 0) {
                throw new UsageException("option --" + name + " takes no value");
            }
            String value = "";
            if (!meta && !opt.flag()) {
                value = eq >= 0 ? a.substring(eq + 1) : i + 1 < args.length && !args[i + 1].startsWith("-") ? args[++i] : null;
                if (value == null || value.isEmpty()) {
                    throw new UsageException("option --" + name + " needs a value (" + opt.value() + "); a value that starts"
                                             + " with '-' is written --" + name + "=VALUE");
                }
            }
            given.put(name, value);
        }
        if (given.containsKey("version")) {
            o.command = "version";
            return o;
        }
        if (given.containsKey("help") || (!words.isEmpty() && words.get(0).equals("help"))) {
            o.command = "help";
            o.helpFor = topic(words.isEmpty() || !words.get(0).equals("help") ? words : words.subList(1, words.size()));
            return o;
        }
        o.command = command(words);
        o.apply(given);
        return o;
    }

    // The command the words name: "dut on", "sweep tx", "rx", ...
    private static String command(List<String> words) throws UsageException {
        if (words.isEmpty()) {
            throw new UsageException("no command given: use " + COMMANDS);
        }
        String first = words.get(0);
        String second = words.size() > 1 ? words.get(1) : null;
        boolean mode = "rx".equals(second) || "tx".equals(second);
        String command;
        int used = 1;
        if (first.equals("dut")) {
            if (!"on".equals(second) && !"off".equals(second)) {
                throw new UsageException("dut needs 'on' or 'off'");
            }
            command = "dut " + second;
            used = 2;
        } else if (first.equals("sweep")) {
            command = "sweep " + (mode ? second : "rx");
            used = mode ? 2 : 1;
        } else if (Option.command(first) != null && !first.equals("help")) {
            command = first;
        } else {
            throw new UsageException("unknown command '" + first + "': use " + COMMANDS);
        }
        if (words.size() > used) {
            throw new UsageException("unexpected argument '" + words.get(used) + "' after " + command);
        }
        if (command.equals("sim")) {
            throw new UsageException("sim runs through the launcher: ./halvenor sim");
        }
        return command;
    }

    // "", "rx", "dut", "dut on", "sweep", "sweep tx", "sim": the page to show, null for all.
    private static String topic(List<String> words) throws UsageException {
        if (words.isEmpty()) {
            return null;
        }
        String joined = String.join(" ", words);
        if (joined.equals("dut") || joined.equals("sweep") || joined.equals("sim") || joined.equals("help")) {
            return joined;
        }
        return command(words);
    }

    private void apply(Map<String, String> given) throws UsageException {
        for (Map.Entry<String, String> e : given.entrySet()) {
            Option opt = Option.named(e.getKey());
            if (!opt.commands().contains(command)) {
                throw new UsageException("option --" + opt.name() + " does not apply to " + command + " (its options: "
                                         + optionList(command) + ")");
            }
            values.put(opt.name(), opt.parse(e.getValue()));
        }
        for (Option opt : Option.ALL) {
            if (opt.requiredBy().contains(command) && !values.containsKey(opt.name())) {
                throw new UsageException(command + " needs --" + opt.name() + " (" + opt.range() + ")");
            }
        }
    }

    static String optionList(String command) {
        TreeSet<String> names = new TreeSet<>();
        for (Option o : Option.ALL) {
            if (o.commands().contains(command)) {
                names.add("--" + o.name());
            }
        }
        return names.isEmpty() ? "none" : String.join(", ", names);
    }

    boolean flag(String name) {
        return values.containsKey(name);
    }

    String text(String name) {
        return (String) values.get(name);
    }

    double seconds(String name, double fallback) {
        Object v = values.get(name);
        return v == null ? fallback : (Double) v;
    }

    Band band() {
        return (Band) values.get("freq");
    }

    Phy phy() {
        return (Phy) values.get("phy");
    }

    Long expected() {
        return (Long) values.get("expected");
    }

    int octet(String name) {
        return (Integer) values.get(name);
    }

    /** The verdict's PER limit, a fraction. */
    double limit() {
        Object v = values.get("limit");
        return (v == null ? DEFAULT_LIMIT_PERCENT : (Double) v) / 100;
    }

    long minPackets() {
        Object v = values.get("min-packets");
        return v == null ? DEFAULT_MIN_PACKETS : (Long) v;
    }

    /** The controller values the host layer takes; `none` stands for a device without the HAL. */
    static String checkHci(String source, String value) throws UsageException {
        Matcher m = HCI.matcher(value);
        if (!m.matches() || (m.group(1) != null && Integer.parseInt(m.group(1)) > 65535)) {
            throw new UsageException("bad " + source + " '" + value + "': expected " + Option.named("hci").range());
        }
        if (m.group(5) != null && Integer.parseInt(m.group(5)) > 65534) {
            throw new UsageException("bad " + source + " '" + value + "': adapter index " + m.group(5) + " is not in 0..65534");
        }
        String fields = m.group(3);
        for (String field : fields == null || fields.isEmpty() ? new String[0] : fields.substring(1).split(",")) {
            if (field.equals("rtscts") || (field.matches("[0-9]{1,7}") && BAUDS.contains(Integer.parseInt(field)))) {
                continue;
            }
            throw new UsageException("bad " + source + " '" + value + "': " + (field.matches("[0-9]+")
                    ? "baud rate " + field + " is not a standard speed (" + standardSpeeds() + ")"
                    : "'" + field + "' is neither a baud rate nor rtscts"));
        }
        return value;
    }

    private static String standardSpeeds() {
        return String.join(", ", new TreeSet<>(BAUDS).stream().map(String::valueOf).toList());
    }

    /**
     * The library and the host layer read HALVENOR_HCI, HALVENOR_HAL and HALVENOR_BTSNOOP
     * from the process environment, which a running JVM cannot change: the launcher exports
     * them before the JVM starts. Each is checked here whichever way it was given, before
     * anything runs.
     */
    void checkEnvironment(Map<String, String> env) throws UsageException {
        if (env.get("HALVENOR_CONSOLE_CAPTURE") == null || env.get("HALVENOR_LOG_FILE") == null) {
            throw new UsageException("the console runs through its launcher: ./halvenor " + command);
        }
        hci = checkHci(text("hci") != null ? "--hci" : "HALVENOR_HCI", launcherValue(env, "hci", "sim"));
        btsnoop = launcherValue(env, "btsnoop", null);
        hal = launcherValue(env, "hal", "hidl");
        if (!hal.matches("hidl|aidl")) {  // a --hal given here has been checked already
            throw new UsageException("bad HALVENOR_HAL '" + hal + "': expected " + Option.named("hal").range());
        }
        if (hci.equals("sim")) {
            String[][] settings = {{"reftx", "1"}, {"loss", "0"}, {"burst", "1"}, {"seed", "0"}, {"delay", "0"}};
            for (String[] setting : settings) {
                String v = env.getOrDefault("HALVENOR_SIM_" + setting[0].toUpperCase(Locale.ROOT), "");
                simulator.put(setting[0], v.isEmpty() ? setting[1] : v);
            }
        }
    }

    /**
     * The value the launcher exported for the option (`fallback` when unset or empty); one
     * given on the command line must be the same, or the library would see another.
     */
    private String launcherValue(Map<String, String> env, String option, String fallback) throws UsageException {
        String variable = Option.named(option).env();
        String value = env.getOrDefault(variable, "");
        value = value.isEmpty() ? fallback : value;
        String given = text(option);
        if (given != null && !given.equals(value)) {
            throw new UsageException("--" + option + " " + given + " must be given to the ./halvenor launcher, which sets "
                                     + variable + (value == null ? "" : " (the library sees '" + value + "')"));
        }
        return value;
    }

    /**
     * Every file the run will write is tried now, before anything runs: the capture is
     * opened for appending (created when missing), the page and the CSV, written at the end
     * to a file beside them and renamed, by creating that file and opening what is there.
     */
    void checkPaths() throws UsageException {
        if (btsnoop != null) {
            tryAppend("--btsnoop", Path.of(btsnoop));
        }
        for (String name : List.of("report", "csv")) {
            if (text(name) != null) {
                tryReplace("--" + name, Path.of(text(name)));
            }
        }
    }

    private static void tryAppend(String option, Path file) throws UsageException {
        try {
            Files.newByteChannel(file, StandardOpenOption.CREATE, StandardOpenOption.WRITE, StandardOpenOption.APPEND).close();
            if (!Capture.appendable(file)) {
                throw new UsageException("bad " + option + " '" + file + "': the file exists and is not a btsnoop capture"
                                         + " (it would be appended to; give a new file)");
            }
        } catch (IOException e) {
            throw new UsageException("bad " + option + " '" + file + "': " + reason(e));
        }
    }

    private static void tryReplace(String option, Path file) throws UsageException {
        try {
            if (Files.isDirectory(file)) {
                throw new UsageException("bad " + option + " '" + file + "': it is a directory");
            }
            if (Files.exists(file)) {
                Files.newByteChannel(file, StandardOpenOption.WRITE).close();
            }
            Files.delete(Replacement.create(file));
        } catch (IOException e) {
            throw new UsageException("bad " + option + " '" + file + "': " + reason(e));
        }
    }

    // The system's words for why a file could not be opened or created.
    static String reason(IOException e) {
        if (e instanceof NoSuchFileException) {
            return "No such file or directory";
        }
        if (e instanceof AccessDeniedException) {
            return "Permission denied";
        }
        if (e instanceof NotDirectoryException) {
            return "Not a directory";
        }
        if (e instanceof FileSystemException f && f.getReason() != null) {
            return f.getReason();
        }
        return e.getMessage();
    }
}
