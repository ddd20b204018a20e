// LE PHYs of the direct tests: 1M uses the original test commands, 2M the enhanced ones.
package com.quorvex.halvenor.console;

enum Phy {
    LE_1M("1M", false),
    LE_2M("2M", true);

    final String name;
    final boolean enhanced;

    Phy(String name, boolean enhanced) {
        this.name = name;
        this.enhanced = enhanced;
    }

    static Phy parse(String text) throws UsageException {
        String t = text.trim().toUpperCase().replace("LE", "").trim();
        for (Phy p : values()) {
            if (t.equals(p.name)) {
                return p;
            }
        }
        throw new UsageException("bad --phy '" + text + "': valid values are 1M, 2M");
    }
}
