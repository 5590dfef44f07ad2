#pragma once

#include <atomic>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Options.h"
#include "sim/Scenario.h"

namespace verolux::sim {

// --sweep: the grid of the swept settings' values, each cell a run in the chosen mode into a
// subfolder of options.outDir named after its values; then a table with a row per cell (and for
// two keys a grid of animation error p95 and one of latency p50), marking the cells with the
// lowest animation error p95 whose latency p50 is within --latency-budget-ms (or lowest overall
// without a budget). Prints to stdout, progress to stderr; returns the exit status.
int sweepSettings(const Options& options, const std::vector<host::SettingValue>& settings,
                  const Capture* capture, const Scenario* scenario,
                  const std::atomic<bool>& interrupted);

}  // namespace verolux::sim
