// Device Under Test entry and exit against BlueZ's controller emulator, a controller
// nobody here wrote: every command answered and no wait for a time-out.
package com.quorvex.halvenor;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTimeoutPreemptively;
import static org.junit.jupiter.api.Assertions.assertTrue;
import static org.junit.jupiter.api.Assertions.fail;

import java.io.File;
import java.io.IOException;
import java.net.StandardProtocolFamily;
import java.net.UnixDomainSocketAddress;
import java.nio.channels.SocketChannel;
import java.nio.file.Path;
import java.time.Duration;
import java.util.List;
import org.junit.jupiter.api.AfterAll;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;

@Tag("btvirt")
class BtvirtTest {
    private static final Path SOCKET = Path.of("/tmp/bt-server-bredr");
    // Well below any reply time-out: the emulator answers at once.
    private static final Duration PROMPTLY = Duration.ofSeconds(3);
    private static Process btvirt;
    private static Capture capture;
    private static TestModeUtils radio;
    private static Recorder recorder;

    @BeforeAll
    static void startEmulator() throws IOException {
        assertEquals("unix:" + SOCKET, System.getenv("HALVENOR_HCI"));
        capture = Capture.fromEnvironment();
        File btvirtPath = new File("/usr/bin/btvirt");
        if (!btvirtPath.canExecute()) {
            fail("btvirt is missing: apt-get install bluez-test-tools (scripts/install-deps.sh does)");
        }
        // Another suite's emulator may still hold the fixed socket path.
        assertTrue(Wait.until(() -> !connects(), 120), "another btvirt kept serving " + SOCKET);
        btvirt = new ProcessBuilder(btvirtPath.getPath(), "-s", "-l0")
                .redirectOutput(ProcessBuilder.Redirect.DISCARD)
                .redirectError(ProcessBuilder.Redirect.DISCARD).start();
        assertTrue(Wait.until(BtvirtTest::accepting, 10), "btvirt serves " + SOCKET);
        recorder = new Recorder();
        radio = new TestModeUtils(recorder);
        radio.initNative();
    }

    @AfterAll
    static void stopEmulator() throws InterruptedException {
        if (radio != null) {
            radio.destoryNative();
        }
        if (btvirt != null) {
            btvirt.destroy();
            btvirt.waitFor();
        }
    }

    private static boolean accepting() {
        if (!btvirt.isAlive()) {
            fail("btvirt exited with status " + btvirt.exitValue() + " (is another one serving " + SOCKET + "?)");
        }
        return connects();
    }

    private static boolean connects() {
        try (SocketChannel c = SocketChannel.open(StandardProtocolFamily.UNIX)) {
            return c.connect(UnixDomainSocketAddress.of(SOCKET));
        } catch (IOException e) {
            return false;
        }
    }

    @Test
    void deviceUnderTestEntryAndExitAreAnsweredWithoutTimeOut() throws IOException {
        capture.mark();

        assertEquals(0, (int) assertTimeoutPreemptively(PROMPTLY, () -> radio.enterTestModeNative()));
        assertEquals(0, (int) assertTimeoutPreemptively(PROMPTLY, () -> radio.quitTestModeNative()));

        int[] opcodes = {0x1803, 0x0C05, 0x0C1A, 0x0C20, 0x0C22, 0x0C03};
        List<Btsnoop.Packet> seen = capture.awaitSinceMark(p -> !Btsnoop.repliesTo(p, 0x0C03).isEmpty());
        assertEquals(List.of("01 03 18 00", "01 05 0C 03 02 00 02", "01 1A 0C 01 03", "01 20 0C 01 00",
                             "01 22 0C 01 00", "01 03 0C 00"),
                     Btsnoop.commands(seen));
        for (int opcode : opcodes) {
            assertEquals(1, Btsnoop.repliesTo(seen, opcode).size(), String.format("one reply to 0x%04X", opcode));
        }
        assertEquals(List.of(), recorder.take());
    }
}
