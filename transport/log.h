// Every line of the library goes to the platform log under one tag.
#pragma once

#include <android/log.h>

#define HALVENOR_LOG_TAG "halvenor"
#define LOGI(...) __android_log_print(ANDROID_LOG_INFO, HALVENOR_LOG_TAG, __VA_ARGS__)
#define LOGE(...) __android_log_print(ANDROID_LOG_ERROR, HALVENOR_LOG_TAG, __VA_ARGS__)
