#include "sim/Options.h"

#include <algorithm>
#include <charconv>
#include <cstdio>

#include "sim/SettingsKeys.h"
#include "sim/TextNumbers.h"

namespace verolux::sim {

namespace {

// Real-valued options with their accepted range. The upper bounds keep every derived duration in
// nanoseconds far from overflow and a run's recording within memory.
struct RealOption {
    std::string_view name;
    double Options::*field;
    double min;
    bool minIncluded;
    double max;
    std::string_view rule;
};

const RealOption REAL_OPTIONS[] = {
        // A slower game would not show a frame within a run; the bound keeps the period finite.
        {"--fps", &Options::fps, 0.1, true, 1000, "must be between 0.1 and 1000"},
        {"--hz", &Options::hz, 1, true, 1000, "must be between 1 and 1000"},
        {"--jitter-ms", &Options::jitterMs, 0, true, 1000, "must be between 0 and 1000"},
        {"--render-ms", &Options::renderMs, 0, true, 1000, "must be between 0 and 1000"},
        {"--duration", &Options::durationSec, 0, false, 3600,
         "must be greater than 0 and at most 3600 seconds"},
        {"--picture-at", &Options::pictureAtSec, 0, true, 3600, "must be between 0 and 3600"},
        {"--client-composition", &Options::clientCompositionShare, 0, true, 1,
         "must be between 0 and 1"},
};

struct WholeOption {
    std::string_view name;
    uint32_t Options::*field;
    int64_t min;
    int64_t max;
};

const WholeOption WHOLE_OPTIONS[] = {
        {"--mode", &Options::mode, 0, 5},
        {"--slots", &Options::slots, 2, 64},
        {"--layers", &Options::layers, 1, 16},
        {"--game-width", &Options::gameWidth, 1, 16384},
        {"--game-height", &Options::gameHeight, 1, 16384},
        {"--width", &Options::width, 16, 4096},
};

struct TextOption {
    std::string_view name;
    std::string Options::*field;
};

const TextOption TEXT_OPTIONS[] = {
        {"--out", &Options::outDir},
        {"--capture", &Options::capturePath},
        {"--settings", &Options::settingsPath},
        {"--scenario", &Options::scenario},
};

// More cells than anyone reads in a table; each is a run of its own.
constexpr size_t MAX_SWEEP_VALUES = 64;
constexpr size_t MAX_SWEEP_KEYS = 2;

std::string formatNumber(double value) {
    char text[32];
    snprintf(text, sizeof(text), "%g", value);
    return text;
}

std::string tryHelp(std::string_view message) {
    return errorLine(std::string(message) + " (try --help)");
}

// Each apply returns the error line, or an empty string when the value was taken.
std::string applyReal(const RealOption& option, std::string_view text, Options& options) {
    const auto value = parseNumber(text);
    if (!value) {
        return errorLine(std::string(option.name) + " expects a number (got " + quoted(text) + ")");
    }
    const bool aboveMin = option.minIncluded ? *value >= option.min : *value > option.min;
    if (!aboveMin || *value > option.max) {
        return errorLine(std::string(option.name) + " " + std::string(option.rule) + " (got " +
                         formatNumber(*value) + ")");
    }
    options.*option.field = *value;
    if (option.field == &Options::durationSec) options.durationGiven = true;
    return {};
}

std::string applyWhole(const WholeOption& option, std::string_view text, Options& options) {
    const auto value = parseInteger(text);
    if (!value) {
        return errorLine(std::string(option.name) + " expects a whole number (got " + quoted(text) +
                         ")");
    }
    if (*value < option.min || *value > option.max) {
        return errorLine(std::string(option.name) + " must be between " +
                         std::to_string(option.min) + " and " + std::to_string(option.max) +
                         " (got " + std::to_string(*value) + ")");
    }
    options.*option.field = static_cast<uint32_t>(*value);
    return {};
}

std::string applySeed(std::string_view text, Options& options) {
    const char* end = text.data() + text.size();
    const auto [ptr, ec] = std::from_chars(text.data(), end, options.seed);
    if (text.empty() || ec != std::errc() || ptr != end) {
        return errorLine("--seed expects a whole number from 0 to 2^64-1 (got " + quoted(text) +
                         ")");
    }
    return {};
}

std::string applyCompare(std::string_view text, Options& options) {
    options.compare.clear();
    for (std::string_view item : splitAtCommas(text)) {
        const auto mode = parseInteger(item);
        if (!mode || *mode < 0 || *mode > 5) {
            return errorLine("--compare expects modes from 0 to 5, separated by commas (got " +
                             quoted(text) + ")");
        }
        const auto value = static_cast<uint32_t>(*mode);
        if (std::find(options.compare.begin(), options.compare.end(), value) !=
            options.compare.end()) {
            return errorLine("--compare names mode " + std::to_string(value) + " twice");
        }
        options.compare.push_back(value);
    }
    if (options.compare.size() < 2) {
        return errorLine("--compare expects two or more modes (got " + quoted(text) + ")");
    }
    return {};
}

std::string applySweep(std::string_view text, Options& options) {
    const size_t equals = text.find('=');
    const std::string key(trim(text.substr(0, std::min(equals, text.size()))));
    if (equals == std::string_view::npos || findSettingKey(key) == nullptr) {
        return errorLine("--sweep expects a settings key and its values, key=v1,v2,... (got " +
                         quoted(text) + ")");
    }
    if (findSettingKey(key)->type == SettingType::POINTS) {
        return errorLine("--sweep cannot sweep " + key + ": its values hold commas");
    }
    if (options.sweep.size() == MAX_SWEEP_KEYS) return errorLine("--sweep takes two keys at most");
    for (const SweepAxis& axis : options.sweep) {
        if (axis.key == key) return errorLine("--sweep gives " + key + " twice");
    }
    SweepAxis axis;
    axis.key = key;
    for (std::string_view item : splitAtCommas(text.substr(equals + 1))) {
        Result<host::SettingValue> value = parseSettingAssignment(key + "=" + std::string(item));
        if (!value.ok())
            return errorLine("--sweep" + value.error.substr(errorLine("--set").size()));
        axis.texts.emplace_back(item);
        axis.values.push_back(std::move(value.value));
    }
    if (axis.values.size() > MAX_SWEEP_VALUES) {
        return errorLine("--sweep takes at most " + std::to_string(MAX_SWEEP_VALUES) +
                         " values per key");
    }
    options.sweep.push_back(std::move(axis));
    return {};
}

// Applies an option that takes a value; false when the name is no such option.
bool applyValueOption(std::string_view name, std::string_view text, Options& options,
                      std::string& error) {
    for (const RealOption& option : REAL_OPTIONS) {
        if (option.name == name) {
            error = applyReal(option, text, options);
            return true;
        }
    }
    for (const WholeOption& option : WHOLE_OPTIONS) {
        if (option.name == name) {
            error = applyWhole(option, text, options);
            return true;
        }
    }
    for (const TextOption& option : TEXT_OPTIONS) {
        if (option.name == name) {
            if (text.empty()) error = errorLine(std::string(name) + " needs a non-empty value");
            options.*option.field = text;
            return true;
        }
    }
    if (name == "--seed") {
        error = applySeed(text, options);
        return true;
    }
    if (name == "--time") {
        if (text == "simulated") {
            options.time = TimeMode::SIMULATED;
        } else if (text == "real") {
            options.time = TimeMode::REAL;
        } else {
            error = errorLine("--time expects simulated or real (got " + quoted(text) + ")");
        }
        return true;
    }
    if (name == "--set") {
        auto value = parseSettingAssignment(text);
        error = value.error;
        if (value.ok()) options.overrides.push_back(std::move(value.value));
        return true;
    }
    if (name == "--compare") {
        error = applyCompare(text, options);
        return true;
    }
    if (name == "--sweep") {
        error = applySweep(text, options);
        return true;
    }
    if (name == "--latency-budget-ms") {
        const auto value = parseNumber(text);
        if (!value || *value < 0 || *value > 10'000) {
            error = errorLine("--latency-budget-ms expects a number from 0 to 10000 (got " +
                              quoted(text) + ")");
        } else {
            options.latencyBudgetMs = value;
        }
        return true;
    }
    return false;
}

// Applies an option that takes no value; false when the name is no such option.
bool applyFlag(std::string_view name, Options& options) {
    if (name == "--help" || name == "-h") {
        options.help = true;
    } else if (name == "--loop") {
        options.loop = true;
    } else if (name == "--no-reference") {
        options.reference = false;
    } else if (name == "--quiet") {
        options.quiet = true;
    } else if (name == "--no-figures") {
        options.figures = false;
    } else {
        return false;
    }
    return true;
}

}  // namespace

Result<Options> parseOptions(int argc, const char* const* argv) {
    using R = Result<Options>;
    R result;
    Options& options = result.value;
    for (int i = 1; i < argc; i++) {
        const std::string_view arg = argv[i] != nullptr ? argv[i] : "";
        std::string_view name = arg;
        std::string_view text;
        const size_t equals = arg.find('=');
        const bool inlineValue = arg.rfind("--", 0) == 0 && equals != std::string_view::npos;
        if (inlineValue) {
            name = arg.substr(0, equals);
            text = arg.substr(equals + 1);
        }
        if (applyFlag(name, options)) {
            if (inlineValue) return R::failure(errorLine(std::string(name) + " takes no value"));
            if (options.help) return result;
            continue;
        }
        if (arg.empty() || arg[0] != '-') {
            return R::failure(tryHelp("unexpected argument " + quoted(arg)));
        }
        if (!inlineValue && i + 1 < argc) text = argv[i + 1] != nullptr ? argv[i + 1] : "";
        std::string error;
        if (!applyValueOption(name, text, options, error)) {
            return R::failure(tryHelp("unknown option " + quoted(name)));
        }
        if (!inlineValue) {
            if (i + 1 >= argc) return R::failure(errorLine(std::string(name) + " needs a value"));
            i++;
        }
        if (!error.empty()) return R::failure(error);
        options.givenOptions.emplace_back(name);
    }
    if (!options.compare.empty() && !options.sweep.empty()) {
        return R::failure(errorLine("--compare and --sweep run grids of their own: give one"));
    }
    if (!options.compare.empty() && options.given("--mode")) {
        return R::failure(errorLine("--compare gives the modes: drop --mode"));
    }
    if (options.latencyBudgetMs && options.sweep.empty()) {
        return R::failure(errorLine("--latency-budget-ms marks the cells of a --sweep: add one"));
    }
    return result;
}

bool Options::given(std::string_view option) const {
    return std::find(givenOptions.begin(), givenOptions.end(), option) != givenOptions.end();
}

std::string applyOption(std::string_view name, std::string_view text, Options& options) {
    std::string error;
    if (!applyValueOption(name, text, options, error)) {
        return errorLine("unknown option " + quoted(name));
    }
    return error;
}

const char* timeModeName(TimeMode mode) {
    return mode == TimeMode::REAL ? "real" : "simulated";
}

std::string usage() {
    std::string text = R"(Usage: verolux-sim [options]
Plays a simulated game and display against the library, and the same game without interpolation
(mode 2) beside it, and reports what the screen showed.

Game:
  --fps F            frames per second the game queues (default 30, 0.1 to 1000)
  --jitter-ms J      standard deviation of the frame intervals, ms (default 1)
  --render-ms R      mean GPU time of a frame, ms (default 8)
  --seed N           seed of the jitter and render times (default 1)
  --capture FILE     replay a frame-time capture instead: the project's *.frames.csv or a
                     PresentMon CSV (see sim/captures/README.md); the run lasts until it ends
  --loop             replay the capture until --duration is over
  --game-width W     the game's resolution, for the buffers' memory (default 1920 x 1080)
  --game-height H
  --scenario NAME|FILE
                     play a scenario: the game, display, client composition and settings
                     over time, and what the run must show (checked at the end: a failed
                     expectation exits with status 1); NAME is one of sim/scenarios/*.json
                     (see its README); its options are defaults the command line overrides;
                     simulated time only
Display and library:
  --hz H             display refresh rate (default 60, 1 to 1000)
  --mode M           interpolation mode (default 0):
                       0 retime, 1 fill-in, 2 no interpolation, 3 just in time,
                       4 unlimited, 5 latency reduction
  --slots N          buffers of the game's queue, 2 to 64 (default: enough for the display
                     delay at the refresh rate; the queueSize setting fixes it too)
  --layers N         copies of the game in the mode, 1 to 16 (default 1), each a layer with
                     its own uid on the same display; the copies after the first are
                     measured and summarised in a line each, without files of their own
  --client-composition SHARE
                     share of compositions, 0 to 1, that fall back to client (GPU)
                     composition, drawn from the seed (default 0)
  --settings FILE    settings as a JSON object of the keys below
  --set KEY=VALUE    one setting, after those of --settings; may repeat
                     (e.g. --set delayMs=48 --set alphaFunction=0,0,0.5,1,1,1); gameFpsLimit
                     is the refresh rate unless set (interpolation is on from 1 upwards);
                     gfpsOffsetEnabled=1 holds the game to the game-rate limit
Run and output:
  --time simulated   play every event in simulated time, as fast as the machine can (the
                     default): the same inputs and seed give the same results, byte for byte
  --time real        play the game and the display in real time, on threads of their own
  --duration S       seconds to run (default 10, or the capture's length; at most 3600)
  --out DIR          output folder (default sim-out)
  --width W          width of the space-time picture in pixels, 16 to 4096 (default 320)
  --picture-at S     start of the space-time picture's 2 s window (default 1)
  --no-reference     skip the mode-2 run on the same game
  --no-figures       draw no figures (matplotlib takes seconds); the report shows the tables
Several runs of the same game, each into a subfolder of --out, then one table and one report:
  --compare M,M,...  one run per mode (e.g. 0,2,3,5), side by side
  --sweep KEY=V,V,...
                     one run per value of a settings key; a second --sweep makes a grid of
                     two keys (e.g. --sweep delayMs=32,48,64 --sweep hitTarget=0.95,0.99)
  --latency-budget-ms MS
                     mark the sweep's cells with the lowest animation error p95 whose
                     latency p50 stays within MS (without it: the lowest overall)
Others:
  --quiet            print nothing but errors
  --help             print this and exit

Settings keys (per game, then process-wide):
)";
    std::string line = " ";
    for (const SettingKey& key : settingKeys()) {
        if (line.size() + key.name.size() + 1 > 96) {
            text += line + "\n";
            line = " ";
        }
        line += " ";
        line += key.name;
    }
    return text + line + "\n";
}

Result<std::vector<host::SettingValue>> gatherSettings(const Options& options,
                                                       const std::vector<host::SettingValue>& first) {
    Result<std::vector<host::SettingValue>> result;
    if (!options.settingsPath.empty()) {
        result = readSettingsFile(options.settingsPath);
        if (!result.ok()) return result;
    }
    result.value.insert(result.value.begin(), first.begin(), first.end());
    result.value.insert(result.value.end(), options.overrides.begin(), options.overrides.end());
    return result;
}

}  // namespace verolux::sim
