#pragma once

#include <string>
#include <vector>

namespace android::test {

// Enables the graphics trace tag while it lives and records the trace calls the library makes:
// "B|name" for a section begin, "E" for its end, "C|name|value" for a counter.
class TraceCapture {
public:
    TraceCapture();
    ~TraceCapture();
    TraceCapture(const TraceCapture&) = delete;
    TraceCapture& operator=(const TraceCapture&) = delete;

    std::vector<std::string> events() const;
};

}  // namespace android::test
