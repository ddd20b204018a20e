// Picks the controller behind the host's Bluetooth HAL, HIDL or AIDL alike,
// from HALVENOR_HCI: the simulated controller (default), H4 over a unix or TCP
// socket or a serial line, or no service at all. Runs on the thread that looks
// the service up.
#include <stdlib.h>

#include <string>

#include "host/hal/h4_hci.h"
#include "host/hal/host_controller.h"
#include "host/hal/host_log.h"
#include "host/hal/sim_hci.h"
#include "host/hal/sim_settings.h"

namespace {

// What a setting that cannot be used gives: the library sees a service whose
// initialisation fails, and logs that itself.
class UnusableController final : public HostController {
  public:
    void start(std::shared_ptr<ControllerClient> client) override { client->initialized(false); }
    bool send(uint8_t, const uint8_t*, size_t) override { return true; }
    void stop() override {}
};

std::string env_or(const char* name, const char* fallback) {
    const char* value = getenv(name);
    return value != nullptr && value[0] != '\0' ? value : fallback;
}

// One HALVENOR_SIM_* variable: its default, and how its value is taken.
struct SimVariable {
    const char* name;
    const char* fallback;
    bool (*take)(const char* text, SimControllerSettings* settings, std::string* range);
};

const SimVariable kSimVariables[] = {
        {"HALVENOR_SIM_REFTX", "1", sim_take_reftx},
        {"HALVENOR_SIM_LOSS", "0", sim_take_loss},
        {"HALVENOR_SIM_BURST", "1", sim_take_burst},
        {"HALVENOR_SIM_SEED", "0", sim_take_seed},
        {"HALVENOR_SIM_DELAY", "0", sim_take_delay},
};

// The simulated controller's settings from the environment; an unusable
// value is logged with its range.
bool sim_settings(SimControllerSettings* settings) {
    for (const SimVariable& v : kSimVariables) {
        std::string value = env_or(v.name, v.fallback), range;
        if (!v.take(value.c_str(), settings, &range)) {
            HLOGE("%s=\"%s\": expected %s", v.name, value.c_str(), range.c_str());
            return false;
        }
    }
    return true;
}

}  // namespace

std::unique_ptr<HostController> controller_from_environment() {
    std::string value = env_or("HALVENOR_HCI", "sim");
    if (value == "none") return nullptr;  // a device without a Bluetooth HAL
    if (value == "sim") {
        SimControllerSettings settings;
        if (!sim_settings(&settings)) return std::make_unique<UnusableController>();
        return create_sim_hci(settings);
    }
    H4Target target;
    std::string why;
    if (!parse_h4_target(value, &target, &why)) {
        HLOGE("HALVENOR_HCI=\"%s\": %s", value.c_str(), why.c_str());
        return std::make_unique<UnusableController>();
    }
    return create_h4_hci(target);
}
