// Writing one H4 packet to a descriptor: type byte and packet in one buffer,
// short writes completed. Any thread; callers serialise writes to one fd.
#pragma once

#include <cstddef>
#include <cstdint>

// A far end that takes no byte for timeout_ms (-1: no bound) fails the write
// with ETIMEDOUT, provided the descriptor is non-blocking. False (errno set,
// EIO when a write took nothing) when the write fails.
bool h4_send(int fd, uint8_t type, const uint8_t* packet, size_t len, int timeout_ms);
