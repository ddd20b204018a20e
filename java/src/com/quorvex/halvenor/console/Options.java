// The console's command line: a command, its options and the global options, checked
// up front so that a bad argument is reported before the controller is touched.
package com.quorvex.halvenor.console;

import java.util.ArrayList;
import java.util.HashMap;
import java.util.List;
import java.util.Map;
import java.util.Set;
import java.util.regex.Matcher;
import java.util.regex.Pattern;

final class Options {
    static final String HCI_VALUES = "sim, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD]";
    private static final Pattern HCI = Pattern.compile(
            "sim|unix:.+|tcp:[^:]+:([1-9][0-9]{0,4})|tty:[^,]+(,[1-9][0-9]*)?");
    private static final Set<String> FLAGS = Set.of("verbose", "json", "help");
    private static final Set<String> GLOBAL = Set.of("hci", "btsnoop", "verbose", "json", "help");
    private static final Map<String, Set<String>> COMMAND_OPTIONS = Map.of(
            "demo", Set.of(),
            "help", Set.of(),
            "dut on", Set.of("hold"),
            "dut off", Set.of(),
            "tx", Set.of("freq", "phy", "duration"),
            "rx", Set.of("freq", "phy", "duration", "expected", "window"),
            "sweep rx", Set.of("duration", "expected", "window"),
            "sweep tx", Set.of("duration"),
            "cw", Set.of("channel", "power", "type", "duration"));

    String command;            // one of the keys of COMMAND_OPTIONS
    String hci;                // null: from HALVENOR_HCI, or sim
    String btsnoop;            // null: from HALVENOR_BTSNOOP, or none
    boolean json;
    boolean verbose;
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
            if (!a.startsWith("--")) {
                words.add(a);
                continue;
            }
            int eq = a.indexOf('=');
            String name = a.substring(2, eq < 0 ? a.length() : eq);
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
        o.command = command(words, values.containsKey("help"));
        o.apply(values);
        return o;
    }

    private static String command(List<String> words, boolean help) throws UsageException {
        if (words.isEmpty()) {
            if (help) {
                return "help";
            }
            throw new UsageException("no command given: use demo, dut on, dut off, tx, rx, cw, sweep or help");
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
        } else if (COMMAND_OPTIONS.containsKey(first)) {
            command = first;
        } else {
            throw new UsageException("unknown command '" + first
                                     + "': use demo, dut on, dut off, tx, rx, cw, sweep or help");
        }
        if (words.size() > used) {
            throw new UsageException("unexpected argument '" + words.get(used) + "' after " + command);
        }
        return help ? "help" : command;
    }

    private void apply(Map<String, String> values) throws UsageException {
        Set<String> allowed = COMMAND_OPTIONS.get(command);
        for (String name : values.keySet()) {
            if (!GLOBAL.contains(name) && !allowed.contains(name)) {
                throw new UsageException(unknownOption(name));
            }
        }
        json = values.containsKey("json");
        verbose = values.containsKey("verbose");
        hci = values.get("hci");
        if (hci != null && !validHci(hci)) {
            throw new UsageException("bad --hci '" + hci + "': valid values are " + HCI_VALUES);
        }
        btsnoop = values.get("btsnoop");
        if (btsnoop != null && btsnoop.isEmpty()) {
            throw new UsageException("bad --btsnoop '': give the capture file's path");
        }
        if (command.equals("tx") || command.equals("rx")) {
            band = Band.parse(require(values, "freq", "2402, 2440 or 2480"));
            phy = Phy.parse(require(values, "phy", "1M or 2M"));
        }
        if (values.containsKey("duration")) {
            seconds = Numbers.seconds("--duration", values.get("duration"), 24 * 3600);
        }
        if (values.containsKey("hold")) {
            holdSeconds = Numbers.seconds("--hold", values.get("hold"), 24 * 3600);
        }
        if (values.containsKey("window")) {
            window = Numbers.seconds("--window", values.get("window"), Runner.MAX_WINDOW_S);
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

    private static boolean validHci(String value) {
        Matcher m = HCI.matcher(value);
        return m.matches() && (m.group(1) == null || Integer.parseInt(m.group(1)) <= 65535);
    }

    private String unknownOption(String name) {
        Set<String> allowed = COMMAND_OPTIONS.get(command);
        boolean known = COMMAND_OPTIONS.values().stream().anyMatch(s -> s.contains(name));
        String valid = allowed.isEmpty() ? "none besides the global ones" : "--" + String.join(", --", allowed.stream().sorted().toList());
        return (known ? "option --" + name + " does not apply to " + command : "unknown option --" + name)
               + " (options of " + command + ": " + valid + "; global: --hci, --btsnoop, --verbose, --json)";
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
     */
    void checkEnvironment(Map<String, String> env) throws UsageException {
        String envHci = env.getOrDefault("HALVENOR_HCI", "sim");
        if (hci != null && !hci.equals(envHci)) {
            throw new UsageException("--hci " + hci + " must be given to the ./halvenor launcher, which sets HALVENOR_HCI"
                                     + " (the library sees '" + envHci + "')");
        }
        hci = envHci.isEmpty() ? "sim" : envHci;
        String envSnoop = env.get("HALVENOR_BTSNOOP");
        if (btsnoop != null && !btsnoop.equals(envSnoop)) {
            throw new UsageException("--btsnoop " + btsnoop + " must be given to the ./halvenor launcher,"
                                     + " which sets HALVENOR_BTSNOOP");
        }
        btsnoop = envSnoop == null || envSnoop.isEmpty() ? null : envSnoop;
    }
}
