// A file the run writes at its end, whole or not at all: written to a file beside it and
// renamed over it, so that a run that fails never wipes a good earlier one.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.nio.file.Files;
import java.nio.file.Path;
import java.nio.file.StandardCopyOption;
import java.nio.file.StandardOpenOption;

final class Replacement {
    private Replacement() {}

    /** The new, empty file beside `target` that will replace it; made as the user's umask says. */
    static Path create(Path target) throws IOException {
        Path full = target.toAbsolutePath();
        Path beside = full.resolveSibling("." + full.getFileName() + "." + ProcessHandle.current().pid() + ".tmp");
        Files.newByteChannel(beside, StandardOpenOption.CREATE_NEW, StandardOpenOption.WRITE).close();
        return beside;
    }

    static void write(Path target, CharSequence content) throws IOException {
        Path beside = create(target);
        try {
            Files.writeString(beside, content);
            Files.move(beside, target, StandardCopyOption.REPLACE_EXISTING, StandardCopyOption.ATOMIC_MOVE);
        } finally {
            Files.deleteIfExists(beside);
        }
    }
}
