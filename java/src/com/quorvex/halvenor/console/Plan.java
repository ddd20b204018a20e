// Turns a parsed command line into the ordered steps the console runs.
package com.quorvex.halvenor.console;

import java.util.ArrayList;
import java.util.List;

final class Plan {
    /** 1600 packets a second from the reference transmitter: a second is enough for a verdict. */
    static final double DEMO_RX_SECONDS = 1;
    static final double DEMO_CW_SECONDS = 0.5;
    static final double DEMO_TX_SECONDS = 0.5;
    /** The demo's continuous wave: channel 1, power 9, type 4. */
    static final int[] DEMO_CW = {1, 9, 4};

    interface Item {
        Step run(Runner r);
    }

    private Plan() {}

    static List<Item> of(Options o) {
        List<Item> items = new ArrayList<>();
        double seconds = o.seconds("duration", 1);
        double window = o.seconds("window", Runner.DEFAULT_WINDOW_S);
        switch (o.command) {
            case "dut on" -> items.add(r -> r.dutOn(o.seconds("hold", 0)));
            case "dut off" -> items.add(Runner::dutOff);
            case "tx" -> items.add(r -> r.tx(o.band(), o.phy(), seconds));
            case "rx" -> items.add(r -> r.rx(o.band(), o.phy(), seconds, o.expected(), window));
            case "cw" -> items.add(r -> r.cw(o.octet("channel"), o.octet("power"), o.octet("type"), seconds));
            case "sweep rx" -> sweep(items, true, seconds, o.expected(), window);
            case "sweep tx" -> sweep(items, false, seconds, null, window);
            case "demo" -> demo(items);
            default -> throw new IllegalArgumentException(o.command);
        }
        return items;
    }

    private static void sweep(List<Item> items, boolean rx, double seconds, Long expected, double window) {
        for (Band b : Band.values()) {
            for (Phy p : Phy.values()) {
                items.add(rx ? r -> r.rx(b, p, seconds, expected, window) : r -> r.tx(b, p, seconds));
            }
        }
    }

    private static void demo(List<Item> items) {
        items.add(r -> r.dutOn(0));
        items.add(Runner::dutOff);
        sweep(items, true, DEMO_RX_SECONDS, null, Runner.DEFAULT_WINDOW_S);
        items.add(r -> r.tx(Band.F2440, Phy.LE_2M, DEMO_TX_SECONDS));
        items.add(r -> r.cw(DEMO_CW[0], DEMO_CW[1], DEMO_CW[2], DEMO_CW_SECONDS));
    }
}
