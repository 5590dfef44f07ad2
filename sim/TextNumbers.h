#pragma once

#include <cstdint>
#include <optional>
#include <string_view>
#include <vector>

namespace verolux::sim {

// Numbers typed by users or read from files. The whole text must be the number: no sign other
// than a leading '-', no spaces, no trailing characters; doubles must be finite.
std::optional<int64_t> parseInteger(std::string_view text);
std::optional<double> parseNumber(std::string_view text);

// The text without leading and trailing spaces, tabs and carriage returns.
std::string_view trim(std::string_view text);

// The comma-separated items of the text (a CSV line's cells, an option's list), each trimmed.
std::vector<std::string_view> splitAtCommas(std::string_view text);

}  // namespace verolux::sim
