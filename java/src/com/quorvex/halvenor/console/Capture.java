// Follows a btsnoop capture (H4, as the library writes it) while it grows, handing out each
// record once it is whole. Used by the console's main thread and its trace thread, one Capture each.
package com.quorvex.halvenor.console;

import java.io.IOException;
import java.nio.ByteBuffer;
import java.nio.channels.FileChannel;
import java.nio.file.NoSuchFileException;
import java.nio.file.Path;
import java.nio.file.StandardOpenOption;
import java.util.ArrayList;
import java.util.List;

final class Capture {
    /** "btsnoop\0", version 1, datalink 1002 (H4): the only header the library writes. */
    private static final byte[] HEADER = {
        'b', 't', 's', 'n', 'o', 'o', 'p', 0, 0, 0, 0, 1, 0, 0, 0x03, (byte) 0xea};
    private static final int RECORD_HEADER = 24;
    /** The longest H4 packet: type byte, ACL header and 65535 data bytes. */
    private static final int MAX_PACKET = 1 + 4 + 0xffff;
    /** Holds any whole record, so a window that yields none ends at a record still being written. */
    private static final int WINDOW = 1 << 18;
    /** btsnoop counts microseconds from 0 AD. */
    private static final long EPOCH_DELTA_MICROS = 0x00DCDDB30F2F8000L;

    /** One record: when (Unix epoch, microseconds), which way, its H4 type and the bytes after that type. */
    record Packet(long micros, boolean received, int type, byte[] bytes) {
        boolean isCommand() {
            return !received && type == 1 && bytes.length >= 3;
        }

        boolean isEvent() {
            return received && type == 4 && bytes.length >= 2;
        }

        int opcode() {
            return isCommand() ? u16(0) : -1;
        }

        int eventCode() {
            return isEvent() ? bytes[0] & 0xff : -1;
        }

        /** The opcode this Command Complete or Command Status answers, or -1 for any other event. */
        int answers() {
            return switch (replyKind()) {
                case 0x0e -> u16(3);
                case 0x0f -> u16(4);
                default -> -1;
            };
        }

        /** The status of that Command Complete (first return parameter) or Command Status; -1 otherwise. */
        int status() {
            return switch (replyKind()) {
                case 0x0e -> bytes[5] & 0xff;
                case 0x0f -> bytes[2] & 0xff;
                default -> -1;
            };
        }

        /** 0x0e or 0x0f when this event carries the four parameter bytes every reply starts with. */
        private int replyKind() {
            int code = eventCode();
            int parameters = isEvent() ? Math.min(bytes[1] & 0xff, bytes.length - 2) : 0;
            return (code == 0x0e || code == 0x0f) && parameters >= 4 ? code : -1;
        }

        private int u16(int at) {
            return (bytes[at] & 0xff) | (bytes[at + 1] & 0xff) << 8;
        }
    }

    private final Path file;
    /** Where the next record starts; 0 until the header has been seen. */
    private long position;

    Capture(Path file) {
        this.file = file;
    }

    /** The whole records appended since the last call (all of them on the first call). */
    List<Packet> readNew() throws IOException {
        List<Packet> packets = new ArrayList<>();
        try (FileChannel in = openIfPresent(file)) {
            if (in == null || !pastHeader(in)) {
                return packets;
            }
            long size = in.size();
            while (size - position >= RECORD_HEADER) {
                ByteBuffer window = read(in, position, (int) Math.min(size - position, WINDOW));
                int used = wholeRecords(window, position, packets);
                if (used == 0) {
                    break; // the next record is still being written
                }
                position += used;
            }
        }
        return packets;
    }

    /** True when the file is missing, empty, or an H4 btsnoop capture that may be appended to. */
    static boolean appendable(Path file) throws IOException {
        try (FileChannel in = openIfPresent(file)) {
            return in == null || in.size() == 0 || read(in, 0, HEADER.length).equals(ByteBuffer.wrap(HEADER));
        }
    }

    /** Checks the header the first time it is whole; false until then. */
    private boolean pastHeader(FileChannel in) throws IOException {
        long size = in.size();
        if (size < position) {
            position = 0; // shorter than what was read: a new capture replaced the old one
        }
        if (position > 0) {
            return true;
        }
        ByteBuffer head = read(in, 0, (int) Math.min(size, HEADER.length));
        if (!head.equals(ByteBuffer.wrap(HEADER, 0, head.limit()))) {
            throw new IOException(file + " is not a btsnoop capture of H4 packets (datalink 1002)");
        }
        if (head.limit() < HEADER.length) {
            return false;
        }
        position = HEADER.length;
        return true;
    }

    /** Adds the whole records at the start of the window; returns the bytes they take. */
    private static int wholeRecords(ByteBuffer b, long offset, List<Packet> out) throws IOException {
        int used = 0;
        while (b.remaining() >= RECORD_HEADER) {
            int original = b.getInt();
            int included = b.getInt();
            int flags = b.getInt();
            b.getInt(); // cumulative drops
            long micros = b.getLong() - EPOCH_DELTA_MICROS;
            if (included < 0 || included > MAX_PACKET || Integer.compareUnsigned(included, original) > 0) {
                throw new IOException("corrupt btsnoop record at byte " + (offset + used)
                                      + ": length " + included);
            }
            if (included > b.remaining()) {
                break;
            }
            out.add(packet(b, included, micros, (flags & 1) != 0));
            used = b.position();
        }
        return used;
    }

    private static Packet packet(ByteBuffer b, int included, long micros, boolean received) {
        int type = included > 0 ? b.get() & 0xff : -1;
        byte[] bytes = new byte[Math.max(0, included - 1)];
        b.get(bytes);
        return new Packet(micros, received, type, bytes);
    }

    private static FileChannel openIfPresent(Path file) throws IOException {
        try {
            return FileChannel.open(file, StandardOpenOption.READ);
        } catch (NoSuchFileException e) {
            return null;
        }
    }

    /** Up to {@code length} bytes from {@code at}, fewer if the file ends first; ready to read. */
    private static ByteBuffer read(FileChannel in, long at, int length) throws IOException {
        ByteBuffer b = ByteBuffer.allocate(length);
        while (b.hasRemaining() && in.read(b, at + b.position()) > 0) {
            // FileChannel may return fewer bytes than asked for
        }
        return b.flip();
    }
}
