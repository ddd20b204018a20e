// The library is built with hidden visibility; only what the Java VM and the
// platform look up by name is exported.
#pragma once

#define HALVENOR_EXPORT __attribute__((visibility("default")))
