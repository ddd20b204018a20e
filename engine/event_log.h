// What each HCI event means to the engine: the heading and byte dump it is
// logged with, whether it ends an outside caller's exchange, and which
// command a reply answers. Stateless; the calling Java thread.
#pragma once

#include <cstdint>

enum {
    EVT_INQUIRY_COMPLETE = 0x01,
    EVT_INQUIRY_RESULT = 0x02,
    EVT_CONNECTION_COMPLETE = 0x03,
    EVT_DISCONNECTION_COMPLETE = 0x05,
    EVT_COMMAND_COMPLETE = 0x0E,
    EVT_COMMAND_STATUS = 0x0F,
};

enum EventOutcome { EVENT_ENDS_EXCHANGE, EVENT_READ_ON };

// Logs the event in buf (code, parameter length `len`, parameters) under the
// heading of its code, then its bytes.
void log_event(const uint8_t* buf, int len);
// For outside callers of read_incoming_events, which wait for whatever ends
// an exchange; an event that ends it and is not handled by name goes to the
// Java up-call.
EventOutcome outcome_of(uint8_t* buf, int len);
// The opcode a Command Complete or Command Status answers, when it holds the
// opcode and a status; -1 for every other event.
int answered_opcode(const uint8_t* buf, int len);
