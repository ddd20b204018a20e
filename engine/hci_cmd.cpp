// HCI command framing: token lists and binary fields to H4 command packets,
// one write each, then the reply through the event reader. Runs on the calling
// Java thread.
#include "engine/hci_cmd.h"

#include <stdlib.h>
#include <string.h>
#include <sys/socket.h>
#include <unistd.h>

#include "engine/event_reader.h"
#include "transport/h4_frame.h"
#include "transport/log.h"

// Packet area (4 header bytes + 252 parameters) and, after the write, the
// reply buffer (a whole event is at most 257 bytes).
#define WORK_BUF_SIZE 260
#define MAX_PARAMS 252

// Read Local Version Information (Vol 4, Part E, 7.4.1): every controller
// knows it, and it changes nothing.
static const uint16_t kSyncOpcode = 0x1001;

// HCI replies carry no sequence number: once a command went unanswered, its
// late reply could pass for the next command's. The link stays out of step,
// across sessions too, until a sync command has been answered.
static bool out_of_step = false;

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

// The whole packet or failure: half a command would corrupt the stream.
static bool write_packet(int fd, const uint8_t* packet, int len) {
    size_t done = 0;
    return h4_write_all(fd, packet, static_cast<size_t>(len), -1, &done);
}

// Neither Reset (the lost command may have been one, and its late reply would
// pass for the new one's) nor anything that changes state: Read Local Version
// Information, whose reply can only come after everything sent before it.
static bool sync_link(int fd, const char* caller) {
    LOGI("%s: a command went unanswered, so its reply may still come: syncing with Read Local "
         "Version Information (0x%04x) first", caller, kSyncOpcode);
    uint8_t buf[WORK_BUF_SIZE];
    const uint8_t sync[] = {H4_TYPE_COMMAND, kSyncOpcode & 0xFF, kSyncOpcode >> 8, 0x00};
    long deadline = hci_clock_ms() + HCI_REPLY_TIMEOUT_MS;
    if (wait_for_command_credit(fd, buf, deadline, caller) && write_packet(fd, sync, sizeof(sync)) &&
        read_command_reply(fd, buf, kSyncOpcode, deadline, false) != HCI_NOT_ANSWERED) {
        out_of_step = false;
        return true;
    }
    // As after the HAL's death: the next procedure opens a new session.
    LOGE("%s: the controller did not answer the sync either, ending the session", caller);
    shutdown(fd, SHUT_RDWR);
    return false;
}

// Whatever waits arrived before the command could be seen, so it is read and
// skipped; an out-of-step link is synced, and a withheld credit waited for.
static bool ready_for_command(int fd, uint8_t* work, long deadline, const char* caller) {
    return skip_waiting_packets(fd, work, caller) && (!out_of_step || sync_link(fd, caller)) &&
           wait_for_command_credit(fd, work, deadline, caller);
}

// Sends the packet framed in work and reads its reply into work.
static HciReply exchange(int fd, uint8_t* work, int len, const char* caller, const char* sent_line) {
    HciReply reply = {static_cast<uint16_t>(work[1] | (work[2] << 8)), HCI_NOT_ANSWERED};
    uint8_t scratch[WORK_BUF_SIZE];
    long deadline = hci_clock_ms() + HCI_REPLY_TIMEOUT_MS;
    bool written = ready_for_command(fd, scratch, deadline, caller) && write_packet(fd, work, len);
    LOGI("%s", sent_line);
    memset(work, 0, WORK_BUF_SIZE);
    if (written) {
        reply.status = read_command_reply(fd, work, reply.opcode, deadline, true);
        if (reply.status == HCI_NOT_ANSWERED) out_of_step = true;
    }
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
    return exchange(fd, work, len, "cmd_rawcmd", "Raw HCI command\n");
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
    return exchange(fd, work, len, "hci_send_cmd_rawcmd", "Raw HCI command\n\n");
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
