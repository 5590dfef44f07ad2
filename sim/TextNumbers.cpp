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

std::vector<std::string_view> splitAtCommas(std::string_view text) {
    std::vector<std::string_view> items;
    size_t start = 0;
    while (true) {
        const size_t comma = text.find(',', start);
        items.push_back(trim(text.substr(start, comma - start)));
        if (comma == std::string_view::npos) return items;
        start = comma + 1;
    }
}

}  // namespace verolux::sim
