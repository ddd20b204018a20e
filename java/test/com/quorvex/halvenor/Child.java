// Runs a child process to completion with a bound, collecting its output and status.
package com.quorvex.halvenor;

import java.io.ByteArrayOutputStream;
import java.io.IOException;
import java.io.InputStream;
import java.nio.charset.StandardCharsets;
import java.util.List;
import java.util.Map;
import java.util.concurrent.TimeUnit;

public record Child(int status, String stdout, String stderr) {

    /** Runs {@code command}; {@code env} entries are added (a null value removes one). */
    public static Child run(List<String> command, Map<String, String> env, double seconds)
            throws IOException, InterruptedException {
        Process p = start(command, env);
        return finish(p, seconds);
    }

    public static Process start(List<String> command, Map<String, String> env) throws IOException {
        ProcessBuilder b = new ProcessBuilder(command);
        if (env != null) {
            env.forEach((k, v) -> {
                if (v == null) {
                    b.environment().remove(k);
                } else {
                    b.environment().put(k, v);
                }
            });
        }
        b.redirectInput(ProcessBuilder.Redirect.from(new java.io.File("/dev/null")));
        return b.start();
    }

    /** Waits for {@code p}, reading both streams meanwhile; kills it after {@code seconds}. */
    public static Child finish(Process p, double seconds) throws IOException, InterruptedException {
        ByteArrayOutputStream out = new ByteArrayOutputStream();
        ByteArrayOutputStream err = new ByteArrayOutputStream();
        Thread o = drain(p.getInputStream(), out);
        Thread e = drain(p.getErrorStream(), err);
        if (!p.waitFor((long) (seconds * 1000), TimeUnit.MILLISECONDS)) {
            p.descendants().forEach(ProcessHandle::destroyForcibly);
            p.destroyForcibly();
            p.waitFor();
            o.join();
            e.join();
            throw new AssertionError("still running after " + seconds + " s; stdout: " + text(out) + " stderr: " + text(err));
        }
        o.join();
        e.join();
        return new Child(p.exitValue(), text(out), text(err));
    }

    private static Thread drain(InputStream in, ByteArrayOutputStream sink) {
        Thread t = new Thread(() -> {
            try (in) {
                in.transferTo(sink);
            } catch (IOException ignored) {
                // the stream closes when the process ends
            }
        });
        t.start();
        return t;
    }

    private static String text(ByteArrayOutputStream b) {
        return b.toString(StandardCharsets.UTF_8);
    }
}
