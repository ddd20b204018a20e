// Fuzz target for the host backends' H4 reassembly: one stream fed whole and
// fed in pseudo-random pieces must give the same packets as a reference
// reading, stop at the same unsupported type byte, and account for the bytes
// of an unfinished packet.
#include <cstdint>
#include <vector>

#include "fuzz/fuzz_check.h"
#include "fuzz/h4_reference.h"
#include "host/hal/h4_stream.h"

using Bytes = std::vector<uint8_t>;

namespace {

struct Outcome {
    std::vector<H4Packet> packets;
    bool ok = true;
    uint8_t bad = 0;
    size_t pending = 0;
};

// Feeds the stream in pieces whose sizes come from a small generator seeded
// by `seed`; seed 0 feeds it in one piece.
Outcome feed(const Bytes& s, uint8_t seed) {
    Outcome out;
    H4Stream stream;
    auto sink = [&out](const H4Packet& p) { out.packets.push_back(p); };
    uint32_t state = seed;
    size_t at = 0;
    while (at < s.size()) {
        size_t piece = s.size() - at;
        if (seed != 0) {
            state = state * 1103515245u + 12345u;
            piece = std::min(piece, static_cast<size_t>(1 + (state >> 16) % 300));
        }
        if (!stream.feed(s.data() + at, piece, sink)) {
            out.ok = false;
            out.bad = stream.badType();
            return out;
        }
        at += piece;
    }
    out.pending = stream.pending();
    return out;
}

void check(const Outcome& got, const ReferenceReading& want, const std::vector<uint8_t>& s, const char* how) {
    FUZZ_CHECK(got.ok == !want.bad_type, "%s: feed result", how);
    if (!got.ok) {
        FUZZ_CHECK(got.bad == s[want.bad_at], "%s: bad type %d, expected %d", how, got.bad, s[want.bad_at]);
    }
    FUZZ_CHECK(got.packets.size() == want.packets.size(), "%s: %zu packets, %zu expected", how,
               got.packets.size(), want.packets.size());
    for (size_t i = 0; i < got.packets.size(); ++i) {
        FUZZ_CHECK(got.packets[i].type == want.packets[i].type &&
                           got.packets[i].bytes == want.packets[i].bytes,
                   "%s: packet %zu differs", how, i);
    }
    if (got.ok) FUZZ_CHECK(got.pending == want.partial, "%s: %zu pending, %zu expected", how, got.pending, want.partial);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size < 1) return 0;
    Bytes s(data + 1, data + size);
    ReferenceReading want = read_h4_reference(s);
    check(feed(s, 0), want, s, "whole");
    check(feed(s, data[0] == 0 ? 1 : data[0]), want, s, "pieces");
    return 0;
}
