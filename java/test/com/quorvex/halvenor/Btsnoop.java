// Reads a btsnoop capture (the format of Wireshark and Android's HCI snoop log) into H4
// packets, so tests can check the exact bytes that crossed the HAL.
package com.quorvex.halvenor;

import java.io.IOException;
import java.nio.ByteBuffer;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.ArrayList;
import java.util.Arrays;
import java.util.HexFormat;
import java.util.List;

public final class Btsnoop {
    static final byte[] MAGIC = {'b', 't', 's', 'n', 'o', 'o', 'p', 0};
    static final int VERSION = 1;
    static final int DATALINK_H4 = 1002;
    private static final int FILE_HEADER = 16;
    private static final int RECORD_HEADER = 24;

    /** One record: received (controller to host) or sent, and the H4 bytes (type byte first). */
    public record Packet(boolean received, boolean commandOrEvent, byte[] h4) {
        public boolean isCommand() {
            return !received && h4.length > 0 && h4[0] == 0x01;
        }

        public boolean isEvent() {
            return received && h4.length > 0 && h4[0] == 0x04;
        }

        public String hex() {
            return Btsnoop.hex(h4);
        }
    }

    private Btsnoop() {}

    /** Every record of the file; a missing or empty file has none. Fails on a malformed file. */
    public static List<Packet> read(Path file) throws IOException {
        List<Packet> packets = new ArrayList<>();
        if (!Files.exists(file) || Files.size(file) == 0) {
            return packets;
        }
        ByteBuffer b = ByteBuffer.wrap(Files.readAllBytes(file)); // big-endian throughout
        readHeader(b);
        while (b.remaining() >= RECORD_HEADER) {
            int original = b.getInt();
            int included = b.getInt();
            int flags = b.getInt();
            b.getInt(); // cumulative drops
            b.getLong(); // microseconds since 0 AD
            if (included < 0 || included > original || included > b.remaining()) {
                break; // a record still being written
            }
            byte[] data = new byte[included];
            b.get(data);
            packets.add(new Packet((flags & 1) != 0, (flags & 2) != 0, data));
        }
        return packets;
    }

    private static void readHeader(ByteBuffer b) throws IOException {
        if (b.remaining() < FILE_HEADER) {
            throw new IOException("btsnoop header cut short");
        }
        byte[] magic = new byte[MAGIC.length];
        b.get(magic);
        int version = b.getInt();
        int datalink = b.getInt();
        if (!Arrays.equals(magic, MAGIC) || version != VERSION || datalink != DATALINK_H4) {
            throw new IOException("not an H4 btsnoop file: version " + version + ", datalink " + datalink);
        }
    }

    /** The H4 commands written to the controller, as hex strings. */
    public static List<String> commands(List<Packet> packets) {
        return packets.stream().filter(Packet::isCommand).map(Packet::hex).toList();
    }

    /** The events of opcode {@code opcode} that end an exchange: Command Complete or Command Status. */
    public static List<byte[]> repliesTo(List<Packet> packets, int opcode) {
        List<byte[]> out = new ArrayList<>();
        for (Packet p : packets) {
            if (p.isEvent() && replyOpcode(p.h4()) == opcode) {
                out.add(p.h4());
            }
        }
        return out;
    }

    /** The opcode a Command Complete (0x0E) or Command Status (0x0F) answers, or -1. */
    public static int replyOpcode(byte[] h4) {
        if (h4.length >= 6 && h4[1] == 0x0E) {
            return (h4[4] & 0xFF) | (h4[5] & 0xFF) << 8;
        }
        if (h4.length >= 7 && h4[1] == 0x0F) {
            return (h4[5] & 0xFF) | (h4[6] & 0xFF) << 8;
        }
        return -1;
    }

    /** Num_Packets of an LE Test End's Command Complete: its last two bytes, low byte first. */
    public static int testEndCount(byte[] h4) {
        return (h4[h4.length - 2] & 0xFF) | (h4[h4.length - 1] & 0xFF) << 8;
    }

    public static String hex(byte[] bytes) {
        return HexFormat.ofDelimiter(" ").withUpperCase().formatHex(bytes);
    }
}
