// HCI command framing: token lists and binary fields to H4 command packets,
// one write each, then the reply through the event reader. Runs on the calling
// Java thread.
#include "engine/hci_cmd.h"

#include <errno.h>
#include <poll.h>
#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include "engine/event_reader.h"
#include "transport/h4.h"
#include "transport/log.h"

// Packet area (4 header bytes + 252 parameters) and, after the write, the
// reply buffer (a whole event is at most 257 bytes).
#define WORK_BUF_SIZE 260
#define MAX_PARAMS 252
// Bounds the drain of stale input, so a flooding controller cannot hold it.
#define MAX_STALE_BYTES 65536

// 01, opcode low byte first, parameter length, parameters. The opcode is
// OGF << 10 | OCF (Core Specification Vol 4, Part E, 5.4.1).
static int build_packet(uint8_t* work, uint16_t ogf, uint16_t ocf, uint8_t plen,
                        const uint8_t* params) {
    memset(work, 0, WORK_BUF_SIZE);
    work[0] = H4_TYPE_COMMAND;
    work[1] = static_cast<uint8_t>(ocf & 0xFF);
    work[2] = static_cast<uint8_t>((((ocf & 0x300) | (ogf << 10)) >> 8) & 0xFF);
    work[3] = plen;
    if (plen > 0) memcpy(work + 4, params, plen);
    return 4 + plen;
}

// A descriptor that is not a socket has no non-blocking read of its own:
// asked first whether anything waits, so the read cannot block.
static ssize_t read_if_waiting(int fd, uint8_t* dst, size_t len) {
    struct pollfd pfd = {fd, POLLIN, 0};
    if (poll(&pfd, 1, 0) != 1 || !(pfd.revents & POLLIN)) return 0;
    return read(fd, dst, len);
}

// Whatever is already waiting on fd arrived before this command was sent, so
// it cannot answer it: a reply that came after its command timed out, or an
// event nobody asked for. Dropped so the reader never takes it as the reply.
static void drop_stale_input(int fd, const char* caller) {
    uint8_t scratch[WORK_BUF_SIZE];
    int dropped = 0;
    while (dropped < MAX_STALE_BYTES) {
        ssize_t n = recv(fd, scratch, sizeof(scratch), MSG_DONTWAIT);
        if (n == -1 && errno == EINTR) continue;
        if (n == -1 && errno == ENOTSOCK) n = read_if_waiting(fd, scratch, sizeof(scratch));
        if (n <= 0) break;
        dropped += static_cast<int>(n);
    }
    if (dropped > 0) LOGI("%s: dropped %d stale bytes before the command", caller, dropped);
}

// The whole packet or failure: half a command would corrupt the stream. A
// socket whose peer has gone fails with EPIPE instead of raising SIGPIPE.
static bool write_packet(int fd, const uint8_t* packet, int len) {
    int done = 0;
    while (done < len) {
        ssize_t n = write_no_sigpipe(fd, packet + done, len - done);
        if (n < 0 && errno == EINTR) continue;
        if (n <= 0) return false;
        done += static_cast<int>(n);
    }
    return true;
}

// Reads the reply to the command just written from work, into work.
static HciReply read_reply(int fd, uint8_t* work, bool written) {
    HciReply reply = {static_cast<uint16_t>(work[1] | (work[2] << 8)), HCI_NOT_ANSWERED};
    memset(work, 0, WORK_BUF_SIZE);
    if (written) reply.status = read_command_reply(fd, work, reply.opcode);
    LOGI("\n");
    return reply;
}

static uint8_t hex_byte(const char* token) { return static_cast<uint8_t>(strtol(token, nullptr, 16)); }

HciReply cmd_rawcmd(int fd, int argc, const char* const* argv) {
    HciReply none = {0, HCI_NOT_ANSWERED};
    if (argv == nullptr || argc < 3) return none;
    int plen = argc - 3;
    if (plen > MAX_PARAMS) {
        LOGE("%s: %d parameters do not fit one command (at most %d), nothing sent", "cmd_rawcmd",
             plen, MAX_PARAMS);
        return none;
    }
    uint16_t ogf = static_cast<uint16_t>(strtol(argv[1], nullptr, 16));
    uint16_t ocf = static_cast<uint16_t>(strtol(argv[2], nullptr, 16));
    uint8_t params[WORK_BUF_SIZE] = {0};
    for (int i = 0; i < plen; ++i) params[i] = hex_byte(argv[3 + i]);

    LOGI("ogf 0x%x ocf 0x%x \nParams: ", ogf & 0xFF, ocf & 0xFF);
    for (int i = 0; i < plen; ++i) LOGI("0x%x ", params[i]);
    LOGI("\n");

    uint8_t work[WORK_BUF_SIZE];
    int len = build_packet(work, ogf, ocf, static_cast<uint8_t>(plen), params);
    drop_stale_input(fd, "cmd_rawcmd");
    bool written = write_packet(fd, work, len);
    LOGI("Raw HCI command\n");
    return read_reply(fd, work, written);
}

HciReply hci_cmd_exchange(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, const char* params) {
    LOGI("ogf 0x%x ocf 0x%x \nParams: ", ogf, ocf);
    LOGI("dev_id = %d: ", fd);
    if (plen > 0 && params == nullptr) {
        LOGE("%s: %d parameter bytes announced, none given", "hci_send_cmd_rawcmd", plen);
        return {0, HCI_NOT_ANSWERED};
    }
    for (int i = 0; i < plen; ++i) LOGI("0x%x ", static_cast<uint8_t>(params[i]));
    LOGI("\n");

    uint8_t work[WORK_BUF_SIZE];
    int len = build_packet(work, ogf, ocf, plen, reinterpret_cast<const uint8_t*>(params));
    drop_stale_input(fd, "hci_send_cmd_rawcmd");
    bool written = write_packet(fd, work, len);
    LOGI("Raw HCI command\n\n");
    return read_reply(fd, work, written);
}

int hci_send_cmd_rawcmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, char* params) {
    return hci_cmd_exchange(fd, ogf, ocf, plen, params).status == HCI_NOT_ANSWERED ? -1 : 0;
}

int hci_send_cmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, void* params) {
    if (plen > 0 && params == nullptr) return -1;
    uint8_t work[WORK_BUF_SIZE];
    int len = build_packet(work, ogf, ocf, plen, static_cast<const uint8_t*>(params));
    return write_packet(fd, work, len) ? 0 : -1;
}
