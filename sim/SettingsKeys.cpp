#include "sim/SettingsKeys.h"

#include <json/json.h>

#include <algorithm>
#include <cctype>
#include <cerrno>
#include <cfloat>
#include <cmath>
#include <cstring>
#include <fstream>
#include <limits>
#include <memory>
#include <sstream>
#include <type_traits>
#include <variant>

#include "sim/JsonDocument.h"
#include "sim/TextNumbers.h"

namespace verolux::sim {

namespace {

using host::SettingValue;
using Points = std::vector<SettingValue::Point>;

// A settings file is a handful of lines; anything this big is the wrong file.
constexpr size_t MAX_SETTINGS_FILE_BYTES = 1 << 20;
constexpr int32_t MODE_ID = 7;
constexpr int64_t MAX_MODE = 5;
constexpr int MAX_SETTINGS_DEPTH = 16;

// Each check returns the reason a value is refused, or an empty string; the got text is already
// quoted for the message.
std::string checkInt(const SettingKey& key, int64_t value, const std::string& got,
                     SettingValue::Value& out) {
    if (key.id == MODE_ID && (value < 0 || value > MAX_MODE)) {
        return "mode must be between 0 and 5 (got " + std::to_string(value) + ")";
    }
    if (value < std::numeric_limits<int32_t>::min() || value > std::numeric_limits<int32_t>::max()) {
        return std::string(key.name) + " is out of range (got " + got + ")";
    }
    out = static_cast<int32_t>(value);
    return {};
}

std::string checkFloat(const SettingKey& key, double value, const std::string& got, float& out) {
    if (!std::isfinite(value) || value > FLT_MAX || value < -FLT_MAX) {
        return std::string(key.name) + " is out of range (got " + got + ")";
    }
    out = static_cast<float>(value);
    return {};
}

std::string checkPoints(const SettingKey& key, const std::vector<double>& flat,
                        const std::string& got, SettingValue::Value& out) {
    if (flat.empty()) return std::string(key.name) + " needs at least one x,y point";
    if (flat.size() % 2 != 0) {
        return std::string(key.name) + " needs an even number of values, x,y per point (got " +
               std::to_string(flat.size()) + ")";
    }
    Points points(flat.size() / 2);
    for (size_t i = 0; i < points.size(); i++) {
        if (std::string error = checkFloat(key, flat[2 * i], got, points[i].x); !error.empty()) {
            return error;
        }
        if (std::string error = checkFloat(key, flat[2 * i + 1], got, points[i].y); !error.empty()) {
            return error;
        }
    }
    out = std::move(points);
    return {};
}

// Edits (insertions, deletions, substitutions, case ignored) between two short names.
size_t editDistance(std::string_view a, std::string_view b) {
    std::vector<size_t> row(b.size() + 1);
    for (size_t j = 0; j <= b.size(); j++)
        row[j] = j;
    for (size_t i = 1; i <= a.size(); i++) {
        size_t diagonal = row[0];
        row[0] = i;
        for (size_t j = 1; j <= b.size(); j++) {
            const size_t above = row[j];
            const bool same = std::tolower(static_cast<unsigned char>(a[i - 1])) ==
                              std::tolower(static_cast<unsigned char>(b[j - 1]));
            row[j] = std::min({row[j] + 1, row[j - 1] + 1, diagonal + (same ? 0 : 1)});
            diagonal = above;
        }
    }
    return row[b.size()];
}

// "unknown settings key "x"", and the closest key when one is near enough to be a typo.
std::string unknownKey(std::string_view name) {
    // Typos are a few edits, about one in three letters; anything further is another word.
    const SettingKey* closest = nullptr;
    size_t best = std::max<size_t>(1, name.size() / 3) + 1;
    if (name.size() <= 64) {
        for (const SettingKey& key : settingKeys()) {
            const size_t edits = editDistance(name, key.name);
            if (edits < best) {
                best = edits;
                closest = &key;
            }
        }
    }
    std::string text = "unknown settings key " + quoted(name);
    if (closest != nullptr) text += " (did you mean \"" + std::string(closest->name) + "\"?)";
    return text;
}

std::string expected(const SettingKey& key, const std::string& got) {
    std::string what;
    switch (key.type) {
        case SettingType::INT:
            what = " expects a whole number";
            break;
        case SettingType::FLOAT:
            what = " expects a number";
            break;
        case SettingType::BOOL:
            what = " expects true, false, 1 or 0";
            break;
        case SettingType::POINTS:
            what = " expects a list of x,y numbers";
            break;
    }
    return std::string(key.name) + what + " (got " + got + ")";
}

std::string valueFromText(const SettingKey& key, std::string_view text, SettingValue::Value& out) {
    const std::string got = quoted(text);
    switch (key.type) {
        case SettingType::INT:
            if (auto value = parseInteger(text)) return checkInt(key, *value, got, out);
            break;
        case SettingType::FLOAT:
            if (auto value = parseNumber(text)) {
                float f = 0;
                std::string error = checkFloat(key, *value, got, f);
                if (error.empty()) out = f;
                return error;
            }
            break;
        case SettingType::BOOL:
            if (text == "true" || text == "1" || text == "false" || text == "0") {
                out = text == "true" || text == "1";
                return {};
            }
            break;
        case SettingType::POINTS: {
            std::vector<double> flat;
            size_t start = 0;
            while (!text.empty()) {
                const size_t comma = text.find(',', start);
                auto value = parseNumber(trim(text.substr(start, comma - start)));
                if (!value) return expected(key, got);
                flat.push_back(*value);
                if (comma == std::string_view::npos) break;
                start = comma + 1;
            }
            return checkPoints(key, flat, got, out);
        }
    }
    return expected(key, got);
}

std::string valueFromJson(const SettingKey& key, const Json::Value& json, SettingValue::Value& out) {
    const std::string got = describeJson(json);
    switch (key.type) {
        case SettingType::INT:
            if (json.isInt64()) return checkInt(key, json.asInt64(), got, out);
            if (isJsonNumber(json) && std::floor(json.asDouble()) == json.asDouble()) {
                return std::string(key.name) + " is out of range (got " + got + ")";
            }
            break;
        case SettingType::FLOAT:
            if (isJsonNumber(json)) {
                float f = 0;
                std::string error = checkFloat(key, json.asDouble(), got, f);
                if (error.empty()) out = f;
                return error;
            }
            break;
        case SettingType::BOOL:
            if (json.isBool()) {
                out = json.asBool();
                return {};
            }
            if (isJsonNumber(json) && (json.asDouble() == 0 || json.asDouble() == 1)) {
                out = json.asDouble() == 1;
                return {};
            }
            break;
        case SettingType::POINTS: {
            if (!json.isArray()) break;
            std::vector<double> flat;
            for (const Json::Value& item : json) {
                if (isJsonNumber(item)) {
                    flat.push_back(item.asDouble());
                } else if (item.isArray() && item.size() == 2 && isJsonNumber(item[0]) &&
                           isJsonNumber(item[1])) {
                    flat.push_back(item[0].asDouble());
                    flat.push_back(item[1].asDouble());
                } else {
                    return std::string(key.name) + " expects numbers or [x, y] pairs (got " +
                           describeJson(item) + ")";
                }
            }
            return checkPoints(key, flat, got, out);
        }
    }
    return expected(key, got);
}

}  // namespace

const std::vector<SettingKey>& settingKeys() {
    using T = SettingType;
    static const std::vector<SettingKey> KEYS = {
            {"gameFpsLimit", 0, T::INT},
            {"delayMs", 1, T::INT},
            {"smartDelay", 2, T::BOOL},
            {"delayUpdatePeriodSec", 3, T::FLOAT},
            {"hitTarget", 4, T::FLOAT},
            {"delayChangeRateMs", 5, T::INT},
            {"hitThreshold", 6, T::FLOAT},
            {"mode", MODE_ID, T::INT},
            {"writeToFrametracker", 8, T::BOOL},
            {"rfpsOffset", 9, T::INT},
            {"rfpsSmoothness", 10, T::FLOAT},
            {"spareFlag", 11, T::BOOL},
            {"gfpsOffsetEnabled", 12, T::BOOL},
            {"gfpsOffset", 13, T::INT},
            {"gfpsMinimum", 14, T::INT},
            {"gfpsMaximum", 15, T::INT},
            {"rfpsMinimum", 16, T::INT},
            {"rfpsMaximum", 17, T::INT},
            {"rfps", 18, T::INT},
            {"rfpsMaxSkippedFrames", 19, T::INT},
            {"detectRefreshRate", 20, T::BOOL},
            {"alphaFunction", 21, T::POINTS},
            {"justInTimeMarginMs", 22, T::INT},
            {"minimumRegalStability", 23, T::FLOAT},
            {"maxConsecutiveGlCompositions", 24, T::INT},
            {"maxPercentGlCompositions", 25, T::FLOAT},
            {"minAcceptableFps", 26, T::INT},
            {"maxAcceptableFps", 27, T::INT},
            {"logLevel", 100, T::INT},
            {"queueSize", 101, T::INT},
            {"defaultDelay", 102, T::INT},
            {"keepTwoHwcLayers", 115, T::BOOL},
            {"applyDelayToFrames", 116, T::BOOL},
    };
    return KEYS;
}

const SettingKey* findSettingKey(std::string_view name) {
    for (const SettingKey& key : settingKeys()) {
        if (key.name == name) return &key;
    }
    return nullptr;
}

Result<SettingValue> parseSettingAssignment(std::string_view assignment) {
    using R = Result<SettingValue>;
    const size_t equals = assignment.find('=');
    if (equals == std::string_view::npos) {
        return R::failure(errorLine("--set expects key=value (got " + quoted(assignment) + ")"));
    }
    const std::string_view name = trim(assignment.substr(0, equals));
    const SettingKey* key = findSettingKey(name);
    if (key == nullptr) return R::failure(errorLine("--set: " + unknownKey(name)));
    R result;
    result.value.id = key->id;
    std::string error = valueFromText(*key, trim(assignment.substr(equals + 1)), result.value.value);
    if (!error.empty()) return R::failure(errorLine("--set: " + error));
    return result;
}

Result<std::vector<SettingValue>> settingsFromJson(const Json::Value& object,
                                                   std::string_view where) {
    using R = Result<std::vector<SettingValue>>;
    const std::string prefix = std::string(where) + ": ";
    if (!object.isObject()) {
        return R::failure(errorLine(prefix + "expected an object of settings keys"));
    }
    R result;
    for (const std::string& name : object.getMemberNames()) {
        const SettingKey* key = findSettingKey(name);
        if (key == nullptr) return R::failure(errorLine(prefix + unknownKey(name)));
        SettingValue entry{key->id, {}};
        std::string error = valueFromJson(*key, object[name], entry.value);
        if (!error.empty()) return R::failure(errorLine(prefix + error));
        result.value.push_back(std::move(entry));
    }
    return result;
}

Result<std::vector<SettingValue>> parseSettingsJson(std::string_view text, std::string_view source) {
    // Settings nest three levels at most (object, curve, point).
    const Result<Json::Value> root = parseJsonDocument(text, source, MAX_SETTINGS_DEPTH);
    if (!root.ok()) return Result<std::vector<SettingValue>>::failure(root.error);
    return settingsFromJson(root.value, source);
}

Result<std::vector<SettingValue>> readSettingsFile(const std::string& path) {
    const Result<std::string> text = readSmallFile(path, MAX_SETTINGS_FILE_BYTES, "settings file");
    if (!text.ok()) return Result<std::vector<SettingValue>>::failure(text.error);
    return parseSettingsJson(text.value, path);
}

int32_t logLevelOf(const std::vector<SettingValue>& settings) {
    constexpr int32_t LOG_LEVEL_ID = 100;
    int32_t level = 0;
    for (const SettingValue& setting : settings) {
        if (const auto* value = std::get_if<int32_t>(&setting.value);
            value != nullptr && setting.id == LOG_LEVEL_ID) {
            level = *value;
        }
    }
    return level;
}

std::string describeSetting(const SettingValue& setting) {
    std::string name = "id " + std::to_string(setting.id);
    for (const SettingKey& key : settingKeys()) {
        if (key.id == setting.id) name = key.name;
    }
    std::ostringstream value;
    std::visit(
            [&value](const auto& v) {
                using T = std::decay_t<decltype(v)>;
                if constexpr (std::is_same_v<T, bool>) {
                    value << (v ? "true" : "false");
                } else if constexpr (std::is_same_v<T, Points>) {
                    for (size_t i = 0; i < v.size(); i++)
                        value << (i == 0 ? "" : ",") << v[i].x << ',' << v[i].y;
                } else {
                    value << v;
                }
            },
            setting.value);
    return name + "=" + value.str();
}

}  // namespace verolux::sim
