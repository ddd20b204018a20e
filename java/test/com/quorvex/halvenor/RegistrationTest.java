// Loading libhalvenor.so beside application classes, each in a JVM of its own: the real
// class loads cleanly; one it must refuse leaves two log lines and a refused load.
package com.quorvex.halvenor;

import static org.junit.jupiter.api.Assertions.assertEquals;

import java.nio.file.Path;
import java.util.List;
import java.util.regex.Matcher;
import java.util.regex.Pattern;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.CsvSource;

@Tag("registration")
class RegistrationTest {
    // liblog on a host: "TAG P MM-DD hh:mm:ss PID TID message".
    private static final Pattern LOG = Pattern.compile("^(\\S+) ([VDIWEF]) \\d\\d-\\d\\d \\S+ +\\d+ +\\d+ (.*)$");

    @ParameterizedTest(name = "{0}")
    @CsvSource(delimiter = '|', value = {
        "class|real|loaded|",
        "class|missing-native.jar|refused java.lang.UnsatisfiedLinkError|registerNativeMethods failed for",
        "class|wrong-signature.jar|refused java.lang.UnsatisfiedLinkError|registerNativeMethods failed for",
        "library||refused java.lang.UnsatisfiedLinkError|registerNativeMethods unable to find class"})
    void loadEndsAsTheClassDeserves(String mode, String jar, String outcome, String firstLine) throws Exception {
        String shadow = System.getProperty("halvenor.shadow.dir");
        String cp = shadow + "/halvenor_probe.jar" + (jar == null ? "" : ":" + (jar.equals("real")
                ? System.getProperty("halvenor.jar") : Path.of(shadow, jar).toString()));
        Child c = Child.run(List.of(System.getProperty("halvenor.java"), "-Djava.library.path="
                                    + System.getProperty("halvenor.library.dir"), "-cp", cp,
                                    "com.quorvex.halvenor.probe.LoadProbe", mode), null, 60);
        List<String> errors = c.stderr().lines().map(LOG::matcher).filter(Matcher::matches)
                               .filter(m -> m.group(1).equals("halvenor") && m.group(2).equals("E"))
                               .map(m -> m.group(3)).toList();
        String name = "'com/quorvex/halvenor/TestModeUtils'";
        assertEquals(firstLine == null ? List.of()
                     : List.of(firstLine + " " + name, "ERROR: BinaryDictionary native registration failed"),
                     errors, c.stderr());
        assertEquals(outcome, c.stdout().strip().split(":")[0], c.stdout());
    }
}
