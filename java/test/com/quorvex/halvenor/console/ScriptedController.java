// A controller for the console's tests: H4 on a unix socket, answering each command as the
// test's script says (a Command Complete with status 0x00 unless told otherwise), staying
// silent, or closing the connection. One thread serves the connections one after another.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.net.StandardProtocolFamily;
import java.net.UnixDomainSocketAddress;
import java.nio.ByteBuffer;
import java.nio.channels.ServerSocketChannel;
import java.nio.channels.SocketChannel;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.List;
import java.util.Map;

final class ScriptedController implements AutoCloseable {
    /** What to send for a command: events (each without its H4 type byte), or CLOSE. */
    static final List<byte[]> CLOSE = List.of(new byte[0]);
    static final List<byte[]> SILENT = List.of();

    private final Path path;
    private final ServerSocketChannel server;
    private final Map<Integer, List<byte[]>> script;

    /** Commands not in `script` are accepted; LE Test End reports 1000 packets. */
    ScriptedController(Path path, Map<Integer, List<byte[]>> script) throws IOException {
        this.path = path;
        this.script = script;
        Files.deleteIfExists(path);
        server = ServerSocketChannel.open(StandardProtocolFamily.UNIX).bind(UnixDomainSocketAddress.of(path));
        Thread t = new Thread(this::serve, "scripted-controller");
        t.setDaemon(true);
        t.start();
    }

    String hci() {
        return "unix:" + path;
    }

    static byte[] complete(int opcode, int... returned) {
        byte[] e = {0x0e, (byte) (3 + returned.length), 1, (byte) opcode, (byte) (opcode >> 8)};
        byte[] all = java.util.Arrays.copyOf(e, 5 + returned.length);
        for (int i = 0; i < returned.length; i++) {
            all[5 + i] = (byte) returned[i];
        }
        return all;
    }

    static byte[] status(int opcode, int status) {
        return new byte[] {0x0f, 4, (byte) status, 1, (byte) opcode, (byte) (opcode >> 8)};
    }

    private void serve() {
        while (server.isOpen()) {
            try (SocketChannel c = server.accept()) {
                while (answer(c)) {
                    // one command at a time
                }
            } catch (IOException e) {
                // the console closed its side, or the test closed the server
            }
        }
    }

    // Reads one command and answers it; false once the connection is to end.
    private boolean answer(SocketChannel c) throws IOException {
        ByteBuffer head = ByteBuffer.allocate(4);
        if (!readFully(c, head) || !readFully(c, ByteBuffer.allocate(head.get(3) & 0xff))) {
            return false;
        }
        int opcode = (head.get(1) & 0xff) | (head.get(2) & 0xff) << 8;
        List<byte[]> reply = script.getOrDefault(opcode,
                List.of(opcode == 0x201f ? complete(opcode, 0, 0xe8, 0x03) : complete(opcode, 0)));
        for (byte[] event : reply == CLOSE ? List.<byte[]>of() : reply) {
            ByteBuffer b = ByteBuffer.allocate(event.length + 1).put((byte) 4).put(event).flip();
            while (b.hasRemaining()) {
                c.write(b);
            }
        }
        return reply != CLOSE;
    }

    private static boolean readFully(SocketChannel c, ByteBuffer b) throws IOException {
        while (b.hasRemaining()) {
            if (c.read(b) < 0) {
                return false;
            }
        }
        return true;
    }

    @Override
    public void close() throws IOException {
        server.close();
        Files.deleteIfExists(path);
    }
}
