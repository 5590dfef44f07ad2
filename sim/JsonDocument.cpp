#include "sim/JsonDocument.h"

#include <json/json.h>

#include <cerrno>
#include <cstring>
#include <fstream>
#include <memory>
#include <sstream>

#include "sim/TextNumbers.h"

namespace verolux::sim {

namespace {

constexpr size_t MAX_JSON_ERROR_CHARS = 100;

// jsoncpp reports "* Line 3, Column 5\n  Missing ',' or '}' in object declaration\n" per error;
// keep the first one, on one short line: jsoncpp quotes the offending text whole ("'1e999...' is
// not a number.", "Duplicate key: '...'").
std::string firstJsonError(const std::string& errors) {
    std::istringstream lines(errors);
    std::string where;
    std::string what;
    std::getline(lines, where);
    std::getline(lines, what);
    where = std::string(trim(where));
    if (where.rfind("* ", 0) == 0) where.erase(0, 2);
    what = std::string(trim(what));
    return printable(what.empty() ? where : where + ": " + what, MAX_JSON_ERROR_CHARS);
}

}  // namespace

Result<Json::Value> parseJsonDocument(std::string_view text, std::string_view source, int maxDepth) {
    using R = Result<Json::Value>;
    const std::string prefix = std::string(source) + ": ";
    Json::CharReaderBuilder builder;
    Json::CharReaderBuilder::strictMode(&builder.settings_);
    builder["allowComments"] = true;
    builder["stackLimit"] = maxDepth;
    const std::unique_ptr<Json::CharReader> reader(builder.newCharReader());
    R result;
    std::string errors;
    bool parsed = false;
    try {
        parsed = reader->parse(text.data(), text.data() + text.size(), &result.value, &errors);
    } catch (const Json::Exception&) {
        // The reader throws instead of reporting when the nesting exceeds its stack limit.
        return R::failure(errorLine(prefix + "invalid JSON: nested deeper than " +
                                    std::to_string(maxDepth) + " levels"));
    }
    if (!parsed) return R::failure(errorLine(prefix + "invalid JSON: " + firstJsonError(errors)));
    return result;
}

Result<std::string> readSmallFile(const std::string& path, size_t maxBytes, std::string_view what) {
    using R = Result<std::string>;
    std::ifstream in(path, std::ios::binary);
    if (!in) {
        return R::failure(errorLine("cannot read " + std::string(what) + " " + path + ": " +
                                    strerror(errno)));
    }
    std::ostringstream text;
    char buffer[4096];
    size_t total = 0;
    while (in.read(buffer, sizeof(buffer)) || in.gcount() > 0) {
        total += static_cast<size_t>(in.gcount());
        if (total > maxBytes) {
            return R::failure(errorLine(path + ": larger than " + std::to_string(maxBytes >> 20) +
                                        " MiB, not a " + std::string(what)));
        }
        text.write(buffer, in.gcount());
    }
    if (in.bad()) return R::failure(errorLine("cannot read " + std::string(what) + " " + path));
    return {text.str(), {}};
}

std::string describeJson(const Json::Value& value) {
    if (value.isString()) return quoted(value.asString());
    Json::StreamWriterBuilder builder;
    builder["indentation"] = "";
    return quoted(Json::writeString(builder, value));
}

bool isJsonNumber(const Json::Value& value) {
    return value.type() == Json::intValue || value.type() == Json::uintValue ||
           value.type() == Json::realValue;
}

}  // namespace verolux::sim
