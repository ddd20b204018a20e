// Writing one H4 packet: one buffer, so that a packet leaves in a single
// write unless the descriptor takes it in parts. Caller's thread.
#include "host/hal/h4_io.h"

#include <errno.h>
#include <sys/socket.h>
#include <unistd.h>

#include <cstring>
#include <vector>

bool h4_send(int fd, bool is_socket, uint8_t type, const uint8_t* packet, size_t len) {
    std::vector<uint8_t> h4(len + 1);
    h4[0] = type;
    if (len > 0) memcpy(h4.data() + 1, packet, len);
    size_t done = 0;
    while (done < h4.size()) {
        ssize_t n = is_socket ? send(fd, h4.data() + done, h4.size() - done, MSG_NOSIGNAL)
                              : write(fd, h4.data() + done, h4.size() - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) {
            if (n == 0) errno = EIO;
            return false;
        }
        done += static_cast<size_t>(n);
    }
    return true;
}
