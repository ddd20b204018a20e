// Names HCI commands, events and error codes and writes packets out for people, btmon-like: a heading
// line, then indented fields. Stateless; used by the console's main thread and its trace thread.
package com.quorvex.halvenor.console;

import static java.util.Map.entry;

import java.util.ArrayList;
import java.util.Arrays;
import java.util.HexFormat;
import java.util.List;
import java.util.Locale;
import java.util.Map;

final class Hci {
    /** The column where the time printed on a heading line ends. */
    private static final int TIME_END = 82;
    private static final String FIELD = "        ";
    private static final String ANSWERED = "      ";
    private static final String TRUNCATED = FIELD + "(truncated)";
    private static final int VENDOR_OGF = 0x3f;
    private static final int LE_TEST_END = 0x201f;

    private static final Map<Integer, String> COMMANDS = Map.ofEntries(
            entry(0x0000, "No Operation"),
            entry(0x0401, "Inquiry"), entry(0x0402, "Inquiry Cancel"),
            entry(0x0405, "Create Connection"), entry(0x0406, "Disconnect"),
            entry(0x0409, "Accept Connection Request"), entry(0x040a, "Reject Connection Request"),
            entry(0x0c01, "Set Event Mask"), entry(0x0c03, "Reset"), entry(0x0c05, "Set Event Filter"),
            entry(0x0c13, "Write Local Name"), entry(0x0c14, "Read Local Name"),
            entry(0x0c18, "Write Page Timeout"), entry(0x0c19, "Read Scan Enable"),
            entry(0x0c1a, "Write Scan Enable"), entry(0x0c1f, "Read Authentication Enable"),
            entry(0x0c20, "Write Authentication Enable"), entry(0x0c21, "Read Encryption Mode"),
            entry(0x0c22, "Write Encryption Mode"), entry(0x0c23, "Read Class of Device"),
            entry(0x0c24, "Write Class of Device"), entry(0x0c2d, "Read Transmit Power Level"),
            entry(0x0c33, "Host Buffer Size"), entry(0x0c45, "Write Inquiry Mode"),
            entry(0x0c56, "Write Simple Pairing Mode"), entry(0x0c6d, "Write LE Host Support"),
            entry(0x1001, "Read Local Version Information"), entry(0x1002, "Read Local Supported Commands"),
            entry(0x1003, "Read Local Supported Features"), entry(0x1004, "Read Local Extended Features"),
            entry(0x1005, "Read Buffer Size"), entry(0x1009, "Read BD_ADDR"),
            entry(0x1403, "Read Link Quality"), entry(0x1405, "Read RSSI"),
            entry(0x1801, "Read Loopback Mode"), entry(0x1802, "Write Loopback Mode"),
            entry(0x1803, "Enable Device Under Test Mode"), entry(0x1804, "Write Simple Pairing Debug Mode"),
            entry(0x2001, "LE Set Event Mask"), entry(0x2002, "LE Read Buffer Size"),
            entry(0x2003, "LE Read Local Supported Features"), entry(0x2005, "LE Set Random Address"),
            entry(0x2006, "LE Set Advertising Parameters"), entry(0x2008, "LE Set Advertising Data"),
            entry(0x200a, "LE Set Advertising Enable"), entry(0x200b, "LE Set Scan Parameters"),
            entry(0x200c, "LE Set Scan Enable"), entry(0x201c, "LE Read Supported States"),
            entry(0x201d, "LE Receiver Test"), entry(0x201e, "LE Transmitter Test"),
            entry(LE_TEST_END, "LE Test End"), entry(0x202f, "LE Read Maximum Data Length"),
            entry(0x2030, "LE Read PHY"), entry(0x2031, "LE Set Default PHY"),
            entry(0x2033, "LE Receiver Test v2"), entry(0x2034, "LE Transmitter Test v2"),
            entry(0x204b, "LE Read Transmit Power"), entry(0x204f, "LE Receiver Test v3"),
            entry(0x2050, "LE Transmitter Test v3"), entry(0x207b, "LE Transmitter Test v4"),
            entry(0xfc04, "Vendor Continuous Wave"));

    private static final Map<Integer, String> EVENTS = Map.ofEntries(
            entry(0x01, "Inquiry Complete"), entry(0x02, "Inquiry Result"),
            entry(0x03, "Connection Complete"), entry(0x04, "Connection Request"),
            entry(0x05, "Disconnection Complete"),
            entry(0x06, "Authentication Complete"), entry(0x07, "Remote Name Request Complete"),
            entry(0x08, "Encryption Change"), entry(0x0b, "Read Remote Supported Features Complete"),
            entry(0x0c, "Read Remote Version Information Complete"), entry(0x0e, "Command Complete"),
            entry(0x0f, "Command Status"), entry(0x10, "Hardware Error"), entry(0x12, "Role Change"),
            entry(0x13, "Number of Completed Packets"), entry(0x14, "Mode Change"),
            entry(0x1a, "Data Buffer Overflow"), entry(0x1b, "Max Slots Change"),
            entry(0x22, "Inquiry Result with RSSI"), entry(0x2c, "Synchronous Connection Complete"),
            entry(0x2f, "Extended Inquiry Result"), entry(0x3e, "LE Meta"), entry(0xff, "Vendor"));

    /** Controller error codes, Core Specification 5.x, Vol 1, Part F. */
    private static final String[] STATUSES = {
        "Success", "Unknown HCI Command", "Unknown Connection Identifier", "Hardware Failure", "Page Timeout",
        "Authentication Failure", "PIN or Key Missing", "Memory Capacity Exceeded", "Connection Timeout",
        "Connection Limit Exceeded", "Synchronous Connection Limit To A Device Exceeded",
        "Connection Already Exists", "Command Disallowed", "Connection Rejected due to Limited Resources",
        "Connection Rejected Due To Security Reasons", "Connection Rejected due to Unacceptable BD_ADDR",
        "Connection Accept Timeout Exceeded", "Unsupported Feature or Parameter Value",
        "Invalid HCI Command Parameters", "Remote User Terminated Connection",
        "Remote Device Terminated Connection due to Low Resources",
        "Remote Device Terminated Connection due to Power Off", "Connection Terminated By Local Host",
        "Repeated Attempts", "Pairing Not Allowed", "Unknown LMP PDU", "Unsupported Remote Feature",
        "SCO Offset Rejected", "SCO Interval Rejected", "SCO Air Mode Rejected",
        "Invalid LMP Parameters / Invalid LL Parameters", "Unspecified Error",
        "Unsupported LMP Parameter Value / Unsupported LL Parameter Value", "Role Change Not Allowed",
        "LMP Response Timeout / LL Response Timeout",
        "LMP Error Transaction Collision / LL Procedure Collision",
        "LMP PDU Not Allowed", "Encryption Mode Not Acceptable", "Link Key cannot be Changed",
        "Requested QoS Not Supported", "Instant Passed", "Pairing With Unit Key Not Supported",
        "Different Transaction Collision", "Reserved for future use", "QoS Unacceptable Parameter",
        "QoS Rejected", "Channel Classification Not Supported", "Insufficient Security",
        "Parameter Out Of Mandatory Range", "Reserved for future use", "Role Switch Pending",
        "Reserved for future use", "Reserved Slot Violation", "Role Switch Failed",
        "Extended Inquiry Response Too Large", "Secure Simple Pairing Not Supported By Host",
        "Host Busy - Pairing", "Connection Rejected due to No Suitable Channel Found", "Controller Busy",
        "Unacceptable Connection Parameters", "Advertising Timeout",
        "Connection Terminated due to MIC Failure",
        "Connection Failed to be Established / Synchronization Timeout", "Previously Used",
        "Coarse Clock Adjustment Rejected but Will Try to Adjust Using Clock Dragging",
        "Type0 Submap Not Defined", "Unknown Advertising Identifier", "Limit Reached",
        "Operation Cancelled by Host", "Packet Too Long"};

    // Parameter values by code; a code past the end of its list is reserved.
    private static final String[] FILTER_TYPES = {"Clear All Filters", "Inquiry Result", "Connection Setup"};
    private static final String[] FILTER_CONDITIONS = {"All devices", "Class of Device", "BD_ADDR"};
    private static final String[] AUTO_ACCEPT = {
        "Reserved", "Do not auto accept", "Auto accept, role switch disabled",
        "Auto accept, role switch enabled"};
    private static final String[] SCAN_ENABLE = {
        "No Scans", "Inquiry Scan", "Page Scan", "Page Scan + Inquiry Scan"};
    private static final String[] AUTHENTICATION = {"Not required", "Required for all connections"};
    private static final String[] ENCRYPTION_MODES = {
        "Disabled", "Point-to-point packets", "Point-to-point and broadcast packets"};
    private static final String[] PAYLOADS = {
        "PRBS9 sequence", "11110000", "10101010", "PRBS15 sequence",
        "11111111", "00000000", "00001111", "01010101"};
    private static final String[] RX_PHYS = {"Reserved", "LE 1M", "LE 2M", "LE Coded"};
    private static final String[] TX_PHYS = {"Reserved", "LE 1M", "LE 2M", "LE Coded S=8", "LE Coded S=2"};
    private static final String[] MODULATION = {"Standard", "Stable"};
    private static final String[] LINK_TYPES = {"SCO", "ACL", "eSCO"};
    private static final String[] ENCRYPTION = {"Disabled", "Enabled"};

    private Hci() {}

    static String commandName(int opcode) {
        String name = COMMANDS.get(opcode);
        if (name != null) {
            return name;
        }
        String kind = opcode >> 10 == VENDOR_OGF ? "Vendor Command" : "Unknown Command";
        return String.format("%s 0x%04x", kind, opcode);
    }

    static String eventName(int code) {
        return EVENTS.getOrDefault(code, String.format("Unknown Event 0x%02x", code));
    }

    static String statusName(int status) {
        return status >= 0 && status < STATUSES.length ? STATUSES[status] : "Unknown Status";
    }

    /** "LE Receiver Test v2 (0x2033)" */
    static String commandLabel(int opcode) {
        return String.format("%s (0x%04x)", commandName(opcode), opcode);
    }

    /** The packet as btmon would show it: a heading line ending in the time since the start, then fields. */
    static List<String> describe(Capture.Packet p, long sinceStartMicros) {
        List<String> out = new ArrayList<>();
        String arrow = p.received() ? ">" : "<";
        switch (p.type()) {
            case 1 -> command(arrow, p.bytes(), out);
            case 2 -> acl(arrow, p.received(), p.bytes(), out);
            case 3 -> sco(arrow, p.received(), p.bytes(), out);
            case 4 -> event(arrow, p.bytes(), out);
            default -> out.add(p.type() < 0 ? arrow + " Empty record" : String.format(
                    "%s Unknown packet type 0x%02x len %d", arrow, p.type(), p.bytes().length));
        }
        out.set(0, withTime(out.get(0), sinceStartMicros));
        return out;
    }

    private static void command(String arrow, byte[] b, List<String> out) {
        if (b.length < 3) {
            out.add(arrow + " HCI Command" + (b.length == 2 ? ": " + opcodeText(u16(b, 0)) : ""));
            out.add(TRUNCATED);
            return;
        }
        int opcode = u16(b, 0);
        out.add(String.format("%s HCI Command: %s plen %d", arrow, opcodeText(opcode), b[2] & 0xff));
        Fields f = new Fields(b, 3, b[2] & 0xff);
        decode(f, out, () -> commandFields(opcode, f, out));
    }

    private static void event(String arrow, byte[] b, List<String> out) {
        if (b.length < 2) {
            out.add(arrow + " HCI Event" + (b.length == 1 ? ": " + eventText(b[0] & 0xff) : ""));
            out.add(TRUNCATED);
            return;
        }
        int code = b[0] & 0xff;
        out.add(String.format("%s HCI Event: %s plen %d", arrow, eventText(code), b[1] & 0xff));
        Fields f = new Fields(b, 2, b[1] & 0xff);
        decode(f, out, () -> eventFields(code, f, out));
    }

    private static void acl(String arrow, boolean received, byte[] b, List<String> out) {
        String heading = arrow + " ACL Data " + (received ? "RX" : "TX");
        if (b.length < 4) {
            out.add(heading);
            out.add(TRUNCATED);
            return;
        }
        int dlen = u16(b, 2);
        out.add(String.format("%s: Handle %d flags 0x%02x dlen %d", heading, u16(b, 0) & 0xfff,
                              u16(b, 0) >> 12, dlen));
        if (b.length - 4 < dlen) {
            out.add(TRUNCATED);
        }
    }

    private static void sco(String arrow, boolean received, byte[] b, List<String> out) {
        String heading = arrow + " SCO Data " + (received ? "RX" : "TX");
        if (b.length < 3) {
            out.add(heading);
            out.add(TRUNCATED);
            return;
        }
        int dlen = b[2] & 0xff;
        out.add(String.format("%s: Handle %d flags 0x%02x dlen %d", heading, u16(b, 0) & 0xfff,
                              u16(b, 0) >> 12 & 0x3, dlen));
        if (b.length - 3 < dlen) {
            out.add(TRUNCATED);
        }
    }

    /** Runs a decoder; a field cut off by the packet's end, or a packet short of plen, adds "(truncated)". */
    private static void decode(Fields f, List<String> out, Runnable decoder) {
        try {
            decoder.run();
        } catch (Truncated e) {
            out.add(TRUNCATED);
            return;
        }
        hex("Extra data", f.rest(), out);
        if (f.cut) {
            out.add(TRUNCATED);
        }
    }

    private static void commandFields(int opcode, Fields f, List<String> out) {
        switch (opcode) {
            case 0x0c03, 0x1803, LE_TEST_END -> { } // no parameters
            case 0x0c05 -> eventFilter(f, out);
            case 0x0c1a -> out.add(named("Scan enable", f.u8(), SCAN_ENABLE));
            case 0x0c20 -> out.add(named("Authentication enable", f.u8(), AUTHENTICATION));
            case 0x0c22 -> out.add(named("Encryption mode", f.u8(), ENCRYPTION_MODES));
            case 0x201d -> out.add(channel("RX", f.u8()));
            case 0x201e -> transmitterTest(f, out, false);
            case 0x2033 -> receiverTestV2(f, out);
            case 0x2034 -> transmitterTest(f, out, true);
            case 0xfc04 -> fixedHex(f, 9, out);
            default -> hex("Parameters", f.rest(), out);
        }
    }

    private static void eventFilter(Fields f, List<String> out) {
        int type = f.u8();
        out.add(named("Filter type", type, FILTER_TYPES));
        if (type != 0x01 && type != 0x02) {
            return; // clearing the filters, or a reserved type, takes no condition
        }
        int condition = f.u8();
        out.add(named("Filter condition type", condition, FILTER_CONDITIONS));
        if (condition == 0x01) {
            out.add(FIELD + String.format("Class of device: 0x%06x", f.u24()));
            out.add(FIELD + String.format("Class of device mask: 0x%06x", f.u24()));
        } else if (condition == 0x02) {
            out.add(FIELD + "Address: " + address(f.take(6)));
        }
        if (type == 0x02 && condition <= 0x02) {
            out.add(named("Auto accept", f.u8(), AUTO_ACCEPT));
        }
    }

    private static void receiverTestV2(Fields f, List<String> out) {
        out.add(channel("RX", f.u8()));
        out.add(named("PHY", f.u8(), RX_PHYS));
        out.add(named("Modulation index", f.u8(), MODULATION));
    }

    private static void transmitterTest(Fields f, List<String> out, boolean v2) {
        out.add(channel("TX", f.u8()));
        out.add(FIELD + "Test data length: " + f.u8() + " bytes");
        out.add(named("Packet payload", f.u8(), PAYLOADS));
        if (v2) {
            out.add(named("PHY", f.u8(), TX_PHYS));
        }
    }

    /** Parameters only shown in hex, of a known length: what is there, then whether some are missing. */
    private static void fixedHex(Fields f, int length, List<String> out) {
        boolean whole = f.left() >= length;
        hex("Parameters", f.take(Math.min(length, f.left())), out);
        if (!whole) {
            throw new Truncated();
        }
    }

    private static void eventFields(int code, Fields f, List<String> out) {
        switch (code) {
            case 0x01 -> out.add(status("Status", f.u8()));
            case 0x03 -> connectionComplete(f, out);
            case 0x05 -> disconnectionComplete(f, out);
            case 0x0e -> commandComplete(f, out);
            case 0x0f -> commandStatus(f, out);
            case 0x10 -> out.add(FIELD + String.format("Code: 0x%02x", f.u8()));
            case 0x13 -> completedPackets(f, out);
            case 0x3e -> {
                out.add(FIELD + String.format("Subevent: 0x%02x", f.u8()));
                hex("Parameters", f.rest(), out);
            }
            default -> hex("Parameters", f.rest(), out);
        }
    }

    private static void commandComplete(Fields f, List<String> out) {
        int ncmd = f.u8();
        int opcode = f.u16();
        out.add(answered(opcode, ncmd));
        if (f.left() == 0) {
            return; // only the No Operation opcode comes without a status
        }
        out.add(status("Status", f.u8()));
        if (opcode == LE_TEST_END) {
            out.add(FIELD + "Number of packets: " + f.u16());
        } else {
            hex("Return parameters", f.rest(), out);
        }
    }

    /** The answered command heads the fields as in Command Complete, though the status comes first. */
    private static void commandStatus(Fields f, List<String> out) {
        int status = f.u8();
        boolean whole = f.left() >= 3;
        if (whole) {
            int ncmd = f.u8();
            out.add(answered(f.u16(), ncmd));
        }
        out.add(status("Status", status));
        if (!whole) {
            throw new Truncated();
        }
    }

    private static void completedPackets(Fields f, List<String> out) {
        int handles = f.u8();
        out.add(FIELD + "Num handles: " + handles);
        // Arrayed parameters alternate, handle then count (Core Specification, Vol 4, Part E).
        for (int i = 0; i < handles; i++) {
            out.add(FIELD + "Handle: " + (f.u16() & 0xfff));
            out.add(FIELD + "Count: " + f.u16());
        }
    }

    private static void connectionComplete(Fields f, List<String> out) {
        out.add(status("Status", f.u8()));
        out.add(FIELD + "Handle: " + (f.u16() & 0xfff));
        out.add(FIELD + "Address: " + address(f.take(6)));
        out.add(named("Link type", f.u8(), LINK_TYPES));
        out.add(named("Encryption", f.u8(), ENCRYPTION));
    }

    private static void disconnectionComplete(Fields f, List<String> out) {
        out.add(status("Status", f.u8()));
        out.add(FIELD + "Handle: " + (f.u16() & 0xfff));
        out.add(status("Reason", f.u8()));
    }

    private static String answered(int opcode, int ncmd) {
        return ANSWERED + opcodeText(opcode) + " ncmd " + ncmd;
    }

    private static String opcodeText(int opcode) {
        return String.format("%s (0x%02x|0x%04x)", commandName(opcode), opcode >> 10, opcode & 0x3ff);
    }

    private static String eventText(int code) {
        return String.format("%s (0x%02x)", eventName(code), code);
    }

    private static String status(String label, int status) {
        return FIELD + String.format("%s: %s (0x%02x)", label, statusName(status), status);
    }

    private static String named(String label, int value, String[] names) {
        String name = value < names.length ? names[value] : "Reserved";
        return FIELD + String.format("%s: %s (0x%02x)", label, name, value);
    }

    /** LE channels of the direct test mode: 0 to 39, 2 MHz apart from 2402 MHz. */
    private static String channel(String way, int channel) {
        String frequency = channel <= 39 ? (2402 + 2 * channel) + " MHz" : "out of range";
        return FIELD + way + " channel: " + channel + " (" + frequency + ")";
    }

    /** A BD_ADDR travels least significant byte first; people read it the other way round. */
    private static String address(byte[] b) {
        StringBuilder s = new StringBuilder();
        for (int i = b.length - 1; i >= 0; i--) {
            s.append(String.format("%02X", b[i] & 0xff)).append(i > 0 ? ":" : "");
        }
        return s.toString();
    }

    private static void hex(String label, byte[] bytes, List<String> out) {
        if (bytes.length > 0) {
            out.add(FIELD + label + ": " + HexFormat.ofDelimiter(" ").formatHex(bytes));
        }
    }

    private static String withTime(String heading, long micros) {
        long m = Math.abs(micros);
        String sign = micros < 0 ? "-" : "";
        String time = String.format(Locale.ROOT, "%s%d.%06d", sign, m / 1_000_000, m % 1_000_000);
        return heading + " ".repeat(Math.max(1, TIME_END - heading.length() - time.length())) + time;
    }

    private static int u16(byte[] b, int at) {
        return (b[at] & 0xff) | (b[at + 1] & 0xff) << 8;
    }

    /** A packet ended inside a field. */
    private static final class Truncated extends RuntimeException {
        private static final long serialVersionUID = 1L;

        Truncated() {
            super(null, null, false, false); // control flow only: no stack trace
        }
    }

    /** Little-endian reader of a packet's parameters, up to plen or the packet's end if that is sooner. */
    private static final class Fields {
        private final byte[] b;
        private final int end;
        /** The packet ends before plen says it should. */
        private final boolean cut;
        private int at;

        Fields(byte[] b, int start, int plen) {
            this.b = b;
            this.at = start;
            this.end = Math.min(b.length, start + plen);
            this.cut = start + plen > b.length;
        }

        int left() {
            return end - at;
        }

        int u8() {
            return take(1)[0] & 0xff;
        }

        int u16() {
            byte[] v = take(2);
            return (v[0] & 0xff) | (v[1] & 0xff) << 8;
        }

        int u24() {
            byte[] v = take(3);
            return (v[0] & 0xff) | (v[1] & 0xff) << 8 | (v[2] & 0xff) << 16;
        }

        byte[] take(int n) {
            if (left() < n) {
                throw new Truncated();
            }
            at += n;
            return Arrays.copyOfRange(b, at - n, at);
        }

        byte[] rest() {
            return take(left());
        }
    }
}
