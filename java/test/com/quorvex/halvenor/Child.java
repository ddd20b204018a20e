// Runs a child process to completion with a bound, collecting its output and status;
// and waits, bounded, for what other processes bring about.
package com.quorvex.halvenor;

import java.io.ByteArrayOutputStream;
import java.io.File;
import java.io.IOException;
import java.io.InputStream;
import java.nio.charset.StandardCharsets;
import java.util.List;
import java.util.Map;
import java.util.concurrent.TimeUnit;
import java.util.function.BooleanSupplier;

public record Child(int status, String stdout, String stderr) {

    /** Runs {@code command}; {@code env} entries are added (a null value removes one). */
    public static Child run(List<String> command, Map<String, String> env, double seconds)
            throws IOException, InterruptedException {
        return finish(start(command, env), seconds);
    }

    public static Process start(List<String> command, Map<String, String> env) throws IOException {
        ProcessBuilder b = new ProcessBuilder(command).redirectInput(ProcessBuilder.Redirect.from(new File("/dev/null")));
        if (env != null) {
            env.forEach((k, v) -> b.environment().compute(k, (key, old) -> v));
        }
        return b.start();
    }

    /** Waits for {@code p}, reading both streams meanwhile; kills it after {@code seconds}. */
    public static Child finish(Process p, double seconds) throws IOException, InterruptedException {
        ByteArrayOutputStream out = new ByteArrayOutputStream();
        ByteArrayOutputStream err = new ByteArrayOutputStream();
        Thread o = drain(p.getInputStream(), out);
        Thread e = drain(p.getErrorStream(), err);
        boolean ended = p.waitFor((long) (seconds * 1000), TimeUnit.MILLISECONDS);
        if (!ended) {
            p.descendants().forEach(ProcessHandle::destroyForcibly);
            p.destroyForcibly().waitFor();
        }
        o.join();
        e.join();
        String stdout = out.toString(StandardCharsets.UTF_8), stderr = err.toString(StandardCharsets.UTF_8);
        if (!ended) {
            throw new AssertionError("still running after " + seconds + " s; stdout: " + stdout + " stderr: " + stderr);
        }
        return new Child(p.exitValue(), stdout, stderr);
    }

    /** True once {@code condition} holds, false if it still does not after {@code seconds}. */
    public static boolean waitUntil(BooleanSupplier condition, double seconds) throws InterruptedException {
        for (long deadline = System.nanoTime() + (long) (seconds * 1e9); !condition.getAsBoolean(); Thread.sleep(10)) {
            if (System.nanoTime() > deadline) {
                return false;
            }
        }
        return true;
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
}
