// The simulated controller's settings taken from text: the one place their
// values and ranges are read, for the in-process simulator's environment and
// halvenor-sim's options alike. Any thread.
#pragma once

#include <string>

#include "host/hal/sim_controller.h"

// Each sets its setting from `text` and returns true, or returns false with
// the values it takes in *range ("a fraction from 0 to 1").
bool sim_take_reftx(const char* text, SimControllerSettings* settings, std::string* range);
bool sim_take_loss(const char* text, SimControllerSettings* settings, std::string* range);
bool sim_take_burst(const char* text, SimControllerSettings* settings, std::string* range);
bool sim_take_seed(const char* text, SimControllerSettings* settings, std::string* range);
bool sim_take_delay(const char* text, SimControllerSettings* settings, std::string* range);
