// Fuzz target for the simulated controller's command handling: two
// controllers on one air take arbitrary command packets while a fake clock
// moves on. Every packet with a header gets exactly one Command Complete for
// its own opcode, with the status a reference model of the commands predicts
// and, for LE Test End, a packet count the elapsed time allows.
#include <cstdint>
#include <vector>

#include "fuzz/fuzz_check.h"
#include "host/hal/sim_controller.h"

using Bytes = std::vector<uint8_t>;

namespace {

constexpr uint16_t op(uint16_t ogf, uint16_t ocf) { return static_cast<uint16_t>((ogf << 10) | ocf); }

// LE test packets go out at least 625 us apart (Core Specification Vol 6,
// Part F, 4.1.6).
const int64_t kMinIntervalUs = 625;

enum class Test { NONE, TX, RX };

struct Model {
    Test test = Test::NONE;
    int64_t rx_start = 0;
    int tx_starts = 0;           // transmitter tests started so far
    int other_tx_at_rx = 0;      // the other controller's tx_starts when this RX began
};

struct Row {
    uint16_t opcode;
    int len;  // exact parameter length, -1 for any
};

// The commands of the test modes (Vol 4, Part E, 7.3.x, 7.6.3, 7.8.28-29,
// 7.8.50-51) and the vendor continuous-wave command.
const Row kRows[] = {
        {op(0x03, 0x0003), 0}, {op(0x06, 0x0003), 0}, {op(0x03, 0x0005), -1},
        {op(0x03, 0x001A), 1}, {op(0x03, 0x0020), 1}, {op(0x03, 0x0022), 1},
        {op(0x08, 0x001D), 1}, {op(0x08, 0x0033), 3}, {op(0x08, 0x001E), 3},
        {op(0x08, 0x0034), 4}, {op(0x08, 0x001F), 0}, {op(0x3F, 0x0004), 9},
};

const Row* find_row(uint16_t opcode) {
    for (const Row& row : kRows) {
        if (row.opcode == opcode) return &row;
    }
    return nullptr;
}

// Status of an LE test start: parameters first, then whether a test runs.
uint8_t start_test(Model& m, bool valid, Test kind, int64_t now) {
    if (!valid) return 0x12;
    if (m.test != Test::NONE) return 0x0C;
    m.test = kind;
    m.rx_start = now;
    if (kind == Test::TX) ++m.tx_starts;
    return 0x00;
}

// Predicted status; -1 where any of success or invalid parameters is right.
int predict(Model& m, const uint8_t* pkt, size_t len, int64_t now) {
    uint16_t opcode = static_cast<uint16_t>(pkt[0] | (pkt[1] << 8));
    const uint8_t* p = pkt + 3;
    size_t plen = len - 3;
    const Row* row = find_row(opcode);
    if (row == nullptr) return 0x01;
    if (pkt[2] != plen || (row->len >= 0 && static_cast<size_t>(row->len) != plen)) return 0x12;
    switch (opcode) {
        case op(0x03, 0x0003): m.test = Test::NONE; return 0x00;
        case op(0x03, 0x0005): return -1;
        case op(0x03, 0x001A): return p[0] <= 0x03 ? 0x00 : 0x12;
        case op(0x03, 0x0020): return p[0] <= 0x01 ? 0x00 : 0x12;
        case op(0x03, 0x0022): return p[0] <= 0x02 ? 0x00 : 0x12;
        case op(0x08, 0x001D): return start_test(m, p[0] <= 39, Test::RX, now);
        case op(0x08, 0x0033):
            return start_test(m, p[0] <= 39 && p[1] >= 1 && p[1] <= 3 && p[2] <= 1, Test::RX, now);
        case op(0x08, 0x001E): return start_test(m, p[0] <= 39 && p[2] <= 7, Test::TX, now);
        case op(0x08, 0x0034):
            return start_test(m, p[0] <= 39 && p[2] <= 7 && p[3] >= 1 && p[3] <= 4, Test::TX, now);
        case op(0x08, 0x001F): m.test = Test::NONE; return 0x00;
        default: return 0x00;
    }
}

}  // namespace

// Records: [controller bit + clock step in ms][length][packet bytes].
extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 2) return 0;
    int64_t now_us = 1000000;
    SimAir air([&now_us] { return now_us; });
    SimControllerSettings settings;
    settings.reference_tx = data[0] & 1;
    settings.loss = (data[1] % 5) / 4.0;
    SimController controllers[2] = {SimController(air, settings), SimController(air, settings)};
    Model models[2];

    size_t at = 2;
    while (at + 2 <= size) {
        int which = data[at] >> 7;
        now_us += (data[at] & 0x7F) * 1000;
        size_t len = std::min<size_t>(data[at + 1], size - at - 2);
        const uint8_t* pkt = data + at + 2;
        at += 2 + len;
        Model before = models[which];
        auto events = controllers[which].command(pkt, len);
        if (len < 3) {
            FUZZ_CHECK(events.empty(), "events for a packet without a header");
            continue;
        }
        FUZZ_CHECK(events.size() == 1, "%zu events for one command", events.size());
        const Bytes& e = events[0];
        FUZZ_CHECK(e.size() >= 6 && e[0] == 0x0E && e[1] == e.size() - 2 && e[2] == 1,
                   "not a Command Complete with one credit");
        FUZZ_CHECK(e[3] == pkt[0] && e[4] == pkt[1], "Command Complete for another opcode");
        Model& other = models[1 - which];
        int status = predict(models[which], pkt, len, now_us);
        if (status >= 0) FUZZ_CHECK(e[5] == status, "status 0x%02x, expected 0x%02x", e[5], status);
        if (models[which].test == Test::RX && before.test != Test::RX) {
            models[which].other_tx_at_rx = other.tx_starts;
        }
        bool test_end = (pkt[0] | (pkt[1] << 8)) == op(0x08, 0x001F) && status == 0;
        if (!test_end) continue;
        FUZZ_CHECK(e.size() == 8, "LE Test End returns a 2-byte packet count");
        int count = e[6] | (e[7] << 8);
        int64_t elapsed = now_us - before.rx_start;
        // The other controller and the reference transmitter, each at most one
        // packet per interval plus one; every further burst of the other
        // controller during the window can add one packet of its own phase.
        int bursts = other.tx_starts - before.other_tx_at_rx;
        int64_t most = before.test == Test::RX ? 2 * (elapsed / kMinIntervalUs + 1) + bursts : 0;
        FUZZ_CHECK(count <= most, "%d packets in %lld us", count, static_cast<long long>(elapsed));
    }
    return 0;
}
