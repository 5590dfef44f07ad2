#pragma once

#include <atomic>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Options.h"
#include "sim/Scenario.h"

namespace verolux::sim {

// --compare: the same game (generated, a capture or a scenario) through each listed mode, each
// into a subfolder of options.outDir (mode-0/, ...) with every file of a run but the figures and
// the report; then one table with a column per mode, one report.html and, unless --no-figures,
// one figure that sets the modes side by side. Prints to stdout, progress to stderr; returns the
// exit status.
int compareModes(const Options& options, const std::vector<host::SettingValue>& settings,
                 const Capture* capture, const Scenario* scenario,
                 const std::atomic<bool>& interrupted);

}  // namespace verolux::sim
