// The three LE test channels the library offers, named by centre frequency.
package com.quorvex.halvenor.console;

import com.quorvex.halvenor.TestModeUtils;

enum Band {
    F2402(2402, 0),
    F2440(2440, 19),
    F2480(2480, 39);

    final int mhz;
    final int channel;

    Band(int mhz, int channel) {
        this.mhz = mhz;
        this.channel = channel;
    }

    int txCode() {
        return TestModeUtils.TX_2402 - 2402 + mhz;
    }

    int rxCode() {
        return TestModeUtils.RX_2402 - 2402 + mhz;
    }

    String label() {
        return mhz + " MHz (ch " + channel + ")";
    }

    /** The band of "2440" or "2440MHz", or null. */
    static Band parse(String text) {
        String t = text.trim().toLowerCase().replace("mhz", "").trim();
        for (Band b : values()) {
            if (t.equals(Integer.toString(b.mhz))) {
                return b;
            }
        }
        return null;
    }
}
