// Writing one H4 packet to a descriptor: type byte and packet in one buffer,
// short writes completed. Any thread; callers serialise writes to one fd.
#pragma once

#include <cstddef>
#include <cstdint>

// Sockets are written with MSG_NOSIGNAL, so a vanished peer is an EPIPE
// error rather than a SIGPIPE. False (errno set) when the write fails.
bool h4_send(int fd, bool is_socket, uint8_t type, const uint8_t* packet, size_t len);
