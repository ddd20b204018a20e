// The natives when HALVENOR_HCI names a controller that is not there: failures come
// back promptly, as -1 or as missing callbacks, and the library stays usable.
package com.quorvex.halvenor;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTimeoutPreemptively;

import java.time.Duration;
import java.util.List;
import org.junit.jupiter.api.AfterAll;
import org.junit.jupiter.api.BeforeAll;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;

@Tag("nocontroller")
class NoControllerTest {
    private static final Duration PROMPTLY = Duration.ofSeconds(10);
    private static Recorder recorder;
    private static TestModeUtils radio;

    @BeforeAll
    static void bind() {
        recorder = new Recorder();
        radio = new TestModeUtils(recorder);
        radio.initNative();
    }

    @AfterAll
    static void release() {
        radio.destoryNative();
    }

    @Test
    void enterReturnsMinusOneWithoutController() {
        assertEquals(-1, (int) assertTimeoutPreemptively(PROMPTLY, () -> radio.enterTestModeNative()));
        assertEquals(-1, (int) assertTimeoutPreemptively(PROMPTLY, () -> radio.enterTestModeNative()), "and again");
    }

    @Test
    void quitReturnsZeroWithoutSession() {
        assertEquals(0, radio.quitTestModeNative());
    }

    @Test
    void leCommandWithoutControllerMakesNoCallback() {
        assertTimeoutPreemptively(PROMPTLY, () -> radio.sendTestCommandNative(TestModeUtils.RX_2440, true));
        assertTimeoutPreemptively(PROMPTLY, () -> radio.sendTestCommandNative(TestModeUtils.TEST_END, false));
        assertTimeoutPreemptively(PROMPTLY, () -> radio.sendCwtxCommandNative(1, 9, 4));

        assertEquals(List.of(), recorder.take());
    }
}
