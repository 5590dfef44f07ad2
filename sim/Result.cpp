#include "sim/Result.h"

namespace verolux::sim {

namespace {

constexpr size_t MAX_QUOTED_CHARS = 40;

}  // namespace

std::string errorLine(std::string_view message) {
    std::string line = "verolux-sim: ";
    line += message;
    return line;
}

std::string quoted(std::string_view text) {
    std::string out = "\"";
    for (size_t i = 0; i < text.size() && i < MAX_QUOTED_CHARS; i++) {
        const auto c = static_cast<unsigned char>(text[i]);
        out += c < 0x20 || c == 0x7f ? '?' : static_cast<char>(c);
    }
    if (text.size() > MAX_QUOTED_CHARS) out += "...";
    out += '"';
    return out;
}

}  // namespace verolux::sim
