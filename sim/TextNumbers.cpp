#include "sim/TextNumbers.h"

#include <charconv>
#include <cmath>

namespace verolux::sim {

std::optional<int64_t> parseInteger(std::string_view text) {
    int64_t value = 0;
    const char* end = text.data() + text.size();
    const auto [ptr, ec] = std::from_chars(text.data(), end, value);
    if (text.empty() || ec != std::errc() || ptr != end) return std::nullopt;
    return value;
}

std::optional<double> parseNumber(std::string_view text) {
    double value = 0;
    const char* end = text.data() + text.size();
    const auto [ptr, ec] = std::from_chars(text.data(), end, value);
    if (text.empty() || ec != std::errc() || ptr != end || !std::isfinite(value)) {
        return std::nullopt;
    }
    return value;
}

std::string_view trim(std::string_view text) {
    constexpr std::string_view SPACE = " \t\r";
    const size_t first = text.find_first_not_of(SPACE);
    if (first == std::string_view::npos) return {};
    return text.substr(first, text.find_last_not_of(SPACE) - first + 1);
}

}  // namespace verolux::sim
