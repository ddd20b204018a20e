// H4 framing (type byte, fixed preamble, payload) and whole-run stream I/O
// on a descriptor. Stateless; safe on any thread.
#pragma once

#include <cstdint>

#include "transport/h4_frame.h"

// Payload length from the type and the preamble, or -1 (logged) for a byte
// that starts no packet (types 1 to 5 do).
int get_payload_len(uint8_t type, const uint8_t* preamble);

// Move exactly len bytes; len on success, 0 for len <= 0, -1 on failure.
int safe_read(int fd, unsigned char* buf, int len);
int safe_write(int fd, unsigned char* buf, int len);
