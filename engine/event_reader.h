// Event reader: reads the controller's reply events from the session
// descriptor after a command. Runs on the calling Java thread.
#pragma once

#include <cstdint>

#include "transport/export.h"

// How long one wait for a reply byte may last: the usual HCI command time-out.
#define HCI_REPLY_TIMEOUT_MS 2000

extern "C" {

// Reads events into buf (at least 257 bytes) until one ends the exchange.
// 0 when such an event was handled, -1 on a failed or timed-out read or when
// the stream does not carry an event. The third argument is not used.
HALVENOR_EXPORT int read_incoming_events(int fd, uint8_t* buf, int);

}  // extern "C"

// As read_incoming_events, but a Command Complete or Command Status for any
// other opcode than `opcode` is a late reply to an earlier command: it is
// logged and skipped instead of ending the exchange.
int read_command_reply(int fd, uint8_t* buf, uint16_t opcode);
