// The engineering console as an engineer runs it: ./halvenor with arguments, against the
// simulated controller or a scripted one, judged by its output, its exit status, its JSON
// and the capture of what reached the controller.
package com.quorvex.halvenor.console;

import static org.junit.jupiter.api.Assertions.assertArrayEquals;
import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.quorvex.halvenor.Child;
import com.google.gson.Gson;
import com.google.gson.stream.JsonReader;
import com.google.gson.stream.JsonToken;
import java.io.IOException;
import java.io.StringReader;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.HexFormat;
import java.util.List;
import java.util.Map;
import java.util.stream.Stream;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
import org.junit.jupiter.params.provider.CsvSource;
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

    private static void assertNoLibraryLog(Child c) {
        assertFalse(c.stderr().contains("halvenor I ") || c.stderr().contains("halvenor E "),
                    "library log lines hidden without --verbose: " + c.stderr());
        assertFalse((c.stdout() + c.stderr()).contains("WARNING in native method"), "JNI used as it must be: " + c.stderr());
    }

    @Test
    void demoTourPassesAgainstSimulatedController() throws Exception {
        Child c = halvenor("demo");

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        String out = c.stdout();
        assertTrue(out.startsWith("halvenor demo (controller: sim)"), out);
        List<String> rows = out.lines().filter(l -> l.matches("^(dut on|dut off|rx|cw) .*")).toList();
        assertEquals(9, rows.size(), out);
        assertTrue(rows.stream().allMatch(r -> r.endsWith(" ok")), out);
        assertTrue(out.contains("all 9 steps ok"), out);
        assertFalse(out.contains("\r") || out.contains("\033"), "no progress display off a terminal");
        assertNoLibraryLog(c);
    }

    /**
     * With the simulator missing a tenth of the packets, the interval holds the true loss at
     * the shortest window, where edges weigh the most; the counts are the capture's.
     */
    @Test
    void perIntervalHoldsTheTrueLossAtTheShortestWindow() throws Exception {
        Path snoop = fresh("windows.btsnoop");
        Child c = Child.run(command(List.of("--btsnoop", snoop.toString(), "--json", "rx", "--freq", "2480",
                                            "--phy", "2M", "--duration", "3", "--window", "1")),
                            environment("HALVENOR_SIM_LOSS", "0.1"), 120);

        assertEquals(0, c.status(), c.stderr());
        Map<String, Object> step = steps(c).get(0);
        assertEquals(3, ((List<?>) step.get("windows")).size(), step.toString());
        String rx = "01 33 20 03 27 02 00";
        assertEquals(List.of(rx, TEST_END, rx, TEST_END, rx, TEST_END), commands(snoop));
        List<?> ci = (List<?>) step.get("per_ci95");
        assertTrue((Double) ci.get(0) <= 0.1 && 0.1 <= (Double) ci.get(1), "the interval holds 10 %: " + step);
        // Wireshark's dissectors, written by nobody here, read the capture the same way.
        Child tshark = Child.run(List.of("tshark", "-r", snoop.toString(), "-Y", "bthci_evt.le_num_packets",
                                         "-T", "fields", "-e", "bthci_evt.le_num_packets"), null, 60);
        assertEquals(step.get("windows").toString().replaceAll("\\.0|[\\[\\] ]", ""),
                     String.join(",", tshark.stdout().strip().lines().toList()), tshark.stderr());
    }

    /** With the tester's count, PER and its Wilson score interval (z = 1.96) follow from it. */
    @Test
    void expectedCountFromTesterSetsPer() throws Exception {
        Child c = halvenor("--json", "rx", "--freq", "2402", "--phy", "1M", "--duration", "0.3", "--expected", "1000");

        Map<String, Object> step = steps(c).get(0);
        double p = (1000.0 - number(step, "received")) / 1000, z2 = 1.959964 * 1.959964;
        double centre = (p + z2 / 2000) / (1 + z2 / 1000);
        double half = 1.959964 / (1 + z2 / 1000) * Math.sqrt(p * (1 - p) / 1000 + z2 / 4e6);
        List<?> ci = (List<?>) step.get("per_ci95");
        assertArrayEquals(new double[] {p, centre - half, centre + half},
                          new double[] {(Double) step.get("per"), (Double) ci.get(0), (Double) ci.get(1)}, 1e-5);
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

    @Test
    void verboseShowsLibraryLogLinesAndTraceDecodesTheTraffic() throws Exception {
        Child c = halvenor("--verbose", "--trace", "rx", "--freq", "2440", "--phy", "2M", "--duration", "0.2");

        assertEquals(0, c.status(), c.stderr());
        for (String line : List.of("sendBleTestCommand, init smd successful",
                                   "< HCI Command: LE Receiver Test v2 (0x08|0x0033) plen 3", "PHY: LE 2M (0x02)",
                                   "> HCI Event: Command Complete (0x0e) plen 6", "Number of packets: ")) {
            assertTrue(c.stderr().contains(line), line + " in " + c.stderr());
        }
    }

    static Stream<Arguments> controllerAnswers() {
        Map<Integer, List<byte[]>> refuse2M = Map.of(0x2033, List.of(ScriptedController.complete(0x2033, 0x11)));
        return Stream.of(
            Arguments.of("refused", refuse2M, List.of("rx", "--freq", "2402", "--phy", "2M", "--duration", "0.2"),
                         "LE Receiver Test v2 (0x2033) refused: 0x11 Unsupported Feature or Parameter Value"),
            Arguments.of("refused by Command Status", Map.of(0xfc04, List.of(ScriptedController.status(0xfc04, 0x01))),
                         List.of("cw", "--channel", "1", "--power", "1", "--type", "1", "--duration", "0.2"),
                         "Vendor Continuous Wave (0xfc04) refused: 0x01 Unknown HCI Command"),
            Arguments.of("silent", Map.of(0x201f, ScriptedController.SILENT),
                         List.of("tx", "--freq", "2440", "--phy", "1M", "--duration", "0.2"),
                         "no reply within 2000 ms to LE Test End"),
            Arguments.of("closes", Map.of(0x201f, ScriptedController.CLOSE),
                         List.of("rx", "--freq", "2440", "--phy", "1M", "--duration", "0.2"),
                         "LE Test End not answered: %s: controller closed the connection"),
            Arguments.of("refuses a command the mode needs", Map.of(0x0c05, List.of(ScriptedController.complete(0x0c05, 0x12))),
                         List.of("dut", "on"), "Set Event Filter (0x0c05) refused: 0x12 Invalid HCI Command Parameters"),
            Arguments.of("refuses only the obsolete one", Map.of(0x0c22, List.of(ScriptedController.status(0x0c22, 0x01))),
                         List.of("dut", "on"), null));
    }

    @ParameterizedTest(name = "{0}")
    @MethodSource("controllerAnswers")
    void okMeansTheControllerAcceptedEveryCommand(String name, Map<Integer, List<byte[]>> script, List<String> args,
                                                  String failure) throws Exception {
        try (ScriptedController controller = new ScriptedController(work.resolve("scripted.sock"), script)) {
            Child table = Child.run(command(concat(List.of("--hci", controller.hci()), args)), environment(), 60);
            Child c = Child.run(command(concat(List.of("--json", "--hci", controller.hci()), args)), environment(), 60);

            assertEquals(failure == null ? 0 : 1, table.status(), table.stdout() + table.stderr());
            Map<String, Object> step = steps(c).get(0);
            String why = failure == null ? null : failure.replace("%s", controller.hci());
            assertEquals(why, step.get("error"));
            assertTrue(why == null || table.stdout().contains("FAILED " + step.get("step") + " " + step.get("setting")
                                                             + ": " + why), table.stdout());
        }
    }

    /** A refusal does not stop a sweep: the 1M steps pass, the 2M ones fail. */
    @Test
    void sweepGoesOnAfterARefusedStep() throws Exception {
        try (ScriptedController controller = new ScriptedController(work.resolve("sweep.sock"),
                Map.of(0x2033, List.of(ScriptedController.complete(0x2033, 0x11))))) {
            Child c = halvenor("--hci", controller.hci(), "--json", "sweep", "--duration", "0.2");
            assertEquals(List.of(true, false, true, false, true, false), steps(c).stream().map(s -> s.get("ok")).toList());
        }
    }

    static Stream<Arguments> unreachable() {
        return Stream.of(Arguments.of("unix:/nothing/listens/here", "sweep",
                         "no controller reachable: unix:/nothing/listens/here: connect: No such file or directory"),
            Arguments.of("tty:/dev/null,115200,rtscts", "sweep",
                         "no controller reachable: tty:/dev/null,115200,rtscts: not a serial line"),
            Arguments.of("none", "dut on", "no controller reachable: no Bluetooth HAL service"));
    }

    @ParameterizedTest(name = "{0}")
    @MethodSource("unreachable")
    void unreachableControllerNamesTheCause(String hci, String command, String why) throws Exception {
        Path page = fresh("unreachable.html");
        Child c = Child.run(command(concat(List.of("--hci", hci, "--report", page.toString()), List.of(command.split(" ")))),
                            environment(), 60);

        assertEquals(1, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stdout().contains(": " + why), c.stdout());
        String html = Files.readString(page);
        assertTrue(html.contains("id=\"verdict\">1 of 1 steps FAILED") && html.contains(HtmlReport.esc(why)), html);
        String step = command.equals("sweep") ? "rx " : command + " ";
        assertEquals(1, c.stdout().lines().filter(l -> l.startsWith(step)).count(), "stops at the first: " + c.stdout());
        assertNoLibraryLog(c);
    }

    static Stream<Arguments> badArguments() {
        return Stream.of(
            Arguments.of(List.of("rx", "--freq", "2441", "--phy", "1M"), "2402 (ch 0), 2440 (ch 19), 2480 (ch 39)"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "3M"), "valid values are 1M, 2M"),
            Arguments.of(List.of("rx", "--phy", "1M"), "rx needs --freq (2402, 2440 or 2480)"),
            Arguments.of(List.of("--hci", "bluetooth0", "demo"), "sim, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD][,rtscts]"),
            Arguments.of(List.of("--hci", "tty:/dev/ttyS0,12345", "demo"), "baud rate 12345 is not a standard speed"),
            Arguments.of(List.of("cw", "--channel", "256", "--power", "1", "--type", "1"), "valid values are 0 to 255"),
            Arguments.of(List.of("rx", "--freq", "2402", "--phy", "1M", "--window", "0.5"), "at least 1 and at most 40"),
            Arguments.of(List.of("rx", "--freq", "2402", "--phy", "1M", "--expected", "many"), "1 or more"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "1M", "--expected", "5"), "does not apply to tx"),
            Arguments.of(List.of("--jsn", "demo"), "unknown option '--jsn'"),
            Arguments.of(List.of("rx", "--freq", "2402", "--freq", "2440", "--phy", "1M"), "option --freq given twice"),
            Arguments.of(List.of("--btsnoop", "/nonexistent/dir/x.btsnoop", "demo"), "cannot write there"),
            Arguments.of(List.of("--btsnoop", "/etc/passwd", "demo"), "the file exists and is not a btsnoop capture"),
            Arguments.of(List.of("frobnicate"), "use demo, dut on, dut off, tx, rx, cw, sweep or help"),
            Arguments.of(List.of("HALVENOR_HCI=tcp:localhost", "demo"), "bad HALVENOR_HCI 'tcp:localhost'"));
    }

    /** A leading NAME=VALUE sets the environment instead. */
    @ParameterizedTest(name = "{0}")
    @MethodSource("badArguments")
    void badArgumentIsNamedWithValidValues(List<String> args, String message) throws Exception {
        boolean env = args.get(0).contains("=") && !args.get(0).startsWith("-");
        Child c = Child.run(command(env ? args.subList(1, args.size()) : args),
                            env ? environment(args.get(0).split("=", 2)) : environment(), 60);

        assertEquals(2, c.status(), c.stderr());
        assertTrue(c.stderr().contains(message), c.stderr());
        assertEquals("", c.stdout());
    }

    @ParameterizedTest(name = "{0}")
    @CsvSource(delimiter = '|', value = {"-h|sim [--unix PATH", "help rx|usage: ./halvenor rx --freq F",
                                         "cw --help|usage: ./halvenor cw --channel C"})
    void helpHasAPagePerCommand(String args, String shows) throws Exception {
        Child c = halvenor(args.split(" "));
        assertEquals(0, c.status());
        assertTrue(c.stdout().contains(shows), c.stdout());
    }

    static Stream<Arguments> signals() {
        String rx = "01 1D 20 01 13";
        String cw = "01 04 FC 09 05 27 00 00 20 00 00 00 00";
        return Stream.of(
            Arguments.of("INT", 130, rx, List.of("rx", "--freq", "2440", "--phy", "1M", "--duration", "60"), TEST_END),
            Arguments.of("TERM", 143, cw, List.of("--json", "cw", "--channel", "39", "--power", "0", "--type", "0",
                                                  "--duration", "60"), RESET),
            Arguments.of("HUP", 129, "01 22 0C 01 00", List.of("dut", "on", "--hold", "60"), RESET));
    }

    /** A signal to the launcher's own process reaches the JVM, which ends the test first. */
    @ParameterizedTest(name = "{0}")
    @MethodSource("signals")
    void signalEndsTheTestOnTheControllerAndKeepsTheResults(String signal, int status, String started,
                                                            List<String> args, String last) throws Exception {
        Path snoop = fresh("signal.btsnoop");
        Path page = fresh("signal.html");
        Process p = Child.start(command(concat(List.of("--btsnoop", snoop.toString(), "--report", page.toString()), args)),
                                environment());
        boolean running = Child.waitUntil(() -> {
            try {
                return commands(snoop).contains(started);
            } catch (IOException e) {
                return false; // header still being written
            }
        }, 30);
        new ProcessBuilder("kill", "-" + signal, Long.toString(p.pid())).inheritIO().start().waitFor();
        Child c = Child.finish(p, 30);

        assertTrue(running, "the test started: " + c.stdout() + c.stderr());
        assertEquals(status, c.status(), c.stdout() + c.stderr());
        List<String> sent = commands(snoop);
        assertEquals(last, sent.get(sent.size() - 1), "the test was ended: " + sent);
        assertTrue(Files.readString(page).contains("id=\"verdict\">INTERRUPTED"), "the page says so at the top");
        if (args.get(0).equals("--json")) {
            assertEquals(true, json(c).get("interrupted"), c.stdout());
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
        assertEquals(List.of("dut on", "dut off", "rx", "rx", "rx", "rx", "rx", "rx", "cw"),
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
            assertTrue(expected >= 780 && Math.abs(number(s, "received") - 0.95 * expected) <= expected / 20, s.toString());
            assertTrue(s.get("commands").toString().contains("status_name=Success"), s.toString());
            String row = "<tr data-step=\"" + i + "\"><td>rx</td><td>" + s.get("setting") + "</td><td>0.50 s</td><td>"
                         + number(s, "received") + "</td><td>" + expected + "</td>";
            assertTrue(dom.stdout().contains(row), row);
        }
    }

    @Test
    void progressIsDrawnOnTerminal() throws Exception {
        String run = String.join(" ", command(List.of("rx", "--freq", "2440", "--phy", "2M", "--duration", "0.5")));
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
            Process tx = Child.start(command(List.of("--hci", hci, "tx", "--freq", "2440", "--phy", "2M",
                                                     "--duration", "3")), environment());
            Thread.sleep(1000);
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
