// Tool-data pump: the thread that carries H4 packets from the tool end of the
// socket pair to the HAL.
#pragma once

#include <sys/time.h>

#include "transport/export.h"

extern "C" {

// How long one wait for tool data lasts: 0 s and 500000 us.
HALVENOR_EXPORT extern struct timeval timeout;

HALVENOR_EXPORT void* process_tool_data(void* arg);

}  // extern "C"
