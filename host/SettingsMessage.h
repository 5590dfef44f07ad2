#pragma once

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <cstdint>
#include <string>
#include <variant>
#include <vector>

namespace verolux::host {

// One entry of a settings message: a parameter id and its value, as the controlling service sends
// them through SettingsController::updateSettings.
struct SettingValue {
    struct Point {
        float x;
        float y;
    };
    using Value = std::variant<int32_t, float, bool, std::vector<Point>>;

    int32_t id;
    Value value;
};

// Builds the parcel of an updateSettings call: int32 count, then per entry int32 id and the value
// (int32, float, int32 0/1 for bools, or int32 point count then float x, float y per point).
void writeSettingsMessage(const std::vector<SettingValue>& values, android::Parcel& out);

}  // namespace verolux::host
