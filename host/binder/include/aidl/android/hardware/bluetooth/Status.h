// Host stand-in for the NDK backend's class of the frozen Bluetooth HAL's
// Status enum (version 1): what initializationComplete reports.
#pragma once

#include <cstdint>
#include <string>

namespace aidl {
namespace android {
namespace hardware {
namespace bluetooth {

enum class Status : int32_t {
    SUCCESS = 0,
    ALREADY_INITIALIZED = 1,
    UNABLE_TO_OPEN_INTERFACE = 2,
    HARDWARE_INITIALIZATION_ERROR = 3,
    UNKNOWN = 4,
};

[[nodiscard]] static inline std::string toString(Status val) {
    switch (val) {
        case Status::SUCCESS: return "SUCCESS";
        case Status::ALREADY_INITIALIZED: return "ALREADY_INITIALIZED";
        case Status::UNABLE_TO_OPEN_INTERFACE: return "UNABLE_TO_OPEN_INTERFACE";
        case Status::HARDWARE_INITIALIZATION_ERROR: return "HARDWARE_INITIALIZATION_ERROR";
        case Status::UNKNOWN: return "UNKNOWN";
        default: return std::to_string(static_cast<int32_t>(val));
    }
}

}  // namespace bluetooth
}  // namespace hardware
}  // namespace android
}  // namespace aidl
