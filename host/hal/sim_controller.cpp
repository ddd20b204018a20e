// A simulated controller: a table of {opcode, parameter length, handler}
// with unknown opcodes answered in one place. Runs on the thread that hands
// it a command (a service's event thread or a server connection's thread).
#include "host/hal/sim_controller.h"

#include "host/hal/host_log.h"

namespace {

constexpr uint16_t opcode(uint16_t ogf, uint16_t ocf) { return (ogf << 10) | ocf; }

constexpr int kAnyLength = -1;
constexpr uint8_t kLastChannel = 39;       // LE RF channels 0..39
constexpr uint8_t kRefPayloadLength = 37;  // what the reference transmitter sends
constexpr uint8_t kEventCommandComplete = 0x0E;

}  // namespace

// The handlers of the command table: each checks its parameters' values
// (their length is checked by the table) and fills the reply.
struct SimCommands {
    struct Reply {
        uint8_t status = HCI_SUCCESS;
        std::vector<uint8_t> params;  // return parameters after the status
    };
    using Handler = void (*)(SimController&, const uint8_t* p, size_t len, Reply& reply);

    static void reset(SimController& c, const uint8_t*, size_t, Reply&) { c.endTests(); }
    static void accept(SimController&, const uint8_t*, size_t, Reply&) {}
    static void setEventFilter(SimController&, const uint8_t* p, size_t len, Reply& reply);
    static void writeScanEnable(SimController&, const uint8_t* p, size_t, Reply& reply) {
        if (p[0] > 0x03) reply.status = HCI_INVALID_PARAMETERS;
    }
    static void writeAuthEnable(SimController&, const uint8_t* p, size_t, Reply& reply) {
        if (p[0] > 0x01) reply.status = HCI_INVALID_PARAMETERS;
    }
    static void writeEncryptionMode(SimController&, const uint8_t* p, size_t, Reply& reply) {
        if (p[0] > 0x02) reply.status = HCI_INVALID_PARAMETERS;
    }
    static void receiverTest(SimController& c, const uint8_t* p, size_t, Reply& reply) {
        startRx(c, p[0], LE_PHY_1M, reply);
    }
    static void receiverTestV2(SimController& c, const uint8_t* p, size_t, Reply& reply);
    static void transmitterTest(SimController& c, const uint8_t* p, size_t, Reply& reply);
    static void transmitterTestV2(SimController& c, const uint8_t* p, size_t, Reply& reply);
    static void testEnd(SimController& c, const uint8_t*, size_t, Reply& reply);
    static void continuousWave(SimController&, const uint8_t*, size_t, Reply&) {}

    static void startRx(SimController& c, uint8_t channel, uint8_t phy, Reply& reply);
    static void startTx(SimController& c, const uint8_t* p, uint8_t phy, Reply& reply);
    static uint16_t receivedPackets(SimController& c);
};

namespace {

using Reply = SimCommands::Reply;

struct CommandRow {
    uint16_t opcode;
    int param_len;  // exact parameter length, or kAnyLength
    SimCommands::Handler handler;
};

// The command table; a row without a handler ends it.
const CommandRow kCommands[] = {
        {opcode(0x03, 0x0003), 0, SimCommands::reset},
        {opcode(0x06, 0x0003), 0, SimCommands::accept},  // Enable Device Under Test Mode
        {opcode(0x03, 0x0005), kAnyLength, SimCommands::setEventFilter},
        {opcode(0x03, 0x001A), 1, SimCommands::writeScanEnable},
        {opcode(0x03, 0x0020), 1, SimCommands::writeAuthEnable},
        {opcode(0x03, 0x0022), 1, SimCommands::writeEncryptionMode},
        {opcode(0x08, 0x001D), 1, SimCommands::receiverTest},
        {opcode(0x08, 0x0033), 3, SimCommands::receiverTestV2},
        {opcode(0x08, 0x001E), 3, SimCommands::transmitterTest},
        {opcode(0x08, 0x0034), 4, SimCommands::transmitterTestV2},
        {opcode(0x08, 0x001F), 0, SimCommands::testEnd},
        {opcode(0x3F, 0x0004), 9, SimCommands::continuousWave},  // vendor: continuous wave
        {0, 0, nullptr},
};

const CommandRow* find_command(uint16_t op) {
    for (const CommandRow* row = kCommands; row->handler != nullptr; ++row) {
        if (row->opcode == op) return row;
    }
    return nullptr;
}

bool length_fits(int want, size_t len) { return want == kAnyLength || static_cast<size_t>(want) == len; }

// Parameters Set Event Filter needs for its filter and condition types
// (Vol 4, Part E, 7.3.3); 0 for a combination that does not exist.
size_t event_filter_len(const uint8_t* p, size_t len) {
    if (p[0] == 0x00) return 1;  // clear all filters
    if (len < 2 || p[0] > 0x02) return 0;
    bool setup = p[0] == 0x02;   // connection setup filters carry Auto_Accept_Flag
    switch (p[1]) {
        case 0x00: return setup ? 3 : 2;    // all devices
        case 0x01: return setup ? 9 : 8;    // class of device and mask (3 + 3)
        case 0x02: return setup ? 9 : 8;    // one BD_ADDR
        default: return 0;
    }
}

SimController::Event command_complete(uint16_t op, const Reply& reply) {
    SimController::Event event = {kEventCommandComplete, 0, 1, static_cast<uint8_t>(op & 0xFF),
                                  static_cast<uint8_t>(op >> 8), reply.status};
    event.insert(event.end(), reply.params.begin(), reply.params.end());
    event[1] = static_cast<uint8_t>(event.size() - 2);
    return event;
}

}  // namespace

void SimCommands::setEventFilter(SimController&, const uint8_t* p, size_t len, Reply& reply) {
    // An empty command has no Filter_Type to look at.
    if (len == 0) {
        reply.status = HCI_INVALID_PARAMETERS;
        return;
    }
    size_t want = event_filter_len(p, len);
    // Auto_Accept_Flag, last byte of a connection setup filter, is 0x01..0x03.
    bool bad_flag = want == len && p[0] == 0x02 && (p[len - 1] < 0x01 || p[len - 1] > 0x03);
    if (want == 0 || want != len || bad_flag) reply.status = HCI_INVALID_PARAMETERS;
}

void SimCommands::receiverTestV2(SimController& c, const uint8_t* p, size_t, Reply& reply) {
    // PHY 1..3, modulation index standard (0) or stable (1).
    if (p[1] < LE_PHY_1M || p[1] > LE_PHY_CODED_S8 || p[2] > 0x01) {
        reply.status = HCI_INVALID_PARAMETERS;
        return;
    }
    startRx(c, p[0], p[1], reply);
}

void SimCommands::transmitterTest(SimController& c, const uint8_t* p, size_t, Reply& reply) {
    startTx(c, p, LE_PHY_1M, reply);
}

void SimCommands::transmitterTestV2(SimController& c, const uint8_t* p, size_t, Reply& reply) {
    if (p[3] < LE_PHY_1M || p[3] > LE_PHY_CODED_S2) {
        reply.status = HCI_INVALID_PARAMETERS;
        return;
    }
    startTx(c, p, p[3], reply);
}

void SimCommands::startRx(SimController& c, uint8_t channel, uint8_t phy, Reply& reply) {
    if (channel > kLastChannel) {
        reply.status = HCI_INVALID_PARAMETERS;
    } else if (c.test_ != SimController::Test::NONE) {
        reply.status = HCI_COMMAND_DISALLOWED;
    } else {
        c.test_ = SimController::Test::RX;
        c.rx_channel_ = channel;
        c.rx_phy_ = phy;
        c.rx_start_ = c.air_.now();
        c.air_.holdHistory(c.id(), c.rx_start_);
    }
}

// p: TX_Channel, Test_Data_Length, Packet_Payload (0..7).
void SimCommands::startTx(SimController& c, const uint8_t* p, uint8_t phy, Reply& reply) {
    if (p[0] > kLastChannel || p[2] > 0x07) {
        reply.status = HCI_INVALID_PARAMETERS;
    } else if (c.test_ != SimController::Test::NONE) {
        reply.status = HCI_COMMAND_DISALLOWED;
    } else {
        c.test_ = SimController::Test::TX;
        c.air_.startTransmitter(c.id(), p[0], phy, p[1]);
    }
}

uint16_t SimCommands::receivedPackets(SimController& c) {
    int64_t end = c.air_.now();
    uint64_t sent = c.air_.packetsHeard(c.id(), c.rx_channel_, c.rx_phy_, c.rx_start_, end);
    if (c.settings_.reference_tx) {
        int64_t interval = le_test_interval_us(c.rx_phy_, kRefPayloadLength);
        sent += packets_in_window(c.rx_start_, interval, c.rx_start_, end);
    }
    // Num_Packets is 16 bits; a long test wraps as a controller's counter does.
    return static_cast<uint16_t>(c.loss_.received(sent) & 0xFFFF);
}

// A transmitter test reports 0 packets; so does a Test End with no test.
void SimCommands::testEnd(SimController& c, const uint8_t*, size_t, Reply& reply) {
    uint16_t packets = c.test_ == SimController::Test::RX ? receivedPackets(c) : 0;
    c.endTests();
    reply.params = {static_cast<uint8_t>(packets & 0xFF), static_cast<uint8_t>(packets >> 8)};
}

SimController::SimController(SimAir& air, SimControllerSettings settings)
    : air_(air), settings_(settings), loss_(settings.loss, settings.burst, settings.seed) {}

SimController::~SimController() { endTests(); }

void SimController::endTests() {
    if (test_ == Test::TX) air_.stopTransmitter(id());
    if (test_ == Test::RX) air_.releaseHistory(id());
    test_ = Test::NONE;
}

std::vector<SimController::Event> SimController::command(const uint8_t* packet, size_t len) {
    if (len < 3) {
        HLOGE("sim: command of %zu bytes has no header, dropped", len);
        return {};
    }
    uint16_t op = packet[0] | (packet[1] << 8);
    size_t plen = len - 3;
    Reply reply;
    const CommandRow* row = find_command(op);
    if (row == nullptr) {
        reply.status = HCI_UNKNOWN_COMMAND;
    } else if (packet[2] != plen || !length_fits(row->param_len, plen)) {
        reply.status = HCI_INVALID_PARAMETERS;
    } else {
        row->handler(*this, packet + 3, plen, reply);
    }
    if (reply.status != HCI_SUCCESS) {
        HLOGI("sim: command 0x%04x answered with status 0x%02x", op, reply.status);
    }
    return {command_complete(op, reply)};
}
