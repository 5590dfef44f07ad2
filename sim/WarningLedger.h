#pragma once

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <cstdint>
#include <string>
#include <vector>

#include "sim/Recording.h"

namespace verolux::sim {

// The warnings of one writeWarningsToParcel call, decoded from the parcel's words as the settings
// client reads them: records of int32 size (20), int32 code, int64 wall-clock ms, and an int32 or
// a float by the code, until the data ends.
struct DecodedWarnings {
    std::vector<WarningRecord> warnings;  // time not set: the caller knows the run's clock
    std::string error;                    // why decoding stopped early; empty when it did not
};

DecodedWarnings decodeWarnings(const android::Parcel& parcel);

// A warning's time on the run's monotonic clock, from its wall-clock time (ms) and the run's start
// on both clocks; at most a day from the start.
nsecs_t warningRunTime(int64_t wallMs, nsecs_t startTime, int64_t startWallMs);

// "LOW_GAME_FPS", ...; "code N" for a code the library does not define.
std::string warningCodeName(int32_t code);

// One line of the ledger: "61.02 s  14:03:12.345  run  LOW_GAME_FPS  29", the time from the
// run's start and the warning's own wall-clock time of day (UTC).
std::string ledgerLine(const WarningRecord& warning, nsecs_t runStart, const std::string& game);

}  // namespace verolux::sim
