// Tool-data pump: the library's only thread. Reads whole H4 packets from the
// bridge end and hands each, without its type byte, to the HAL.
#include "transport/pump.h"

#include <errno.h>
#include <poll.h>
#include <string.h>
#include <sys/socket.h>

#include <vector>

#include "transport/h4.h"
#include "transport/log.h"
#include "transport/session.h"

using android::hardware::hidl_vec;
using android::hardware::Return;

struct timeval timeout;

enum WaitResult { WAIT_READABLE, WAIT_TIMED_OUT, WAIT_FAILED };

// poll rather than select: descriptors of 1024 and above work, and the
// time-out is taken afresh from `timeout` for every wait, never lowered.
static WaitResult wait_for_tool_data(int fd) {
    int ms = static_cast<int>(timeout.tv_sec * 1000 + timeout.tv_usec / 1000);
    struct pollfd pfd = {fd, POLLIN, 0};
    int rc;
    while ((rc = poll(&pfd, 1, ms)) == -1 && errno == EINTR) {
    }
    if (rc == 0) return WAIT_TIMED_OUT;
    if (rc > 0 && (pfd.revents & POLLNVAL)) errno = EBADF;
    if (rc < 0 || (pfd.revents & POLLNVAL)) {
        LOGE("select failed, Error: %s (%d)\n", strerror(errno), errno);
        return WAIT_FAILED;
    }
    return WAIT_READABLE;
}

// A busy tool end has the next packet waiting already: its type byte is
// taken without a wait, which saves a poll call per packet under load. An
// empty stream, its end or an error are left to the wait and safe_read,
// which report them as ever; errno is kept for their messages.
static bool take_waiting_type_byte(int fd, uint8_t* type) {
    int saved_errno = errno;
    ssize_t n;
    while ((n = recv(fd, type, 1, MSG_DONTWAIT)) == -1 && errno == EINTR) {
    }
    if (n != 1) errno = saved_errno;
    return n == 1;
}

static bool read_type_byte(int fd, uint8_t* type) {
    if (safe_read(fd, type, 1) == -1) {
        LOGE("%s: failed to read the packet from tools", "process_tool_data");
        return false;
    }
    return true;
}

// Reads the rest of the packet whose type byte is in; `packet` receives it
// without the type byte. False ends the pump.
static bool read_packet(int fd, uint8_t* type, std::vector<uint8_t>& packet) {
    LOGI("%s: Packet type :%d", "process_tool_data", *type);
    if (*type == 0 || *type > H4_TYPE_EVENT) {
        LOGE("%s: Unsupported preamble_len packet type %d", "process_tool_data", *type);
        return false;
    }

    uint8_t preamble[H4_MAX_PREAMBLE] = {0};
    int preamble_len = preamble_len_table[*type - 1];
    if (safe_read(fd, preamble, preamble_len) == -1) {
        LOGE("%s: failed to read the packet from tools", "process_tool_data");
        return false;
    }
    int payload_len = get_payload_len(*type, preamble);
    if (payload_len < 0) {
        LOGE("%s: Invalid payload length ", "process_tool_data");
        return false;
    }

    packet.assign(preamble_len + payload_len, 0);
    memcpy(packet.data(), preamble, preamble_len);
    if (safe_read(fd, packet.data() + preamble_len, payload_len) == -1) {
        LOGE("%s: failed to read the packet from tool", "process_tool_data");
        return false;
    }
    return true;
}

static void forward_packet(uint8_t type, std::vector<uint8_t>& packet) {
    LOGE("PACKET_TYPE = %d", type);
    if (type == H4_TYPE_EVENT) {
        LOGE("%s: Unsupported packet type: %d", "process_tool_data", type);
        return;
    }
    // Every session change joins the pump before it touches btHci, so the
    // service read here is the one this session opened.
    if (btHci == nullptr) {
        LOGE("%s: no HAL service, packet dropped", "process_tool_data");
        return;
    }
    hidl_vec<uint8_t> hci;
    hci.setToExternal(packet.data(), packet.size());
    Return<void> sent = type == H4_TYPE_COMMAND ? btHci->sendHciCommand(hci)
                        : type == H4_TYPE_ACL   ? btHci->sendAclData(hci)
                                                : btHci->sendScoData(hci);
    if (!sent.isOk()) LOGE("%s: the HAL refused packet type %d", "process_tool_data", type);
}

void* process_tool_data(void*) {
    std::vector<uint8_t> packet;
    timeout.tv_sec = 0;
    timeout.tv_usec = 500000;
    LOGE("process_tool_data IN!");

    // The bridge end does not change while this pump runs: it is closed only
    // after the pump has been joined.
    int fd = server_fd;
    for (;;) {
        uint8_t type = 0;
        if (!take_waiting_type_byte(fd, &type)) {
            WaitResult waited = wait_for_tool_data(fd);
            if (waited == WAIT_FAILED) break;
            if (waited == WAIT_TIMED_OUT) {
                if (__atomic_load_n(&client_fd, __ATOMIC_ACQUIRE) != -1) continue;
                LOGI("Quit test mode!");
                break;
            }
            if (!read_type_byte(fd, &type)) break;
        }
        if (!read_packet(fd, &type, packet)) break;
        forward_packet(type, packet);
    }
    LOGE("Process tool OUT !!!");
    return nullptr;
}
