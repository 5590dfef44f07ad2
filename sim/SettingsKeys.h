#pragma once

#include <cstdint>
#include <string>
#include <string_view>
#include <vector>

#include <json/value.h>

#include "host/SettingsMessage.h"
#include "sim/Result.h"

namespace verolux::sim {

enum class SettingType { INT, FLOAT, BOOL, POINTS };

// A settings key the user may give, named as the library's Settings field or tunable it sets.
struct SettingKey {
    std::string_view name;
    int32_t id;
    SettingType type;
};

// The per-game settings (ids 0 to 27) and the process-wide tunables (100 to 102, 115, 116).
const std::vector<SettingKey>& settingKeys();
// nullptr when no key has that name (names are case-sensitive).
const SettingKey* findSettingKey(std::string_view name);

// One "key=value" of --set. alphaFunction takes a flat x,y list: "alphaFunction=0,0,0.5,1,1,1".
// Bools take true, false, 1 or 0.
Result<host::SettingValue> parseSettingAssignment(std::string_view assignment);

// A JSON object of the same keys; alphaFunction is an array of numbers (flat x,y list) or of
// [x, y] pairs. source names the text in error lines, normally its file name. The values come out
// in key order; each key may appear once.
Result<std::vector<host::SettingValue>> parseSettingsJson(std::string_view text,
                                                          std::string_view source);
Result<std::vector<host::SettingValue>> readSettingsFile(const std::string& path);
// The same from an object already read; `where` names it in error lines ("FILE: deliveries[0]").
Result<std::vector<host::SettingValue>> settingsFromJson(const Json::Value& object,
                                                         std::string_view where);

// The logLevel these settings leave the library at (0 when they do not set it).
int32_t logLevelOf(const std::vector<host::SettingValue>& settings);

// "key=value" as --set takes it, for the record of a run's options.
std::string describeSetting(const host::SettingValue& setting);

}  // namespace verolux::sim
