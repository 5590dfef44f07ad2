#include "sim/WarningLedger.h"

#include <algorithm>
#include <cinttypes>
#include <cstdio>
#include <ctime>

#include "WatchdogWarningController.h"

namespace verolux::sim {

namespace {

using android::Interpolation::WarningCode;

constexpr int64_t DAY_MS = 24LL * 3600 * 1000;

// Codes 1 and 3 carry a float; every other code an int32 (an invalid one a zero int32).
bool carriesFloat(int32_t code) {
    return code == WarningCode::LATENCY_REDUCTION_UNSTABLE || code == WarningCode::RESERVED_FLOAT_3;
}

}  // namespace

DecodedWarnings decodeWarnings(const android::Parcel& parcel) {
    using android::Interpolation::WatchdogWarning;
    DecodedWarnings out;
    size_t position = parcel.dataPosition();
    while (position < parcel.dataSize()) {
        if (parcel.dataSize() - position < size_t{WatchdogWarning::PARCEL_SIZE}) {
            out.error = "a warning record cut short after " + std::to_string(out.warnings.size()) +
                        " whole ones";
            break;
        }
        const int32_t size = parcel.readInt32();
        if (size != WatchdogWarning::PARCEL_SIZE) {
            out.error = "a warning record of " + std::to_string(size) + " bytes, not " +
                        std::to_string(WatchdogWarning::PARCEL_SIZE);
            break;
        }
        WarningRecord warning;
        warning.code = parcel.readInt32();
        warning.wallMs = parcel.readInt64();
        warning.floatValue = carriesFloat(warning.code);
        warning.value = warning.floatValue ? static_cast<double>(parcel.readFloat())
                                           : static_cast<double>(parcel.readInt32());
        out.warnings.push_back(warning);
        position += WatchdogWarning::PARCEL_SIZE;
    }
    return out;
}

nsecs_t warningRunTime(int64_t wallMs, nsecs_t startTime, int64_t startWallMs) {
    // A wall-clock time a day or more away from the run's start is not this run's (the clock was
    // set, or the parcel is broken); it stays a day away, so that the arithmetic stays in range.
    const int64_t offsetMs =
            std::clamp(wallMs, startWallMs - DAY_MS, startWallMs + DAY_MS) - startWallMs;
    return startTime + offsetMs * 1'000'000;
}

std::string warningCodeName(int32_t code) {
    switch (code) {
        case WarningCode::LOW_GAME_FPS:
            return "LOW_GAME_FPS";
        case WarningCode::LATENCY_REDUCTION_UNSTABLE:
            return "LATENCY_REDUCTION_UNSTABLE";
        case WarningCode::RESERVED_INT_2:
            return "RESERVED_INT_2";
        case WarningCode::RESERVED_FLOAT_3:
            return "RESERVED_FLOAT_3";
        case WarningCode::HIGH_GAME_FPS:
            return "HIGH_GAME_FPS";
    }
    return "code " + std::to_string(code);
}

std::string ledgerLine(const WarningRecord& warning, nsecs_t runStart, const std::string& game) {
    const time_t seconds = static_cast<time_t>(warning.wallMs / 1000);
    tm utc{};
    gmtime_r(&seconds, &utc);
    char value[32];
    if (warning.floatValue) {
        snprintf(value, sizeof(value), "%.3f", warning.value);
    } else {
        snprintf(value, sizeof(value), "%.0f", warning.value);
    }
    char line[160];
    snprintf(line, sizeof(line), "%8.2f s  %02d:%02d:%02d.%03d UTC  %-9s  %-26s  %s",
             static_cast<double>(warning.time - runStart) / 1e9, utc.tm_hour, utc.tm_min,
             utc.tm_sec, static_cast<int>(warning.wallMs % 1000), game.c_str(),
             warningCodeName(warning.code).c_str(), value);
    return line;
}

}  // namespace verolux::sim
