// Event reader: reads the controller's packets from the session descriptor
// after a command, each whole by its own header, and decides which event
// answers the command. Runs on the calling Java thread.
#pragma once

#include <cstdint>

#include "transport/export.h"

// How long the controller has to answer: the usual HCI command time-out.
#define HCI_REPLY_TIMEOUT_MS 2000

extern "C" {

// Reads packets into buf (at least 257 bytes) until an event ends the
// exchange; data packets and empty events are logged and skipped. 0 when such
// an event was handled, -1 on a failed or timed-out read or a stream that
// cannot be followed. The third argument is not used.
HALVENOR_EXPORT int read_incoming_events(int fd, uint8_t* buf, int);

}  // extern "C"

// Status of a command that was not sent or not answered.
#define HCI_NOT_ANSWERED (-1)

// Monotonic milliseconds: the clock of every reply deadline.
long hci_clock_ms();

// Reads the reply to the command `opcode` just written, until `deadline`: its
// Command Complete, or a Command Status that refuses it. Every other packet is
// logged and skipped. The controller's status (0x00: accepted), or
// HCI_NOT_ANSWERED. With `up_call`, an accepted Command Complete goes on to
// the Java up-call (LE Test End's only when it holds Num_Packets). A stream
// that cannot be followed any more is shut down (logged), ending the session.
int read_command_reply(int fd, uint8_t* buf, uint16_t opcode, long deadline, bool up_call);
// Reads and logs as skipped every packet already waiting on fd: it came
// before the next command could have been seen. False when the stream has
// ended, or cannot be followed (logged, the stream shut down).
bool skip_waiting_packets(int fd, uint8_t* buf, const char* caller);
// True at once unless the controller's last Command Complete or Command
// Status withheld its command credit (Num_HCI_Command_Packets 0) on this
// stream; then reads and skips packets until one grants a credit. False
// (logged) when none came by `deadline` or the stream broke.
bool wait_for_command_credit(int fd, uint8_t* buf, long deadline, const char* caller);
