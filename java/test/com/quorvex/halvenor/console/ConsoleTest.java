// The engineering console as an engineer runs it: ./halvenor with arguments, judged by
// its output, its exit status and the capture of what reached the controller.
package com.quorvex.halvenor.console;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import com.quorvex.halvenor.Btsnoop;
import com.quorvex.halvenor.Child;
import com.quorvex.halvenor.Json;
import com.quorvex.halvenor.Wait;
import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.HashMap;
import java.util.List;
import java.util.Map;
import java.util.stream.Stream;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
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

    private static Map<String, String> environment() {
        Map<String, String> env = new HashMap<>();
        env.put("HALVENOR_BUILD_DIR", System.getProperty("halvenor.build.dir"));
        env.put("HALVENOR_NO_BUILD", "1");
        env.put("HALVENOR_HCI", null);
        env.put("HALVENOR_BTSNOOP", null);
        return env;
    }

    private static List<String> command(String... args) {
        List<String> c = new ArrayList<>();
        c.add(System.getProperty("halvenor.launcher"));
        c.addAll(List.of(args));
        return c;
    }

    private static Child halvenor(String... args) throws IOException, InterruptedException {
        return Child.run(command(args), environment(), 120);
    }

    private static Path fresh(String name) throws IOException {
        Path p = work.resolve(name);
        Files.deleteIfExists(p);
        return p;
    }

    @SuppressWarnings("unchecked")
    private static Map<String, Object> json(Child c) {
        return (Map<String, Object>) Json.parse(c.stdout());
    }

    @SuppressWarnings("unchecked")
    private static List<Map<String, Object>> steps(Map<String, Object> result) {
        return (List<Map<String, Object>>) result.get("steps");
    }

    private static long number(Map<String, Object> m, String key) {
        return ((Double) m.get(key)).longValue();
    }

    private static void assertNoLibraryLog(Child c) {
        assertFalse(c.stderr().contains("halvenor I ") || c.stderr().contains("halvenor E "),
                    "library log lines hidden without --verbose: " + c.stderr());
    }

    @Test
    void demoTourPassesAgainstSimulatedController() throws Exception {
        Child c = halvenor("demo");

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        String out = c.stdout();
        assertTrue(out.startsWith("halvenor demo (controller: sim)"), out);
        List<String> rows = out.lines().filter(l -> l.matches("^(dut on|dut off|rx|cw) .*")).toList();
        assertEquals(9, rows.size(), out);
        for (String f : List.of("2402 MHz (ch 0) LE 1M", "2402 MHz (ch 0) LE 2M", "2440 MHz (ch 19) LE 1M",
                                "2440 MHz (ch 19) LE 2M", "2480 MHz (ch 39) LE 1M", "2480 MHz (ch 39) LE 2M")) {
            assertTrue(rows.stream().anyMatch(r -> r.startsWith("rx") && r.contains(f) && r.contains("%")), f + " in\n" + out);
        }
        assertTrue(rows.stream().allMatch(r -> r.endsWith(" ok")), out);
        assertTrue(out.contains("all 9 steps ok"), out);
        assertFalse(out.contains("\r") || out.contains("\033"), "no progress display off a terminal");
        assertNoLibraryLog(c);
    }

    @Test
    void demoJsonReportsEveryStepWithCountsAndPer() throws Exception {
        Child c = halvenor("--json", "demo");

        assertEquals(0, c.status(), c.stderr());
        Map<String, Object> result = json(c);
        assertEquals(true, result.get("ok"));
        assertEquals("sim", result.get("hci"));
        List<Map<String, Object>> steps = steps(result);
        assertEquals(List.of("dut on", "dut off", "rx", "rx", "rx", "rx", "rx", "rx", "cw"),
                     steps.stream().map(s -> s.get("step")).toList());
        for (Map<String, Object> s : steps.subList(2, 8)) {
            long received = number(s, "received");
            long expected = number(s, "expected");
            assertTrue(expected >= 800 && expected <= 1200, "0.5 s or a little more at 1600 packets a second: " + s);
            assertTrue(Math.abs(received - expected) <= expected / 10, "within 10 % of the reference transmitter: " + s);
            double per = (Double) s.get("per");
            List<?> ci = (List<?>) s.get("per_ci95");
            assertTrue((Double) ci.get(0) <= per && per <= (Double) ci.get(1) && (Double) ci.get(1) > 0, s.toString());
        }
    }

    @Test
    void longReceiverRunIsSplitIntoWindowsAndSummed() throws Exception {
        Path snoop = fresh("windows.btsnoop");
        Child c = halvenor("--btsnoop", snoop.toString(), "--json",
                           "rx", "--freq", "2480", "--phy", "2M", "--duration", "1", "--window", "0.25");

        assertEquals(0, c.status(), c.stderr());
        Map<String, Object> step = steps(json(c)).get(0);
        List<?> windows = (List<?>) step.get("windows");
        assertEquals(4, windows.size(), step.toString());
        List<Btsnoop.Packet> packets = Btsnoop.read(snoop);
        List<String> sent = Btsnoop.commands(packets);
        String rx = "01 33 20 03 27 02 00";
        assertEquals(List.of(rx, TEST_END, rx, TEST_END, rx, TEST_END, rx, TEST_END), sent);
        List<byte[]> ends = Btsnoop.repliesTo(packets, 0x201F);
        long sum = 0;
        for (int i = 0; i < 4; i++) {
            int count = Btsnoop.testEndCount(ends.get(i));
            assertEquals(count, ((Double) windows.get(i)).intValue(), "window " + i);
            sum += count;
        }
        assertEquals(sum, number(step, "received"));
        assertTrue(number(step, "expected") >= 1600 && number(step, "expected") <= 2000, step.toString());
    }

    @Test
    void expectedCountFromTesterSetsPer() throws Exception {
        Child c = halvenor("--json", "rx", "--freq", "2402", "--phy", "1M", "--duration", "0.3", "--expected", "1000");

        assertEquals(0, c.status(), c.stderr());
        Map<String, Object> step = steps(json(c)).get(0);
        assertEquals(1000, number(step, "expected"));
        assertEquals(true, step.get("expected_given"));
        long received = number(step, "received");
        double per = (1000.0 - received) / 1000;
        assertEquals(per, (Double) step.get("per"), 1e-5);
        // Wilson score interval, z = 1.96: p' = (p + z^2/2n) / (1 + z^2/n) +- z/(1 + z^2/n) sqrt(p(1-p)/n + z^2/4n^2)
        double z2 = 1.959964 * 1.959964;
        double centre = (per + z2 / 2000) / (1 + z2 / 1000);
        double half = 1.959964 / (1 + z2 / 1000) * Math.sqrt(per * (1 - per) / 1000 + z2 / 4e6);
        List<?> ci = (List<?>) step.get("per_ci95");
        assertEquals(centre - half, (Double) ci.get(0), 1e-5);
        assertEquals(centre + half, (Double) ci.get(1), 1e-5);
    }

    @Test
    void transmitterTestIsEndedAndCaptured() throws Exception {
        Path snoop = fresh("tx.btsnoop");
        Child c = halvenor("--btsnoop", snoop.toString(), "tx", "--freq", "2402", "--phy", "2M", "--duration", "0.2");

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        assertEquals(List.of("01 34 20 04 00 25 00 02", TEST_END), Btsnoop.commands(Btsnoop.read(snoop)));
        assertNoLibraryLog(c);
    }

    @Test
    void continuousWaveIsStoppedWithReset() throws Exception {
        Path snoop = fresh("cw.btsnoop");
        Child c = halvenor("--btsnoop=" + snoop, "cw", "--channel", "1", "--power", "0x09", "--type", "4", "--duration", "0.2");

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        assertEquals(List.of(TEST_END, "01 04 FC 09 05 01 09 04 20 00 00 00 00", RESET),
                     Btsnoop.commands(Btsnoop.read(snoop)));
    }

    @Test
    void deviceUnderTestOnAndOffAreSeparateRuns() throws Exception {
        Path on = fresh("dut-on.btsnoop");
        Path off = fresh("dut-off.btsnoop");

        Child c1 = halvenor("--btsnoop", on.toString(), "dut", "on");
        Child c2 = halvenor("--btsnoop", off.toString(), "dut", "off");

        assertEquals(0, c1.status(), c1.stdout() + c1.stderr());
        assertEquals(0, c2.status(), c2.stdout() + c2.stderr());
        assertEquals(List.of("01 03 18 00", "01 05 0C 03 02 00 02", "01 1A 0C 01 03", "01 20 0C 01 00", "01 22 0C 01 00"),
                     Btsnoop.commands(Btsnoop.read(on)));
        assertEquals(List.of(TEST_END, RESET), Btsnoop.commands(Btsnoop.read(off)));
    }

    @Test
    void verboseShowsLibraryLogLines() throws Exception {
        Child c = halvenor("--verbose", "dut", "on");

        assertEquals(0, c.status(), c.stderr());
        assertTrue(c.stderr().contains("enterTestMode, hci_enable_device_under_test_mode IN."), c.stderr());
    }

    @Test
    void unreachableControllerFailsWithStatusOne() throws Exception {
        Child c = halvenor("--hci", "unix:" + work.resolve("nothing-listens-here"), "--json", "sweep");

        assertEquals(1, c.status(), c.stdout() + c.stderr());
        Map<String, Object> result = json(c);
        assertEquals(false, result.get("ok"));
        List<Map<String, Object>> steps = steps(result);
        assertEquals(1, steps.size(), "stops at the first failure: " + steps);
        assertTrue(((String) steps.get(0).get("error")).contains("no controller reachable"), steps.toString());
        assertNoLibraryLog(c);
    }

    static Stream<Arguments> badArguments() {
        return Stream.of(
            Arguments.of(List.of("rx", "--freq", "2441", "--phy", "1M"), "2402 (ch 0), 2440 (ch 19), 2480 (ch 39)"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "3M"), "valid values are 1M, 2M"),
            Arguments.of(List.of("rx", "--phy", "1M"), "rx needs --freq (2402, 2440 or 2480)"),
            Arguments.of(List.of("--hci", "bluetooth0", "demo"), "sim, unix:PATH, tcp:HOST:PORT or tty:DEVICE[,BAUD]"),
            Arguments.of(List.of("--hci", "tcp:localhost:99999", "demo"), "sim, unix:PATH, tcp:HOST:PORT"),
            Arguments.of(List.of("cw", "--channel", "256", "--power", "1", "--type", "1"), "valid values are 0 to 255"),
            Arguments.of(List.of("cw", "--channel", "1", "--power", "1"), "cw needs --type (0 to 255)"),
            Arguments.of(List.of("rx", "--freq", "2402", "--phy", "1M", "--window", "41"), "at most 40"),
            Arguments.of(List.of("rx", "--freq", "2402", "--phy", "1M", "--duration", "-1"), "more than 0"),
            Arguments.of(List.of("rx", "--freq", "2402", "--phy", "1M", "--expected", "many"), "1 or more"),
            Arguments.of(List.of("tx", "--freq", "2402", "--phy", "1M", "--expected", "5"), "does not apply to tx"),
            Arguments.of(List.of("dut"), "dut needs 'on' or 'off'"),
            Arguments.of(List.of("frobnicate"), "use demo, dut on, dut off, tx, rx, cw, sweep or help"),
            Arguments.of(List.of(), "no command given"));
    }

    @ParameterizedTest(name = "{0}")
    @MethodSource("badArguments")
    void badArgumentIsNamedWithValidValues(List<String> args, String message) throws Exception {
        Child c = halvenor(args.toArray(new String[0]));

        assertEquals(2, c.status(), c.stderr());
        assertTrue(c.stderr().contains(message), c.stderr());
        assertEquals("", c.stdout());
    }

    @Test
    void helpListsCommands() throws Exception {
        Child c = halvenor("help");

        assertEquals(0, c.status());
        for (String word : List.of("demo", "dut on", "dut off", "tx --freq", "rx --freq", "sweep", "cw --channel", "--json")) {
            assertTrue(c.stdout().contains(word), word);
        }
    }

    /** Ctrl-C reaches the whole foreground process group; setsid gives the run one of its own. */
    private static Child interruptOnce(Path snoop, String command, String... args) throws Exception {
        List<String> cmd = new ArrayList<>(List.of("setsid"));
        cmd.addAll(command("--btsnoop", snoop.toString()));
        cmd.addAll(List.of(args));
        Process p = Child.start(cmd, environment());
        boolean started = Wait.until(() -> {
            try {
                return Btsnoop.commands(Btsnoop.read(snoop)).contains(command);
            } catch (IOException e) {
                return false; // header still being written
            }
        }, 30);
        new ProcessBuilder("kill", "-INT", "--", "-" + p.pid()).inheritIO().start().waitFor();
        Child c = Child.finish(p, 30);
        assertTrue(started, "the test started: " + c.stdout() + c.stderr());
        return c;
    }

    @Test
    void interruptEndsReceiverTestBeforeExit() throws Exception {
        Path snoop = fresh("interrupt-rx.btsnoop");
        String rx = "01 1D 20 01 13";

        Child c = interruptOnce(snoop, rx, "rx", "--freq", "2440", "--phy", "1M", "--duration", "60");

        assertEquals(130, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stderr().contains("interrupted: sent LE Test End"), c.stderr());
        List<Btsnoop.Packet> packets = Btsnoop.read(snoop);
        assertEquals(List.of(rx, TEST_END), Btsnoop.commands(packets));
        assertEquals(1, Btsnoop.repliesTo(packets, 0x201F).size(), "the end was answered");
    }

    @Test
    void interruptStopsContinuousWaveWithReset() throws Exception {
        Path snoop = fresh("interrupt-cw.btsnoop");
        String cw = "01 04 FC 09 05 27 00 00 20 00 00 00 00";

        Child c = interruptOnce(snoop, cw, "cw", "--channel", "39", "--power", "0", "--type", "0", "--duration", "60");

        assertEquals(130, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stderr().contains("interrupted: sent HCI Reset"), c.stderr());
        assertEquals(List.of(TEST_END, cw, RESET), Btsnoop.commands(Btsnoop.read(snoop)));
    }

    @Test
    void progressIsDrawnOnTerminal() throws Exception {
        String run = String.join(" ", command("rx", "--freq", "2440", "--phy", "2M", "--duration", "0.5"));
        Child c = Child.run(List.of("script", "-qec", run, "/dev/null"), environment(), 60);

        assertEquals(0, c.status(), c.stdout() + c.stderr());
        assertTrue(c.stdout().contains("\r\033[Krx 2440 MHz (ch 19) LE 2M ["), c.stdout());
    }
}
