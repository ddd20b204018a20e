// H4 framing, the one place it is written: the packet type that leads each
// HCI packet on a UART-style stream, the header each type starts with, how
// long a packet is, whether a packet agrees with its own header, and the
// write that moves a whole run of bytes. Stateless; any thread. Used by the
// library and by the host layer alike.
#pragma once

#include <cstddef>
#include <cstdint>

// HCI packet indicators (Core Specification Vol 4, Part A, 2).
enum : uint8_t {
    H4_TYPE_COMMAND = 1,
    H4_TYPE_ACL = 2,
    H4_TYPE_SCO = 3,
    H4_TYPE_EVENT = 4,
    H4_TYPE_ISO = 5,
};

// The longest header of any type, in bytes.
#define H4_MAX_HEADER 4

// Header length of a type, after its type byte; 0 for a byte that starts no packet.
size_t h4_header_len(uint8_t type);
// Payload length that a whole header of this type announces.
size_t h4_payload_len(uint8_t type, const uint8_t* header);
// Length, type byte included, of the H4 packet that starts at `bytes`, once
// its header is among the `avail` bytes; 0 while it is not or when the first
// byte starts no packet.
size_t h4_packet_len(const uint8_t* bytes, size_t avail);
// True when an HCI packet of this type (no type byte) is as long as its own
// header says.
bool h4_packet_agrees(uint8_t type, const uint8_t* packet, size_t len);
// Lower-case name of the packet type for log lines ("ACL data"), or "unknown".
const char* h4_type_name(uint8_t type);

// Writes all `len` bytes, going on after short writes and signals; a socket
// whose peer has gone fails with EPIPE rather than raising SIGPIPE. With
// `timeout_ms` >= 0 a descriptor that takes no byte for that long fails with
// ETIMEDOUT (a non-blocking descriptor is waited for; a blocking one blocks).
// False with errno set, 0 when a write took nothing; *done says how much went.
bool h4_write_all(int fd, const uint8_t* buf, size_t len, int timeout_ms, size_t* done);
