// Feeds arbitrary bytes to the simulator's settings readers: the JSON settings file and, when the
// first byte says so, a --set key=value. Whatever they accept is described for the run's record
// and written into the settings message the library receives.

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>
#include <string_view>
#include <vector>

#include "fuzz/ErrorLine.h"
#include "host/SettingsMessage.h"
#include "sim/SettingsKeys.h"

namespace {

using verolux::host::SettingValue;

void use(const std::vector<SettingValue>& settings) {
    for (const SettingValue& setting : settings) {
        if (verolux::sim::describeSetting(setting).empty()) abort();
    }
    verolux::sim::logLevelOf(settings);
    android::Parcel message;
    verolux::host::writeSettingsMessage(settings, message);
}

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    if (size == 0) return 0;
    const std::string_view text(reinterpret_cast<const char*>(data) + 1, size - 1);
    if ((data[0] & 1) != 0) {
        const auto assignment = verolux::sim::parseSettingAssignment(text);
        if (assignment.ok()) use({assignment.value});
        if (!assignment.ok() && !verolux::fuzz::isErrorLine(assignment.error)) abort();
        return 0;
    }
    const auto settings = verolux::sim::parseSettingsJson(text, "fuzz.json");
    if (settings.ok()) use(settings.value);
    if (!settings.ok() && !verolux::fuzz::isErrorLine(settings.error)) abort();
    return 0;
}
