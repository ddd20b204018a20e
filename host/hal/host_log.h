// Log lines of the host-only HAL layer, under their own tag so a capture
// tells the host's controllers apart from the library. Any thread.
#pragma once

#include <android/log.h>

#define HOST_LOG_TAG "halvenor-host"
#define HLOGI(...) __android_log_print(ANDROID_LOG_INFO, HOST_LOG_TAG, __VA_ARGS__)
#define HLOGE(...) __android_log_print(ANDROID_LOG_ERROR, HOST_LOG_TAG, __VA_ARGS__)
