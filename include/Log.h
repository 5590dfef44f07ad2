#pragma once

#include <android/log.h>

#include "Tunables.h"

// Every diagnostic line of the library goes through ILOG: debug priority, no tag, printed only
// when the process-wide logLevel is at least `level`.
#define ILOG(level, ...)                                                                     \
    do {                                                                                     \
        if (::android::Interpolation::logLevel.load(std::memory_order_relaxed) >= (level)) { \
            __android_log_print(ANDROID_LOG_DEBUG, nullptr, __VA_ARGS__);                    \
        }                                                                                    \
    } while (false)
