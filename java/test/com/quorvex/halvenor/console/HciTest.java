// HCI packets decoded for people, and a btsnoop capture followed while a record is half written.
package com.quorvex.halvenor.console;

import static java.nio.charset.StandardCharsets.US_ASCII;
import static java.nio.file.StandardOpenOption.APPEND;
import static org.junit.jupiter.api.Assertions.assertEquals;

import java.io.IOException;
import java.nio.ByteBuffer;
import java.nio.file.Files;
import java.nio.file.Path;
import java.util.Arrays;
import java.util.HexFormat;
import java.util.List;
import java.util.stream.Stream;
import org.junit.jupiter.api.Tag;
import org.junit.jupiter.api.Test;
import org.junit.jupiter.api.io.TempDir;
import org.junit.jupiter.params.ParameterizedTest;
import org.junit.jupiter.params.provider.Arguments;
import org.junit.jupiter.params.provider.MethodSource;

@Tag("console")
class HciTest {
    private static final String F = "        ";

    static Stream<Arguments> packets() {
        return Stream.of(
            Arguments.of(1, "33 20 03 13 02 00", 4523, List.of(
                "< HCI Command: LE Receiver Test v2 (0x08|0x0033) plen 3                   0.004523",
                F + "RX channel: 19 (2440 MHz)", F + "PHY: LE 2M (0x02)",
                F + "Modulation index: Standard (0x00)")),
            Arguments.of(4, "0e 06 01 1f 20 00 22 03", 512000, List.of(
                "> HCI Event: Command Complete (0x0e) plen 6                               0.512000",
                "      LE Test End (0x08|0x001f) ncmd 1", F + "Status: Success (0x00)",
                F + "Number of packets: 802")),
            Arguments.of(4, "0f 04 01", 1_000_000, List.of(
                "> HCI Event: Command Status (0x0f) plen 4                                 1.000000",
                F + "Status: Unknown HCI Command (0x01)", F + "(truncated)")));
    }

    @ParameterizedTest
    @MethodSource("packets")
    void describesPacketsAsBtmonDoes(int type, String hex, long micros, List<String> expected) {
        Capture.Packet p = new Capture.Packet(0, type == 4, type, HexFormat.ofDelimiter(" ").parseHex(hex));
        assertEquals(expected, Hci.describe(p, micros));
    }

    static Stream<String> statuses() {
        return Stream.of("00 Success", "0c Command Disallowed", "12 Invalid HCI Command Parameters",
                         "45 Packet Too Long", "46 Unknown Status");
    }

    @ParameterizedTest
    @MethodSource("statuses")
    void namesStatusesAsTheCoreSpecificationDoes(String row) {
        assertEquals(row.substring(3), Hci.statusName(Integer.parseInt(row.substring(0, 2), 16)));
    }

    @Test
    void returnsARecordSplitAcrossTwoWritesOnceItIsWhole(@TempDir Path dir) throws IOException {
        Path file = dir.resolve("hci.btsnoop");
        ByteBuffer b = ByteBuffer.allocate(16 + 28 + 31).put("btsnoop\0".getBytes(US_ASCII))
                .putInt(1).putInt(1002);
        byte[] whole = b.put(record(0, "01 03 0c 00")).put(record(3, "04 0e 04 01 03 0c 0c")).array();
        Files.write(file, Arrays.copyOf(whole, whole.length - 4)); // the reply's last bytes not yet written
        Capture capture = new Capture(file);
        assertEquals(List.of(0x0c03), capture.readNew().stream().map(Capture.Packet::opcode).toList());
        Files.write(file, Arrays.copyOfRange(whole, whole.length - 4, whole.length), APPEND);
        assertEquals(List.of(List.of(1_500_000L, true, 0x0c03, 0x0c)), capture.readNew().stream()
                .map(p -> List.<Object>of(p.micros(), p.received(), p.answers(), p.status())).toList());
        assertEquals(List.of(), capture.readNew());
    }

    private static byte[] record(int flags, String hex) {
        byte[] h4 = HexFormat.ofDelimiter(" ").parseHex(hex);
        return ByteBuffer.allocate(24 + h4.length).putInt(h4.length).putInt(h4.length).putInt(flags)
                .putInt(0).putLong(0x00DCDDB30F2F8000L + 1_500_000).put(h4).array(); // 1.5 s after 1970
    }
}
