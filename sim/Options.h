#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Result.h"

namespace verolux::sim {

// How a run keeps time: simulated (one thread plays every event in time order, as fast as it can,
// and the library's clock reads the time of the event being played) or real (the game, the
// display and the release threads wait on the real clock).
enum class TimeMode { SIMULATED, REAL };

// One key of a sweep and the values it takes, in the order given.
struct SweepAxis {
    std::string key;
    std::vector<std::string> texts;          // each value as typed
    std::vector<host::SettingValue> values;  // the same, as settings
};

// What verolux-sim was asked to do. Without a capture the game is generated: frames at fps with
// a normally distributed queue-time jitter and render time, from the seed.
struct Options {
    TimeMode time = TimeMode::SIMULATED;
    double fps = 30;
    double jitterMs = 1;
    double renderMs = 8;  // mean GPU time of a frame
    double hz = 60;
    double clientCompositionShare = 0;  // compositions that fall back to client composition
    uint32_t mode = 0;
    uint32_t slots = 0;   // buffer-queue slots; 0: sized by the reference host
    uint32_t layers = 1;  // copies of the game in the mode, each a layer of its own
    double durationSec = 10;
    bool durationGiven = false;  // without it, a capture plays to its end
    bool loop = false;           // replay the capture until the duration is over
    uint32_t gameWidth = 1920;   // the game's resolution, for the buffers' memory
    uint32_t gameHeight = 1080;
    double pictureAtSec = 1;  // start of the space-time picture's window
    std::string outDir = "sim-out";
    std::string capturePath;                    // empty: the generator above plays the game
    std::string settingsPath;                   // empty: no settings file
    std::vector<host::SettingValue> overrides;  // --set values, in the order given
    uint64_t seed = 1;
    uint32_t width = 320;   // picture width in pixels
    bool reference = true;  // also run mode 2 on the same game
    bool figures = true;    // draw the figures with matplotlib
    bool quiet = false;
    bool help = false;
    std::string scenario;           // a shipped scenario's name or a scenario file; empty: none
    std::vector<uint32_t> compare;  // the modes to run side by side; empty: one run
    std::vector<SweepAxis> sweep;   // one or two keys whose grid of values to run
    std::optional<double> latencyBudgetMs;
    std::vector<std::string> givenOptions;  // the options the command line gave, by name

    bool given(std::string_view option) const;
};

// Applies an option that takes a value (its name with "--") as the command line would, without
// noting it as given; an error line when it is refused, empty when taken.
std::string applyOption(std::string_view name, std::string_view text, Options& options);

// argv[0] is the program and is skipped. Options take their value as the next argument or after
// '=' (--fps=60); --set may repeat. --help stops parsing and wins over anything after it.
Result<Options> parseOptions(int argc, const char* const* argv);

std::string usage();

// "simulated" or "real".
const char* timeModeName(TimeMode mode);

// The settings message of a run: `first` (a scenario's), the settings file's values, then the
// --set overrides, so that an override wins when the library applies the entries in order.
Result<std::vector<host::SettingValue>> gatherSettings(
        const Options& options, const std::vector<host::SettingValue>& first = {});

}  // namespace verolux::sim
