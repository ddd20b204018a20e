// Picks the controller behind IBluetoothHci "default" on a host, from
// HALVENOR_HCI: the simulated controller (default), H4 over a unix or TCP
// socket or a serial line, or no service at all. Runs on the thread that calls getService.
#include <stdlib.h>

#include <string>

#include <hidl/HostServices.h>

#include "host/hal/h4_hci.h"
#include "host/hal/host_hci.h"
#include "host/hal/host_log.h"
#include "host/hal/sim_hci.h"

namespace {

// What getService hands out for a setting it cannot use: the library sees a
// service whose initialisation fails, and logs that itself.
class UnusableHci final : public HostHci {
  public:
    Return<void> initialize(const sp<IBluetoothHciCallbacks>& callback) override {
        callback->initializationComplete(Status::INITIALIZATION_ERROR);
        return Void();
    }

  private:
    Return<void> send(uint8_t, const hidl_vec<uint8_t>&) override { return Void(); }
    void stop() override {}
};

std::string env_or(const char* name, const char* fallback) {
    const char* value = getenv(name);
    return value != nullptr && value[0] != '\0' ? value : fallback;
}

// A decimal number from 0 to max.
bool parse_range(const std::string& text, double max, double* out) {
    char* end = nullptr;
    double v = strtod(text.c_str(), &end);
    if (end == text.c_str() || *end != '\0' || !(v >= 0.0 && v <= max)) return false;
    *out = v;
    return true;
}

// HALVENOR_SIM_REFTX (1 on, 0 off; default on), HALVENOR_SIM_LOSS (0..1) and
// HALVENOR_SIM_DELAY (seconds, 0..10).
bool sim_settings(SimControllerSettings* settings) {
    std::string reftx = env_or("HALVENOR_SIM_REFTX", "1");
    std::string loss = env_or("HALVENOR_SIM_LOSS", "0");
    std::string delay = env_or("HALVENOR_SIM_DELAY", "0");
    if (reftx != "0" && reftx != "1") {
        HLOGE("HALVENOR_SIM_REFTX=\"%s\": expected 0 or 1", reftx.c_str());
        return false;
    }
    if (!parse_range(loss, 1, &settings->loss)) {
        HLOGE("HALVENOR_SIM_LOSS=\"%s\": expected a fraction from 0 to 1", loss.c_str());
        return false;
    }
    if (!parse_range(delay, 10, &settings->delay_s)) {
        HLOGE("HALVENOR_SIM_DELAY=\"%s\": expected seconds from 0 to 10", delay.c_str());
        return false;
    }
    settings->reference_tx = reftx == "1";
    return true;
}

}  // namespace

namespace android {
namespace hardware {
namespace host {

sp<bluetooth::V1_0::IBluetoothHci> createDefaultBluetoothHci(const std::string& serviceName) {
    if (serviceName != "default") return nullptr;
    std::string value = env_or("HALVENOR_HCI", "sim");
    if (value == "none") return nullptr;  // a device without a Bluetooth HAL
    if (value == "sim") {
        SimControllerSettings settings;
        if (!sim_settings(&settings)) return new UnusableHci();
        return create_sim_hci(settings);
    }
    H4Target target;
    std::string why;
    if (!parse_h4_target(value, &target, &why)) {
        HLOGE("HALVENOR_HCI=\"%s\": %s", value.c_str(), why.c_str());
        return new UnusableHci();
    }
    return create_h4_hci(target);
}

}  // namespace host
}  // namespace hardware
}  // namespace android
