// A simulated controller in this process behind a host HAL service. Commands
// are handled and answered on the controller's own event thread, as a real
// HAL answers from its own threads.
#pragma once

#include <memory>

#include "host/hal/host_controller.h"
#include "host/hal/sim_controller.h"

// A new controller on the process's shared air.
std::unique_ptr<HostController> create_sim_hci(SimControllerSettings settings);
