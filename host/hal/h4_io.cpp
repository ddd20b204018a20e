// Writing one H4 packet: one buffer, so that a packet leaves in a single
// write unless the descriptor takes it in parts. Caller's thread.
#include "host/hal/h4_io.h"

#include <errno.h>

#include <cstring>
#include <vector>

#include "transport/h4_frame.h"

bool h4_send(int fd, uint8_t type, const uint8_t* packet, size_t len, int timeout_ms) {
    std::vector<uint8_t> h4(len + 1);
    h4[0] = type;
    if (len > 0) memcpy(h4.data() + 1, packet, len);
    size_t done = 0;
    if (h4_write_all(fd, h4.data(), h4.size(), timeout_ms, &done)) return true;
    if (errno == 0) errno = EIO;
    return false;
}
