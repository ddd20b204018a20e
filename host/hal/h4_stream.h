// H4 reassembly: cuts a byte stream, however it was split into reads, into
// whole packets. Pure (no I/O); one instance per stream, used by one thread.
#pragma once

#include <cstddef>
#include <cstdint>
#include <functional>
#include <vector>

#include "transport/h4_frame.h"

struct H4Packet {
    uint8_t type;
    std::vector<uint8_t> bytes;  // the HCI packet, without the type byte
};

class H4Stream {
  public:
    using Sink = std::function<void(const H4Packet&)>;

    // Hands every packet completed by these bytes to sink, in stream order.
    // Returns false on a byte that starts no packet: the stream cannot be
    // resynchronised, so the caller ends it; badType() names the byte.
    bool feed(const uint8_t* data, size_t len, const Sink& sink);
    uint8_t badType() const { return bad_type_; }
    // Bytes of a packet begun but not finished.
    size_t pending() const { return packet_.bytes.size() + (state_ == State::TYPE ? 0 : 1); }
    void reset();

  private:
    enum class State { TYPE, HEADER, PAYLOAD };
    size_t takeType(const uint8_t* data);
    size_t takeHeader(const uint8_t* data, size_t len);
    size_t takePayload(const uint8_t* data, size_t len);

    State state_ = State::TYPE;
    H4Packet packet_{0, {}};
    size_t want_ = 0;  // bytes the packet needs in all (header + payload)
    uint8_t bad_type_ = 0;
};
