// What each HCI event means to the engine: headings and dumps for the log,
// the events that end an outside caller's exchange, and the opcode a reply
// answers. Runs on the calling Java thread.
#include "engine/event_log.h"

#include "jni/binding.h"
#include "transport/log.h"

// Parameter byte i of the event in buf (byte 2 is the first), 0 when the
// event is too short to hold it.
static uint8_t param(const uint8_t* buf, int len, int i) { return i < len + 2 ? buf[i] : 0; }

static void dump_event(const uint8_t* buf, int len) {
    for (int i = 0; i < len + 2; ++i) LOGI("[%x]", buf[i]);
    LOGI("\n");
}

void log_event(const uint8_t* buf, int len) {
    switch (buf[0]) {
        case EVT_INQUIRY_COMPLETE:
            LOGI("INQ COMPLETE EVENT RECEIVED\n");
            LOGI("\n");
            return;
        case EVT_INQUIRY_RESULT:
            LOGI("INQ RESULT EVENT RECEIVED \n");
            break;
        case EVT_CONNECTION_COMPLETE:
            if (buf[2] != 0) {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH ERROR CODE 0x%x \n", buf[2]);
            } else {
                LOGI("CONNECTION COMPLETE EVENT RECEIVED WITH HANDLE: 0x%02x%02x \n",
                     param(buf, len, 4), param(buf, len, 3));
            }
            break;
        case EVT_DISCONNECTION_COMPLETE:
            LOGI("DISCONNECTION COMPLETE EVENT RECEIVED WITH REASON CODE: 0x%x \n",
                 param(buf, len, 5));
            break;
        case EVT_COMMAND_STATUS:
            LOGI("Command Status Received\n");
            dump_event(buf, len);
            if (buf[2] == 0x02) LOGI("\nUnknown connection identifier");
            return;
        default:
            LOGI("Other event received, Breaking\n");
    }
    dump_event(buf, len);
}

// Inquiry Result and a pending Command Status (0x00) read on; a Command
// Status with any other status is a rejection, after which the controller
// sends nothing more for that command.
EventOutcome outcome_of(uint8_t* buf, int len) {
    switch (buf[0]) {
        case EVT_INQUIRY_RESULT:
            return EVENT_READ_ON;
        case EVT_COMMAND_STATUS:
            if (buf[2] == 0x00) return EVENT_READ_ON;
            if (buf[2] != 0x02) {
                LOGI("%s: command rejected with status 0x%x", "read_incoming_events", buf[2]);
            }
            return EVENT_ENDS_EXCHANGE;
        case EVT_INQUIRY_COMPLETE:
        case EVT_CONNECTION_COMPLETE:
        case EVT_DISCONNECTION_COMPLETE:
            return EVENT_ENDS_EXCHANGE;
        default:
            onReceivedTestData(buf, len + 2);
            return EVENT_ENDS_EXCHANGE;
    }
}

// Command Complete: credits, opcode, then the return parameters, Status first;
// Command Status: status, credits, opcode (Core Specification Vol 4, Part E,
// 7.7.14 and 7.7.15).
int answered_opcode(const uint8_t* buf, int len) {
    if (len < 4) return -1;
    if (buf[0] == EVT_COMMAND_COMPLETE) return buf[3] | (buf[4] << 8);
    if (buf[0] == EVT_COMMAND_STATUS) return buf[4] | (buf[5] << 8);
    return -1;
}
