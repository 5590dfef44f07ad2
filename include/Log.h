#pragma once

#include <android/log.h>

#include "Tunables.h"

// Every diagnostic line of the library goes through ILOG: debug priority, no tag, printed only
// when the process-wide logLevel is at least `level`.
#define ILOG(level, ...) ILOG_TAGGED(level, nullptr, __VA_ARGS__)

// As ILOG, for the few messages that carry a log tag.
#define ILOG_TAGGED(level, tag, ...)                                                         \
    do {                                                                                     \
        if (::android::Interpolation::logLevel.load(std::memory_order_relaxed) >= (level)) { \
            __android_log_print(ANDROID_LOG_DEBUG, tag, __VA_ARGS__);                        \
        }                                                                                    \
    } while (false)
