// HCI command framing: builds H4 command packets from token lists or binary
// fields, writes them to a descriptor and reads the reply. Runs on the calling
// Java thread; one exchange at a time per descriptor.
#pragma once

#include <cstdint>

#include "transport/export.h"

// Token form: argv[1] is the OGF, argv[2] the OCF, argv[3] onwards one
// parameter byte each, all hexadecimal text; argv[0] is not examined.
// 0 when the command was written and answered, -1 otherwise (nothing is sent
// for fewer than 3 or more than 255 tokens).
int cmd_rawcmd(int fd, int argc, const char* const* argv);

extern "C" {

// Sends the command and reads its reply: 0 when written and answered, whatever
// the controller's status, -1 when the write failed or no reply came.
HALVENOR_EXPORT int hci_send_cmd_rawcmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen,
                                        char* params);
// Sends the command only: 0 when written, -1 when the write failed.
HALVENOR_EXPORT int hci_send_cmd(int fd, uint16_t ogf, uint16_t ocf, uint8_t plen, void* params);

}  // extern "C"
