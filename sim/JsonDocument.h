#pragma once

#include <json/value.h>

#include <string>
#include <string_view>

#include "sim/Result.h"

namespace verolux::sim {

// A small JSON document a user wrote (a settings file, a scenario): read strictly, with comments
// allowed, nested at most `maxDepth` levels. Errors are one line naming `source` (the file):
// "verolux-sim: SOURCE: invalid JSON: Line 3, Column 5: Missing ',' or '}' in object declaration".
Result<Json::Value> parseJsonDocument(std::string_view text, std::string_view source, int maxDepth);

// The whole file, refused when it is larger than `maxBytes`: a user's file of that size is the
// wrong file. `what` names the kind of file in the error lines ("settings file").
Result<std::string> readSmallFile(const std::string& path, size_t maxBytes, std::string_view what);

// The value as it stands in the file, in double quotes and cut short, for an error line.
std::string describeJson(const Json::Value& value);

bool isJsonNumber(const Json::Value& value);

}  // namespace verolux::sim
