// Loading libhalvenor.so next to application classes it must refuse, each in a JVM of
// its own: the two log lines on the child's stderr and the refused load.
package com.quorvex.halvenor;

import static org.junit.jupiter.api.Assertions.assertEquals;
import static org.junit.jupiter.api.Assertions.assertTrue;

import java.io.IOException;
import java.nio.file.Path;
import java.util.List;
import java.util.regex.Matcher;
import java.util.regex.Pattern;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;

@Tag("registration")
class RegistrationTest {
    private static final String CLASS = "com/quorvex/halvenor/TestModeUtils";
    private static final String REFUSED = "ERROR: BinaryDictionary native registration failed";
    // liblog on a host: "TAG P MM-DD hh:mm:ss PID TID message".
    private static final Pattern LOG = Pattern.compile("^(\\S+) ([VDIWEF]) \\d\\d-\\d\\d \\S+ +\\d+ +\\d+ (.*)$");

    private static Path shadow(String jar) {
        return Path.of(System.getProperty("halvenor.shadow.dir"), jar);
    }

    private static Child load(String mode, Path... classpath) throws IOException, InterruptedException {
        StringBuilder cp = new StringBuilder(shadow("halvenor_probe.jar").toString());
        for (Path p : classpath) {
            cp.append(':').append(p);
        }
        return Child.run(List.of(System.getProperty("halvenor.java"),
                                 "-Djava.library.path=" + System.getProperty("halvenor.library.dir"),
                                 "-cp", cp.toString(), "com.quorvex.halvenor.probe.LoadProbe", mode),
                         null, 60);
    }

    /** The library's error lines, in order, as tag-priority-message. */
    private static List<String> libraryErrors(String stderr) {
        return stderr.lines().map(LOG::matcher).filter(Matcher::matches)
                     .filter(m -> m.group(1).equals("halvenor") && m.group(2).equals("E"))
                     .map(m -> m.group(3)).toList();
    }

    private static void assertRefused(Child c, String firstLine) {
        assertEquals(List.of(firstLine, REFUSED), libraryErrors(c.stderr()), c.stderr());
        assertTrue(c.stdout().startsWith("refused java.lang.UnsatisfiedLinkError"), "the VM refused the library: " + c.stdout());
        assertEquals(0, c.status(), c.stderr());
    }

    @Test
    void realClassLoadsWithoutErrorLines() throws Exception {
        Child c = load("class", Path.of(System.getProperty("halvenor.jar")));
        assertEquals("loaded", c.stdout().strip(), c.stderr());
        assertEquals(List.of(), libraryErrors(c.stderr()));
    }

    @Test
    void classMissingANativeIsRefused() throws Exception {
        assertRefused(load("class", shadow("missing-native.jar")), "registerNativeMethods failed for '" + CLASS + "'");
    }

    @Test
    void nativeWithAnotherSignatureIsRefused() throws Exception {
        assertRefused(load("class", shadow("wrong-signature.jar")), "registerNativeMethods failed for '" + CLASS + "'");
    }

    @Test
    void missingClassIsRefused() throws Exception {
        assertRefused(load("library"), "registerNativeMethods unable to find class '" + CLASS + "'");
    }
}
