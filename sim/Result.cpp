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

std::string printable(std::string_view text, size_t maxChars) {
    std::string out;
    for (size_t i = 0; i < text.size() && i < maxChars; i++) {
        const auto c = static_cast<unsigned char>(text[i]);
        out += c < 0x20 || c == 0x7f ? '?' : static_cast<char>(c);
    }
    if (text.size() > maxChars) out += "...";
    return out;
}

std::string quoted(std::string_view text) {
    return "\"" + printable(text, MAX_QUOTED_CHARS) + "\"";
}

}  // namespace verolux::sim
