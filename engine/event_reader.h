// Event reader: reads the controller's reply events from the session
// descriptor after a command. Runs on the calling Java thread.
#pragma once

#include <cstdint>

#include "transport/export.h"

// How long the controller has to answer: the usual HCI command time-out.
#define HCI_REPLY_TIMEOUT_MS 2000

extern "C" {

// Reads events into buf (at least 257 bytes) until one ends the exchange.
// 0 when such an event was handled, -1 on a failed or timed-out read or when
// the stream does not carry an event. The third argument is not used.
HALVENOR_EXPORT int read_incoming_events(int fd, uint8_t* buf, int);

}  // extern "C"

// Status of a command that was not sent or not answered.
#define HCI_NOT_ANSWERED (-1)

// Reads the reply to the command `opcode` just written, within one reply
// time-out in all: its Command Complete, or a Command Status that refuses it.
// Every other event is logged and skipped. The controller's status (0x00:
// accepted), or HCI_NOT_ANSWERED. An accepted Command Complete goes on to the
// Java up-call (LE Test End's only when it holds Num_Packets).
int read_command_reply(int fd, uint8_t* buf, uint16_t opcode);
