// HCI command framing: builds H4 command packets from token lists or binary
// fields, writes them to a descriptor and reads the reply. Runs on the calling
// Java thread; one exchange at a time per descriptor.
#pragma once

#include <cstdint>

#include "engine/event_reader.h"
#include "transport/export.h"

// What the controller answered to one command: its status (0x00 accepted,
// any other value refused), or HCI_NOT_ANSWERED when the command was not
// written or no reply came in time.
struct HciReply {
    uint16_t opcode;
    int status;
};

// Token form: argv[1] is the OGF, argv[2] the OCF, argv[3] onwards one
// parameter byte each, all hexadecimal text; argv[0] is not examined. Nothing
// is sent for fewer than 3 or more than 255 tokens.
HciReply cmd_rawcmd(int fd, int argc, const char* const* argv);
// Binary form of the same exchange, logged as hci_send_cmd_rawcmd logs it.
HciReply hci_cmd_exchange(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, const char* params);

extern "C" {

// Sends the command and reads its reply: 0 when written and answered, whatever
// the controller's status, -1 when the write failed or no reply came.
HALVENOR_EXPORT int hci_send_cmd_rawcmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen,
                                        char* params);
// Sends the command only: 0 when written, -1 when the write failed.
HALVENOR_EXPORT int hci_send_cmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, void* params);

}  // extern "C"
