// Independent reference reading of an H4 stream for the fuzz targets
// (Bluetooth Core Specification Vol 4, Part A): headers of 3, 4, 3 and 2
// bytes for types 1 to 4; payload length in header byte 2 (command, SCO),
// bytes 2 and 3 low first (ACL) or byte 1 (event).
#pragma once

#include <cstddef>
#include <cstdint>
#include <vector>

struct ReferencePacket {
    uint8_t type;
    std::vector<uint8_t> bytes;  // header and payload, without the type byte
};

struct ReferenceReading {
    std::vector<ReferencePacket> packets;  // the whole packets, in order
    bool bad_type = false;                 // stopped at a type byte outside 1..4
    size_t bad_at = 0;                     // where that type byte stands
    size_t partial = 0;                    // bytes of an unfinished last packet
};

inline ReferenceReading read_h4_reference(const std::vector<uint8_t>& s) {
    ReferenceReading r;
    size_t at = 0;
    while (at < s.size()) {
        uint8_t type = s[at];
        size_t header = type == 1 ? 3 : type == 2 ? 4 : type == 3 ? 3 : type == 4 ? 2 : 0;
        if (header == 0) {
            r.bad_type = true;
            r.bad_at = at;
            return r;
        }
        size_t h = at + 1;
        size_t total = header;
        if (h + header <= s.size()) {
            total += type == 2 ? s[h + 2] + 256u * s[h + 3] : type == 4 ? s[h + 1] : s[h + 2];
        }
        if (h + header > s.size() || h + total > s.size()) {
            r.partial = s.size() - at;
            return r;
        }
        r.packets.push_back({type, std::vector<uint8_t>(s.begin() + h, s.begin() + h + total)});
        at = h + total;
    }
    return r;
}
