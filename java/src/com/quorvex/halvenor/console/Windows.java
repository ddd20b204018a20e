// A receiver step's counting windows as the controller counted them: from its reply to the
// test's start to its reply to LE Test End, as the capture timed both. Where in each reply's
// latency the controller acted is unknown, so a window may have been shorter or longer by
// that much: the expected count is a range, and PER's interval is widened to it. The verdict
// compares that interval with the PER limit. Runs under the step's lock, on the main thread
// or the interrupt hook.
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

    /** What a window or a step holds measured against the limit. */
    record Judged(long expected, Per per, Step.Verdict verdict, String why) {}

    private Windows() {}

    /** Adds a window's count and timing; the reason when the capture cannot time it, else null. */
    static String add(Step s, List<Observer.Exchange> window, int startOpcode, int packets) {
        Observer.Exchange start = last(window, startOpcode);
        Observer.Exchange end = last(window, Runner.LE_TEST_END);
        if (start == null || end == null || start.repliedMicros() < 0 || end.repliedMicros() < 0) {
            return "the capture holds no replies to time the controller's window by";
        }
        Step.Window w = new Step.Window(packets, end.repliedMicros() - start.repliedMicros(),
                                        Math.max(0, end.sentMicros() - start.repliedMicros()),
                                        end.repliedMicros() - start.sentMicros(), start.repliedMicros());
        synchronized (s) {
            s.windows.add(w);
            s.received = (s.received == null ? 0 : s.received) + packets;
            s.windowMicros += w.micros();
            s.shortestMicros += w.shortestMicros();
            s.longestMicros += w.longestMicros();
        }
        return null;
    }

    /**
     * Sets what was expected, PER and the verdict, from the tester's count when given, else
     * from the windows; returns why the count is impossible (more than could have been sent),
     * or null.
     */
    static String judge(Step s, double limit, long minPackets) {
        synchronized (s) {
            if (s.received == null) {
                return null;
            }
            s.expectedLow = low(s.shortestMicros);
            s.expectedHigh = high(s.longestMicros);
            long nominal = Math.round(s.windowMicros / PACKET_INTERVAL_US);
            Judged j = judged(s.received, s.expectedGiven != null ? s.expectedGiven : nominal, s.expectedGiven == null,
                              s.expectedLow, s.expectedHigh, s.timingTooUncertain(), limit, minPackets);
            s.expected = j.expected();
            s.per = j.per();
            long allowance = s.expectedHigh - nominal;
            String impossible = s.expectedGiven != null
                    ? s.received > s.expectedGiven + allowance ? "the controller counted " + s.received + " packets, more"
                      + " than the " + s.expectedGiven + " the tester sent (--expected)" : null
                    : s.received > s.expectedHigh ? String.format(Locale.ROOT, "the controller counted %d packets, more"
                      + " than the %d a transmitter can send in its %.2f s window", s.received, s.expectedHigh,
                      s.windowMicros / 1e6) : null;
            s.verdict = impossible == null ? j.verdict() : null;
            s.verdictWhy = impossible == null ? j.why() : null;
            return impossible;
        }
    }

    /** One window on its own, as the CSV shows it. */
    static Judged judge(Step.Window w, double limit, long minPackets) {
        boolean uncertain = w.longestMicros() - w.shortestMicros() > MAX_UNCERTAINTY * w.micros();
        return judged(w.count(), Math.round(w.micros() / PACKET_INTERVAL_US), true, low(w.shortestMicros()),
                      high(w.longestMicros()), uncertain, limit, minPackets);
    }

    // PASS when the interval lies below the limit, FAIL above it; INCONCLUSIVE when it straddles
    // the limit, when fewer packets than the minimum were expected or the timing was too
    // uncertain. Nothing received is a FAIL whatever else: 100 % is above any limit.
    private static Judged judged(long received, long expected, boolean timed, long low, long high, boolean uncertain,
                                 double limit, long minPackets) {
        Per per = timed ? Per.of(received, expected, low, high) : Per.of(received, expected);
        if (received == 0) {
            return new Judged(expected, per, Step.Verdict.FAIL, "no transmitter heard");
        }
        if (expected < minPackets) {
            return new Judged(expected, per, Step.Verdict.INCONCLUSIVE, expected + " packets expected, fewer than the "
                              + minPackets + " a verdict needs");
        }
        if (uncertain) {
            return new Judged(expected, per, Step.Verdict.INCONCLUSIVE,
                              "timing too uncertain: the replies' latency is over 5 % of the window");
        }
        if (per.high() < limit) {
            return new Judged(expected, per, Step.Verdict.PASS, null);
        }
        String interval = String.format(Locale.ROOT, "%.2f-%.2f %%", per.low() * 100, per.high() * 100);
        String against = String.format(Locale.ROOT, "the %.1f %% limit", limit * 100);
        return per.low() > limit
                ? new Judged(expected, per, Step.Verdict.FAIL, String.format(Locale.ROOT, "PER %.2f %% [%s] is above %s",
                                                                             per.rate() * 100, interval, against))
                : new Judged(expected, per, Step.Verdict.INCONCLUSIVE, "the interval " + interval + " straddles " + against);
    }

    private static long low(long micros) {
        return (long) Math.floor(micros / PACKET_INTERVAL_US);
    }

    private static long high(long micros) {
        return (long) Math.ceil(micros / PACKET_INTERVAL_US);
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
