// A receiver step's counting windows as the controller counted them: from its reply to the
// test's start to its reply to LE Test End, as the capture timed both. Where in each reply's
// latency the controller acted is unknown, so a window may have been shorter or longer by
// that much: the expected count is a range, and PER's interval is widened to it. Runs
// under the step's lock, on the main thread or the interrupt hook.
package com.quorvex.halvenor.console;

import java.util.List;
import java.util.Locale;

final class Windows {
    /**
     * LE test packets repeat every I(L) = ceil((L + 249) / 625) x 625 us (Core Specification,
     * Vol 6, Part F, 4.1.6). The library's 37-byte payloads last 376 us on LE 1M and 192 us
     * on LE 2M, so both repeat every 625 us: 1600 packets a second.
     */
    static final double PACKET_INTERVAL_US = 625;
    /** Above this share of the window, the timing is too uncertain to judge PER by. */
    static final double MAX_UNCERTAINTY = 0.05;

    private Windows() {}

    /** Adds a window's count and timing; the reason when the capture cannot time it, else null. */
    static String add(Step s, List<Observer.Exchange> window, int startOpcode, int packets) {
        Observer.Exchange start = last(window, startOpcode);
        Observer.Exchange end = last(window, Runner.LE_TEST_END);
        if (start == null || end == null || start.repliedMicros() < 0 || end.repliedMicros() < 0) {
            return "the capture holds no replies to time the controller's window by";
        }
        synchronized (s) {
            s.windows.add(packets);
            s.received = (s.received == null ? 0 : s.received) + packets;
            s.windowMicros += end.repliedMicros() - start.repliedMicros();
            s.shortestMicros += Math.max(0, end.sentMicros() - start.repliedMicros());
            s.longestMicros += end.repliedMicros() - start.sentMicros();
        }
        return null;
    }

    /**
     * Sets what was expected and PER, from the tester's count when given, else from the
     * windows; returns why the count is impossible (more than could have been sent), or null.
     */
    static String judge(Step s) {
        synchronized (s) {
            if (s.received == null) {
                return null;
            }
            long nominal = Math.round(s.windowMicros / PACKET_INTERVAL_US);
            s.expectedLow = (long) Math.floor(s.shortestMicros / PACKET_INTERVAL_US);
            s.expectedHigh = (long) Math.ceil(s.longestMicros / PACKET_INTERVAL_US);
            long allowance = s.expectedHigh - nominal;
            if (s.expectedGiven != null) {
                s.expected = s.expectedGiven;
                s.per = Per.of(s.received, s.expected);
                return s.received > s.expectedGiven + allowance
                        ? "the controller counted " + s.received + " packets, more than the " + s.expectedGiven
                          + " the tester sent (--expected)" : null;
            }
            s.expected = nominal;
            s.per = Per.of(s.received, nominal, s.expectedLow, s.expectedHigh);
            return s.received > s.expectedHigh
                    ? String.format(Locale.ROOT, "the controller counted %d packets, more than the %d a transmitter can send in"
                                    + " its %.2f s window", s.received, s.expectedHigh, s.windowMicros / 1e6) : null;
        }
    }

    private static Observer.Exchange last(List<Observer.Exchange> window, int opcode) {
        Observer.Exchange found = null;
        for (Observer.Exchange e : window) {
            if (e.opcode() == opcode) {
                found = e;
            }
        }
        return found;
    }
}
