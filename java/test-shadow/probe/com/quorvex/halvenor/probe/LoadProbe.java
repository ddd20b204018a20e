// Loads libhalvenor.so in a JVM of its own and prints how the load ended, so a test can
// check the library's verdict on whatever application class shares its class path.
package com.quorvex.halvenor.probe;

public final class LoadProbe {
    private LoadProbe() {}

    /** args[0]: "class" loads through com.quorvex.halvenor.TestModeUtils, "library" loads directly. */
    public static void main(String[] args) {
        try {
            if (args.length > 0 && args[0].equals("library")) {
                System.loadLibrary("halvenor");
            } else {
                Class.forName("com.quorvex.halvenor.TestModeUtils");
            }
            System.out.println("loaded");
        } catch (LinkageError | ClassNotFoundException e) {
            System.out.println("refused " + e.getClass().getName() + ": " + e.getMessage());
        }
    }
}
