// The engineering console as an engineer runs it: ./halvenor with arguments, against the
// simulated controller or a scripted one, judged by its output, its exit status, its JSON
// and the capture of what reached the controller.
package com.quorvex.halvenor.console;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assumptions.assumeTrue;

import com.quorvex.halvenor.Child;
import com.google.gson.Gson;
import com.google.gson.stream.JsonReader;
import com.google.gson.stream.JsonToken;
import java.io.BufferedReader;
import java.io.IOException;
import java.io.InputStreamReader;
import java.io.StringReader;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.HexFormat;
import java.util.List;
import java.util.Locale;
import java.util.Map;
import java.util.stream.Stream;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
import org.junit.jupiter.params.provider.CsvSource;
import org.junit.jupiter.params.provider.ValueSource;
import org.junit.jupiter.params.provider.MethodSource;

@Tag("console")
class ConsoleTest {
    private static final String TEST_END = "01 1F 20 00";
    private static final String RESET = "01 03 0C 00";
    private static Path work;

    @BeforeAll
    static void workDirectory() throws IOException {
        work = Files.createDirectories(Path.of(System.getProperty("halvenor.work.dir")));
    }

    private static Map<String, String> environment(String... pairs) {
        Map<String, String> env = new HashMap<>();
        env.put("HALVENOR_BUILD_DIR", System.getProperty("halvenor.build.dir"));
        env.put("HALVENOR_NO_BUILD", "1");
        env.put("HALVENOR_HCI", null);
        env.put("HALVENOR_BTSNOOP", null);
        env.put("HALVENOR_HAL", null);
        env.put("HALVENOR_AIDL_HELD", null);
        env.put("JAVA_TOOL_OPTIONS", "-Xcheck:jni");  // the console's JVM checks every JNI call the library makes
        for (int i = 0; i < pairs.length; i += 2) {
            env.put(pairs[i], pairs[i + 1]);
        }
        return env;
    }

    private static List<String> command(List<String> args) {
        List<String> c = new ArrayList<>();
        c.add(System.getProperty("halvenor.launcher"));
        c.addAll(args);
        return c;
    }

    private static List<String> concat(List<String> a, List<String> b) {
        return Stream.concat(a.stream(), b.stream()).toList();
    }

    private static Child halvenor(String... args) throws IOException, InterruptedException {
        return Child.run(command(List.of(args)), environment(), 120);
    }

    private static Path fresh(String name) throws IOException {
        Path p = work.resolve(name);
        Files.deleteIfExists(p);
        return p;
    }

    /** The console's JSON, read strictly: one value, nothing after it. Numbers are doubles. */
    @SuppressWarnings("unchecked")
    private static Map<String, Object> json(Child c) throws IOException {
        JsonReader reader = new JsonReader(new StringReader(c.stdout()));
        Object value = new Gson().getAdapter(Object.class).read(reader);
        assertEquals(JsonToken.END_DOCUMENT, reader.peek(), c.stdout());
        return (Map<String, Object>) value;
    }

    @SuppressWarnings("unchecked")
    private static List<Map<String, Object>> steps(Child c) throws IOException {
        return (List<Map<String, Object>>) json(c).get("steps");
    }

    private static long number(Map<String, Object> m, String key) {
        return ((Double) m.get(key)).longValue();
    }

    /** The H4 commands the capture holds, as hex. */
    private static List<String> commands(Path capture) throws IOException {
        return new Capture(capture).readNew().stream().filter(Capture.Packet::isCommand)
                .map(p -> "01 " + HexFormat.ofDelimiter(" ").withUpperCase().formatHex(p.bytes())).toList();
    }

    /** Whether the capture shows the command within 30 s. */
    private static boolean sent(Path capture, String command) throws InterruptedException {
        return Child.waitUntil(() -> {
            try {
                return commands(capture).contains(command);
            } catch (IOException e) {
                return false; // its header still being written
            }
        }, 30);
    }

    private static void assertNoLibraryLog(Child c) {
        assertFalse(c.stderr().contains("halvenor I ") || c.stderr().contains("halvenor E "),
                    "library log lines hidden without --verbose: " + c.stderr());
        assertFalse((c.stdout() + c.stderr()).contains("WARNING in native method"), "JNI used as it must be: " + c.stderr());
    }

    @ParameterizedTest(name = "{0}")
    @ValueSource(strings = {"hidl", "aidl"})
    void demoTourPassesAgainstSimulatedController(String hal) throws Exception {
        Child c = halvenor("--hal", hal, "demo");

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        String out = c.stdout();
        assertTrue(out.startsWith("halvenor demo (controller: sim" + (hal.equals("aidl") ? ", HAL: aidl)" : ")")), out);
        List<String> rows = out.lines().filter(l -> l.matches("^(dut on|dut off|rx|tx|cw) .*")).toList();
        assertEquals(10, rows.size(), out);
        assertTrue(rows.stream().allMatch(r -> r.endsWith(" ok")), out);
        assertEquals(6, rows.stream().filter(r -> r.contains(" PASS ")).count(), out);
        assertTrue(out.lines().allMatch(l -> l.length() <= 80), "the table fits 80 columns: " + out);
        assertTrue(out.contains("all 10 steps ok (6 PASS)"), out);
        assertFalse(out.contains("\r") || out.contains("\033"), "no progress display off a terminal");
        assertNoLibraryLog(c);
    }

    /**
     * The interval holds the simulator's true loss: at the shortest window, where edges weigh
     * the most, and whatever the controller's latency, as the window is the controller's own,
     * from its reply to the start to its reply to LE Test End. When that latency is more than
     * 5 % of the window, the row says the timing is too uncertain to judge. The counts are
     * the capture's.
     */
    @ParameterizedTest(name = "loss {0}, processing delay {1} s, {2} s in windows of {3} s")
    @CsvSource({"0.1,0,3,1,false", "0,0.05,3,3,false", "0,0.6,1,1,true"})
    void perIntervalHoldsTheTrueLoss(double loss, String delay, int seconds, int window, boolean uncertain) throws Exception {
        Path snoop = fresh("windows.btsnoop");
        Path page = fresh("windows.html");
        Child c = Child.run(command(List.of("--btsnoop", snoop.toString(), "--report", page.toString(), "--json", "rx", "--freq",
                                            "2480", "--phy", "2M", "--duration", "" + seconds, "--window", "" + window)),
                            environment("HALVENOR_SIM_LOSS", "" + loss, "HALVENOR_SIM_DELAY", delay, "HALVENOR_SIM_SEED", "11"), 120);

        assertTrue(c.status() == 0 || c.status() == 4, c.stderr());  // short windows: too few packets for a verdict
        String caption = Files.readString(page).replaceAll("(?s).*<figcaption id=\"per-caption\">(.*?)</figcaption>.*", "$1");
        assertTrue(caption.contains("LE 2M") && !caption.contains("LE 1M"), "the caption keys only the PHYs shown: " + caption);
        Map<String, Object> step = steps(c).get(0);
        List<String> sent = new ArrayList<>();
        for (int i = 0; i < seconds / window; i++) {
            sent.addAll(List.of("01 33 20 03 27 02 00", TEST_END));
        }
        assertEquals(sent, commands(snoop));
        List<?> ci = (List<?>) step.get("per_ci95");
        assertTrue((Double) ci.get(0) <= loss && loss <= (Double) ci.get(1), "the interval holds the loss: " + step);
        assertEquals(uncertain, step.get("timing_too_uncertain"), step.toString());
        // Wireshark's dissectors, written by nobody here, read the capture the same way.
        Child tshark = Child.run(List.of("tshark", "-r", snoop.toString(), "-Y", "bthci_evt.le_num_packets",
                                         "-T", "fields", "-e", "bthci_evt.le_num_packets"), null, 60);
        assertEquals(step.get("windows").toString().replaceAll("\\.0|[\\[\\] ]", ""),
                     String.join(",", tshark.stdout().strip().lines().toList()), tshark.stderr());
    }

    static Stream<Arguments> capturedCommands() {
        return Stream.of(Arguments.of(List.of("tx", "--freq", "2402", "--phy", "2M", "--duration", "0.2"),
                         List.of("01 34 20 04 00 25 00 02", TEST_END)),
            Arguments.of(List.of("cw", "--channel", "1", "--power", "0x09", "--type", "4", "--duration", "0.2"),
                         List.of(TEST_END, "01 04 FC 09 05 01 09 04 20 00 00 00 00", RESET)),
            Arguments.of(List.of("dut", "off"), List.of(TEST_END, RESET)));
    }

    @ParameterizedTest(name = "{0}")
    @MethodSource("capturedCommands")
    void eachCommandSendsItsBytesAndIsAppendedToTheCapture(List<String> args, List<String> sent) throws Exception {
        Path snoop = fresh("commands.btsnoop");
        List<String> run = new ArrayList<>(List.of("--btsnoop=" + snoop));
        run.addAll(args);
        // dut off, the shortest, also runs twice: a second run appends to the capture.
        int runs = args.equals(List.of("dut", "off")) ? 2 : 1;
        List<String> all = new ArrayList<>();
        for (int i = 0; i < runs; i++) {
            Child c = Child.run(command(run), environment(), 60);
            assertEquals(0, c.status(), c.stdout() + c.stderr());
            assertNoLibraryLog(c);
            all.addAll(sent);
        }
        assertEquals(all, commands(snoop));
    }

    /** The library's own line says which HAL it opened. */
    @ParameterizedTest(name = "{0}")
    @CsvSource({"hidl,hidl_client_initialize: HIDL = true", "aidl,hidl_client_initialize: AIDL = true"})
    void verboseShowsLibraryLogLinesAndTraceDecodesTheTraffic(String hal, String opened) throws Exception {
        Child c = halvenor("--hal", hal, "--verbose", "--trace", "rx", "--freq", "2440", "--phy", "2M", "--duration", "0.2",
                           "--min-packets", "100");

        assertEquals(0, c.status(), c.stderr());
        for (String line : List.of(opened, "sendBleTestCommand, init smd successful",
                                   "< HCI Command: LE Receiver Test v2 (0x08|0x0033) plen 3", "PHY: LE 2M (0x02)",
                                   "> HCI Event: Command Complete (0x0e) plen 6", "Number of packets: ")) {
            assertTrue(c.stderr().contains(line), line + " in " + c.stderr());
        }
    }

    private static final List<String> RX_1M = List.of("rx", "--freq", "2440", "--phy", "1M", "--duration", "0.3");

    /** Every row over HIDL; the rows where the HAL dies with its controller over AIDL too. */
    static Stream<Arguments> controllerAnswers() {
        List<Arguments> rows = answerRows().toList();
        return Stream.concat(rows.stream().map(a -> withHal("hidl", a)),
                             rows.stream().filter(a -> a.get()[0].toString().startsWith("closes")).map(a -> withHal("aidl", a)));
    }

    private static Arguments withHal(String hal, Arguments row) {
        return Arguments.of(Stream.concat(Stream.of(hal), Stream.of(row.get())).toArray());
    }

    static Stream<Arguments> answerRows() {
        int rx = 0x201d;
        return Stream.of(
            Arguments.of("refused", Map.of(0x2033, List.of(ScriptedController.complete(0x2033, 0x11))),
                         List.of("rx", "--freq", "2402", "--phy", "2M", "--duration", "0.2"),
                         "LE Receiver Test v2 (0x2033) refused: 0x11 Unsupported Feature or Parameter Value"),
            Arguments.of("refused by Command Status", Map.of(0xfc04, List.of(ScriptedController.status(0xfc04, 0x01))),
                         List.of("cw", "--channel", "1", "--power", "1", "--type", "1", "--duration", "0.2"),
                         "Vendor Continuous Wave (0xfc04) refused: 0x01 Unknown HCI Command"),
            Arguments.of("silent", Map.of(0x201f, ScriptedController.SILENT),
                         List.of("tx", "--freq", "2440", "--phy", "1M", "--duration", "0.2"),
                         "no reply within 2000 ms to LE Test End"),
            Arguments.of("closes", Map.of(0x201f, List.of(ScriptedController.CLOSE)), RX_1M,
                         "LE Test End not answered: %s: controller closed the connection"),
            Arguments.of("refuses a command the mode needs", Map.of(0x0c05, List.of(ScriptedController.complete(0x0c05, 0x12))),
                         List.of("dut", "on"), "Set Event Filter (0x0c05) refused: 0x12 Invalid HCI Command Parameters"),
            Arguments.of("refuses only the obsolete one", Map.of(0x0c22, List.of(ScriptedController.status(0x0c22, 0x01))),
                         List.of("dut", "on"), null),
            // A reply after the library gave up is no reply: the library syncs, and so does the console.
            Arguments.of("answers after the library gave up",
                         Map.of(0x0c05, List.of(ScriptedController.pause(2500), ScriptedController.complete(0x0c05))),
                         List.of("dut", "on"), "no reply within 2000 ms to Set Event Filter"),
            Arguments.of("answers the test end late",
                         Map.of(0x201f, List.of(ScriptedController.pause(2500), ScriptedController.complete(0x201f, 0, 1, 0))),
                         List.of("tx", "--freq", "2440", "--phy", "1M", "--duration", "0.2"),
                         "no reply within 2000 ms to LE Test End"),
            Arguments.of("sends data and an empty event beside the reply",
                         Map.of(rx, List.of(ScriptedController.data(2, 1, 0x20, 2, 0, 0x0e, 0x0e), ScriptedController.event(0xff, 0),
                                            ScriptedController.data(3, 1, 0, 1, 0x04), ScriptedController.complete(rx, 0))),
                         RX_1M, null),
            Arguments.of("withholds its credit for a while",
                         Map.of(rx, List.of(ScriptedController.credited(0, rx, 0), ScriptedController.creditAfter(800))), RX_1M, null),
            Arguments.of("reports a hardware error", Map.of(rx, List.of(ScriptedController.event(0x10, 1, 0x42),
                                                                        ScriptedController.complete(rx, 0))),
                         RX_1M, "the controller reported Hardware Error 0x42 during the step"),
            Arguments.of("counts more than the tester sent", Map.of(), concat(RX_1M, List.of("--expected", "50")),
                         "the controller counted 100 packets, more than the 50 the tester sent (--expected)"),
            Arguments.of("counts more than a transmitter can send", Map.of(0x201f, List.of(ScriptedController.complete(0x201f, 0, 0xff, 0xff))),
                         RX_1M, "the controller counted 65535 packets, more than the {high} a transmitter can send in its {window} s window"),
            // Gone 0.1 s into a 6 s test: the step ends at once with the cause.
            Arguments.of("closes during the test", Map.of(rx, List.of(ScriptedController.complete(rx, 0),
                                                                      ScriptedController.pause(100), ScriptedController.CLOSE)),
                         List.of("rx", "--freq", "2440", "--phy", "1M", "--duration", "6"),
                         "%s: controller closed the connection"));
    }

    @ParameterizedTest(name = "{0}: {1}")
    @MethodSource("controllerAnswers")
    void okMeansTheControllerAcceptedEveryCommand(String hal, String name, Map<Integer, List<ScriptedController.Act>> script,
                                                  List<String> args, String failure) throws Exception {
        try (ScriptedController controller = new ScriptedController(work.resolve("scripted.sock"), script)) {
            long start = System.nanoTime();
            Child c = Child.run(command(concat(List.of("--json", "--hal", hal, "--hci", controller.hci()), args)), environment(), 60);
            double took = (System.nanoTime() - start) / 1e9;

            // A receiver step's 0.3 s is too short for a verdict: inconclusive, 4.
            assertEquals(failure != null ? 1 : args.get(0).equals("rx") ? 4 : 0, c.status(), c.stdout() + c.stderr());
            Map<String, Object> step = steps(c).get(0);
            String why = failure == null ? null : failure.replace("%s", controller.hci());
            if (why != null && why.contains("{high}")) {  // the window's bound, as the step reports it
                why = why.replace("{high}", ((List<?>) step.get("expected_range")).get(1).toString().replace(".0", ""))
                         .replace("{window}", String.format(Locale.ROOT, "%.2f", (Double) step.get("window_s")));
            }
            assertEquals(why, step.get("error"));
            String commands = step.get("commands").toString();
            assertFalse(commands.contains("Read Local Version"), "the library's sync is not the step's: " + commands);
            if (step.get("step").equals("rx") || step.get("step").equals("tx")) {
                assertTrue(commands.contains("LE Test End"), "a started test is ended: " + commands);
            }
            assertTrue(took < (args.contains("6") ? 5 : 12), name + " took " + took + " s");
        }
    }

    /** A refusal does not stop a sweep: the 1M steps pass, the 2M ones fail. */
    @Test
    void sweepGoesOnAfterARefusedStep() throws Exception {
        try (ScriptedController controller = new ScriptedController(work.resolve("sweep.sock"),
                Map.of(0x2033, List.of(ScriptedController.complete(0x2033, 0x11))))) {
            Child c = halvenor("--hci", controller.hci(), "--json", "sweep", "--duration", "0.2");
            assertEquals(List.of(true, false, true, false, true, false), steps(c).stream().map(s -> s.get("ok")).toList());
            assertEquals(1, c.status(), "steps that could not run outweigh the inconclusive verdicts of the others");
        }
    }

    /**
     * Over either HAL; with neither (none), the library tries HIDL and says so. An AIDL HAL
     * held by another client, as a phone's is while its own Bluetooth is on, is not taken.
     */
    static Stream<Arguments> unreachable() {
        List<Arguments> rows = List.of(Arguments.of("unix:/nothing/listens/here", "sweep",
                         "no controller reachable: unix:/nothing/listens/here: connect: No such file or directory"),
            Arguments.of("tty:/dev/null,115200,rtscts", "sweep",
                         "no controller reachable: tty:/dev/null,115200,rtscts: not a serial line"),
            Arguments.of("none", "dut on", "no controller reachable: no Bluetooth HAL service"),
            // This machine's kernel has no Bluetooth: its setup, not the controller, is at fault (exit 2).
            Arguments.of("hci:0", "dut on", "no controller reachable: hci:0: this kernel has no Bluetooth (no AF_BLUETOOTH"
                         + " sockets): load its module with modprobe bluetooth, or use a kernel built with Bluetooth"));
        return Stream.concat(Stream.of("hidl", "aidl").flatMap(hal -> rows.stream().map(a -> withHal(hal, a))),
            Stream.of(Arguments.of("aidl held", "sim", "dut on", "no controller reachable: the Bluetooth HAL failed to"
                                   + " initialize: ALREADY_INITIALIZED: the HAL is in use, usually by the phone's own"
                                   + " Bluetooth: turn Bluetooth off and try again")));
    }

    @ParameterizedTest(name = "{0}: {1}")
    @MethodSource("unreachable")
    void unreachableControllerNamesTheCause(String hal, String hci, String command, String why) throws Exception {
        assumeTrue(!hci.startsWith("hci:") || !Files.exists(Path.of("/sys/class/bluetooth")), "a kernel without Bluetooth");
        Path page = fresh("unreachable.html");
        Child c = Child.run(command(concat(List.of("--hal", hal.split(" ")[0], "--hci", hci, "--report", page.toString()),
                                           List.of(command.split(" ")))),
                            environment("HALVENOR_AIDL_HELD", hal.endsWith("held") ? "1" : null), 60);

        assertEquals(hci.startsWith("hci:") ? 2 : 1, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stdout().contains(": " + why), c.stdout());
        String html = Files.readString(page);
        assertTrue(html.contains("id=\"verdict\">1 of 1 step failed") && html.contains(HtmlReport.esc(why)), html);
        String step = command.equals("sweep") ? "rx " : command + " ";
        assertEquals(1, c.stdout().lines().filter(l -> l.startsWith(step)).count(), "stops at the first: " + c.stdout());
        assertNoLibraryLog(c);
    }

    static Stream<Arguments> badArguments() {
        List<String> rx = List.of("rx", "--freq", "2402", "--phy", "1M");
        return Stream.of(
            Arguments.of(List.of("rx", "--freq", "2441", "--phy", "1M"), "bad --freq '2441': expected 2402 (ch 0), 2440 (ch 19) or 2480 (ch 39)"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "3M"), "bad --phy '3M': expected 1M or 2M"),
            Arguments.of(List.of("rx", "--phy", "1M"), "rx needs --freq (2402 (ch 0), 2440 (ch 19) or 2480 (ch 39))"),
            Arguments.of(List.of("--hci", "bluetooth0", "demo"), "expected sim, none, unix:PATH, tcp:HOST:PORT, tty:DEVICE[,BAUD][,rtscts] or hci:N"),
            Arguments.of(List.of("--hci", "hci:65535", "dut", "on"), "bad --hci 'hci:65535': adapter index 65535 is not in 0..65534"),
            Arguments.of(List.of("--hci", "tty:/dev/ttyS0,12345", "demo"), "baud rate 12345 is not a standard speed"),
            Arguments.of(List.of("cw", "--channel", "256", "--power", "1", "--type", "1"), "expected 0 to 255 (or 0x00 to 0xff)"),
            Arguments.of(concat(rx, List.of("--window", "0.5")), "bad --window '0.5': expected seconds from 1 to 40"),
            Arguments.of(concat(rx, List.of("--duration", "0.001")), "bad --duration '0.001': expected seconds from 0.01 to 86400"),
            Arguments.of(concat(rx, List.of("--expected", "many")), "expected a whole number of packets, 1 or more"),
            Arguments.of(concat(List.of("--limit", "101"), rx), "bad --limit '101': expected a percentage from 0 to 100"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "1M", "--expected", "5"), "does not apply to tx"),
            Arguments.of(List.of("sweep", "tx", "--window", "5"), "option --window does not apply to sweep tx"),
            Arguments.of(List.of("--jsn", "demo"), "unknown option '--jsn'"),
            Arguments.of(List.of("rx", "--freq", "2402", "--freq", "2440", "--phy", "1M"), "option --freq given twice"),
            // A value never starts with '-' unless written --opt=VALUE.
            Arguments.of(List.of("--btsnoop", "--json", "rx"), "option --btsnoop needs a value (FILE)"),
            Arguments.of(List.of("--report", "--json", "demo"), "option --report needs a value (FILE.html)"),
            Arguments.of(List.of("rx", "--freq", "--phy", "1M"), "option --freq needs a value (F)"),
            // Files are tried before anything runs, with the system's reason.
            Arguments.of(List.of("--btsnoop", "/proc/x", "dut", "off"), "bad --btsnoop '/proc/x': No such file or directory"),
            Arguments.of(List.of("--report", "/proc/x", "dut", "off"), "bad --report '/proc/x': No such file or directory"),
            Arguments.of(List.of("--csv", "/etc/passwd/x.csv", "dut", "off"), "bad --csv '/etc/passwd/x.csv': Not a directory"),
            Arguments.of(List.of("--btsnoop", "/etc/passwd", "demo"), "the file exists and is not a btsnoop capture"),
            Arguments.of(List.of("USER=nobody", "--csv", "/root/x.csv", "dut", "off"), "bad --csv '/root/x.csv': Permission denied"),
            Arguments.of(List.of("frobnicate"), "use demo, dut on, dut off, tx, rx, sweep, cw, sim or help"),
            Arguments.of(List.of("help", "frobnicate"), "unknown command 'frobnicate'"),
            Arguments.of(List.of("HALVENOR_HCI=tcp:localhost", "demo"), "bad HALVENOR_HCI 'tcp:localhost'"),
            Arguments.of(List.of("--hal", "binder", "demo"), "bad --hal 'binder': expected hidl or aidl"));
    }

    /** A leading NAME=VALUE sets the environment instead; USER=nobody runs the launcher as nobody. */
    @ParameterizedTest(name = "{0}")
    @MethodSource("badArguments")
    void badArgumentIsNamedWithValidValues(List<String> args, String message) throws Exception {
        boolean env = args.get(0).contains("=") && !args.get(0).startsWith("-");
        List<String> run = command(env ? args.subList(1, args.size()) : args);
        // As nobody the launcher checks its own packages and runs the build it may not write.
        Child c = args.get(0).equals("USER=nobody") ? Child.run(asNobody(run), environment("HALVENOR_NO_BUILD", null), 60)
                  : Child.run(run, env ? environment(args.get(0).split("=", 2)) : environment(), 60);

        assertEquals(2, c.status(), c.stderr());
        assertTrue(c.stderr().contains(message), c.stderr());
        assertEquals("", c.stdout());
    }

    private static List<String> asNobody(List<String> command) {
        return concat(List.of("setpriv", "--reuid=65534", "--regid=65534", "--clear-groups", "env", "HOME=/tmp"), command);
    }

    /** Each help exits 0 with its page; --help lists every global option. */
    @ParameterizedTest(name = "{0}")
    @CsvSource(delimiter = '|', value = {"-h|sim [--unix PATH]", "--help|--report FILE.html", "help rx|usage: ./halvenor rx --freq F",
                                         "cw --help|usage: ./halvenor cw --channel C", "help dut|usage: ./halvenor dut off",
                                         "dut --help|usage: ./halvenor dut on [--hold S]", "help sim|usage: ./halvenor sim [--unix PATH]",
                                         "sim --help|usage: halvenor-sim", "help sweep|usage: ./halvenor sweep tx [--duration S]",
                                         "--version|libhalvenor.so built from commit "})
    void helpHasAPagePerCommand(String args, String shows) throws Exception {
        Child c = halvenor(args.split(" "));
        assertEquals(0, c.status(), c.stderr());
        assertTrue(c.stdout().contains(shows), c.stdout());
    }

    /**
     * The launcher exports the options the table gives an environment variable, and no
     * others; the standalone simulator takes the table's sim options, with its help lines,
     * and names each bad value as the console does.
     */
    @Test
    void launcherAndSimulatorTakeTheTablesOptions() throws Exception {
        String launcher = Files.readString(Path.of(System.getProperty("halvenor.launcher")));
        java.util.regex.Matcher m = java.util.regex.Pattern.compile("\"([a-z-]+) (HALVENOR_\\w+) (value|flag)\"").matcher(launcher);
        List<String> exported = new ArrayList<>();
        while (m.find()) {
            exported.add(m.group(1) + " " + m.group(2) + " " + m.group(3));
        }
        assertEquals(Option.ALL.stream().filter(o -> o.env() != null)
                     .map(o -> o.name() + " " + o.env() + (o.flag() ? " flag" : " value")).toList(), exported);
        List<Option> sim = Option.ALL.stream().filter(o -> o.commands().contains("sim")).toList();
        String help = halvenor("sim", "--help").stdout();
        assertEquals(sim.size(), help.lines().filter(l -> l.startsWith("  --")).count(), help);
        for (Option o : sim) {
            assertTrue(help.contains(String.format("  %-18s %s%n", o.usage(), o.help())), o.usage() + " in " + help);
            if (o.kind() != Option.Kind.PATH) {
                Child bad = halvenor("sim", "--" + o.name(), "x-1");
                assertEquals(2, bad.status(), bad.stderr());
                assertTrue(bad.stderr().contains(o.bad("x-1").getMessage()), bad.stderr());
            }
        }
    }

    static Stream<Arguments> verdicts() {
        return Stream.of(  // loss, reference transmitter, options, verdict, exit status
            Arguments.of("0", "1", List.of(), "PASS", 0),
            Arguments.of("0.6", "1", List.of(), "FAIL", 3),
            Arguments.of("0.308", "1", List.of("--duration", "3"), "INCONCLUSIVE", 4),  // the interval straddles the limit
            Arguments.of("0", "1", List.of("--duration", "0.5"), "INCONCLUSIVE", 4),  // 800 packets, fewer than 1500
            Arguments.of("0", "1", List.of("--duration", "0.5", "--min-packets", "500"), "PASS", 0),
            Arguments.of("0.4", "1", List.of("--limit", "50"), "PASS", 0),
            Arguments.of("0", "0", List.of(), "FAIL", 3));  // no transmitter heard
    }

    /** The simulator loses packets at random, from a fixed seed; the CSV has the window and the step. */
    @ParameterizedTest(name = "loss {0}, reference transmitter {1}, {2}: {3}")
    @MethodSource("verdicts")
    void verdictComparesTheIntervalWithTheLimit(String loss, String reftx, List<String> options, String verdict, int status)
            throws Exception {
        Path csv = fresh("verdict.csv");
        Child c = Child.run(command(concat(List.of("--json", "--csv", csv.toString(), "rx", "--freq", "2440", "--phy", "1M"),
                                           options)),
                            environment("HALVENOR_SIM_LOSS", loss, "HALVENOR_SIM_REFTX", reftx, "HALVENOR_SIM_SEED", "7"), 60);

        assertEquals(status, c.status(), c.stdout() + c.stderr());
        assertEquals(verdict, steps(c).get(0).get("verdict"), c.stdout());
        List<String> rows = Files.readAllLines(csv);
        assertEquals(List.of(Csv.HEADER, "window", "step"), List.of(rows.get(0), rows.get(1).split(",")[0], rows.get(2).split(",")[0]));
        assertTrue(rows.get(2).endsWith("," + verdict + ",ok"), rows.get(2));
    }

    static Stream<Arguments> signals() {
        String rx = "01 1D 20 01 13";
        String cw = "01 04 FC 09 05 27 00 00 20 00 00 00 00";
        List<String> rx60 = List.of("rx", "--freq", "2440", "--phy", "1M", "--duration", "60");
        return Stream.of(
            Arguments.of("INT", 130, rx, concat(List.of("--json"), rx60), TEST_END),
            Arguments.of("TERM", 143, cw, List.of("cw", "--channel", "39", "--power", "0", "--type", "0",
                                                  "--duration", "60"), RESET),
            Arguments.of("HUP", 129, "01 22 0C 01 00", List.of("dut", "on", "--hold", "60"), RESET),
            // A serial line whose flow control the controller holds once it has answered the start.
            Arguments.of("TERM on a held line", 143, rx, concat(List.of("--hci", "tty:HELD"), rx60), TEST_END));
    }

    /** A signal to the launcher's own process reaches the JVM, which ends the test first, within 3 s. */
    @ParameterizedTest(name = "{0}")
    @MethodSource("signals")
    void signalEndsTheTestOnTheControllerAndKeepsTheResults(String signal, int status, String started,
                                                            List<String> args, String last) throws Exception {
        Path snoop = fresh("signal.btsnoop");
        Path page = fresh("signal.html");
        Process line = Child.start(List.of(System.getProperty("halvenor.pty.controller"), "--hold-after", "201d"), null);
        String tty = new BufferedReader(new InputStreamReader(line.getInputStream())).readLine();
        List<String> run = args.stream().map(a -> a.replace("HELD", tty)).toList();
        Process p = Child.start(command(concat(List.of("--btsnoop", snoop.toString(), "--report", page.toString()), run)),
                                environment());
        boolean running = sent(snoop, started);
        long start = System.nanoTime();
        new ProcessBuilder("kill", "-" + signal.split(" ")[0], Long.toString(p.pid())).inheritIO().start().waitFor();
        Child c = Child.finish(p, 30);
        double took = (System.nanoTime() - start) / 1e9;
        line.destroy();

        assertTrue(running, "the test started: " + c.stdout() + c.stderr());
        assertEquals(status, c.status(), c.stdout() + c.stderr());
        assertTrue(took < 3, "ended " + took + " s after the signal");
        List<String> sent = commands(snoop);
        assertEquals(last, sent.get(sent.size() - 1), "the test was ended: " + sent);
        assertTrue(Files.readString(page).contains("id=\"verdict\">INTERRUPTED"), "the page says so at the top");
        if (args.get(0).equals("--json")) {  // the step keeps what it measured: its commands and its count
            assertEquals(true, json(c).get("interrupted"), c.stdout());
            Map<String, Object> step = steps(c).get(0);
            assertTrue(number(step, "received") > 0 && step.get("commands").toString().contains("LE Test End"), c.stdout());
        } else {
            assertTrue(c.stdout().contains("INTERRUPTED") && c.stdout().contains("interrupted after 0 steps ok"), c.stdout());
        }
    }

    /**
     * The page a reader opens: a real browser loads it with no console message, and its chart
     * and table hold the very numbers the JSON of the same run gives. A screenshot is kept.
     */
    @Test
    void reportOpensInABrowserWithTheNumbersOfTheJson() throws Exception {
        Path page = fresh("demo.html");
        Path shot = fresh("demo.png");
        Child c = Child.run(command(List.of("--json", "--report", page.toString(), "demo")),
                            environment("HALVENOR_SIM_LOSS", "0.05"), 120);
        assertEquals(0, c.status(), c.stderr());
        assertEquals(List.of("dut on", "dut off", "rx", "rx", "rx", "rx", "rx", "rx", "tx", "cw"),
                     steps(c).stream().map(s -> s.get("step")).toList());
        List<String> browser = new ArrayList<>(List.of("chromium", "--headless", "--no-sandbox", "--disable-gpu",
                "--disable-quic", "--no-first-run", "--disable-background-networking", "--disable-component-update",
                "--disable-sync", "--user-data-dir=" + Files.createTempDirectory(work, "chromium"),
                "--enable-logging=stderr", "--v=0", "--window-size=1000,2000", page.toUri().toString()));
        Child dom = Child.run(Stream.concat(browser.stream(), Stream.of("--dump-dom")).toList(), null, 120);
        Child png = Child.run(Stream.concat(browser.stream(), Stream.of("--screenshot=" + shot)).toList(), null, 120);
        assertEquals(0, dom.status() + png.status(), dom.stderr());
        assertFalse(dom.stderr().contains("CONSOLE"), "no console messages: " + dom.stderr());
        assertTrue(Files.size(shot) > 10_000, "screenshot taken");
        assertTrue(dom.stdout().contains("lies below 30.8 %, FAIL above it; at least 1500 packets") && dom.stdout().contains("loss 0.05,"),
                   "the page records the limit and the simulator's settings");
        // The step table fits the page: a copy of it measures itself in the browser.
        Path measured = work.resolve("demo-measured.html");
        Files.writeString(measured, Files.readString(page).replace("</body>", "<script>var t = document.getElementById("
                + "'steps').parentElement; document.body.setAttribute('data-fit', [document.documentElement.scrollWidth,"
                + " innerWidth, t.scrollWidth, t.clientWidth].join(' '));</script></body>"));
        for (String width : List.of("1000", "1920")) {
            List<String> at = browser.stream().map(a -> a.replace("1000,2000", width + ",2000")
                    .replace(page.toUri().toString(), measured.toUri().toString())).toList();
            String fit = Child.run(concat(at, List.of("--dump-dom")), null, 120).stdout().replaceAll("(?s).*data-fit=\"([0-9 ]+)\".*", "$1");
            String[] w = fit.split(" ");
            assertTrue(Integer.parseInt(w[0]) <= Integer.parseInt(w[1]) && Integer.parseInt(w[2]) <= Integer.parseInt(w[3]),
                       "no horizontal scrolling at " + width + " px: " + fit);
        }
        List<Map<String, Object>> steps = steps(c);
        java.util.regex.Matcher point = java.util.regex.Pattern.compile(
                "<g class=\"point\" data-step=\"(\\d+)\"[^>]* data-per=\"([^\"]+)\" data-low=\"([^\"]+)\""
                + " data-high=\"([^\"]+)\"").matcher(dom.stdout());
        int points = 0;
        for (; point.find(); points++) {
            Map<String, Object> s = steps.get(Integer.parseInt(point.group(1)));
            List<?> ci = (List<?>) s.get("per_ci95");
            assertEquals(List.of(s.get("per"), ci.get(0), ci.get(1)),
                         List.of(Double.valueOf(point.group(2)), Double.valueOf(point.group(3)), Double.valueOf(point.group(4))));
        }
        assertEquals(6, points, "a point per channel and PHY");
        for (int i = 2; i < 8; i++) {
            Map<String, Object> s = steps.get(i);
            long expected = number(s, "expected");
            assertTrue(expected >= 1580 && Math.abs(number(s, "received") - 0.95 * expected) <= expected / 20, s.toString());
            assertTrue(s.get("commands").toString().contains("status_name=Success"), s.toString());
            String row = "<tr data-step=\"" + i + "\"><td>rx</td><td>" + s.get("setting") + "</td><td>1.00 s</td><td>"
                         + number(s, "received") + "</td><td>" + expected + "</td>";
            assertTrue(dom.stdout().contains(row), row);
        }
    }

    @Test
    void progressIsDrawnOnTerminal() throws Exception {
        String run = String.join(" ", command(List.of("rx", "--freq", "2440", "--phy", "2M", "--duration", "0.5", "--min-packets", "100")));
        Child c = Child.run(List.of("script", "-qec", run, "/dev/null"), environment(), 60);

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stdout().contains("\r\033[Krx 2440 MHz (ch 19) LE 2M ["), c.stdout());
    }

    /** Two consoles on one air from the launcher's simulator: one transmits, the other counts. */
    @Test
    void simulatorFromTheLauncherCarriesATestBetweenTwoConsoles() throws Exception {
        Path socket = fresh("sim.sock");
        Process sim = Child.start(command(List.of("sim", "--unix", socket.toString())), environment());
        try {
            assertTrue(Child.waitUntil(() -> Files.exists(socket), 30), "the simulator listens");
            String hci = "unix:" + socket;
            Path snoop = fresh("tx.btsnoop");
            Process tx = Child.start(command(List.of("--btsnoop", snoop.toString(), "--hci", hci, "tx", "--freq", "2440",
                                                     "--phy", "2M", "--duration", "6")), environment());
            assertTrue(sent(snoop, "01 34 20 04 13 25 00 02"), "the transmitter started");
            Child rx = halvenor("--hci", hci, "--json", "rx", "--freq", "2440", "--phy", "2M", "--duration", "1");
            assertEquals(0, Child.finish(tx, 30).status());
            assertEquals(0, rx.status(), rx.stdout() + rx.stderr());
            assertTrue(number(steps(rx).get(0), "received") > 1400, "about 1600 heard: " + rx.stdout());
        } finally {
            sim.toHandle().destroy(); // SIGTERM, leaving its output to be read
        }
        Child after = Child.finish(sim, 30);
        assertTrue(after.stdout().contains("listening on unix:" + socket), after.stdout());
    }

    /** BlueZ's emulator, a controller written by nobody here: Device Under Test mode on and off. */
    @Test
    void deviceUnderTestModeOnBluezsEmulator() throws Exception {
        Process btvirt = Child.start(List.of("btvirt", "-s", "-l0"), null);
        try {
            Path socket = Path.of("/tmp/bt-server-bredr");
            assertTrue(Child.waitUntil(() -> Files.exists(socket), 30), "btvirt listens");
            Child on = halvenor("--hci", "unix:" + socket, "--json", "dut", "on");
            Child off = halvenor("--hci", "unix:" + socket, "dut", "off");
            assertEquals(0, on.status() + off.status(), on.stdout() + off.stdout());
            assertTrue(on.stdout().contains("{\"command\":\"Enable Device Under Test Mode\",\"opcode\":\"0x1803\","
                                            + "\"status\":0"), on.stdout());
        } finally {
            btvirt.destroy();
            btvirt.waitFor();
        }
    }
}
