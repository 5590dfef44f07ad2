#pragma once

#include <cutils/trace.h>

#include <cstdint>

namespace android::Interpolation {

inline bool isGraphicsTraceEnabled() {
    return (atrace_get_enabled_tags() & ATRACE_TAG_GRAPHICS) != 0;
}

// A trace section for the enclosing scope; the platform's calls emit it only while the graphics
// tag is enabled, tested when the section opens and again when it closes.
class ScopedTrace {
public:
    explicit ScopedTrace(const char* name) { atrace_begin(ATRACE_TAG_GRAPHICS, name); }
    ~ScopedTrace() { atrace_end(ATRACE_TAG_GRAPHICS); }
    ScopedTrace(const ScopedTrace&) = delete;
    ScopedTrace& operator=(const ScopedTrace&) = delete;
};

inline void traceCounter(const char* name, int32_t value) {
    atrace_int(ATRACE_TAG_GRAPHICS, name, value);
}

}  // namespace android::Interpolation
