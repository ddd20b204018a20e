// A controller speaking H4 behind a host HAL service: on a unix or TCP
// socket, a serial line, or an adapter's HCI user channel. A reader thread per session connects, reports
// whether it could and delivers the controller's packets; any thread may send.
#pragma once

#include <memory>

#include "host/hal/h4_target.h"
#include "host/hal/host_controller.h"

std::unique_ptr<HostController> create_h4_hci(const H4Target& target);
