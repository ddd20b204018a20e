// What a fuzz target does when a check fails: name the check, dump the
// input's size, and abort so libFuzzer keeps the input as a crash.
#pragma once

#include <cstdio>
#include <cstdlib>

#define FUZZ_CHECK(cond, ...)                                              \
    do {                                                                   \
        if (!(cond)) {                                                     \
            fprintf(stderr, "fuzz check failed at %s:%d: %s: ", __FILE__, \
                    __LINE__, #cond);                                      \
            fprintf(stderr, __VA_ARGS__);                                  \
            fprintf(stderr, "\n");                                         \
            abort();                                                       \
        }                                                                  \
    } while (0)
