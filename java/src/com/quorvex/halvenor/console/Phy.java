// LE PHYs of the direct tests: 1M uses the original test commands, 2M the enhanced ones.
package com.quorvex.halvenor.console;

enum Phy {
    LE_1M("1M", false, 0x201e, 0x201d),
    LE_2M("2M", true, 0x2034, 0x2033);

    final String name;
    final boolean enhanced;
    /** The opcodes of the test commands the library sends on this PHY. */
    final int txOpcode;
    final int rxOpcode;

    Phy(String name, boolean enhanced, int txOpcode, int rxOpcode) {
        this.name = name;
        this.enhanced = enhanced;
        this.txOpcode = txOpcode;
        this.rxOpcode = rxOpcode;
    }

    /** The PHY of "2M" or "LE 2M", or null. */
    static Phy parse(String text) {
        String t = text.trim().toUpperCase().replace("LE", "").trim();
        for (Phy p : values()) {
            if (t.equals(p.name)) {
                return p;
            }
        }
        return null;
    }
}
