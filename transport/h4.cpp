// H4 framing and whole-run stream I/O shared by the pump (reads) and the HAL
// callbacks (writes). Runs on whichever thread calls it.
#include "transport/h4.h"

#include <errno.h>
#include <string.h>
#include <unistd.h>

#include "transport/log.h"

int get_payload_len(uint8_t type, const uint8_t* preamble) {
    if (h4_header_len(type) == 0) {
        LOGE("%s: Unsupported packet type, failed to get length", "get_payload_len");
        return -1;
    }
    return static_cast<int>(h4_payload_len(type, preamble));
}

int safe_read(int fd, unsigned char* buf, int len) {
    if (buf == nullptr) {
        LOGE("%s: The buffer is NULL", "safe_read");
        return -1;
    }
    if (len == 0) {
        LOGE("%s: No data to read", "safe_read");
        return 0;
    }
    if (len < 0) return 0;

    int done = 0;
    while (done < len) {
        ssize_t n = read(fd, buf + done, len - done);
        if (n < 0 && errno == EINTR) continue;
        if (n < 0) {
            LOGE("%s: Read error: (%s)", "safe_read", strerror(errno));
            return -1;
        }
        if (n == 0) {
            LOGE("%s: read returned 0, err = %s, read bytes: %d", "safe_read", strerror(errno), done);
            return -1;
        }
        done += static_cast<int>(n);
    }
    return len;
}

int safe_write(int fd, unsigned char* buf, int len) {
    if (buf == nullptr) {
        LOGE("%s: The buffer is NULL", "safe_write");
        return -1;
    }
    if (len == 0) {
        LOGE("%s: No data to write", "safe_write");
        return 0;
    }
    if (len < 0) return 0;

    size_t done = 0;
    if (h4_write_all(fd, buf, static_cast<size_t>(len), -1, &done)) return len;
    if (errno == 0) {
        LOGE("%s: Write returned 0, err = %s, bytes written: %d", "safe_write", strerror(errno),
             static_cast<int>(done));
    } else {
        LOGE("%s: Write error: (%s)", "safe_write", strerror(errno));
    }
    return -1;
}
