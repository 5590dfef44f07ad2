#include "host/SettingsMessage.h"

#include <type_traits>

namespace verolux::host {

namespace {

void writeValue(android::Parcel& out, const SettingValue::Value& value) {
    std::visit(
            [&out](const auto& v) {
                using T = std::decay_t<decltype(v)>;
                if constexpr (std::is_same_v<T, int32_t>) {
                    out.writeInt32(v);
                } else if constexpr (std::is_same_v<T, float>) {
                    out.writeFloat(v);
                } else if constexpr (std::is_same_v<T, bool>) {
                    out.writeInt32(v ? 1 : 0);
                } else {
                    out.writeInt32(static_cast<int32_t>(v.size()));
                    for (const SettingValue::Point& point : v) {
                        out.writeFloat(point.x);
                        out.writeFloat(point.y);
                    }
                }
            },
            value);
}

}  // namespace

void writeSettingsMessage(const std::vector<SettingValue>& values, android::Parcel& out) {
    out.writeInt32(static_cast<int32_t>(values.size()));
    for (const SettingValue& entry : values) {
        out.writeInt32(entry.id);
        writeValue(out, entry.value);
    }
}

}  // namespace verolux::host
