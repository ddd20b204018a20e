// A controller for the console's tests: H4 on a unix socket, answering each command as the
// test's script says (a Command Complete with status 0x00 unless told otherwise): with
// events and data packets, late, withholding its command credit (and dropping a command
// sent without one, as such controllers do), or closing the connection. One thread serves
// the connections one after another, one command at a time.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.net.StandardProtocolFamily;
import java.net.UnixDomainSocketAddress;
import java.nio.ByteBuffer;
import java.nio.channels.ServerSocketChannel;
import java.nio.channels.SocketChannel;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.List;
import java.util.Map;

final class ScriptedController implements AutoCloseable {
    /** One thing the controller does for a command: send a packet, pause, or end the connection. */
    record Act(int type, byte[] bytes, long ms) {}

    static final Act CLOSE = new Act(0, null, 0);
    static final List<Act> SILENT = List.of();

    private final Path path;
    private final ServerSocketChannel server;
    private final Map<Integer, List<Act>> script;

    /** Commands not in `script` are accepted; LE Test End reports 100 packets. */
    ScriptedController(Path path, Map<Integer, List<Act>> script) throws IOException {
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

    static Act event(int... bytes) {
        byte[] e = new byte[bytes.length];
        for (int i = 0; i < bytes.length; i++) {
            e[i] = (byte) bytes[i];
        }
        return new Act(4, e, 0);
    }

    static Act complete(int opcode, int... returned) {
        return credited(1, opcode, returned);
    }

    /** A Command Complete granting `credits` further commands. */
    static Act credited(int credits, int opcode, int... returned) {
        int[] e = Arrays.copyOf(new int[] {0x0e, 3 + returned.length, credits, opcode & 0xff, opcode >> 8}, 5 + returned.length);
        System.arraycopy(returned, 0, e, 5, returned.length);
        return event(e);
    }

    static Act status(int opcode, int status) {
        return event(0x0f, 4, status, 1, opcode & 0xff, opcode >> 8);
    }

    static Act data(int type, int... bytes) {
        return new Act(type, event(bytes).bytes(), 0);
    }

    static Act pause(long ms) {
        return new Act(-1, null, ms);
    }

    /** Gives the credit back after `ms`; a command sent before then is dropped, unanswered. */
    static Act creditAfter(long ms) {
        return new Act(-2, null, ms);
    }

    private void serve() {
        while (server.isOpen()) {
            try (SocketChannel c = server.accept()) {
                while (answer(c)) {
                    // one command at a time
                }
            } catch (IOException | InterruptedException e) {
                // the console closed its side, or the test closed the server
            }
        }
    }

    // Reads one command and answers it; false once the connection is to end.
    private boolean answer(SocketChannel c) throws IOException, InterruptedException {
        ByteBuffer head = ByteBuffer.allocate(4);
        if (!readFully(c, head) || !readFully(c, ByteBuffer.allocate(head.get(3) & 0xff))) {
            return false;
        }
        int opcode = (head.get(1) & 0xff) | (head.get(2) & 0xff) << 8;
        List<Act> acts = script.getOrDefault(opcode,
                List.of(opcode == 0x201f ? complete(opcode, 0, 100, 0) : complete(opcode, 0)));
        for (Act a : acts) {
            if (a == CLOSE) {
                return false;
            } else if (a.type() == -1) {
                Thread.sleep(a.ms());
            } else if (a.type() == -2) {
                dropWhatComesWithin(c, a.ms());
                send(c, 4, new byte[] {0x0e, 3, 1, 0, 0}); // the no-op Command Complete: one credit
            } else {
                send(c, a.type(), a.bytes());
            }
        }
        return true;
    }

    // A command sent while the credit was withheld is waiting by now: it is dropped.
    private static void dropWhatComesWithin(SocketChannel c, long ms) throws IOException, InterruptedException {
        Thread.sleep(ms);
        c.configureBlocking(false);
        c.read(ByteBuffer.allocate(4096));
        c.configureBlocking(true);
    }

    private static void send(SocketChannel c, int type, byte[] packet) throws IOException {
        ByteBuffer b = ByteBuffer.allocate(packet.length + 1).put((byte) type).put(packet).flip();
        while (b.hasRemaining()) {
            c.write(b);
        }
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
