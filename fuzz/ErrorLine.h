#pragma once

#include <cstddef>
#include <string>

namespace verolux::fuzz {

// A longer error line would hold more of the input than the readers' quoting lets through.
constexpr size_t MAX_ERROR_LINE_CHARS = 300;

// Bad input gets one short line: no control characters, whatever the input held.
inline bool isErrorLine(const std::string& line) {
    if (line.empty() || line.size() > MAX_ERROR_LINE_CHARS) return false;
    for (unsigned char c : line) {
        if (c < 0x20 || c == 0x7f) return false;
    }
    return true;
}

}  // namespace verolux::fuzz
