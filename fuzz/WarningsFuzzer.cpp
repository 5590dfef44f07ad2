// Feeds arbitrary bytes to the simulator's reader of the warnings parcel, as the words a
// writeWarningsToParcel call left, and puts what it decodes on the run's clock and into the
// ledger's lines, as the simulator does.

#include <limits>
#include <memory>

#include <binder/Parcel.h>

#include <cstddef>
#include <cstdint>
#include <cstdlib>

#include "WatchdogWarningController.h"
#include "sim/WarningLedger.h"

namespace {

// A run that started at 10 s of uptime, on 2023-11-14 22:13:20 UTC.
constexpr nsecs_t START_TIME = 10'000'000'000;
constexpr int64_t START_WALL_MS = 1'700'000'000'000;

}  // namespace

extern "C" int LLVMFuzzerTestOneInput(const uint8_t* data, size_t size) {
    android::Parcel parcel;
    parcel.setData(data, size);
    verolux::sim::DecodedWarnings decoded = verolux::sim::decodeWarnings(parcel);
    if (decoded.warnings.size() > size / android::Interpolation::WatchdogWarning::PARCEL_SIZE) {
        abort();
    }
    for (verolux::sim::WarningRecord& warning : decoded.warnings) {
        warning.time = verolux::sim::warningRunTime(warning.wallMs, START_TIME, START_WALL_MS);
        verolux::sim::ledgerLine(warning, START_TIME, "run");
    }
    return 0;
}
