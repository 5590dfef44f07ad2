#pragma once

#include <atomic>
#include <optional>
#include <ostream>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Capture.h"
#include "sim/Options.h"
#include "sim/Recording.h"

namespace verolux::sim {

struct SimulationResult {
    Recording run;
    std::optional<Recording> reference;  // the same game in mode 2
    bool interrupted = false;
};

// One run of verolux-sim: the game in the chosen mode and, unless left out, the same game (same
// seed or capture) in mode 2 beside it, on one display, in real time.
class Simulation {
public:
    static constexpr uint32_t GAME_UID = 10'001;
    static constexpr uint32_t REFERENCE_UID = 10'002;
    static constexpr uint32_t BUFFER_HEIGHT = 4;

    Simulation(const Options& options, std::vector<host::SettingValue> settings,
               const Capture* capture);

    // Runs until the duration has passed or `interrupted` is set; progress lines go to `progress`
    // when it is not null.
    SimulationResult run(const std::atomic<bool>& interrupted, std::ostream* progress);

private:
    const Options mOptions;
    const std::vector<host::SettingValue> mSettings;
    const Capture* const mCapture;
};

}  // namespace verolux::sim
