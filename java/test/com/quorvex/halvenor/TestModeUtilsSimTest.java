// The library end to end in this JVM against the simulated controller: the natives'
// commands checked byte for byte in the btsnoop capture, the callbacks as Java sees them.
package com.quorvex.halvenor;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertFalse;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.io.IOException;
import java.util.List;
import java.util.stream.Stream;
import org.junit.jupiter.api.AfterAll;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.BeforeEach;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
import org.junit.jupiter.params.provider.MethodSource;

@Tag("sim")
class TestModeUtilsSimTest {
    private static final String TEST_END = "01 1F 20 00";
    private static final int TEST_END_OPCODE = 0x201F;

    private static Capture capture;
    private static Recorder recorder;
    private static TestModeUtils radio;

    @BeforeAll
    static void bind() throws IOException {
        capture = Capture.fromEnvironment();
        recorder = new Recorder();
        radio = new TestModeUtils(recorder);
        radio.initNative();
    }

    @AfterAll
    static void release() {
        radio.destoryNative();
    }

    // Each case starts with no session, the controller reset and no callbacks pending.
    @BeforeEach
    void closeSession() throws IOException {
        assertEquals(0, radio.quitTestModeNative());
        recorder.take();
        capture.mark();
    }

    @Test
    void roadOfOneRequestReachesTheWireAndJavaBeforeTheNativeReturns() throws IOException {
        radio.sendTestCommandNative(TestModeUtils.RX_2440, true);

        assertEquals(List.of("sent 22440"), recorder.take(), "onSendCmdSuccess before the native returned");
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, 0x2033).isEmpty());
        assertEquals(List.of("01 33 20 03 13 02 00"), Btsnoop.commands(seen));
        byte[] reply = Btsnoop.repliesTo(seen, 0x2033).get(0);
        assertEquals(0x0E, reply[1], "a Command Complete: " + Btsnoop.hex(reply));
        assertEquals(0x00, reply[6], "status success: " + Btsnoop.hex(reply));
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
    }

    static Stream<Arguments> leCommands() {
        return Stream.of(
            Arguments.of(12402, false, "01 1E 20 03 00 25 00"),
            Arguments.of(12440, false, "01 1E 20 03 13 25 00"),
            Arguments.of(12480, false, "01 1E 20 03 27 25 00"),
            Arguments.of(12402, true, "01 34 20 04 00 25 00 02"),
            Arguments.of(12440, true, "01 34 20 04 13 25 00 02"),
            Arguments.of(12480, true, "01 34 20 04 27 25 00 02"),
            Arguments.of(22402, false, "01 1D 20 01 00"),
            Arguments.of(22440, false, "01 1D 20 01 13"),
            Arguments.of(22480, false, "01 1D 20 01 27"),
            Arguments.of(22402, true, "01 33 20 03 00 02 00"),
            Arguments.of(22440, true, "01 33 20 03 13 02 00"),
            Arguments.of(22480, true, "01 33 20 03 27 02 00"));
    }

    @ParameterizedTest(name = "code {0} enhanced {1}: {2}")
    @MethodSource("leCommands")
    void everyLeTestAndItsEndAreByteExact(int code, boolean enhanced, String packet) throws IOException {
        radio.sendTestCommandNative(code, enhanced);
        radio.sendTestCommandNative(TestModeUtils.TEST_END, enhanced);

        List<String> calls = recorder.take();
        assertEquals(3, calls.size(), calls.toString());
        assertEquals("sent " + code, calls.get(0));
        assertTrue(calls.get(1).startsWith("count "), calls.toString());
        assertEquals("sent 3000", calls.get(2));
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, TEST_END_OPCODE).isEmpty());
        assertEquals(List.of(packet, TEST_END), Btsnoop.commands(seen));
    }

    @Test
    void deviceUnderTestEntryAndExitAreByteExactAndAnswered() throws IOException {
        assertEquals(0, radio.enterTestModeNative());
        assertEquals(0, radio.quitTestModeNative());

        int[] opcodes = {0x1803, 0x0C05, 0x0C1A, 0x0C20, 0x0C22, 0x0C03};
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, 0x0C03).isEmpty());
        assertEquals(List.of("01 03 18 00", "01 05 0C 03 02 00 02", "01 1A 0C 01 03", "01 20 0C 01 00",
                             "01 22 0C 01 00", "01 03 0C 00"),
                     Btsnoop.commands(seen));
        for (int opcode : opcodes) {
            assertEquals(1, Btsnoop.repliesTo(seen, opcode).size(), String.format("one reply to 0x%04X", opcode));
        }
        assertEquals(List.of(), recorder.take(), "Device Under Test mode makes no callback");
    }

    @Test
    void continuousWaveCommandIsByteExactWithNoCallback() throws IOException {
        radio.sendCwtxCommandNative(1, 9, 4);

        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, 0xFC04).isEmpty());
        assertEquals(List.of("01 04 FC 09 05 01 09 04 20 00 00 00 00"), Btsnoop.commands(seen));
        assertEquals(List.of(), recorder.take());
    }

    @Test
    void receiverCountReachesJavaOnceBeforeTheEndIsConfirmed() throws IOException, InterruptedException {
        radio.sendTestCommandNative(TestModeUtils.RX_2402, false);
        assertEquals(List.of("sent 22402"), recorder.take(), "no count for the start of a test");
        Thread.sleep(300); // the test's duration: the simulated air carries 1600 packets a second

        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);

        List<String> calls = recorder.take();
        assertEquals(2, calls.size(), calls.toString());
        assertEquals("sent 3000", calls.get(1));
        int count = Integer.parseInt(calls.get(0).substring("count ".length()));
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, TEST_END_OPCODE).isEmpty());
        byte[] end = Btsnoop.repliesTo(seen, TEST_END_OPCODE).get(0);
        assertEquals(Btsnoop.testEndCount(end), count, "Java gets the controller's Num_Packets: " + Btsnoop.hex(end));
        assertTrue(count >= 300 * 16 / 10 * 9 / 10, "about 1600 packets a second, got " + count + " in 0.3 s");
    }

    @Test
    void testEndWithoutSessionIsSentButReportsNoCount() throws IOException {
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);

        assertEquals(List.of("sent 3000"), recorder.take());
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, TEST_END_OPCODE).isEmpty());
        assertEquals(List.of(TEST_END), Btsnoop.commands(seen));
    }

    @Test
    void quitWithoutSessionReturnsZeroAndSendsNothing() throws IOException {
        assertEquals(0, radio.quitTestModeNative());
        assertEquals(0, radio.quitTestModeNative());

        assertEquals(List.of(), Btsnoop.commands(capture.sinceMark()));
    }

    @Test
    void codeOutsideTheTableSendsNothingAndCallsNothing() throws IOException {
        radio.sendTestCommandNative(0, false);
        radio.sendTestCommandNative(22441, true);

        assertEquals(List.of(), recorder.take());
        assertEquals(List.of(), Btsnoop.commands(capture.sinceMark()));
    }

    @Test
    void destroyThenTestNativeOpensFreshSession() throws IOException {
        radio.sendTestCommandNative(TestModeUtils.RX_2480, true);
        radio.destoryNative();
        radio.initNative();
        recorder.take();

        // A session opened for the end itself clears the pending count; the old one would have kept it.
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);

        assertEquals(List.of("sent 3000"), recorder.take());
        radio.sendTestCommandNative(TestModeUtils.TX_2402, false);
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        List<String> calls = recorder.take();
        assertEquals(List.of("sent 12402", "count 0", "sent 3000"), calls, "a transmitter test ends with no packets");
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> Btsnoop.repliesTo(p, TEST_END_OPCODE).size() == 2);
        assertEquals(List.of("01 33 20 03 27 02 00", TEST_END, "01 1E 20 03 00 25 00", TEST_END), Btsnoop.commands(seen));
    }

    @Test
    void listenerThatThrowsLeavesTheLibraryWorking() throws IOException {
        radio.setListener(new TestModeUtils.Listener() {
            @Override
            public void onSendCmdSuccess(int code) {
                throw new IllegalStateException("listener fault " + code);
            }
        });
        Thread.UncaughtExceptionHandler previous = Thread.currentThread().getUncaughtExceptionHandler();
        Thread.currentThread().setUncaughtExceptionHandler((t, e) -> { });
        try {
            radio.sendTestCommandNative(TestModeUtils.RX_2440, false);
            radio.sendTestCommandNative(TestModeUtils.TEST_END, false);
        } finally {
            Thread.currentThread().setUncaughtExceptionHandler(previous);
            radio.setListener(recorder);
        }
        radio.sendTestCommandNative(TestModeUtils.RX_2440, false);
        radio.sendTestCommandNative(TestModeUtils.TEST_END, false);

        List<String> calls = recorder.take();
        assertEquals("sent 22440", calls.get(0));
        assertFalse(calls.isEmpty());
        assertEquals(4, Btsnoop.commands(capture.awaitSinceMark(p -> Btsnoop.repliesTo(p, TEST_END_OPCODE).size() == 2)).size());
    }
}
