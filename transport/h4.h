// H4 framing (type byte, fixed preamble, payload) and whole-run stream I/O
// on a descriptor. Stateless; safe on any thread.
#pragma once

#include <cstdint>
#include <sys/types.h>

enum {
    H4_TYPE_COMMAND = 1,
    H4_TYPE_ACL = 2,
    H4_TYPE_SCO = 3,
    H4_TYPE_EVENT = 4,
};

// Largest preamble of any type, in bytes.
#define H4_MAX_PREAMBLE 4

// Preamble length by type, indexed by type minus 1.
extern const int preamble_len_table[4];

// Payload length from the type and the preamble, or -1 for a type outside 1..4.
int get_payload_len(uint8_t type, const uint8_t* preamble);

// Move exactly len bytes; len on success, 0 for len <= 0, -1 on failure.
int safe_read(int fd, unsigned char* buf, int len);
int safe_write(int fd, unsigned char* buf, int len);

// One write() that fails with EPIPE rather than raising SIGPIPE when the peer
// of a socket has gone; descriptors that are not sockets get a plain write().
ssize_t write_no_sigpipe(int fd, const unsigned char* buf, size_t len);
