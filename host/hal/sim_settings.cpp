// The simulated controller's settings from text, each with its range. Pure;
// any thread.
#include "host/hal/sim_settings.h"

#include <errno.h>
#include <stdlib.h>

// A decimal number from min to max, the whole text of it.
static bool number_in(const char* text, double min, double max, double* out) {
    char* end = nullptr;
    double v = strtod(text, &end);
    if (end == text || *end != '\0' || !(v >= min && v <= max)) return false;
    *out = v;
    return true;
}

bool sim_take_reftx(const char* text, SimControllerSettings* settings, std::string* range) {
    std::string t = text;
    if (t != "0" && t != "1") return *range = "0 or 1", false;
    settings->reference_tx = t == "1";
    return true;
}

bool sim_take_loss(const char* text, SimControllerSettings* settings, std::string* range) {
    if (!number_in(text, 0, 1, &settings->loss)) return *range = "a fraction from 0 to 1", false;
    return true;
}

bool sim_take_burst(const char* text, SimControllerSettings* settings, std::string* range) {
    if (!number_in(text, 1, 1000, &settings->burst)) {
        return *range = "a mean burst length from 1 to 1000 packets", false;
    }
    return true;
}

bool sim_take_seed(const char* text, SimControllerSettings* settings, std::string* range) {
    char* end = nullptr;
    errno = 0;
    unsigned long long v = strtoull(text, &end, 10);
    if (*text < '0' || *text > '9' || *end != '\0' || errno == ERANGE) {
        return *range = "a whole number (0: a seed of its own)", false;
    }
    settings->seed = v;
    return true;
}

bool sim_take_delay(const char* text, SimControllerSettings* settings, std::string* range) {
    if (!number_in(text, 0, 10, &settings->delay_s)) return *range = "seconds from 0 to 10", false;
    return true;
}
