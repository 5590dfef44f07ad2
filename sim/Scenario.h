#pragma once

#include <cstdint>
#include <optional>
#include <string>
#include <string_view>
#include <utility>
#include <vector>

#include "host/SettingsMessage.h"
#include "sim/Options.h"
#include "sim/Result.h"

namespace verolux::sim {

// A stretch of the run in which the game plays differently from the options' fps, jitter and
// render time. Times are seconds from the start of the run. Where stretches overlap, the later
// one in the file decides each value it sets.
struct GameSegment {
    double from = 0;
    std::optional<double> until;  // the end of the run when not set
    std::optional<double> fps;
    // A sawtooth: from fps at the start of each rampSec, the rate climbs linearly to rampTo.
    std::optional<double> rampTo;
    std::optional<double> rampSec;
    std::optional<double> jitterMs;
    std::optional<double> renderMs;
    // Every spikeEverySec from `from`, the next frame the game starts takes spikeRenderMs on the
    // GPU.
    std::optional<double> spikeEverySec;
    std::optional<double> spikeRenderMs;
    // Every n-th frame is queued with the timestamp of the frame before it.
    std::optional<uint32_t> reuseTimestampEvery;
};

struct DisplayChange {
    double at = 0;
    double hz = 60;
};

struct ClientCompositionBurst {
    double from = 0;
    double until = 0;
    double share = 1;  // of the compositions in the burst that fall back to client composition
};

// Settings the controlling service delivers to every layer's game at a time of the run.
struct SettingsDelivery {
    double at = 0;
    std::vector<host::SettingValue> settings;
};

// What the run must show at its end: the named measure (see Expectations.h) against each bound
// that is set.
struct Expectation {
    std::string that;  // what it means, in words; may be empty
    std::string measure;
    std::optional<double> equals;
    std::optional<double> atLeast;
    std::optional<double> atMost;
};

// A scenario file (sim/scenarios/README.md describes the format).
struct Scenario {
    std::string name;  // the file's name without its extension
    std::string path;
    std::string description;
    // Defaults of command-line options, as option name (without "--") and value text; options
    // given on the command line win.
    std::vector<std::pair<std::string, std::string>> options;
    std::vector<host::SettingValue> settings;  // delivered at the start, before --settings and --set
    std::vector<GameSegment> game;
    std::vector<DisplayChange> display;
    std::vector<ClientCompositionBurst> clientComposition;
    std::vector<SettingsDelivery> deliveries;
    std::vector<Expectation> expectations;
};

// The shipped scenarios' folder.
std::string scenarioFolder();
// The names of the shipped scenarios, sorted.
std::vector<std::string> scenarioNames();

// `nameOrPath` is a shipped scenario's name, or a file (it holds a '/' or ends in ".json").
Result<Scenario> readScenario(std::string_view nameOrPath);
// `source` names the text in error lines: "verolux-sim: SOURCE: game[1].fps must be ...".
Result<Scenario> parseScenario(std::string_view text, std::string_view source);

// Takes the scenario's option defaults into `options` where the command line did not give them,
// with the command line's checks, and puts its settings before those of --settings and --set.
Status applyScenario(const Scenario& scenario, Options& options);

}  // namespace verolux::sim
