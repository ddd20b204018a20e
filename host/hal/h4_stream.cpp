// H4 reassembly: a state machine of one function per state (type, header,
// payload). Pure; runs on whichever thread reads the stream.
#include "host/hal/h4_stream.h"

#include <algorithm>

void H4Stream::reset() {
    state_ = State::TYPE;
    packet_.type = 0;
    packet_.bytes.clear();
    want_ = 0;
}

size_t H4Stream::takeType(const uint8_t* data) {
    packet_.type = data[0];
    want_ = h4_header_len(packet_.type);
    if (want_ == 0) return 0;
    state_ = State::HEADER;
    return 1;
}

size_t H4Stream::takeHeader(const uint8_t* data, size_t len) {
    size_t n = std::min(len, want_ - packet_.bytes.size());
    packet_.bytes.insert(packet_.bytes.end(), data, data + n);
    if (packet_.bytes.size() == want_) {
        want_ += h4_payload_len(packet_.type, packet_.bytes.data());
        state_ = State::PAYLOAD;
    }
    return n;
}

size_t H4Stream::takePayload(const uint8_t* data, size_t len) {
    size_t n = std::min(len, want_ - packet_.bytes.size());
    packet_.bytes.insert(packet_.bytes.end(), data, data + n);
    return n;
}

bool H4Stream::feed(const uint8_t* data, size_t len, const Sink& sink) {
    size_t used = 0;
    while (used < len || state_ == State::PAYLOAD) {
        if (state_ == State::PAYLOAD && packet_.bytes.size() == want_) {
            // A zero-length payload completes with its header, before more bytes arrive.
            sink(packet_);
            reset();
            continue;
        }
        if (used == len) break;
        size_t n = 0;
        switch (state_) {
            case State::TYPE:
                n = takeType(data + used);
                if (n == 0) {
                    bad_type_ = data[used];
                    reset();
                    return false;
                }
                break;
            case State::HEADER: n = takeHeader(data + used, len - used); break;
            case State::PAYLOAD: n = takePayload(data + used, len - used); break;
        }
        used += n;
    }
    return true;
}
